// Internal to platform/: what the message port's files share. The port is split along its
// seams: socket naming and binding (MessagePortSocket.cpp), the server of a local port
// (MessagePortServer.cpp), the blocking client of a remote port (MessagePortClient.cpp), and the
// port object with the public functions (CFMessagePort.cpp).
#pragma once

#include <sys/socket.h>
#include <sys/types.h>
#include <sys/un.h>

#include <atomic>
#include <chrono>
#include <cmath>
#include <deque>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <unordered_map>
#include <unordered_set>
#include <vector>

#include "platform/CFMessagePort.h"
#include "platform/CFRunLoopInternal.h"
#include "platform/CFRuntime.h"
#include "platform/LogEscape.h"
#include "protocol/MessagePortWire.h"

namespace glyphwell::port::internal {

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
using glyphwell::RunLoopDriver;
using glyphwell::port::FrameAssembler;
using glyphwell::port::FrameBody;

/// A data object adopting a frame's body (no copy); empty for an empty body.
CFDataRef CreateDataAdopting(FrameBody& body);
/// strerror_r's text for `error`.
std::string ErrorText(int error);
/// The address of the socket at `path`; false when it does not fit.
bool MakeAddress(const std::string& path, sockaddr_un* address);
/// Closes `descriptor`; nothing for -1.
void CloseDescriptor(int descriptor);

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
int WaitFor(int descriptor, short events, const Deadline& deadline);

/// A connected stream socket to `path`, or -1 with `*error` set: ENOENT or ECONNREFUSED when
/// nothing listens there, EAGAIN when the server's queue of connections to accept stayed full
/// until `deadline`. The socket blocks; each call says whether it may wait (MSG_DONTWAIT).
int ConnectTo(const std::string& path, const Deadline& deadline, int* error);

/// The listening socket systemd passed (LISTEN_PID/LISTEN_FDS), or -1. The variables are
/// removed whenever present, so only the first port of the process gets the socket.
int TakeActivationSocket(const std::string& portName);

/// Binds and listens on `path`, taking over a stale socket file. `portName` is the name as log
/// lines show it (escaped). Returns the listening socket and the file's identity, or -1 (after
/// one log line unless a live server has the name).
int BindListeningSocket(const std::string& portName, const std::string& path, dev_t* device,
                        ino_t* inode);

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
extern thread_local std::vector<std::shared_ptr<RequestState>> currentRequests;

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

} // namespace glyphwell::port::internal

using namespace glyphwell::port::internal;
using glyphwell::LogEscape;
using glyphwell::runtime::CFObject;
using glyphwell::runtime::kMessagePortKind;

/// A message port. The fields of a local port (the server) and of a remote port (its blocking
/// client) are kept apart in `local` and `client`; a port uses only its own kind's.
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
    std::string socketPath;

    /// A local port's fields: used on the run loop's thread only.
    struct Local {
        int listenDescriptor = -1;
        int spareDescriptor = -1;  ///< given up to accept and refuse a client when out of them
        int serveSignal = -1;      ///< eventfd: readable while connections wait for their turn
        int stallTimer = -1;       ///< timerfd: the next check for stalled unfinished requests
        int hangUps = -1;          ///< epoll set of every connection: readable on a hang-up
        int lastAcceptError = 0;   ///< the accept failure already logged, until one succeeds
        bool acceptPaused = false; ///< out of descriptors without a spare: not watching clients
        bool ownsSocketFile = false;
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
    } local;

    /// A remote port's fields: its kept connection, used by one request at a time.
    struct Client {
        std::mutex requestMutex;    ///< one request at a time
        std::mutex descriptorMutex; ///< guards `descriptor` against Invalidate on another thread
        int descriptor = -1;
        std::vector<uint8_t> receiveBuffer;
    } client;

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
