#include "platform/CFMessagePort.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/epoll.h>
#include <sys/eventfd.h>
#include <sys/file.h>
#include <sys/ioctl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/timerfd.h>
#include <sys/uio.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <chrono>
#include <climits>
#include <cmath>
#include <cstdlib>
#include <cstring>
#include <deque>
#include <map>
#include <mutex>
#include <unordered_map>
#include <unordered_set>
#include <vector>

#include "platform/CFData.h"
#include "platform/CFRunLoopInternal.h"
#include "platform/CFRuntime.h"
#include "platform/CFString.h"
#include "platform/HomeDirectory.h"
#include "platform/Log.h"
#include "platform/LogEscape.h"
#include "platform/PlatformTesting.h"
#include "protocol/MessagePortWire.h"

using glyphwell::AppLog;
using glyphwell::LogEscape;
using glyphwell::RunLoopDriver;
using glyphwell::port::FrameAssembler;
using glyphwell::port::ReceiveInto;
using glyphwell::runtime::CFObject;
using glyphwell::runtime::kMessagePortKind;

namespace {

/// Bytes read from a socket per call.
constexpr size_t kReadChunk = 64 * 1024;
/// Read calls per readiness event, so that one busy client cannot hold the loop.
constexpr int kReadsPerEvent = 16;
/// Connections accepted per readiness event of the listening socket.
constexpr int kAcceptsPerEvent = 64;
/// While a connection has a request waiting, being handled or answered, at most this many bytes
/// of its later frames are held; beyond it the connection is not read until they are served.
constexpr size_t kReadAheadLimit = 1u << 20;
/// How long an unfinished request may go without a new byte before its connection is closed.
constexpr std::chrono::milliseconds kDefaultStallTimeout{30000};
/// The most bytes that unfinished requests may hold across all connections of a port.
constexpr size_t kDefaultUnfinishedLimit = size_t(128) << 20;
/// The most connections one client process may hold open at once: a quarter of the usual 1024
/// descriptors, so that a client that leaks connections cannot use up the agent's.
constexpr size_t kDefaultConnectionsPerProcess = 256;

using Clock = std::chrono::steady_clock;

/// A data object adopting a frame's body (no copy); empty for an empty body.
CFDataRef CreateDataAdopting(glyphwell::port::FrameBody& body) {
    const size_t length = body.Size();
    UInt8* bytes = body.Release();
    if (!bytes)
        return CFDataCreate(kCFAllocatorDefault, nullptr, 0);
    return CFDataCreateWithBytesNoCopy(kCFAllocatorDefault, bytes, CFIndex(length),
                                       kCFAllocatorMalloc);
}

std::string ErrorText(int error) {
    char buffer[128];
    return strerror_r(error, buffer, sizeof buffer);
}

bool MakeAddress(const std::string& path, sockaddr_un* address) {
    std::memset(address, 0, sizeof *address);
    address->sun_family = AF_UNIX;
    if (path.empty() || path.size() >= sizeof address->sun_path)
        return false;
    std::memcpy(address->sun_path, path.data(), path.size());
    return true;
}

void CloseDescriptor(int descriptor) {
    if (descriptor >= 0)
        close(descriptor); // Linux releases the descriptor even when close reports EINTR
}

/// A point in time for poll-based waits. Zero, negative and NaN timeouts do not wait at all;
/// kCFMessagePortWaitForever (and anything beyond ~30 years) waits without limit.
class Deadline {
public:
    explicit Deadline(CFTimeInterval seconds) {
        if (std::isnan(seconds) || seconds <= 0) {
            end_ = std::chrono::steady_clock::now();
        } else if (seconds > 1e9) {
            forever_ = true;
        } else {
            end_ = std::chrono::steady_clock::now() +
                   std::chrono::duration_cast<std::chrono::steady_clock::duration>(
                       std::chrono::duration<double>(seconds));
        }
    }

    bool IsForever() const { return forever_; }

    /// Milliseconds left for poll(): -1 without limit, 0 once passed.
    int RemainingMilliseconds() const {
        if (forever_)
            return -1;
        const auto left = end_ - std::chrono::steady_clock::now();
        if (left <= std::chrono::steady_clock::duration::zero())
            return 0;
        // Round up, so that a wait never ends just before the deadline.
        const auto milliseconds =
            std::chrono::duration_cast<std::chrono::milliseconds>(left).count() + 1;
        return milliseconds > INT_MAX ? INT_MAX : int(milliseconds);
    }

private:
    bool forever_ = false;
    std::chrono::steady_clock::time_point end_;
};

/// Waits until `descriptor` reports `events` (or a hang-up or error). 1: ready, 0: deadline
/// passed, -1: poll failed.
int WaitFor(int descriptor, short events, const Deadline& deadline) {
    for (;;) {
        pollfd entry{descriptor, events, 0};
        const int milliseconds = deadline.RemainingMilliseconds();
        const int count = poll(&entry, 1, milliseconds);
        if (count > 0)
            return 1;
        if (count == 0) {
            if (milliseconds == 0 || deadline.RemainingMilliseconds() == 0)
                return 0;
            continue;
        }
        if (errno != EINTR)
            return -1;
    }
}

/// A connected stream socket to `path`, or -1 with `*error` set: ENOENT or ECONNREFUSED when
/// nothing listens there, EAGAIN when the server's queue of connections to accept stayed full
/// until `deadline`. The socket blocks; each call says whether it may wait (MSG_DONTWAIT).
int ConnectTo(const std::string& path, const Deadline& deadline, int* error) {
    sockaddr_un address;
    if (!MakeAddress(path, &address)) {
        *error = ENAMETOOLONG;
        return -1;
    }
    const int descriptor = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    if (descriptor < 0) {
        *error = errno;
        return -1;
    }
    for (;;) {
        // connect waits while the server's queue is full, for as long as the send timeout of
        // the socket allows (zero: without limit; the shortest limit when the deadline passed).
        const int milliseconds = deadline.RemainingMilliseconds();
        timeval limit{};
        if (milliseconds >= 0) {
            limit.tv_sec = milliseconds / 1000;
            limit.tv_usec = milliseconds == 0 ? 1 : (milliseconds % 1000) * 1000;
        }
        setsockopt(descriptor, SOL_SOCKET, SO_SNDTIMEO, &limit, sizeof limit);
        if (connect(descriptor, reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0 ||
            errno == EISCONN)
            break;
        // An interrupted connect of a Unix socket has not begun: it is simply made again.
        if (errno == EINTR)
            continue;
        *error = errno;
        CloseDescriptor(descriptor);
        return -1;
    }
    const timeval none{};
    setsockopt(descriptor, SOL_SOCKET, SO_SNDTIMEO, &none, sizeof none);
    return descriptor;
}

/// The request a local port's callback is handling, as its PendingRequest.
class RequestState final : public glyphwell::port::PendingRequest {
public:
    RequestState(int processID, bool withdrawn) : processID_(processID), withdrawn_(withdrawn) {}

    bool IsWithdrawn() const override {
        std::lock_guard<std::mutex> lock(mutex_);
        return withdrawn_;
    }

    void SetWithdrawalHandler(std::function<void()> handler) override {
        {
            std::lock_guard<std::mutex> lock(mutex_);
            if (!withdrawn_) {
                handler_ = std::move(handler);
                return;
            }
        }
        if (handler)
            handler();
    }

    int ClientProcessID() const override { return processID_; }

    /// Marks the request withdrawn and runs its handler (outside the lock: it may call back).
    void Withdraw() {
        std::function<void()> handler;
        {
            std::lock_guard<std::mutex> lock(mutex_);
            if (withdrawn_)
                return;
            withdrawn_ = true;
            handler.swap(handler_);
        }
        if (handler)
            handler();
    }

private:
    const int processID_;
    mutable std::mutex mutex_;
    bool withdrawn_;
    std::function<void()> handler_;
};

/// The requests being handled on this thread, innermost last.
thread_local std::vector<std::shared_ptr<RequestState>> currentRequests;

/// One accepted client of a local port.
struct Connection {
    Connection() = default;
    Connection(const Connection&) = delete;
    Connection& operator=(const Connection&) = delete;
    ~Connection() {
        if (reply)
            CFRelease(reply);
    }

    /// Nothing of it is waiting: no whole frame held, none being handled or answered.
    bool IsIdle() const { return !busy && !writing && !input.HasFrame(); }

    int descriptor = -1; ///< -1 once closed
    int processID = 0;
    FrameAssembler input{FrameAssembler::Kind::Request, kMessagePortMaxFrame};
    bool busy = false;         ///< one of its requests is in the callback
    bool queued = false;       ///< in the port's queue of connections with a frame to serve
    bool readPaused = false;   ///< enough of its later frames are held: not read for now
    bool readClosed = false;   ///< the client shut its writing side down; it still gets replies
    bool writeBlocked = false; ///< waiting for room in the socket buffer
    std::shared_ptr<RequestState> current;

    /// Bytes of its unfinished frame counted in the port's total, and when the last came.
    size_t unfinishedCounted = 0;
    Clock::time_point lastProgress;

    // The reply being written: a 4-byte header, then the body of `reply` (owned; may be null).
    bool writing = false;
    CFDataRef reply = nullptr;
    uint8_t replyHeader[glyphwell::port::kReplyHeaderSize] = {};
    size_t replyWritten = 0;
    size_t replyTotal = 0;
};

using ConnectionPtr = std::shared_ptr<Connection>;

std::mutex activationMutex;

/// The listening socket systemd passed (LISTEN_PID/LISTEN_FDS), or -1. The variables are
/// removed whenever present, so only the first port of the process gets the socket.
int TakeActivationSocket(const std::string& portName) {
    std::lock_guard<std::mutex> lock(activationMutex);
    const char* pidText = getenv("LISTEN_PID");
    const char* countText = getenv("LISTEN_FDS");
    if (!pidText && !countText)
        return -1;
    auto parse = [](const char* text) -> long {
        if (!text || !*text)
            return -1;
        char* end = nullptr;
        errno = 0;
        const long value = std::strtol(text, &end, 10);
        return errno || *end ? -1 : value;
    };
    const long pid = parse(pidText);
    const long count = parse(countText);
    unsetenv("LISTEN_PID");
    unsetenv("LISTEN_FDS");
    unsetenv("LISTEN_FDNAMES");
    if (pid != long(getpid()) || count < 1)
        return -1;
    // Like every descriptor of ours, the passed ones are not inherited by child processes.
    for (long passed = 0; passed < std::min(count, 64L); ++passed)
        fcntl(3 + int(passed), F_SETFD, FD_CLOEXEC);

    constexpr int kFirstPassedDescriptor = 3;
    int type = 0, listening = 0;
    socklen_t size = sizeof type;
    sockaddr_storage address{};
    socklen_t addressSize = sizeof address;
    const bool usable =
        getsockopt(kFirstPassedDescriptor, SOL_SOCKET, SO_TYPE, &type, &size) == 0 &&
        type == SOCK_STREAM &&
        (size = sizeof listening,
         getsockopt(kFirstPassedDescriptor, SOL_SOCKET, SO_ACCEPTCONN, &listening, &size) == 0) &&
        listening &&
        getsockname(kFirstPassedDescriptor, reinterpret_cast<sockaddr*>(&address), &addressSize) ==
            0 &&
        address.ss_family == AF_UNIX;
    if (!usable) {
        AppLog("message port %s: descriptor 3 from the service manager is not a listening Unix "
               "stream socket; not using it",
               portName.c_str());
        return -1;
    }
    const int flags = fcntl(kFirstPassedDescriptor, F_GETFL);
    if (flags >= 0)
        fcntl(kFirstPassedDescriptor, F_SETFL, flags | O_NONBLOCK);
    return kFirstPassedDescriptor;
}

/// An exclusive lock on the file `lockPath` (created when missing), or -1. Whoever holds the lock
/// removes the file before letting go (UnlockName), so a lock won on a file that was removed
/// meanwhile guards nothing: it is taken again on the file now at the path.
int LockName(const std::string& lockPath) {
    for (int attempt = 0; attempt < 100; ++attempt) {
        const int lock = open(lockPath.c_str(), O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0600);
        if (lock < 0)
            return -1;
        while (flock(lock, LOCK_EX) != 0 && errno == EINTR) {
        }
        struct stat held, current;
        if (fstat(lock, &held) == 0 && lstat(lockPath.c_str(), &current) == 0 &&
            held.st_dev == current.st_dev && held.st_ino == current.st_ino)
            return lock;
        CloseDescriptor(lock);
    }
    return -1;
}

/// Removes the lock file of LockName and lets the lock go; nothing for -1.
void UnlockName(int lock, const std::string& lockPath) {
    if (lock < 0)
        return;
    unlink(lockPath.c_str());
    CloseDescriptor(lock);
}

/// True when the name's socket file can be bound: there is none, or nothing listens on it (a
/// stale file left by a server that ended without removing it, removed here). False when a live
/// server answers (no log line: the caller says what it means) or, after one log line, when the
/// file is not a socket or cannot be checked or removed.
bool ClearStaleSocket(const std::string& portName, const std::string& path,
                      const sockaddr_un& address) {
    struct stat status;
    if (lstat(path.c_str(), &status) != 0) {
        if (errno == ENOENT)
            return true;
        AppLog("message port %s: cannot check %s: %s", portName.c_str(), LogEscape(path).c_str(),
               ErrorText(errno).c_str());
        return false;
    }
    if (!S_ISSOCK(status.st_mode)) {
        AppLog("message port %s: %s exists and is not a socket", portName.c_str(),
               LogEscape(path).c_str());
        return false;
    }
    const int probe = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
    if (probe < 0) {
        AppLog("message port %s: socket: %s", portName.c_str(), ErrorText(errno).c_str());
        return false;
    }
    const int result = connect(probe, reinterpret_cast<const sockaddr*>(&address), sizeof address);
    const int error = errno;
    CloseDescriptor(probe);
    if (result == 0 || error == EAGAIN || error == EINPROGRESS)
        return false; // the name is taken by a running server
    if (error != ECONNREFUSED) {
        AppLog("message port %s: cannot check %s: %s", portName.c_str(), LogEscape(path).c_str(),
               ErrorText(error).c_str());
        return false;
    }
    if (unlink(path.c_str()) != 0 && errno != ENOENT) {
        AppLog("message port %s: cannot remove the stale socket %s: %s", portName.c_str(),
               LogEscape(path).c_str(), ErrorText(errno).c_str());
        return false;
    }
    return true;
}

/// A socket bound to `address` (mode 0600) and listening, and its file's identity; -1 after one
/// log line (none when a server bound the name first).
int BindAndListen(const std::string& portName, const std::string& path, const sockaddr_un& address,
                  dev_t* device, ino_t* inode) {
    const int descriptor = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
    if (descriptor < 0) {
        AppLog("message port %s: socket: %s", portName.c_str(), ErrorText(errno).c_str());
        return -1;
    }
    if (bind(descriptor, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
        if (errno != EADDRINUSE)
            AppLog("message port %s: cannot bind %s: %s", portName.c_str(), LogEscape(path).c_str(),
                   ErrorText(errno).c_str());
        CloseDescriptor(descriptor);
        return -1;
    }
    chmod(path.c_str(), 0600);
    struct stat status;
    if (listen(descriptor, SOMAXCONN) != 0 || stat(path.c_str(), &status) != 0) {
        AppLog("message port %s: cannot listen on %s: %s", portName.c_str(),
               LogEscape(path).c_str(), ErrorText(errno).c_str());
        unlink(path.c_str());
        CloseDescriptor(descriptor);
        return -1;
    }
    *device = status.st_dev;
    *inode = status.st_ino;
    return descriptor;
}

/// Binds and listens on `path`, taking over a stale socket file. `portName` is the name as log
/// lines show it (escaped), as in the helpers above. Returns the listening socket
/// and the file's identity, or -1 (after one log line unless a live server has the name).
int BindListeningSocket(const std::string& portName, const std::string& path, dev_t* device,
                        ino_t* inode) {
    sockaddr_un address;
    if (!MakeAddress(path, &address))
        return -1;
    // Two servers starting at once must not both take over the same stale file: the check,
    // unlink and bind run under a lock on a file beside the socket, removed once bound.
    const std::string lockPath = path + ".lock";
    const int lock = LockName(lockPath);
    int listening = -1;
    if (ClearStaleSocket(portName, path, address))
        listening = BindAndListen(portName, path, address, device, inode);
    UnlockName(lock, lockPath);
    return listening;
}

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

// ---------------------------------------------------------------------------------------------
// The port object

struct __CFMessagePort final : CFObject {
    __CFMessagePort(CFStringRef portName, std::string portNameText, bool isRemote)
        : CFObject(kMessagePortKind), name(static_cast<CFStringRef>(CFRetain(portName))),
          nameText(std::move(portNameText)), remote(isRemote) {}
    ~__CFMessagePort() override;

    bool Equals(const CFObject& other) const override { return this == &other; }
    CFHashCode Hash() const override { return CFHashCode(reinterpret_cast<uintptr_t>(this) >> 4); }
    std::string Description() const override {
        return glyphwell::runtime::DescriptionPrefix(this, "CFMessagePort") +
               "{name = " + nameText + (remote ? ", remote" : ", local") +
               (valid ? ", valid}" : ", invalid}");
    }

    const CFStringRef name;
    const std::string nameText;
    const std::string logName = LogEscape(nameText); ///< the name as log lines show it
    const bool remote;
    std::atomic<bool> valid{true};

    // Local ports: used on the run loop's thread only.
    int listenDescriptor = -1;
    int spareDescriptor = -1;  ///< given up to accept and refuse a client when out of descriptors
    int serveSignal = -1;      ///< eventfd: readable while connections wait for their turn
    int stallTimer = -1;       ///< timerfd: the next check for stalled unfinished requests
    int hangUps = -1;          ///< epoll set of every connection: readable when a client hangs up
    int lastAcceptError = 0;   ///< the accept failure already logged, until an accept succeeds
    bool acceptPaused = false; ///< out of descriptors without a spare: not watching for clients
    bool ownsSocketFile = false;
    std::string socketPath;
    dev_t socketDevice = 0;
    ino_t socketInode = 0;
    CFMessagePortCallBack callout = nullptr;
    CFMessagePortContext context{};
    RunLoopDriver* driver = nullptr;
    __CFRunLoopSource* source = nullptr; ///< not retained: the source retains the port
    std::map<int, ConnectionPtr> connections;
    std::unordered_map<pid_t, size_t> connectionsOfProcess; ///< open connections per client
    std::unordered_set<pid_t> refusedProcesses; ///< at their limit and told so in the log
    size_t connectionsPerProcessLimit = kDefaultConnectionsPerProcess;
    std::deque<std::weak_ptr<Connection>> serveQueue; ///< connections with a frame, in turn
    std::vector<uint8_t> readBuffer;
    size_t unfinishedBytes = 0; ///< bytes of unfinished frames over all connections
    size_t unfinishedLimit = kDefaultUnfinishedLimit;
    Clock::duration stallTimeout = kDefaultStallTimeout;
    bool stallTimerArmed = false;
    bool serveSignalPending = false; ///< `serveSignal` has been written and not yet read

    // Remote ports.
    std::mutex requestMutex;    ///< one request at a time
    std::mutex descriptorMutex; ///< guards `descriptor` against Invalidate on another thread
    int descriptor = -1;
    std::vector<uint8_t> receiveBuffer;

    bool OpenLocalDescriptors();
    void Schedule(RunLoopDriver* newDriver);
    void Cancel(RunLoopDriver* oldDriver);
    void InvalidateLocal();
    void InvalidateRemote();
    void CloseRemoteDescriptor();
    bool IsReceiving() const;
    SInt32 Exchange(SInt32 msgid, CFDataRef data, CFTimeInterval sendTimeout,
                    CFTimeInterval receiveTimeout, CFDataRef* returnData);

private:
    void ShutDownLocal();
    void RemoveSocketFile();
    void UpdateWatch(const ConnectionPtr& connection);
    void OnListenEvent();
    bool AcceptWhenOutOfDescriptors();
    bool AdmitProcess(pid_t process);
    void ResumeAccepting();
    void Accept(int client, const ucred& credentials);
    void OnConnectionEvent(const std::weak_ptr<Connection>& weak, bool readable, bool writable);
    void ReadAvailable(const ConnectionPtr& connection);
    void EndOfStream(const ConnectionPtr& connection);
    void AfterInput(const ConnectionPtr& connection);
    void CountUnfinished(const ConnectionPtr& connection);
    void EnforceUnfinishedLimit();
    void OnStallTimer();
    void ArmStallTimer(Clock::time_point when);
    void OnHangUps();
    void Enqueue(const ConnectionPtr& connection);
    void SignalServe();
    void OnServeSignal();
    void ServeOne(const ConnectionPtr& connection);
    void ResumeReading(const ConnectionPtr& connection);
    CFDataRef Dispatch(const ConnectionPtr& connection, glyphwell::port::Frame& frame);
    void StartReply(const ConnectionPtr& connection, CFDataRef reply);
    void FlushReply(const ConnectionPtr& connection);
    void ReplyFailed(const ConnectionPtr& connection, int error);
    void FinishIfDone(const ConnectionPtr& connection);
    void PeerGone(const ConnectionPtr& connection);
    void Drop(const ConnectionPtr& connection);
    void CloseConnection(ConnectionPtr connection);

    // Remote ports.
    int RemoteDescriptor();
    /// A new connection replacing the kept one, or -1 with `*error` set (see ConnectTo).
    int Reconnect(const Deadline& deadline, int* error);
    bool SendRequestFrame(const uint8_t* header, const UInt8* body, size_t bodyLength,
                          CFTimeInterval sendTimeout, int* connection, SInt32* status);
    SInt32 ReceiveReply(int connection, CFTimeInterval receiveTimeout, CFDataRef* returnData);
};
namespace {

/// Keeps a port alive while a method of it runs code that may release it.
class PortHold {
public:
    explicit PortHold(__CFMessagePort* port) : port_(port) { CFRetain(port_); }
    ~PortHold() { CFRelease(port_); }
    PortHold(const PortHold&) = delete;
    PortHold& operator=(const PortHold&) = delete;

private:
    __CFMessagePort* port_;
};

__CFMessagePort* AsPort(CFTypeRef port) {
    return glyphwell::runtime::AsMutable<__CFMessagePort>(port, kMessagePortKind);
}

/// The run-loop source of a local port.
struct MessagePortSource final : __CFRunLoopSource {
    MessagePortSource(__CFMessagePort* servedPort, CFIndex sourceOrder)
        : __CFRunLoopSource(sourceOrder), port(servedPort) {
        CFRetain(port);
        port->source = this;
    }
    ~MessagePortSource() override {
        port->source = nullptr;
        CFRelease(port);
    }

    std::string Description() const override {
        return glyphwell::runtime::DescriptionPrefix(this, "CFRunLoopSource") +
               "{message port = " + port->nameText + "}";
    }
    void Schedule(RunLoopDriver* driver) override { port->Schedule(driver); }
    void Cancel(RunLoopDriver* driver) override { port->Cancel(driver); }

    __CFMessagePort* const port;
};

} // namespace

__CFMessagePort::~__CFMessagePort() {
    if (remote) {
        CloseDescriptor(descriptor);
    } else {
        // A port with a request in its callback is retained by that dispatch, and a scheduled
        // port by its source: nothing of this port is still running or watched here.
        if (valid.exchange(false))
            ShutDownLocal();
        CloseDescriptor(spareDescriptor);
        if (context.release && context.info)
            context.release(context.info);
    }
    CFRelease(name);
}

// --- local ports: scheduling ----------------------------------------------------------------

bool __CFMessagePort::OpenLocalDescriptors() {
    spareDescriptor = open("/dev/null", O_RDONLY | O_CLOEXEC);
    serveSignal = eventfd(0, EFD_NONBLOCK | EFD_CLOEXEC);
    stallTimer = timerfd_create(CLOCK_MONOTONIC, TFD_NONBLOCK | TFD_CLOEXEC);
    hangUps = epoll_create1(EPOLL_CLOEXEC);
    return serveSignal >= 0 && stallTimer >= 0 && hangUps >= 0;
}

void __CFMessagePort::Schedule(RunLoopDriver* newDriver) {
    if (!valid || remote || !newDriver)
        return;
    driver = newDriver;
    acceptPaused = false;
    driver->Watch(listenDescriptor, true, false, [this](bool, bool) { OnListenEvent(); });
    driver->Watch(serveSignal, true, false, [this](bool, bool) { OnServeSignal(); });
    driver->Watch(stallTimer, true, false, [this](bool, bool) { OnStallTimer(); });
    driver->Watch(hangUps, true, false, [this](bool, bool) { OnHangUps(); });
    for (const auto& [connectionDescriptor, connection] : connections)
        UpdateWatch(connection);
}

void __CFMessagePort::Cancel(RunLoopDriver* oldDriver) {
    if (oldDriver && oldDriver == driver) {
        for (int own : {listenDescriptor, serveSignal, stallTimer, hangUps})
            if (own >= 0)
                driver->Unwatch(own);
        for (const auto& [connectionDescriptor, connection] : connections)
            driver->Unwatch(connectionDescriptor);
    }
    driver = nullptr;
}

void __CFMessagePort::UpdateWatch(const ConnectionPtr& connection) {
    if (!driver || connection->descriptor < 0)
        return;
    // A hang-up is seen through `hangUps` whether or not the connection is read.
    const bool read = !connection->readPaused && !connection->readClosed;
    const bool write = connection->writeBlocked;
    std::weak_ptr<Connection> weak = connection;
    driver->Watch(connection->descriptor, read, write, [this, weak](bool readable, bool writable) {
        OnConnectionEvent(weak, readable, writable);
    });
}

// --- local ports: connections ---------------------------------------------------------------

void __CFMessagePort::OnListenEvent() {
    PortHold hold(this);
    for (int accepted = 0; accepted < kAcceptsPerEvent && valid; ++accepted) {
        int client = glyphwell::port::AcceptConnection()(listenDescriptor, nullptr, nullptr,
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
            if (error != lastAcceptError)
                AppLog("message port %s: cannot accept a connection: %s", logName.c_str(),
                       ErrorText(error).c_str());
            lastAcceptError = error;
            return;
        }
        lastAcceptError = 0;
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
    if (spareDescriptor >= 0) {
        CloseDescriptor(spareDescriptor);
        const int refused =
            glyphwell::port::AcceptConnection()(listenDescriptor, nullptr, nullptr, SOCK_CLOEXEC);
        spareDescriptor = open("/dev/null", O_RDONLY | O_CLOEXEC);
        if (refused >= 0) {
            CloseDescriptor(refused);
            AppLog("message port %s: out of file descriptors; refused a connection",
                   logName.c_str());
            return true;
        }
    }
    // Nothing to refuse with: stop watching the socket until a connection closes.
    if (driver)
        driver->Unwatch(listenDescriptor);
    acceptPaused = true;
    AppLog("message port %s: out of file descriptors; accepting again when a connection closes",
           logName.c_str());
    return false;
}

bool __CFMessagePort::AdmitProcess(pid_t process) {
    const auto held = connectionsOfProcess.find(process);
    if (held == connectionsOfProcess.end() || held->second < connectionsPerProcessLimit)
        return true;
    if (refusedProcesses.insert(process).second)
        AppLog("message port %s: refused a connection from process %d, which holds %zu already",
               logName.c_str(), int(process), held->second);
    return false;
}

void __CFMessagePort::ResumeAccepting() {
    acceptPaused = false;
    if (spareDescriptor < 0)
        spareDescriptor = open("/dev/null", O_RDONLY | O_CLOEXEC);
    if (driver)
        driver->Watch(listenDescriptor, true, false, [this](bool, bool) { OnListenEvent(); });
}

void __CFMessagePort::Accept(int client, const ucred& credentials) {
    // Events 0: the set reports only hang-ups and errors, which epoll always watches.
    epoll_event event{};
    event.data.fd = client;
    if (epoll_ctl(hangUps, EPOLL_CTL_ADD, client, &event) != 0) {
        AppLog("message port %s: cannot watch a connection: %s", logName.c_str(),
               ErrorText(errno).c_str());
        CloseDescriptor(client);
        return;
    }
    auto connection = std::make_shared<Connection>();
    connection->descriptor = client;
    connection->processID = credentials.pid;
    connections[client] = connection;
    ++connectionsOfProcess[credentials.pid];
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
            ReceiveInto(connection->descriptor, connection->input, readBuffer, &drained);
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
    if (serveQueue.empty())
        ServeOne(connection);
    else
        Enqueue(connection);
}

void __CFMessagePort::CountUnfinished(const ConnectionPtr& connection) {
    const size_t now = connection->descriptor >= 0 ? connection->input.PartialBytes() : 0;
    unfinishedBytes = unfinishedBytes - connection->unfinishedCounted + now;
    connection->unfinishedCounted = now;
    if (now > 0 && !stallTimerArmed)
        ArmStallTimer(connection->lastProgress + stallTimeout);
}

void __CFMessagePort::EnforceUnfinishedLimit() {
    while (unfinishedBytes > unfinishedLimit) {
        ConnectionPtr largest;
        for (const auto& [connectionDescriptor, connection] : connections)
            if (!largest || connection->unfinishedCounted > largest->unfinishedCounted)
                largest = connection;
        if (!largest || largest->unfinishedCounted == 0)
            return;
        AppLog("message port %s: unfinished requests held %zu bytes (the limit is %zu); closed "
               "the connection holding %zu of them",
               logName.c_str(), unfinishedBytes, unfinishedLimit, largest->unfinishedCounted);
        Drop(largest);
    }
}

void __CFMessagePort::ArmStallTimer(Clock::time_point when) {
    const auto left = std::max(when - Clock::now(), Clock::duration(std::chrono::microseconds(1)));
    const auto seconds = std::chrono::duration_cast<std::chrono::seconds>(left);
    itimerspec spec{};
    spec.it_value.tv_sec = time_t(seconds.count());
    spec.it_value.tv_nsec = long(std::chrono::nanoseconds(left - seconds).count());
    stallTimerArmed = timerfd_settime(stallTimer, 0, &spec, nullptr) == 0;
}

void __CFMessagePort::OnStallTimer() {
    PortHold hold(this);
    DrainCounter(stallTimer);
    stallTimerArmed = false;
    const Clock::time_point now = Clock::now();
    std::vector<ConnectionPtr> stalled;
    Clock::time_point next = Clock::time_point::max();
    for (const auto& [connectionDescriptor, connection] : connections) {
        // A connection not read for now (its earlier requests are being served) is not stalled.
        if (connection->unfinishedCounted == 0 || connection->readPaused)
            continue;
        const Clock::time_point due = connection->lastProgress + stallTimeout;
        if (due <= now)
            stalled.push_back(connection);
        else
            next = std::min(next, due);
    }
    const double seconds = std::chrono::duration<double>(stallTimeout).count();
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
    const int count = epoll_wait(hangUps, events, 64, 0);
    for (int i = 0; i < count && valid; ++i) {
        const auto found = connections.find(events[i].data.fd);
        if (found != connections.end())
            PeerGone(ConnectionPtr(found->second));
    }
}

// --- local ports: serving in turn -------------------------------------------------------------

void __CFMessagePort::Enqueue(const ConnectionPtr& connection) {
    if (connection->queued || connection->busy || connection->writing ||
        !connection->input.HasFrame())
        return;
    connection->queued = true;
    serveQueue.push_back(connection);
    SignalServe();
}

void __CFMessagePort::SignalServe() {
    if (serveSignalPending)
        return;
    serveSignalPending = true;
    const uint64_t one = 1;
    while (write(serveSignal, &one, sizeof one) < 0 && errno == EINTR) {
    }
}

void __CFMessagePort::OnServeSignal() {
    PortHold hold(this);
    DrainCounter(serveSignal);
    serveSignalPending = false;
    // One request of each connection waiting now; a connection with more goes to the back, and
    // the loop looks at every other descriptor before the next round.
    for (size_t turns = serveQueue.size(); turns > 0 && !serveQueue.empty() && valid; --turns) {
        ConnectionPtr connection = serveQueue.front().lock();
        serveQueue.pop_front();
        if (!connection)
            continue;
        connection->queued = false;
        ServeOne(connection);
    }
    if (!serveQueue.empty() && valid)
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
    CFDataRef reply = callout ? callout(this, frame.msgid, data, context.info) : nullptr;
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
        if (ReceiveInto(connection->descriptor, connection->input, readBuffer, &drained) <= 0 ||
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
    if (driver)
        driver->Unwatch(connection->descriptor);
    epoll_ctl(hangUps, EPOLL_CTL_DEL, connection->descriptor, nullptr);
    connections.erase(connection->descriptor);
    CloseDescriptor(connection->descriptor);
    connection->descriptor = -1;
    if (const auto held = connectionsOfProcess.find(connection->processID);
        held != connectionsOfProcess.end() && --held->second == 0) {
        connectionsOfProcess.erase(held);
        refusedProcesses.erase(connection->processID);
    }
    if (acceptPaused && valid)
        ResumeAccepting();
    CountUnfinished(connection);
    if (connection->reply)
        CFRelease(connection->reply);
    connection->reply = nullptr;
    connection->writing = false;
    connection->writeBlocked = false;
}

bool __CFMessagePort::IsReceiving() const {
    for (const auto& [connectionDescriptor, connection] : connections)
        if (connection->input.BufferedBytes() > 0)
            return true;
    return false;
}

// --- local ports: invalidation --------------------------------------------------------------

void __CFMessagePort::RemoveSocketFile() {
    if (!ownsSocketFile)
        return;
    ownsSocketFile = false;
    struct stat status;
    // Only the file this port made: another server may have taken the name over since.
    if (lstat(socketPath.c_str(), &status) == 0 && status.st_dev == socketDevice &&
        status.st_ino == socketInode)
        unlink(socketPath.c_str());
}

void __CFMessagePort::ShutDownLocal() {
    for (int* own : {&listenDescriptor, &serveSignal, &stallTimer, &hangUps}) {
        if (driver && *own >= 0)
            driver->Unwatch(*own);
    }
    CloseDescriptor(listenDescriptor);
    listenDescriptor = -1;
    RemoveSocketFile();
    std::vector<std::shared_ptr<RequestState>> pending;
    std::vector<ConnectionPtr> open;
    for (const auto& [connectionDescriptor, connection] : connections)
        open.push_back(connection);
    for (const ConnectionPtr& connection : open) {
        if (connection->current)
            pending.push_back(connection->current);
        connection->input.Clear();
        CloseConnection(connection);
    }
    serveQueue.clear();
    for (int* own : {&serveSignal, &stallTimer, &hangUps}) {
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
    if (source) {
        source->valid = false;
        if (source->loop)
            CFRunLoopRemoveSource(source->loop, source, kCFRunLoopCommonModes);
    }
    driver = nullptr;
}

// --- remote ports ---------------------------------------------------------------------------

int __CFMessagePort::RemoteDescriptor() {
    std::lock_guard<std::mutex> lock(descriptorMutex);
    return descriptor;
}

void __CFMessagePort::CloseRemoteDescriptor() {
    std::lock_guard<std::mutex> lock(descriptorMutex);
    CloseDescriptor(descriptor);
    descriptor = -1;
}

int __CFMessagePort::Reconnect(const Deadline& deadline, int* error) {
    const int connected = ConnectTo(socketPath, deadline, error);
    std::lock_guard<std::mutex> lock(descriptorMutex);
    CloseDescriptor(descriptor);
    descriptor = -1;
    if (connected >= 0 && !valid) {
        CloseDescriptor(connected);
        return -1;
    }
    descriptor = connected;
    return connected;
}

void __CFMessagePort::InvalidateRemote() {
    if (!valid.exchange(false))
        return;
    {
        // Wake a request waiting on another thread; it closes the descriptor itself.
        std::lock_guard<std::mutex> lock(descriptorMutex);
        if (descriptor >= 0)
            shutdown(descriptor, SHUT_RDWR);
    }
    std::unique_lock<std::mutex> idle(requestMutex, std::try_to_lock);
    if (idle.owns_lock())
        CloseRemoteDescriptor();
}

namespace {

enum class SendOutcome { Sent, Timeout, PeerClosed, Failed };

SendOutcome SendFrame(int descriptor, const uint8_t* header, const UInt8* body, size_t bodyLength,
                      const Deadline& deadline, bool* sentAny) {
    constexpr size_t headerSize = glyphwell::port::kRequestHeaderSize;
    const size_t total = headerSize + bodyLength;
    size_t done = 0;
    while (done < total) {
        iovec pieces[2];
        int count = 0;
        if (done < headerSize)
            pieces[count++] = {const_cast<uint8_t*>(header) + done, headerSize - done};
        const size_t bodyDone = done > headerSize ? done - headerSize : 0;
        if (bodyDone < bodyLength)
            pieces[count++] = {const_cast<UInt8*>(body) + bodyDone, bodyLength - bodyDone};
        msghdr message{};
        message.msg_iov = pieces;
        message.msg_iovlen = size_t(count);
        const ssize_t sent = sendmsg(descriptor, &message, MSG_NOSIGNAL | MSG_DONTWAIT);
        if (sent > 0) {
            done += size_t(sent);
            *sentAny = true;
            continue;
        }
        if (sent < 0 && errno == EINTR)
            continue;
        if (sent == 0 || errno == EAGAIN || errno == EWOULDBLOCK) {
            const int ready = WaitFor(descriptor, POLLOUT, deadline);
            if (ready == 0)
                return SendOutcome::Timeout;
            if (ready < 0)
                return SendOutcome::Failed;
            continue;
        }
        return errno == EPIPE || errno == ECONNRESET ? SendOutcome::PeerClosed
                                                     : SendOutcome::Failed;
    }
    return SendOutcome::Sent;
}

} // namespace

/// Writes the request frame, on the kept connection or a new one. True when it went out, with
/// the connection in `*connection`; otherwise false with the status in `*status`.
bool __CFMessagePort::SendRequestFrame(const uint8_t* header, const UInt8* body, size_t bodyLength,
                                       CFTimeInterval sendTimeout, int* connection,
                                       SInt32* status) {
    const Deadline sendDeadline(sendTimeout);
    // A kept connection that the server has dropped since (it ended while idle) fails the
    // send with EPIPE before any byte goes out; a new connection is then tried once.
    *connection = RemoteDescriptor();
    for (int attempt = 0;; ++attempt) {
        bool fresh = false;
        if (*connection < 0) {
            int error = 0;
            *connection = Reconnect(sendDeadline, &error);
            if (*connection < 0) {
                *status = !valid            ? kCFMessagePortIsInvalid
                          : error == EAGAIN ? kCFMessagePortSendTimeout
                                            : kCFMessagePortTransportError;
                return false;
            }
            fresh = true;
        }
        bool sentAny = false;
        const SendOutcome outcome =
            SendFrame(*connection, header, body, bodyLength, sendDeadline, &sentAny);
        if (outcome == SendOutcome::Sent)
            return true;
        CloseRemoteDescriptor();
        *connection = -1;
        if (!valid) {
            *status = kCFMessagePortIsInvalid;
            return false;
        }
        if (outcome == SendOutcome::PeerClosed && !sentAny && !fresh && attempt == 0)
            continue;
        *status = outcome == SendOutcome::Timeout      ? kCFMessagePortSendTimeout
                  : outcome == SendOutcome::PeerClosed ? kCFMessagePortBecameInvalidError
                                                       : kCFMessagePortTransportError;
        return false;
    }
}

/// Waits for the one reply frame on `connection` and hands its body out in `*returnData`.
SInt32 __CFMessagePort::ReceiveReply(int connection, CFTimeInterval receiveTimeout,
                                     CFDataRef* returnData) {
    const Deadline receiveDeadline(receiveTimeout);
    FrameAssembler reply(FrameAssembler::Kind::Reply, kMessagePortMaxFrame);
    if (receiveBuffer.empty())
        receiveBuffer.resize(kReadChunk);
    // Without a limit the receive simply blocks (an Invalidate on another thread ends it by
    // shutting the socket down); with one, poll keeps the deadline.
    const bool blocking = receiveDeadline.IsForever();
    while (!reply.HasFrame()) {
        if (!blocking) {
            const int ready = WaitFor(connection, POLLIN, receiveDeadline);
            if (ready <= 0 && valid) {
                CloseRemoteDescriptor();
                return ready == 0 ? kCFMessagePortReceiveTimeout : kCFMessagePortTransportError;
            }
        }
        if (!valid) {
            CloseRemoteDescriptor();
            return kCFMessagePortIsInvalid;
        }
        bool drained = false;
        const ssize_t got = ReceiveInto(connection, reply, receiveBuffer, &drained, blocking);
        if (got > 0 && reply.Failed()) {
            CloseRemoteDescriptor();
            return kCFMessagePortTransportError;
        }
        if (got > 0 || (got < 0 && (errno == EINTR || errno == EAGAIN || errno == EWOULDBLOCK)))
            continue;
        const bool closedByServer = got == 0 || errno == ECONNRESET;
        CloseRemoteDescriptor();
        if (!valid)
            return kCFMessagePortIsInvalid;
        return closedByServer ? kCFMessagePortBecameInvalidError : kCFMessagePortTransportError;
    }
    glyphwell::port::Frame frame = reply.TakeFrame();
    if (reply.BufferedBytes() != 0)
        CloseRemoteDescriptor(); // more than one reply: the connection is out of step
    *returnData = CreateDataAdopting(frame.body);
    return kCFMessagePortSuccess;
}

SInt32 __CFMessagePort::Exchange(SInt32 msgid, CFDataRef data, CFTimeInterval sendTimeout,
                                 CFTimeInterval receiveTimeout, CFDataRef* returnData) {
    const size_t bodyLength = data ? size_t(CFDataGetLength(data)) : 0;
    const UInt8* body = data && bodyLength ? CFDataGetBytePtr(data) : nullptr;
    uint8_t header[glyphwell::port::kRequestHeaderSize];
    glyphwell::port::StoreRequestHeader(msgid, uint32_t(bodyLength), header);

    int connection = -1;
    SInt32 status = kCFMessagePortSuccess;
    if (!SendRequestFrame(header, body, bodyLength, sendTimeout, &connection, &status))
        return status;
    if (!returnData) {
        // No one will read the reply: give the connection up so that it is never taken for
        // the reply of a later request.
        CloseRemoteDescriptor();
        return kCFMessagePortSuccess;
    }
    return ReceiveReply(connection, receiveTimeout, returnData);
}

// ---------------------------------------------------------------------------------------------
// Public operations

CFTypeID CFMessagePortGetTypeID() {
    return kMessagePortKind;
}

CFMessagePortRef CFMessagePortCreateLocal(CFAllocatorRef, CFStringRef name,
                                          CFMessagePortCallBack callout,
                                          CFMessagePortContext* context, Boolean* shouldFreeInfo) {
    if (shouldFreeInfo)
        *shouldFreeInfo = true;
    GW_ASSERT(name != nullptr);
    if (!name)
        return nullptr;
    const std::string text = glyphwell::UTF8String(name).value_or("");
    const std::string path = glyphwell::port::SocketPathForName(text);

    const std::string logName = LogEscape(text); // the name as log lines show it
    int listening = TakeActivationSocket(logName);
    bool ownsFile = false;
    dev_t device = 0;
    ino_t inode = 0;
    if (listening < 0) {
        if (path.empty()) {
            AppLog("message port %s: no safe socket path for this name", logName.c_str());
            return nullptr;
        }
        listening = BindListeningSocket(logName, path, &device, &inode);
        if (listening < 0)
            return nullptr;
        ownsFile = true;
    }

    auto* port = new __CFMessagePort(name, text, false);
    port->listenDescriptor = listening;
    port->ownsSocketFile = ownsFile;
    port->socketPath = path;
    port->socketDevice = device;
    port->socketInode = inode;
    if (!port->OpenLocalDescriptors()) {
        AppLog("message port %s: cannot set up its event descriptors: %s", port->logName.c_str(),
               ErrorText(errno).c_str());
        CFRelease(port); // stops listening and removes the socket file
        return nullptr;
    }
    port->callout = callout;
    if (context) {
        port->context = *context;
        if (context->retain && context->info)
            port->context.info = const_cast<void*>(context->retain(context->info));
    }
    port->readBuffer.resize(kReadChunk);
    if (shouldFreeInfo)
        *shouldFreeInfo = false;
    return port;
}

CFMessagePortRef CFMessagePortCreateRemote(CFAllocatorRef, CFStringRef name) {
    GW_ASSERT(name != nullptr);
    if (!name)
        return nullptr;
    const std::string text = glyphwell::UTF8String(name).value_or("");
    const std::string path = glyphwell::port::SocketPathForName(text);
    if (path.empty())
        return nullptr;
    // A server too busy to accept at once is still a server: the connection is then made by the
    // first request, within its send timeout.
    int error = 0;
    const int connection = ConnectTo(path, Deadline(0), &error);
    if (connection < 0 && error != EAGAIN)
        return nullptr;
    auto* port = new __CFMessagePort(name, text, true);
    port->socketPath = path;
    port->descriptor = connection;
    return port;
}

CFRunLoopSourceRef CFMessagePortCreateRunLoopSource(CFAllocatorRef, CFMessagePortRef local,
                                                    CFIndex order) {
    __CFMessagePort* port = AsPort(local);
    GW_ASSERT(port != nullptr);
    if (!port || port->remote || !port->valid)
        return nullptr;
    if (port->source) {
        CFRetain(port->source);
        return port->source;
    }
    return new MessagePortSource(port, order);
}

SInt32 CFMessagePortSendRequest(CFMessagePortRef remote, SInt32 msgid, CFDataRef data,
                                CFTimeInterval sendTimeout, CFTimeInterval receiveTimeout,
                                CFStringRef, CFDataRef* returnData) {
    if (returnData)
        *returnData = nullptr;
    __CFMessagePort* port = AsPort(remote);
    if (!port || !port->remote || !port->valid)
        return kCFMessagePortIsInvalid;
    if (data && CFDataGetLength(data) > CFIndex(kMessagePortMaxFrame))
        return kCFMessagePortTransportError;
    PortHold hold(port);
    std::lock_guard<std::mutex> lock(port->requestMutex);
    if (!port->valid)
        return kCFMessagePortIsInvalid;
    const SInt32 result = port->Exchange(msgid, data, sendTimeout, receiveTimeout, returnData);
    if (!port->valid)
        port->CloseRemoteDescriptor(); // what an Invalidate during the request left open
    return result;
}

Boolean CFMessagePortIsValid(CFMessagePortRef port) {
    const __CFMessagePort* object = AsPort(port);
    return object && object->valid;
}

void CFMessagePortInvalidate(CFMessagePortRef port) {
    __CFMessagePort* object = AsPort(port);
    if (!object)
        return;
    if (object->remote)
        object->InvalidateRemote();
    else
        object->InvalidateLocal();
}

Boolean CFMessagePortIsRemote(CFMessagePortRef port) {
    const __CFMessagePort* object = AsPort(port);
    return object && object->remote;
}

CFStringRef CFMessagePortGetName(CFMessagePortRef port) {
    const __CFMessagePort* object = AsPort(port);
    return object ? object->name : nullptr;
}

namespace glyphwell::port {

std::string SocketDirectory() {
    std::string directory;
    const char* runtimeDirectory = getenv("XDG_RUNTIME_DIR");
    if (runtimeDirectory && runtimeDirectory[0] == '/') {
        directory = runtimeDirectory;
    } else {
        directory = glyphwell::HomeDirectory();
        if (directory.empty()) {
            AppLog("message port: no socket directory: neither XDG_RUNTIME_DIR nor a home "
                   "directory is known");
            return {};
        }
        while (directory.size() > 1 && directory.back() == '/')
            directory.pop_back();
        directory += directory == "/" ? ".glyphwell" : "/.glyphwell";
        // In the user's home no other user can take the name first; it is still checked, since
        // a home may be shared or its permissions loose.
        const uid_t user = geteuid();
        std::string refusal;
        struct stat status;
        if (mkdir(directory.c_str(), 0700) != 0 && errno != EEXIST)
            refusal = "cannot create it: " + ErrorText(errno);
        else if (lstat(directory.c_str(), &status) != 0)
            refusal = "cannot check it: " + ErrorText(errno);
        else if (S_ISLNK(status.st_mode))
            refusal = "it is a symbolic link";
        else if (!S_ISDIR(status.st_mode))
            refusal = "it is not a directory";
        else if (status.st_uid != user)
            refusal =
                Format("it is owned by uid %u, not %u", unsigned(status.st_uid), unsigned(user));
        else if ((status.st_mode & 077) != 0)
            refusal = Format("its mode %04o lets other users in", unsigned(status.st_mode & 07777));
        if (!refusal.empty()) {
            AppLog("message port: refused the socket directory %s: %s",
                   LogEscape(directory).c_str(), refusal.c_str());
            return {};
        }
    }
    while (directory.size() > 1 && directory.back() == '/')
        directory.pop_back();
    return directory;
}

std::string SocketPathForName(const std::string& name) {
    if (name.empty() || name == "." || name == ".." || name.find('/') != std::string::npos ||
        name.find('\0') != std::string::npos)
        return {};
    const std::string directory = SocketDirectory();
    if (directory.empty())
        return {};
    std::string path = directory == "/" ? "/" + name : directory + "/" + name;
    if (path.size() >= sizeof(sockaddr_un::sun_path))
        return {};
    return path;
}

std::shared_ptr<PendingRequest> CurrentRequest() {
    return currentRequests.empty() ? nullptr : currentRequests.back();
}

/// The local port behind `port`, or null (after an assertion report) for anything else.
static __CFMessagePort* AsLocalPort(CFMessagePortRef port) {
    __CFMessagePort* object = AsPort(port);
    GW_ASSERT(object != nullptr && !object->remote);
    return object && !object->remote ? object : nullptr;
}

void SetStallTimeout(CFMessagePortRef local, std::chrono::milliseconds timeout) {
    if (__CFMessagePort* port = AsLocalPort(local))
        port->stallTimeout = std::max(timeout, std::chrono::milliseconds(1));
}

void SetUnfinishedRequestLimit(CFMessagePortRef local, size_t bytes) {
    if (__CFMessagePort* port = AsLocalPort(local))
        port->unfinishedLimit = bytes;
}

void SetConnectionLimitPerProcess(CFMessagePortRef local, size_t connections) {
    if (__CFMessagePort* port = AsLocalPort(local))
        port->connectionsPerProcessLimit = std::max<size_t>(connections, 1);
}

bool IsReceivingRequest(CFMessagePortRef local) {
    __CFMessagePort* port = AsLocalPort(local);
    return port && port->valid && port->IsReceiving();
}

} // namespace glyphwell::port
