// The server of a local port: accepting connections (peer check, per-process limit, running out
// of descriptors), reading frames (read-ahead, stalled and unfinished requests), serving the
// connections in turn, writing replies, withdrawals and invalidation.
#include <fcntl.h>
#include <poll.h>
#include <sys/epoll.h>
#include <sys/eventfd.h>
#include <sys/ioctl.h>
#include <sys/stat.h>
#include <sys/timerfd.h>
#include <sys/uio.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstring>

#include "platform/CFData.h"
#include "platform/Log.h"
#include "platform/MessagePortInternal.h"
#include "platform/PlatformTesting.h"

using glyphwell::AppLog;
using glyphwell::LogEscape;

namespace glyphwell::port::internal {

CFDataRef CreateDataAdopting(glyphwell::port::FrameBody& body) {
    const size_t length = body.Size();
    UInt8* bytes = body.Release();
    if (!bytes)
        return CFDataCreate(kCFAllocatorDefault, nullptr, 0);
    return CFDataCreateWithBytesNoCopy(kCFAllocatorDefault, bytes, CFIndex(length),
                                       kCFAllocatorMalloc);
}

thread_local std::vector<std::shared_ptr<RequestState>> currentRequests;

} // namespace glyphwell::port::internal

namespace {

/// Whether the peer of `descriptor` has hung up altogether (not merely shut its writing side).
bool PeerHungUp(int descriptor) {
    pollfd entry{descriptor, 0, 0};
    return poll(&entry, 1, 0) > 0 && (entry.revents & (POLLHUP | POLLERR));
}

/// Reads and discards an eventfd's or timerfd's counter.
void DrainCounter(int descriptor) {
    uint64_t counter;
    while (read(descriptor, &counter, sizeof counter) < 0 && errno == EINTR) {
    }
}

} // namespace

// --- local ports: scheduling ----------------------------------------------------------------

bool __CFMessagePort::OpenLocalDescriptors() {
    local.spareDescriptor = open("/dev/null", O_RDONLY | O_CLOEXEC);
    local.serveSignal = eventfd(0, EFD_NONBLOCK | EFD_CLOEXEC);
    local.stallTimer = timerfd_create(CLOCK_MONOTONIC, TFD_NONBLOCK | TFD_CLOEXEC);
    local.hangUps = epoll_create1(EPOLL_CLOEXEC);
    return local.serveSignal >= 0 && local.stallTimer >= 0 && local.hangUps >= 0;
}

void __CFMessagePort::Schedule(RunLoopDriver* newDriver) {
    if (!valid || remote || !newDriver)
        return;
    local.driver = newDriver;
    local.acceptPaused = false;
    local.driver->Watch(local.listenDescriptor, true, false,
                        [this](bool, bool) { OnListenEvent(); });
    local.driver->Watch(local.serveSignal, true, false, [this](bool, bool) { OnServeSignal(); });
    local.driver->Watch(local.stallTimer, true, false, [this](bool, bool) { OnStallTimer(); });
    local.driver->Watch(local.hangUps, true, false, [this](bool, bool) { OnHangUps(); });
    for (const auto& [connectionDescriptor, connection] : local.connections)
        UpdateWatch(connection);
}

void __CFMessagePort::Cancel(RunLoopDriver* oldDriver) {
    if (oldDriver && oldDriver == local.driver) {
        for (int own : {local.listenDescriptor, local.serveSignal, local.stallTimer, local.hangUps})
            if (own >= 0)
                local.driver->Unwatch(own);
        for (const auto& [connectionDescriptor, connection] : local.connections)
            local.driver->Unwatch(connectionDescriptor);
    }
    local.driver = nullptr;
}

void __CFMessagePort::UpdateWatch(const ConnectionPtr& connection) {
    if (!local.driver || connection->descriptor < 0)
        return;
    // A hang-up is seen through `hangUps` whether or not the connection is read.
    const bool read = !connection->readPaused && !connection->readClosed;
    const bool write = connection->writeBlocked;
    std::weak_ptr<Connection> weak = connection;
    local.driver->Watch(connection->descriptor, read, write,
                        [this, weak](bool readable, bool writable) {
                            OnConnectionEvent(weak, readable, writable);
                        });
}

// --- local ports: connections ---------------------------------------------------------------

void __CFMessagePort::OnListenEvent() {
    PortHold hold(this);
    for (int accepted = 0; accepted < kAcceptsPerEvent && valid; ++accepted) {
        int client = glyphwell::port::AcceptConnection()(local.listenDescriptor, nullptr, nullptr,
                                                         SOCK_NONBLOCK | SOCK_CLOEXEC);
        if (client < 0) {
            const int error = errno;
            if (error == EINTR || error == ECONNABORTED)
                continue;
            if (error == EAGAIN || error == EWOULDBLOCK)
                return;
            if (error == EMFILE || error == ENFILE) {
                if (AcceptWhenOutOfDescriptors())
                    continue;
                return;
            }
            // The socket stays readable: say it once, not on every round of the loop.
            if (error != local.lastAcceptError)
                AppLog("message port %s: cannot accept a connection: %s", logName.c_str(),
                       ErrorText(error).c_str());
            local.lastAcceptError = error;
            return;
        }
        local.lastAcceptError = 0;
        ucred credentials{};
        socklen_t size = sizeof credentials;
        if (getsockopt(client, SOL_SOCKET, SO_PEERCRED, &credentials, &size) != 0) {
            AppLog("message port %s: cannot identify a client: %s", logName.c_str(),
                   ErrorText(errno).c_str());
            CloseDescriptor(client);
            continue;
        }
        if (credentials.uid != geteuid()) {
            AppLog("message port %s: refused a connection from uid %u", logName.c_str(),
                   unsigned(credentials.uid));
            CloseDescriptor(client);
            continue;
        }
        if (!AdmitProcess(credentials.pid)) {
            CloseDescriptor(client);
            continue;
        }
        Accept(client, credentials);
    }
}

bool __CFMessagePort::AcceptWhenOutOfDescriptors() {
    // The waiting client keeps the socket readable and the loop spinning: free the spare
    // descriptor to accept and refuse it.
    if (local.spareDescriptor >= 0) {
        CloseDescriptor(local.spareDescriptor);
        const int refused = glyphwell::port::AcceptConnection()(local.listenDescriptor, nullptr,
                                                                nullptr, SOCK_CLOEXEC);
        local.spareDescriptor = open("/dev/null", O_RDONLY | O_CLOEXEC);
        if (refused >= 0) {
            CloseDescriptor(refused);
            AppLog("message port %s: out of file descriptors; refused a connection",
                   logName.c_str());
            return true;
        }
    }
    // Nothing to refuse with: stop watching the socket until a connection closes.
    if (local.driver)
        local.driver->Unwatch(local.listenDescriptor);
    local.acceptPaused = true;
    AppLog("message port %s: out of file descriptors; accepting again when a connection closes",
           logName.c_str());
    return false;
}

bool __CFMessagePort::AdmitProcess(pid_t process) {
    const auto held = local.connectionsOfProcess.find(process);
    if (held == local.connectionsOfProcess.end() || held->second < local.connectionsPerProcessLimit)
        return true;
    if (local.refusedProcesses.insert(process).second)
        AppLog("message port %s: refused a connection from process %d, which holds %zu already",
               logName.c_str(), int(process), held->second);
    return false;
}

void __CFMessagePort::ResumeAccepting() {
    local.acceptPaused = false;
    if (local.spareDescriptor < 0)
        local.spareDescriptor = open("/dev/null", O_RDONLY | O_CLOEXEC);
    if (local.driver)
        local.driver->Watch(local.listenDescriptor, true, false,
                            [this](bool, bool) { OnListenEvent(); });
}

void __CFMessagePort::Accept(int client, const ucred& credentials) {
    // Events 0: the set reports only hang-ups and errors, which epoll always watches.
    epoll_event event{};
    event.data.fd = client;
    if (epoll_ctl(local.hangUps, EPOLL_CTL_ADD, client, &event) != 0) {
        AppLog("message port %s: cannot watch a connection: %s", logName.c_str(),
               ErrorText(errno).c_str());
        CloseDescriptor(client);
        return;
    }
    auto connection = std::make_shared<Connection>();
    connection->descriptor = client;
    connection->processID = credentials.pid;
    local.connections[client] = connection;
    ++local.connectionsOfProcess[credentials.pid];
    UpdateWatch(connection);
}

void __CFMessagePort::OnConnectionEvent(const std::weak_ptr<Connection>& weak, bool readable,
                                        bool writable) {
    ConnectionPtr connection = weak.lock();
    if (!connection || connection->descriptor < 0)
        return;
    PortHold hold(this);
    if (writable && connection->writing)
        FlushReply(connection);
    if (readable && connection->descriptor >= 0 && !connection->readPaused &&
        !connection->readClosed)
        ReadAvailable(connection);
    if (connection->descriptor >= 0)
        AfterInput(connection);
}

void __CFMessagePort::ReadAvailable(const ConnectionPtr& connection) {
    for (int reads = 0; reads < kReadsPerEvent; ++reads) {
        if (!connection->IsIdle() && connection->input.BufferedBytes() >= kReadAheadLimit) {
            connection->readPaused = true;
            UpdateWatch(connection);
            return;
        }
        bool drained = false;
        const ssize_t got =
            ReceiveInto(connection->descriptor, connection->input, local.readBuffer, &drained);
        if (got > 0) {
            if (connection->input.Failed()) {
                AppLog("message port %s: closed a connection whose request announced %u bytes "
                       "(the limit is %u)",
                       logName.c_str(), unsigned(connection->input.RefusedLength()),
                       unsigned(kMessagePortMaxFrame));
                Drop(connection);
                return;
            }
            connection->lastProgress = Clock::now();
            if (drained)
                return; // the next readiness event brings the rest, or the end of the stream
            continue;
        }
        if (got < 0 && errno == EINTR)
            continue;
        if (got < 0 && (errno == EAGAIN || errno == EWOULDBLOCK))
            return;
        if (got == 0)
            EndOfStream(connection);
        else
            PeerGone(connection); // a reset or a failed read
        return;
    }
}

void __CFMessagePort::EndOfStream(const ConnectionPtr& connection) {
    if (PeerHungUp(connection->descriptor)) {
        PeerGone(connection);
        return;
    }
    // Half-closed: the client will send nothing more but waits for its replies. A frame it left
    // unfinished can never be completed.
    if (connection->input.IsMidFrame()) {
        AppLog("message port %s: a client disconnected in the middle of a request",
               logName.c_str());
        connection->input.DropPartial();
    }
    connection->readClosed = true;
    UpdateWatch(connection);
    FinishIfDone(connection);
}

/// After bytes came in or went out: the unfinished bytes are counted, and a connection with a
/// whole frame waits for its turn.
void __CFMessagePort::AfterInput(const ConnectionPtr& connection) {
    CountUnfinished(connection);
    EnforceUnfinishedLimit();
    if (connection->descriptor < 0)
        return;
    // Nobody waits for a turn: one request is served at once, saving a round of the loop; the
    // rest of the connection's requests wait for their turns like everyone's.
    if (local.serveQueue.empty())
        ServeOne(connection);
    else
        Enqueue(connection);
}

void __CFMessagePort::CountUnfinished(const ConnectionPtr& connection) {
    const size_t now = connection->descriptor >= 0 ? connection->input.PartialBytes() : 0;
    local.unfinishedBytes = local.unfinishedBytes - connection->unfinishedCounted + now;
    connection->unfinishedCounted = now;
    if (now > 0 && !local.stallTimerArmed)
        ArmStallTimer(connection->lastProgress + local.stallTimeout);
}

void __CFMessagePort::EnforceUnfinishedLimit() {
    while (local.unfinishedBytes > local.unfinishedLimit) {
        ConnectionPtr largest;
        for (const auto& [connectionDescriptor, connection] : local.connections)
            if (!largest || connection->unfinishedCounted > largest->unfinishedCounted)
                largest = connection;
        if (!largest || largest->unfinishedCounted == 0)
            return;
        AppLog("message port %s: unfinished requests held %zu bytes (the limit is %zu); closed "
               "the connection holding %zu of them",
               logName.c_str(), local.unfinishedBytes, local.unfinishedLimit,
               largest->unfinishedCounted);
        Drop(largest);
    }
}

void __CFMessagePort::ArmStallTimer(Clock::time_point when) {
    const auto left = std::max(when - Clock::now(), Clock::duration(std::chrono::microseconds(1)));
    const auto seconds = std::chrono::duration_cast<std::chrono::seconds>(left);
    itimerspec spec{};
    spec.it_value.tv_sec = time_t(seconds.count());
    spec.it_value.tv_nsec = long(std::chrono::nanoseconds(left - seconds).count());
    local.stallTimerArmed = timerfd_settime(local.stallTimer, 0, &spec, nullptr) == 0;
}

void __CFMessagePort::OnStallTimer() {
    PortHold hold(this);
    DrainCounter(local.stallTimer);
    local.stallTimerArmed = false;
    const Clock::time_point now = Clock::now();
    std::vector<ConnectionPtr> stalled;
    Clock::time_point next = Clock::time_point::max();
    for (const auto& [connectionDescriptor, connection] : local.connections) {
        // A connection not read for now (its earlier requests are being served) is not stalled.
        if (connection->unfinishedCounted == 0 || connection->readPaused)
            continue;
        const Clock::time_point due = connection->lastProgress + local.stallTimeout;
        if (due <= now)
            stalled.push_back(connection);
        else
            next = std::min(next, due);
    }
    const double seconds = std::chrono::duration<double>(local.stallTimeout).count();
    for (const ConnectionPtr& connection : stalled) {
        AppLog("message port %s: closed a connection whose request made no progress for %g s",
               logName.c_str(), seconds);
        Drop(connection);
    }
    if (next != Clock::time_point::max() && valid)
        ArmStallTimer(next);
}

void __CFMessagePort::OnHangUps() {
    PortHold hold(this);
    epoll_event events[64];
    const int count = epoll_wait(local.hangUps, events, 64, 0);
    for (int i = 0; i < count && valid; ++i) {
        const auto found = local.connections.find(events[i].data.fd);
        if (found != local.connections.end())
            PeerGone(ConnectionPtr(found->second));
    }
}

// --- local ports: serving in turn -------------------------------------------------------------

void __CFMessagePort::Enqueue(const ConnectionPtr& connection) {
    if (connection->queued || connection->busy || connection->writing ||
        !connection->input.HasFrame())
        return;
    connection->queued = true;
    local.serveQueue.push_back(connection);
    SignalServe();
}

void __CFMessagePort::SignalServe() {
    if (local.serveSignalPending)
        return;
    local.serveSignalPending = true;
    const uint64_t one = 1;
    while (write(local.serveSignal, &one, sizeof one) < 0 && errno == EINTR) {
    }
}

void __CFMessagePort::OnServeSignal() {
    PortHold hold(this);
    DrainCounter(local.serveSignal);
    local.serveSignalPending = false;
    // One request of each connection waiting now; a connection with more goes to the back, and
    // the loop looks at every other descriptor before the next round.
    for (size_t turns = local.serveQueue.size(); turns > 0 && !local.serveQueue.empty() && valid;
         --turns) {
        ConnectionPtr connection = local.serveQueue.front().lock();
        local.serveQueue.pop_front();
        if (!connection)
            continue;
        connection->queued = false;
        ServeOne(connection);
    }
    if (!local.serveQueue.empty() && valid)
        SignalServe();
}

void __CFMessagePort::ServeOne(const ConnectionPtr& connection) {
    if (connection->descriptor < 0 || connection->busy || connection->writing ||
        !connection->input.HasFrame())
        return;
    glyphwell::port::Frame frame = connection->input.TakeFrame();
    CFDataRef reply = Dispatch(connection, frame);
    if (connection->descriptor < 0 || !valid) {
        // Withdrawn meanwhile: nobody reads this reply.
        if (reply)
            CFRelease(reply);
        return;
    }
    StartReply(connection, reply);
    if (connection->descriptor < 0)
        return;
    ResumeReading(connection);
    Enqueue(connection);
    FinishIfDone(connection);
}

void __CFMessagePort::ResumeReading(const ConnectionPtr& connection) {
    if (!connection->readPaused ||
        (!connection->IsIdle() && connection->input.BufferedBytes() >= kReadAheadLimit))
        return;
    connection->readPaused = false;
    connection->lastProgress = Clock::now(); // not read meanwhile: the clock starts again
    UpdateWatch(connection);
}

CFDataRef __CFMessagePort::Dispatch(const ConnectionPtr& connection,
                                    glyphwell::port::Frame& frame) {
    auto request = std::make_shared<RequestState>(connection->processID, false);
    connection->busy = true;
    connection->current = request;
    CFDataRef data = CreateDataAdopting(frame.body);
    currentRequests.push_back(request);
    CFDataRef reply =
        local.callout ? local.callout(this, frame.msgid, data, local.context.info) : nullptr;
    currentRequests.pop_back();
    CFRelease(data);
    connection->busy = false;
    connection->current.reset();
    return reply;
}

void __CFMessagePort::StartReply(const ConnectionPtr& connection, CFDataRef reply) {
    const CFIndex length = reply ? CFDataGetLength(reply) : 0;
    if (length > CFIndex(kMessagePortMaxFrame)) {
        AppLog("message port %s: a reply of %ld bytes is over the limit; closing its connection",
               logName.c_str(), long(length));
        CFRelease(reply);
        Drop(connection);
        return;
    }
    connection->reply = reply;
    glyphwell::port::StoreBigEndian32(uint32_t(length), connection->replyHeader);
    connection->replyWritten = 0;
    connection->replyTotal = glyphwell::port::kReplyHeaderSize + size_t(length);
    connection->writing = true;
    FlushReply(connection);
}

void __CFMessagePort::FlushReply(const ConnectionPtr& connection) {
    constexpr size_t headerSize = glyphwell::port::kReplyHeaderSize;
    const glyphwell::port::ReplySendFunction send = glyphwell::port::ReplySend();
    while (connection->replyWritten < connection->replyTotal) {
        iovec pieces[2];
        int count = 0;
        const size_t written = connection->replyWritten;
        if (written < headerSize)
            pieces[count++] = {connection->replyHeader + written, headerSize - written};
        const size_t bodyLength = connection->replyTotal - headerSize;
        const size_t bodyWritten = written > headerSize ? written - headerSize : 0;
        if (bodyWritten < bodyLength)
            pieces[count++] = {const_cast<UInt8*>(CFDataGetBytePtr(connection->reply)) +
                                   bodyWritten,
                               bodyLength - bodyWritten};
        msghdr message{};
        message.msg_iov = pieces;
        message.msg_iovlen = size_t(count);
        const ssize_t sent = send(connection->descriptor, &message, MSG_NOSIGNAL | MSG_DONTWAIT);
        if (sent > 0) {
            connection->replyWritten += size_t(sent);
            continue;
        }
        if (sent < 0 && errno == EINTR)
            continue;
        if (sent == 0 || errno == EAGAIN || errno == EWOULDBLOCK) {
            if (!connection->writeBlocked) {
                connection->writeBlocked = true;
                UpdateWatch(connection);
            }
            return;
        }
        ReplyFailed(connection, errno);
        return;
    }
    if (connection->reply)
        CFRelease(connection->reply);
    connection->reply = nullptr;
    connection->writing = false;
    if (connection->writeBlocked) {
        connection->writeBlocked = false;
        UpdateWatch(connection);
    }
    ResumeReading(connection);
    Enqueue(connection);
    FinishIfDone(connection);
}

void __CFMessagePort::ReplyFailed(const ConnectionPtr& connection, int error) {
    if (error == EPIPE || error == ECONNRESET)
        AppLog("message port %s: a client went away in the middle of its reply", logName.c_str());
    else
        AppLog("message port %s: cannot send a reply: %s; closed its connection", logName.c_str(),
               ErrorText(error).c_str());
    Drop(connection);
}

void __CFMessagePort::FinishIfDone(const ConnectionPtr& connection) {
    // A half-closed client whose every request has been answered: nothing more can come.
    if (connection->readClosed && connection->descriptor >= 0 && connection->IsIdle())
        CloseConnection(connection);
}

void __CFMessagePort::PeerGone(const ConnectionPtr& connection) {
    if (connection->descriptor < 0)
        return;
    // What the client sent before it went is read, only to tell whether it left a request
    // unfinished: its requests are dropped unanswered. The socket holds at most its buffer's size.
    for (int reads = 0; reads < 64 && !connection->input.Failed(); ++reads) {
        bool drained = false;
        if (ReceiveInto(connection->descriptor, connection->input, local.readBuffer, &drained) <=
                0 ||
            drained)
            break;
    }
    if (connection->writing)
        AppLog("message port %s: a client went away in the middle of its reply", logName.c_str());
    else if (connection->input.IsMidFrame())
        AppLog("message port %s: a client disconnected in the middle of a request",
               logName.c_str());
    Drop(connection);
}

void __CFMessagePort::Drop(const ConnectionPtr& connection) {
    connection->input.Clear();
    CloseConnection(connection);
    if (connection->current)
        connection->current->Withdraw();
}

void __CFMessagePort::CloseConnection(ConnectionPtr connection) {
    // `connection` is a copy: erasing the map's entry must not destroy it under us.
    if (connection->descriptor < 0)
        return;
    if (local.driver)
        local.driver->Unwatch(connection->descriptor);
    epoll_ctl(local.hangUps, EPOLL_CTL_DEL, connection->descriptor, nullptr);
    local.connections.erase(connection->descriptor);
    CloseDescriptor(connection->descriptor);
    connection->descriptor = -1;
    if (const auto held = local.connectionsOfProcess.find(connection->processID);
        held != local.connectionsOfProcess.end() && --held->second == 0) {
        local.connectionsOfProcess.erase(held);
        local.refusedProcesses.erase(connection->processID);
    }
    if (local.acceptPaused && valid)
        ResumeAccepting();
    CountUnfinished(connection);
    if (connection->reply)
        CFRelease(connection->reply);
    connection->reply = nullptr;
    connection->writing = false;
    connection->writeBlocked = false;
}

bool __CFMessagePort::IsReceiving() const {
    for (const auto& [connectionDescriptor, connection] : local.connections)
        if (connection->input.BufferedBytes() > 0)
            return true;
    return false;
}

// --- local ports: invalidation --------------------------------------------------------------

void __CFMessagePort::RemoveSocketFile() {
    if (!local.ownsSocketFile)
        return;
    local.ownsSocketFile = false;
    struct stat status;
    // Only the file this port made: another server may have taken the name over since.
    if (lstat(socketPath.c_str(), &status) == 0 && status.st_dev == local.socketDevice &&
        status.st_ino == local.socketInode)
        unlink(socketPath.c_str());
}

void __CFMessagePort::ShutDownLocal() {
    for (int* own :
         {&local.listenDescriptor, &local.serveSignal, &local.stallTimer, &local.hangUps}) {
        if (local.driver && *own >= 0)
            local.driver->Unwatch(*own);
    }
    CloseDescriptor(local.listenDescriptor);
    local.listenDescriptor = -1;
    RemoveSocketFile();
    std::vector<std::shared_ptr<RequestState>> pending;
    std::vector<ConnectionPtr> open;
    for (const auto& [connectionDescriptor, connection] : local.connections)
        open.push_back(connection);
    for (const ConnectionPtr& connection : open) {
        if (connection->current)
            pending.push_back(connection->current);
        connection->input.Clear();
        CloseConnection(connection);
    }
    local.serveQueue.clear();
    for (int* own : {&local.serveSignal, &local.stallTimer, &local.hangUps}) {
        CloseDescriptor(*own);
        *own = -1;
    }
    // Handlers last: they may call back into the port.
    for (const auto& request : pending)
        request->Withdraw();
}

void __CFMessagePort::InvalidateLocal() {
    if (!valid.exchange(false))
        return;
    PortHold hold(this);
    ShutDownLocal();
    if (local.source) {
        local.source->valid = false;
        if (local.source->loop)
            CFRunLoopRemoveSource(local.source->loop, local.source, kCFRunLoopCommonModes);
    }
    local.driver = nullptr;
}
