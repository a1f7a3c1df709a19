// Message ports: request/reply messaging between processes of one user over a Unix-domain stream
// socket named after the port.
//
// Socket: <directory>/<name>, the directory being $XDG_RUNTIME_DIR, or without it ~/.glyphwell
// (see SocketDirectory). The frames are those of protocol/MessagePortWire.h; frames longer than
// kMessagePortMaxFrame close the connection.
//
// Local ports accept connections only from peers of the same user id (SO_PEERCRED). Creating a
// local port whose name a live server answers on fails (null, nothing logged: the caller says
// what it means); a stale socket file (nothing listening) is removed and the name taken over.
// The lock file beside the socket that guards this takeover is removed once the port is bound.
// When systemd passes a listening socket (LISTEN_PID/LISTEN_FDS), the first local port created in
// the process serves it instead of binding its own. A local port is served by adding its run-loop
// source to a run loop (see CFRunLoop.h); its callback then runs on that loop's thread, nested
// inside any callback that spins a nested loop, so a request arriving while another one waits
// for the user is answered at once, and first.
//
// Every client may be faulty or hostile, and none can stall the others:
// - Connections with requests waiting are served in turn, one request each per round of the
//   loop, so a client that queues many requests delays the others by one request at most.
// - A foreign peer, a frame over the limit, an unfinished request that has received nothing for
//   the stall timeout (30 s), or a write of a reply that fails closes that connection with one
//   line on the application log.
// - Unfinished requests hold at most 128 MiB over all connections; beyond it the connection
//   holding the most is closed, with one log line.
// - While a connection has a request waiting, in the callback or being answered, at most 1 MiB
//   of its later frames is held; it is not read beyond that until they are served.
// - A client that hangs up (or whose reply cannot be written) is gone: its request in the
//   callback is withdrawn (see PendingRequest), its reply discarded, and the requests it had
//   queued are dropped unhandled. A client that only shuts its writing side down after sending
//   still gets its replies; the connection is closed once they are written.
// Replies are written without blocking; a large reply goes out as the client reads it.
#pragma once

#include <chrono>
#include <cstddef>
#include <functional>
#include <memory>
#include <string>

#include "platform/CFBase.h"
#include "platform/CFDate.h"
#include "platform/CFRunLoop.h"

typedef struct __CFMessagePort* CFMessagePortRef;

enum : SInt32 {
    kCFMessagePortSuccess = 0,
    kCFMessagePortSendTimeout = -1,
    kCFMessagePortReceiveTimeout = -2,
    kCFMessagePortIsInvalid = -3,
    kCFMessagePortTransportError = -4,
    kCFMessagePortBecameInvalidError = -5,
};

/// A timeout that never ends (users take their time).
inline constexpr CFTimeInterval kCFMessagePortWaitForever = __builtin_huge_val();
/// The largest request or reply body accepted.
inline constexpr uint32_t kMessagePortMaxFrame = 64u << 20;

struct CFMessagePortContext {
    CFIndex version;
    void* info;
    const void* (*retain)(const void* info);
    void (*release)(const void* info);
    CFStringRef (*copyDescription)(const void* info);
};

/// Handles one request on a local port: returns the reply (a new reference that the port releases
/// after sending it; null sends an empty reply).
typedef CFDataRef (*CFMessagePortCallBack)(CFMessagePortRef local, SInt32 msgid, CFDataRef data,
                                           void* info);

CFTypeID CFMessagePortGetTypeID();

/// A new local port listening under `name`, or null when the name is taken by a live server
/// (nothing logged) or the socket cannot be made (one line on the application log). `context->info`
/// is passed to every callback; its retain/release callbacks are honoured when given.
/// `*shouldFreeInfo` (when given) is set to false when the port keeps the info, true when no port
/// was made. The request data given to the callback is never null (empty for an empty request).
CFMessagePortRef CFMessagePortCreateLocal(CFAllocatorRef allocator, CFStringRef name,
                                          CFMessagePortCallBack callout,
                                          CFMessagePortContext* context, Boolean* shouldFreeInfo);
/// A new remote port for `name`, connected, or null when no server listens under it. A server too
/// busy to accept at once (its queue of connections is full) still gives a port: its first
/// request connects, within that request's send timeout.
CFMessagePortRef CFMessagePortCreateRemote(CFAllocatorRef allocator, CFStringRef name);
/// A new run-loop source that serves the local port when added to a run loop (the port's one
/// source, retained again when asked twice); null for a remote or invalidated port.
CFRunLoopSourceRef CFMessagePortCreateRunLoopSource(CFAllocatorRef allocator,
                                                    CFMessagePortRef local, CFIndex order);

/// Sends a request and, when `returnData` is not null, waits for the reply and stores it there (a
/// new reference the caller releases). The timeouts are in seconds; kCFMessagePortWaitForever
/// waits without limit. Returns kCFMessagePortSuccess or one of the error codes above:
/// SendTimeout when the request could not be written in time, ReceiveTimeout when no reply came
/// in time (the connection is then closed: a late reply is never mistaken for the next one),
/// IsInvalid for an invalidated port, BecameInvalidError when the server closed the connection
/// before replying, TransportError for any other socket failure (no server listens any more, a
/// request over kMessagePortMaxFrame, a reply over it).
///
/// A remote port keeps one connection for all its requests (one at a time; concurrent callers
/// wait for each other) and stays valid after every error but IsInvalid: a connection that
/// failed, timed out or that the server dropped while idle is replaced by a new one on the next
/// request. Without `returnData` the reply is not awaited and the connection is given up after
/// the request has been written (the server sees its client go away, and may drop the request
/// unhandled). Timeouts of zero, below zero or NaN do not wait at all. Invalidating the port from
/// another thread ends a waiting request with IsInvalid.
SInt32 CFMessagePortSendRequest(CFMessagePortRef remote, SInt32 msgid, CFDataRef data,
                                CFTimeInterval sendTimeout, CFTimeInterval receiveTimeout,
                                CFStringRef replyMode, CFDataRef* returnData);

Boolean CFMessagePortIsValid(CFMessagePortRef port);
/// Stops the port for good: a local port stops listening, removes its socket file (only when it
/// is still the one it made; never a socket handed over by systemd), closes every connection
/// (withdrawing the requests in progress) and leaves its run loop; a remote port closes its
/// connection.
void CFMessagePortInvalidate(CFMessagePortRef port);
Boolean CFMessagePortIsRemote(CFMessagePortRef port);
/// The port's name, not retained.
CFStringRef CFMessagePortGetName(CFMessagePortRef port);

namespace glyphwell::port {

/// The directory of the sockets, shared by servers and clients: $XDG_RUNTIME_DIR when set and
/// absolute; otherwise <home>/.glyphwell, created with mode 0700 when missing. That directory is
/// refused (empty result, one log line naming the path and the reason) when it is a symbolic
/// link, not a directory, owned by another user, or open to others.
std::string SocketDirectory();

/// The socket path for a port name: SocketDirectory()/<name>. Empty when it cannot be made
/// safely: a name that is empty, ".", ".." or holds "/", no usable directory, or a path too long
/// for a socket address.
std::string SocketPathForName(const std::string& name);

/// How long an unfinished request of a local port may receive nothing before its connection is
/// closed (30 s unless set; at least 1 ms). Run-loop thread only.
void SetStallTimeout(CFMessagePortRef local, std::chrono::milliseconds timeout);
/// The most bytes that unfinished requests of a local port may hold over all its connections
/// (128 MiB unless set). Run-loop thread only.
void SetUnfinishedRequestLimit(CFMessagePortRef local, size_t bytes);
/// The most connections one client process may hold open on a local port (256 unless set; at
/// least 1). A connection beyond it is closed at once, with one log line per process until all
/// its connections have closed. Run-loop thread only.
void SetConnectionLimitPerProcess(CFMessagePortRef local, size_t connections);
/// True while a local port is receiving work: a connection holds part of a request, or whole
/// requests not yet handled. False for an invalidated port. Run-loop thread only.
bool IsReceivingRequest(CFMessagePortRef local);

/// One request being handled by a local port's callback. A callback that waits for the user
/// keeps it and learns through it when its client went away (disconnected or died) or the port
/// was invalidated: the handler registered then runs once, on the run loop's thread, and the
/// reply is discarded. The object stays usable after the callback has returned.
class PendingRequest {
public:
    virtual ~PendingRequest() = default;
    virtual bool IsWithdrawn() const = 0;
    /// `handler` runs at most once; when the request is already withdrawn, it runs at once.
    virtual void SetWithdrawalHandler(std::function<void()> handler) = 0;
    /// The client's process id (from SO_PEERCRED).
    virtual int ClientProcessID() const = 0;
};

/// Inside a callback: the request it is handling (the innermost, when callbacks nest); null
/// outside any callback.
std::shared_ptr<PendingRequest> CurrentRequest();

} // namespace glyphwell::port
