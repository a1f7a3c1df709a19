#include "desktop/QZNetworkReachability.h"

#include <cerrno>
#include <cstring>
#include <functional>
#include <linux/netlink.h>
#include <linux/rtnetlink.h>
#include <net/if.h>
#include <set>
#include <sys/socket.h>
#include <sys/time.h>
#include <unistd.h>
#include <vector>

#include "platform/Log.h"

namespace {

/// A dump that does not answer within this time counts as unreadable.
constexpr time_t kReceiveTimeoutSeconds = 2;
constexpr size_t kReceiveBufferSize = 64 * 1024;

/// A NETLINK_ROUTE socket, closed when it goes.
class RouteSocket {
public:
    RouteSocket() : fd_(socket(AF_NETLINK, SOCK_RAW | SOCK_CLOEXEC, NETLINK_ROUTE)) {
        if (fd_ < 0)
            return;
        const timeval timeout{kReceiveTimeoutSeconds, 0};
        setsockopt(fd_, SOL_SOCKET, SO_RCVTIMEO, &timeout, sizeof timeout);
    }
    ~RouteSocket() {
        if (fd_ >= 0)
            close(fd_);
    }
    RouteSocket(const RouteSocket&) = delete;
    RouteSocket& operator=(const RouteSocket&) = delete;

    bool IsOpen() const { return fd_ >= 0; }

    /// Sends a dump request of `type` whose body is `header` (an rtmsg or ifinfomsg) and passes
    /// each answer of that dump to `onMessage`. False when the dump cannot be sent, read, or
    /// ends in an error.
    template <class Header>
    bool Dump(uint16_t type, const Header& header,
              const std::function<void(const nlmsghdr&)>& onMessage) {
        struct {
            nlmsghdr message;
            Header body;
        } request{};
        request.message.nlmsg_len = NLMSG_LENGTH(sizeof(Header));
        request.message.nlmsg_type = type;
        request.message.nlmsg_flags = NLM_F_REQUEST | NLM_F_DUMP;
        request.message.nlmsg_seq = ++sequence_;
        request.body = header;
        sockaddr_nl kernel{};
        kernel.nl_family = AF_NETLINK;
        if (sendto(fd_, &request, request.message.nlmsg_len, 0,
                   reinterpret_cast<const sockaddr*>(&kernel), sizeof kernel) < 0)
            return false;
        return ReceiveDump(request.message.nlmsg_seq, onMessage);
    }

private:
    bool ReceiveDump(uint32_t sequence, const std::function<void(const nlmsghdr&)>& onMessage) {
        std::vector<char> buffer(kReceiveBufferSize);
        for (;;) {
            const ssize_t received = recv(fd_, buffer.data(), buffer.size(), 0);
            if (received < 0 && errno == EINTR)
                continue;
            if (received == 0)
                errno = EIO;
            if (received <= 0)
                return false;
            int remaining = int(received);
            for (auto* message = reinterpret_cast<const nlmsghdr*>(buffer.data());
                 NLMSG_OK(message, remaining); message = NLMSG_NEXT(message, remaining)) {
                if (message->nlmsg_seq != sequence)
                    continue;
                if (message->nlmsg_type == NLMSG_DONE)
                    return true;
                if (message->nlmsg_type == NLMSG_ERROR) {
                    errno = EIO;
                    if (message->nlmsg_len >= NLMSG_LENGTH(sizeof(nlmsgerr))) {
                        const auto* error = static_cast<const nlmsgerr*>(NLMSG_DATA(message));
                        if (error->error < 0)
                            errno = -error->error;
                    }
                    return false;
                }
                onMessage(*message);
            }
        }
    }

    int fd_;
    uint32_t sequence_ = 0;
};

/// Adds to `interfaces` the output interfaces of `message` when it is a usable default route.
void CollectDefaultRouteInterfaces(const nlmsghdr& message, std::set<int>& interfaces) {
    if (message.nlmsg_type != RTM_NEWROUTE || message.nlmsg_len < NLMSG_LENGTH(sizeof(rtmsg)))
        return;
    const auto* route = static_cast<const rtmsg*>(NLMSG_DATA(&message));
    if (route->rtm_dst_len != 0 || route->rtm_type != RTN_UNICAST)
        return;
    uint32_t table = route->rtm_table;
    std::vector<int> outputs;
    int length = int(message.nlmsg_len - NLMSG_LENGTH(sizeof(rtmsg)));
    for (auto* attribute = RTM_RTA(route); RTA_OK(attribute, length);
         attribute = RTA_NEXT(attribute, length)) {
        const size_t payload = RTA_PAYLOAD(attribute);
        if (attribute->rta_type == RTA_TABLE && payload >= sizeof(uint32_t)) {
            std::memcpy(&table, RTA_DATA(attribute), sizeof table);
        } else if (attribute->rta_type == RTA_OIF && payload >= sizeof(int)) {
            int index = 0;
            std::memcpy(&index, RTA_DATA(attribute), sizeof index);
            outputs.push_back(index);
        } else if (attribute->rta_type == RTA_MULTIPATH) {
            const auto* bytes = static_cast<const unsigned char*>(RTA_DATA(attribute));
            size_t offset = 0;
            while (payload - offset >= sizeof(rtnexthop)) {
                rtnexthop hop;
                std::memcpy(&hop, bytes + offset, sizeof hop);
                if (hop.rtnh_len < sizeof(rtnexthop) || hop.rtnh_len > payload - offset)
                    break;
                outputs.push_back(hop.rtnh_ifindex);
                offset += RTNH_ALIGN(hop.rtnh_len);
                if (offset > payload)
                    break;
            }
        }
    }
    // The local table holds the host's own addresses, never a way out.
    if (table == RT_TABLE_LOCAL)
        return;
    interfaces.insert(outputs.begin(), outputs.end());
}

/// Adds to `usable` the index of the interface of `message` when it is up, running and not the
/// loopback.
void CollectUsableInterface(const nlmsghdr& message, std::set<int>& usable) {
    if (message.nlmsg_type != RTM_NEWLINK || message.nlmsg_len < NLMSG_LENGTH(sizeof(ifinfomsg)))
        return;
    const auto* link = static_cast<const ifinfomsg*>(NLMSG_DATA(&message));
    const unsigned flags = link->ifi_flags;
    if ((flags & IFF_UP) && (flags & IFF_RUNNING) && !(flags & IFF_LOOPBACK))
        usable.insert(link->ifi_index);
}

} // namespace

bool QZGetDefaultRouteReachabilityFlags(QZNetworkReachabilityFlags* flags) {
    if (!flags)
        return false;
    *flags = 0;
    RouteSocket socket;
    if (!socket.IsOpen()) {
        glyphwell::AppLog("Cannot read the routing table: %s", std::strerror(errno));
        return false;
    }
    std::set<int> routeInterfaces;
    for (const unsigned char family : {AF_INET, AF_INET6}) {
        rtmsg request{};
        request.rtm_family = family;
        if (!socket.Dump(RTM_GETROUTE, request, [&](const nlmsghdr& message) {
                CollectDefaultRouteInterfaces(message, routeInterfaces);
            })) {
            glyphwell::AppLog("Cannot read the routing table: %s", std::strerror(errno));
            return false;
        }
    }
    std::set<int> usable;
    if (!routeInterfaces.empty()) {
        ifinfomsg request{};
        request.ifi_family = AF_UNSPEC;
        if (!socket.Dump(RTM_GETLINK, request, [&](const nlmsghdr& message) {
                CollectUsableInterface(message, usable);
            })) {
            glyphwell::AppLog("Cannot read the network interfaces: %s", std::strerror(errno));
            return false;
        }
    }
    for (const int index : routeInterfaces) {
        if (usable.count(index)) {
            *flags = kQZNetworkReachabilityFlagsReachable;
            break;
        }
    }
    return true;
}

bool QZNetworkFlagsAllowConnection(QZNetworkReachabilityFlags flags) {
    return (flags & kQZNetworkReachabilityFlagsReachable) &&
           !(flags & kQZNetworkReachabilityFlagsConnectionRequired);
}

bool IsNetworkConnected() {
    QZNetworkReachabilityFlags flags = 0;
    if (!QZGetDefaultRouteReachabilityFlags(&flags))
        return false;
    return QZNetworkFlagsAllowConnection(flags);
}
