// Whether the network can be used right now, from the kernel's routing table.
//
// The default route is reachable when the routing table (read over rtnetlink) holds a unicast
// default route, IPv4 or IPv6, whose output interface (or one of whose next hops' interfaces) is
// up and running and is not the loopback interface. Linux brings no connection up on demand, so
// the connection-required flag is never set here. Synchronous; thread-safe.
#pragma once

#include <cstdint>

typedef uint32_t QZNetworkReachabilityFlags;
enum : QZNetworkReachabilityFlags {
    kQZNetworkReachabilityFlagsReachable = 1u << 1,
    kQZNetworkReachabilityFlagsConnectionRequired = 1u << 2
};

/// Fills `flags` with the reachability of the default route and returns true; false, with
/// `flags` set to 0, when the routing table or the interfaces cannot be read.
bool QZGetDefaultRouteReachabilityFlags(QZNetworkReachabilityFlags* flags);

/// The download test on `flags`: reachable set and connection-required clear; every other bit
/// is ignored.
bool QZNetworkFlagsAllowConnection(QZNetworkReachabilityFlags flags);

/// True when the default route can be used without first bringing up a connection: the flags
/// could be read and pass QZNetworkFlagsAllowConnection. Flags that cannot be read count as not
/// connected.
bool IsNetworkConnected();
