// Message ports over real Unix-domain sockets: each test has its own runtime directory.
#include <gtest/gtest.h>

#include <fcntl.h>
#include <grp.h>
#include <sys/stat.h>
#include <sys/wait.h>

#include <algorithm>
#include <chrono>
#include <filesystem>
#include <fstream>
#include <future>
#include <iostream>
#include <vector>

#include "platform/CFMessagePort.h"
#include "platform/CFRunLoop.h"
#include "platform/MessagePortWire.h"
#include "support/LogCapture.h"
#include "support/PortTestSupport.h"

using namespace glyphwell::testing;
using glyphwell::PollRunLoopDriver;

namespace {

const char kName[] = "org.glyphwell.Test.Port";

struct Reply {
    SInt32 status;
    std::string bytes;
};

/// A remote port for `name`, or null when nothing listens there.
CFMessagePortRef CreateRemote(const std::string& name) {
    CFStringRef portName = CreateCFString(name);
    CFMessagePortRef remote = CFMessagePortCreateRemote(kCFAllocatorDefault, portName);
    CFRelease(portName);
    return remote;
}

/// One request through a new remote port for `name`.
Reply Send(const std::string& name, SInt32 msgid, const std::string& body,
           CFTimeInterval receiveTimeout = 10) {
    CFMessagePortRef remote = CreateRemote(name);
    if (!remote)
        return {-100, {}};
    CFDataRef data = CreateCFData(body);
    CFDataRef reply = nullptr;
    const SInt32 status = CFMessagePortSendRequest(remote, msgid, data, 10, receiveTimeout,
                                                   kCFRunLoopDefaultMode, &reply);
    CFRelease(data);
    CFRelease(remote);
    Reply result{status, BytesOf(reply)};
    if (reply)
        CFRelease(reply);
    return result;
}

std::future<Reply> SendLater(SInt32 msgid, const std::string& body) {
    return std::async(std::launch::async, [msgid, body] { return Send(kName, msgid, body); });
}

bool IsReady(std::future<Reply>& reply) {
    return reply.wait_for(std::chrono::seconds(0)) == std::future_status::ready;
}

/// A local port on the test's own thread; the test runs its driver.
class LocalPort {
public:
    using Handler = std::function<CFDataRef(SInt32 msgid, CFDataRef data)>;

    LocalPort(const std::string& name, Handler handler) : handler_(std::move(handler)) {
        glyphwell::SetRunLoopDriver(&driver_);
        CFStringRef portName = CreateCFString(name);
        CFMessagePortContext context{0, this, nullptr, nullptr, nullptr};
        port_ =
            CFMessagePortCreateLocal(kCFAllocatorDefault, portName, Callback, &context, nullptr);
        CFRelease(portName);
        if (port_) {
            CFRunLoopSourceRef source =
                CFMessagePortCreateRunLoopSource(kCFAllocatorDefault, port_, 0);
            CFRunLoopAddSource(CFRunLoopGetCurrent(), source, kCFRunLoopCommonModes);
            CFRelease(source);
        }
    }
    ~LocalPort() {
        if (port_) {
            CFMessagePortInvalidate(port_);
            CFRelease(port_);
        }
        glyphwell::SetRunLoopDriver(nullptr);
    }

    CFMessagePortRef Port() const { return port_; }

    /// Runs the loop until `done` holds; false when 10 s passed first.
    bool RunUntil(const std::function<bool()>& done) {
        const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(10);
        while (!done()) {
            if (std::chrono::steady_clock::now() > deadline)
                return false;
            driver_.RunOnce(10);
        }
        return true;
    }

private:
    static CFDataRef Callback(CFMessagePortRef, SInt32 msgid, CFDataRef data, void* info) {
        return static_cast<LocalPort*>(info)->handler_(msgid, data);
    }

    PollRunLoopDriver driver_;
    Handler handler_;
    CFMessagePortRef port_ = nullptr;
};

/// Replies with the request bytes, "@" and the msgid.
CFDataRef EchoWithMsgid(SInt32 msgid, CFDataRef data) {
    return CreateCFData(BytesOf(data) + "@" + std::to_string(msgid));
}

/// True when `descriptor` has bytes to read (or its end) now.
bool HasBytes(int descriptor) {
    pollfd entry{descriptor, POLLIN, 0};
    return poll(&entry, 1, 0) > 0;
}

/// Waits up to 10 s for `count` log lines.
bool WaitForLines(const LogCapture& log, size_t count) {
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(10);
    while (log.Texts().size() < count && std::chrono::steady_clock::now() < deadline)
        std::this_thread::sleep_for(std::chrono::milliseconds(5));
    return log.Texts().size() >= count;
}

/// Saves descriptor 3 (where systemd passes the first socket) and restores it when it ends.
class PassedDescriptor {
public:
    PassedDescriptor() : saved_(fcntl(3, F_GETFD) >= 0 ? fcntl(3, F_DUPFD_CLOEXEC, 10) : -1) {}
    ~PassedDescriptor() {
        if (saved_ >= 0) {
            dup2(saved_, 3);
            close(saved_);
        } else {
            close(3);
        }
    }
    PassedDescriptor(const PassedDescriptor&) = delete;
    PassedDescriptor& operator=(const PassedDescriptor&) = delete;

    /// Moves `descriptor` to 3.
    static bool Install(int descriptor) {
        if (descriptor == 3)
            return true;
        const bool moved = dup2(descriptor, 3) == 3;
        close(descriptor);
        return moved;
    }

private:
    int saved_;
};

class MessagePortTest : public ::testing::Test {
protected:
    std::string SocketPath() const { return runtime_.Path() + "/" + kName; }

    TemporaryRuntimeDirectory runtime_;
};

} // namespace

TEST_F(MessagePortTest, RoundTripsManyRequestsOverOneRemotePort) {
    PortServer server(kName, EchoWithMsgid);
    ASSERT_TRUE(server.Started());
    CFMessagePortRef remote = CreateRemote(kName);
    ASSERT_NE(remote, nullptr);
    for (int i = 0; i < 100; ++i) {
        CFDataRef data = CreateCFData("request " + std::to_string(i));
        CFDataRef reply = nullptr;
        ASSERT_EQ(
            CFMessagePortSendRequest(remote, i - 50, data, 5, 5, kCFRunLoopDefaultMode, &reply),
            kCFMessagePortSuccess);
        EXPECT_EQ(BytesOf(reply), "request " + std::to_string(i) + "@" + std::to_string(i - 50));
        CFRelease(data);
        CFRelease(reply);
    }
    CFDataRef reply = nullptr;
    ASSERT_EQ(CFMessagePortSendRequest(remote, 3, nullptr, 5, 5, kCFRunLoopDefaultMode, &reply),
              kCFMessagePortSuccess);
    EXPECT_EQ(BytesOf(reply), "@3");
    CFRelease(reply);
    CFRelease(remote);
}

TEST_F(MessagePortTest, AnswersPipelinedFramesInOrderWithExactBytes) {
    PortServer server(kName, EchoWithMsgid);
    ASSERT_TRUE(server.Started());
    const int client = RawConnect(SocketPath());
    ASSERT_GE(client, 0);
    // msgid 1 with "ab", then msgid -1 with no body, in one write.
    ASSERT_TRUE(RawWrite(client, std::string("\x00\x00\x00\x01\x00\x00\x00\x02"
                                             "ab"
                                             "\xFF\xFF\xFF\xFF\x00\x00\x00\x00",
                                             18)));
    EXPECT_EQ(RawRead(client, 15), std::string("\x00\x00\x00\x04"
                                               "ab@1"
                                               "\x00\x00\x00\x03"
                                               "@-1",
                                               15));
    close(client);
}

TEST_F(MessagePortTest, PortsAndSourcesArePropertyValues) {
    LocalPort local(kName, EchoWithMsgid);
    ASSERT_NE(local.Port(), nullptr);
    EXPECT_NE(access((SocketPath() + ".lock").c_str(), F_OK), 0) << "the lock file is gone";
    EXPECT_EQ(CFGetTypeID(local.Port()), CFMessagePortGetTypeID());
    CFStringRef kind = CFCopyTypeIDDescription(CFMessagePortGetTypeID());
    CFStringRef expected = CFSTR("CFMessagePort");
    EXPECT_TRUE(CFEqual(kind, expected));
    CFRelease(kind);
    EXPECT_FALSE(CFMessagePortIsRemote(local.Port()));
    CFStringRef name = CreateCFString(kName);
    EXPECT_TRUE(CFEqual(CFMessagePortGetName(local.Port()), name));
    CFRelease(name);

    // The port has one source, which the run loop holds.
    CFRunLoopSourceRef source =
        CFMessagePortCreateRunLoopSource(kCFAllocatorDefault, local.Port(), 0);
    CFRunLoopSourceRef again =
        CFMessagePortCreateRunLoopSource(kCFAllocatorDefault, local.Port(), 0);
    EXPECT_EQ(source, again);
    CFRelease(again);
    EXPECT_EQ(CFGetTypeID(source), CFRunLoopSourceGetTypeID());
    EXPECT_TRUE(CFRunLoopContainsSource(CFRunLoopGetCurrent(), source, kCFRunLoopCommonModes));

    // Invalidating stops listening, removes the socket file and leaves the run loop.
    CFMessagePortInvalidate(local.Port());
    EXPECT_FALSE(CFMessagePortIsValid(local.Port()));
    EXPECT_FALSE(CFRunLoopSourceIsValid(source));
    EXPECT_FALSE(CFRunLoopContainsSource(CFRunLoopGetCurrent(), source, kCFRunLoopCommonModes));
    EXPECT_NE(access(SocketPath().c_str(), F_OK), 0);
    EXPECT_EQ(CFMessagePortCreateRunLoopSource(kCFAllocatorDefault, local.Port(), 0), nullptr);
    CFRelease(source);
}

TEST_F(MessagePortTest, NestedRequestFromAnotherClientIsAnsweredFirst) {
    std::vector<std::string> events;
    std::shared_ptr<glyphwell::port::PendingRequest> outer;
    std::future<Reply> inner;
    LocalPort* server = nullptr;
    LocalPort local(kName, [&](SInt32 msgid, CFDataRef) -> CFDataRef {
        if (msgid == 2) {
            events.push_back("inner handled");
            EXPECT_NE(glyphwell::port::CurrentRequest(), outer);
            return CreateCFData("inner");
        }
        outer = glyphwell::port::CurrentRequest();
        events.push_back("outer entered");
        // The callback waits, as an alert does, in a loop nested on the same driver.
        inner = SendLater(2, "");
        EXPECT_TRUE(server->RunUntil([&] { return IsReady(inner); }));
        events.push_back("inner answered");
        EXPECT_EQ(glyphwell::port::CurrentRequest(), outer);
        return CreateCFData("outer");
    });
    server = &local;
    ASSERT_NE(local.Port(), nullptr);

    std::future<Reply> first = SendLater(1, "");
    ASSERT_TRUE(local.RunUntil([&] { return IsReady(first); }));
    EXPECT_EQ(first.get().bytes, "outer");
    EXPECT_EQ(inner.get().bytes, "inner");
    EXPECT_EQ(events,
              (std::vector<std::string>{"outer entered", "inner handled", "inner answered"}));
    EXPECT_EQ(glyphwell::port::CurrentRequest(), nullptr);
}

TEST_F(MessagePortTest, LaterFramesOfABusyConnectionWaitForItsReply) {
    std::vector<std::string> events;
    LocalPort* server = nullptr;
    LocalPort local(kName, [&](SInt32 msgid, CFDataRef) -> CFDataRef {
        events.push_back("enter " + std::to_string(msgid));
        if (msgid == 1) {
            // Spin the loop a while: the second frame has arrived but must not be handled.
            int rounds = 0;
            server->RunUntil([&] { return ++rounds > 20; });
        }
        events.push_back("leave " + std::to_string(msgid));
        return CreateCFData(msgid == 1 ? "A" : "B");
    });
    server = &local;
    const int client = RawConnect(SocketPath());
    ASSERT_GE(client, 0);
    ASSERT_TRUE(RawWrite(client, RequestFrame(1, "") + RequestFrame(2, "")));
    ASSERT_TRUE(local.RunUntil([&] { return events.size() == 4; }));
    EXPECT_EQ(events, (std::vector<std::string>{"enter 1", "leave 1", "enter 2", "leave 2"}));
    EXPECT_EQ(RawRead(client, 10), std::string("\x00\x00\x00\x01"
                                               "A"
                                               "\x00\x00\x00\x01"
                                               "B",
                                               10));
    close(client);
}

TEST_F(MessagePortTest, ClientLeavingWithdrawsItsRequestAndItsReplyIsDropped) {
    LogCapture log;
    int client = -1;
    int withdrawals = 0;
    bool returned = false;
    std::shared_ptr<glyphwell::port::PendingRequest> request;
    LocalPort* server = nullptr;
    LocalPort local(kName, [&](SInt32 msgid, CFDataRef) -> CFDataRef {
        if (msgid != 7)
            return CreateCFData("still serving");
        request = glyphwell::port::CurrentRequest();
        request->SetWithdrawalHandler([&] { ++withdrawals; });
        close(client); // the client gives up while its question is up
        EXPECT_TRUE(server->RunUntil([&] { return request->IsWithdrawn(); }));
        returned = true;
        return CreateCFData("nobody reads this");
    });
    server = &local;
    client = RawConnect(SocketPath());
    ASSERT_GE(client, 0);
    ASSERT_TRUE(RawWrite(client, RequestFrame(7, "question")));
    ASSERT_TRUE(local.RunUntil([&] { return returned; }));

    EXPECT_EQ(withdrawals, 1);
    EXPECT_EQ(request->ClientProcessID(), getpid());
    // A handler set after the withdrawal runs at once.
    bool late = false;
    request->SetWithdrawalHandler([&] { late = true; });
    EXPECT_TRUE(late);

    std::future<Reply> other = SendLater(1, "");
    ASSERT_TRUE(local.RunUntil([&] { return IsReady(other); }));
    EXPECT_EQ(other.get().bytes, "still serving");
    EXPECT_TRUE(log.Texts().empty());
}

TEST_F(MessagePortTest, RefusesAPeerOfAnotherUserWithOneLogLine) {
    if (geteuid() != 0)
        GTEST_SKIP() << "needs root to run a client as another user";
    LogCapture log;
    LocalPort local(kName, EchoWithMsgid);
    ASSERT_NE(local.Port(), nullptr);
    // Open the directory and socket to everyone: the peer check is what must refuse.
    ASSERT_EQ(chmod(runtime_.Path().c_str(), 0711), 0);
    ASSERT_EQ(chmod(SocketPath().c_str(), 0666), 0);

    const std::string path = SocketPath();
    const pid_t child = fork();
    if (child == 0) {
        if (setgroups(0, nullptr) != 0 || setgid(65534) != 0 || setuid(65534) != 0)
            _exit(100);
        const int client = RawConnect(path);
        if (client < 0)
            _exit(2);
        RawWrite(client, RequestFrame(1, "x"));
        _exit(RawSeesClose(client) ? 0 : 1);
    }
    ASSERT_GT(child, 0);
    int status = 0;
    ASSERT_TRUE(local.RunUntil([&] { return waitpid(child, &status, WNOHANG) == child; }));
    ASSERT_TRUE(WIFEXITED(status));
    EXPECT_EQ(WEXITSTATUS(status), 0) << "0: closed without a reply, 1: answered, 2: no connect";

    std::future<Reply> own = SendLater(4, "mine");
    ASSERT_TRUE(local.RunUntil([&] { return IsReady(own); }));
    EXPECT_EQ(own.get().bytes, "mine@4");
    EXPECT_EQ(log.Texts(), (std::vector<std::string>{
                               "message port org.glyphwell.Test.Port: refused a connection from "
                               "uid 65534"}));
}

TEST_F(MessagePortTest, ClosesABrokenConnectionWithOneLogLineAndServesTheOthers) {
    LogCapture log;
    std::atomic<int> handled{0};
    PortServer server(kName, [&](SInt32 msgid, CFDataRef data) {
        ++handled;
        return EchoWithMsgid(msgid, data);
    });
    ASSERT_TRUE(server.Started());
    const std::string midRequest =
        "message port org.glyphwell.Test.Port: a client disconnected in the middle of a request";
    struct Case {
        std::string bytes;
        bool clientCloses; ///< else the server must close
        std::string line;
    } cases[] = {
        {std::string("\x00\x00\x00\x01\x04\x00\x00\x01", 8), false, // 64 MiB + 1
         "message port org.glyphwell.Test.Port: closed a connection whose request announced "
         "67108865 bytes (the limit is 67108864)"},
        {std::string("\x00\x00\x00\x01\x00\x00\x00\x0A"
                     "abc",
                     11),
         true, midRequest},                                                     // body cut short
        {std::string("\x00\x00\x00\x01\x00", 5), true, midRequest},             // header cut short
        {std::string("\x00\x00\x00\x01\x04\x00\x00\x00", 8), true, midRequest}, // the limit
    };
    for (const Case& test : cases) {
        log.Clear();
        const int client = RawConnect(SocketPath());
        ASSERT_GE(client, 0);
        ASSERT_TRUE(RawWrite(client, test.bytes));
        if (!test.clientCloses) {
            EXPECT_TRUE(RawSeesClose(client));
        }
        close(client);
        ASSERT_TRUE(WaitForLines(log, 1));
        EXPECT_EQ(Send(kName, 3, "whole").bytes, "whole@3");
        EXPECT_EQ(log.Texts(), (std::vector<std::string>{test.line}));
    }
    EXPECT_EQ(handled, 4);
}

TEST_F(MessagePortTest, WritesALargeReplyWithoutHoldingUpOtherClients) {
    std::string large(8u << 20, '\0');
    for (size_t i = 0; i < large.size(); ++i)
        large[i] = char(i * 7 + (i >> 12));
    PortServer server(kName, [&](SInt32 msgid, CFDataRef data) {
        return msgid == 9 ? CreateCFData(large) : EchoWithMsgid(msgid, data);
    });
    ASSERT_TRUE(server.Started());
    const int slowReader = RawConnect(SocketPath());
    ASSERT_GE(slowReader, 0);
    ASSERT_TRUE(RawWrite(slowReader, RequestFrame(9, "")));
    std::this_thread::sleep_for(std::chrono::milliseconds(50));

    EXPECT_EQ(Send(kName, 1, "quick", 5).bytes, "quick@1");
    const std::string received = RawRead(slowReader, 4 + large.size(), 10000);
    ASSERT_EQ(received.size(), 4 + large.size());
    EXPECT_EQ(received.substr(0, 4), std::string("\x00\x80\x00\x00", 4));
    EXPECT_TRUE(received.compare(4, std::string::npos, large) == 0);
    close(slowReader);
}

TEST_F(MessagePortTest, TakesOverAStaleSocketFileButNoOtherFile) {
    const int stale = RawListen(SocketPath());
    ASSERT_GE(stale, 0);
    close(stale); // the file stays, nothing listens
    {
        PortServer server(kName, EchoWithMsgid);
        ASSERT_TRUE(server.Started());
        EXPECT_EQ(Send(kName, 1, "x").bytes, "x@1");
    }

    // In a runtime directory whose path could forge a log line, the line shows it escaped.
    const std::string directory = runtime_.Path() + "/run\nforged";
    ASSERT_EQ(mkdir(directory.c_str(), 0700), 0);
    setenv("XDG_RUNTIME_DIR", directory.c_str(), 1);
    LogCapture log;
    std::ofstream(directory + "/" + kName) << "keep me";
    CFStringRef name = CreateCFString(kName);
    EXPECT_EQ(CFMessagePortCreateLocal(kCFAllocatorDefault, name, nullptr, nullptr, nullptr),
              nullptr);
    CFRelease(name);
    setenv("XDG_RUNTIME_DIR", runtime_.Path().c_str(), 1);
    EXPECT_EQ(log.Texts(),
              (std::vector<std::string>{"message port org.glyphwell.Test.Port: " + runtime_.Path() +
                                        "/run\\nforged/" + kName + " exists and is not a socket"}));
    std::ifstream kept(directory + "/" + kName);
    std::string text;
    std::getline(kept, text);
    EXPECT_EQ(text, "keep me");
}

TEST_F(MessagePortTest, NameTakenByALiveServerGivesNull) {
    LogCapture log;
    CFStringRef name = CreateCFString(kName);
    CFMessagePortRef first =
        CFMessagePortCreateLocal(kCFAllocatorDefault, name, nullptr, nullptr, nullptr);
    ASSERT_NE(first, nullptr);
    Boolean shouldFreeInfo = false;
    EXPECT_EQ(
        CFMessagePortCreateLocal(kCFAllocatorDefault, name, nullptr, nullptr, &shouldFreeInfo),
        nullptr);
    EXPECT_TRUE(shouldFreeInfo);
    // The caller logs what a taken name means (the agent: one line of its own).
    EXPECT_TRUE(log.Texts().empty());
    EXPECT_EQ(access(SocketPath().c_str(), F_OK), 0) << "the live server's socket stays";
    EXPECT_NE(access((SocketPath() + ".lock").c_str(), F_OK), 0) << "no lock file left behind";

    CFMessagePortInvalidate(first);
    CFRelease(first);
    CFMessagePortRef next =
        CFMessagePortCreateLocal(kCFAllocatorDefault, name, nullptr, nullptr, &shouldFreeInfo);
    EXPECT_NE(next, nullptr);
    EXPECT_FALSE(shouldFreeInfo);
    CFRelease(next);
    CFRelease(name);
}

TEST_F(MessagePortTest, ReceiveTimeoutLeavesThePortUsableForTheNextRequest) {
    PortServer server(kName, [](SInt32 msgid, CFDataRef data) {
        if (msgid == 5)
            std::this_thread::sleep_for(std::chrono::milliseconds(300));
        return EchoWithMsgid(msgid, data);
    });
    ASSERT_TRUE(server.Started());
    CFMessagePortRef remote = CreateRemote(kName);
    ASSERT_NE(remote, nullptr);
    CFDataRef slow = CreateCFData("slow");
    CFDataRef marker = CreateCFData("not cleared");
    CFDataRef reply = marker;
    EXPECT_EQ(CFMessagePortSendRequest(remote, 5, slow, 1, 0.05, kCFRunLoopDefaultMode, &reply),
              kCFMessagePortReceiveTimeout);
    EXPECT_EQ(reply, nullptr);
    EXPECT_TRUE(CFMessagePortIsValid(remote));

    // The late reply to "slow" is never taken for this one's.
    CFDataRef fast = CreateCFData("fast");
    ASSERT_EQ(CFMessagePortSendRequest(remote, 6, fast, 1, kCFMessagePortWaitForever,
                                       kCFRunLoopDefaultMode, &reply),
              kCFMessagePortSuccess);
    EXPECT_EQ(BytesOf(reply), "fast@6");
    CFRelease(reply);
    CFRelease(slow);
    CFRelease(fast);
    CFRelease(marker);
    CFRelease(remote);
}

TEST_F(MessagePortTest, ReportsEachWayAServerCanFail) {
    const int listener = RawListen(SocketPath());
    ASSERT_GE(listener, 0);
    CFMessagePortRef remote = CreateRemote(kName);
    ASSERT_NE(remote, nullptr);
    CFDataRef data = CreateCFData("x");
    CFDataRef reply = nullptr;

    // A server that reads the request and closes without replying.
    std::thread server([listener] {
        const int connection = accept(listener, nullptr, nullptr);
        RawRead(connection, 9);
        close(connection);
    });
    EXPECT_EQ(CFMessagePortSendRequest(remote, 1, data, 1, kCFMessagePortWaitForever,
                                       kCFRunLoopDefaultMode, &reply),
              kCFMessagePortBecameInvalidError);
    server.join();
    EXPECT_TRUE(CFMessagePortIsValid(remote));

    // A server that never reads: a request too large for the socket buffers cannot be sent.
    CFDataRef large = CreateCFData(std::string(16u << 20, 'x'));
    EXPECT_EQ(CFMessagePortSendRequest(remote, 1, large, 0.1, 1, kCFRunLoopDefaultMode, &reply),
              kCFMessagePortSendTimeout);
    CFRelease(large);

    // A server too busy to accept (its queue of connections is full): the port is still made at
    // once, and a request that cannot connect in time is a send timeout.
    ASSERT_EQ(listen(listener, 0), 0);
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::memcpy(address.sun_path, SocketPath().c_str(), SocketPath().size());
    std::vector<int> queued;
    do
        queued.push_back(socket(AF_UNIX, SOCK_STREAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0));
    while (queued.size() < 64 &&
           connect(queued.back(), reinterpret_cast<sockaddr*>(&address), sizeof address) == 0);
    ASSERT_EQ(errno, EAGAIN);
    std::future<CFMessagePortRef> busy =
        std::async(std::launch::async, [] { return CreateRemote(kName); });
    const bool prompt = busy.wait_for(std::chrono::seconds(5)) == std::future_status::ready;
    EXPECT_TRUE(prompt) << "waited for the server to accept";
    while (!prompt && busy.wait_for(std::chrono::milliseconds(10)) != std::future_status::ready)
        close(accept(listener, nullptr, nullptr)); // lets the waiting connect through
    CFMessagePortRef busyRemote = busy.get();
    ASSERT_NE(busyRemote, nullptr);
    EXPECT_EQ(CFMessagePortSendRequest(busyRemote, 1, data, 0.1, 1, kCFRunLoopDefaultMode, &reply),
              kCFMessagePortSendTimeout);
    CFRelease(busyRemote);
    for (const int descriptor : queued)
        close(descriptor);

    // Nothing listens any more.
    close(listener);
    EXPECT_EQ(CFMessagePortSendRequest(remote, 1, data, 1, 1, kCFRunLoopDefaultMode, &reply),
              kCFMessagePortTransportError);

    CFMessagePortInvalidate(remote);
    EXPECT_FALSE(CFMessagePortIsValid(remote));
    EXPECT_EQ(CFMessagePortSendRequest(remote, 1, data, 1, 1, kCFRunLoopDefaultMode, &reply),
              kCFMessagePortIsInvalid);
    EXPECT_EQ(reply, nullptr);
    CFRelease(data);
    CFRelease(remote);

    EXPECT_EQ(CreateRemote("org.glyphwell.Test.Nobody"), nullptr);
}

TEST_F(MessagePortTest, InvalidatingARemotePortEndsTheRequestWaitingOnIt) {
    std::atomic<int> entered{0}, released{0};
    PortServer server(kName, [&](SInt32 msgid, CFDataRef data) {
        const int request = ++entered;
        while (released < request)
            std::this_thread::sleep_for(std::chrono::milliseconds(5));
        return EchoWithMsgid(msgid, data);
    });
    struct ReleaseAll { // ends before the server, whatever happens
        std::atomic<int>& released;
        ~ReleaseAll() { released = 1 << 30; }
    } releaseAll{released};
    ASSERT_TRUE(server.Started());
    // Once with a blocking wait, once with a poll-based one.
    for (CFTimeInterval timeout : {kCFMessagePortWaitForever, 60.0}) {
        CFMessagePortRef remote = CreateRemote(kName);
        ASSERT_NE(remote, nullptr);
        const int before = entered;
        std::future<SInt32> waiting = std::async(std::launch::async, [remote, timeout] {
            CFDataRef reply = nullptr;
            const SInt32 status = CFMessagePortSendRequest(remote, 1, nullptr, 1, timeout,
                                                           kCFRunLoopDefaultMode, &reply);
            if (reply)
                CFRelease(reply);
            return status;
        });
        const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(10);
        while (entered == before && std::chrono::steady_clock::now() < deadline)
            std::this_thread::sleep_for(std::chrono::milliseconds(5));
        ASSERT_GT(entered, before) << "the request never reached the server";
        CFMessagePortInvalidate(remote);
        ASSERT_EQ(waiting.wait_for(std::chrono::seconds(5)), std::future_status::ready);
        EXPECT_EQ(waiting.get(), kCFMessagePortIsInvalid);
        CFRelease(remote);
        released = entered.load(); // the server may take the next request
    }
}

TEST_F(MessagePortTest, ServesTheListeningSocketHandedOverBySystemd) {
    PassedDescriptor passed;
    ASSERT_TRUE(PassedDescriptor::Install(RawListen(SocketPath())));
    setenv("LISTEN_PID", std::to_string(getpid()).c_str(), 1);
    setenv("LISTEN_FDS", "1", 1);
    setenv("LISTEN_FDNAMES", "glyphwell-ui-agent.socket", 1);

    {
        PortServer server(kName, EchoWithMsgid);
        ASSERT_TRUE(server.Started());
        EXPECT_EQ(getenv("LISTEN_PID"), nullptr);
        EXPECT_EQ(getenv("LISTEN_FDS"), nullptr);
        EXPECT_EQ(getenv("LISTEN_FDNAMES"), nullptr);
        EXPECT_EQ(Send(kName, 8, "activated").bytes, "activated@8");
    }
    // The socket belongs to the service manager: its file stays.
    EXPECT_EQ(access(SocketPath().c_str(), F_OK), 0);
    EXPECT_LT(fcntl(3, F_GETFD), 0) << "the port closed its descriptor";
}

TEST_F(MessagePortTest, IgnoresAHandOverThatIsNotForItOrNotUsable) {
    LogCapture log;
    PassedDescriptor passed;
    int pair[2];
    ASSERT_EQ(socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, pair), 0);
    close(pair[1]);
    ASSERT_TRUE(PassedDescriptor::Install(pair[0]));

    // Meant for another process: not used, and the variables are gone.
    setenv("LISTEN_PID", std::to_string(getpid() + 1).c_str(), 1);
    setenv("LISTEN_FDS", "1", 1);
    {
        PortServer server(kName, EchoWithMsgid);
        ASSERT_TRUE(server.Started());
        EXPECT_EQ(getenv("LISTEN_PID"), nullptr);
        EXPECT_EQ(Send(kName, 1, "own").bytes, "own@1");
    }
    EXPECT_TRUE(log.Texts().empty());

    // For this process, but descriptor 3 is not a listening socket: the port binds its own.
    setenv("LISTEN_PID", std::to_string(getpid()).c_str(), 1);
    setenv("LISTEN_FDS", "1", 1);
    {
        PortServer server(kName, EchoWithMsgid);
        ASSERT_TRUE(server.Started());
        EXPECT_EQ(Send(kName, 2, "own").bytes, "own@2");
    }
    EXPECT_EQ(log.Texts(), (std::vector<std::string>{
                               "message port org.glyphwell.Test.Port: descriptor 3 from the "
                               "service manager is not a listening Unix stream socket; not "
                               "using it"}));
    EXPECT_GE(fcntl(3, F_GETFD), 0) << "a descriptor the port did not take stays open";
}

TEST_F(MessagePortTest, SocketPathNeedsASafeNameAndDirectory) {
    using glyphwell::port::SocketPathForName;
    EXPECT_EQ(SocketPathForName(kName), runtime_.Path() + "/" + kName);
    for (const std::string& bad :
         std::vector<std::string>{"", ".", "..", "a/b", std::string(120, 'n')})
        EXPECT_EQ(SocketPathForName(bad), "") << bad;
}

TEST_F(MessagePortTest, WithoutARuntimeDirectorySocketsLiveInAPrivateDirectoryOfTheHome) {
    // A home whose name holds a newline: the log line must not be forged by it.
    const std::string home = runtime_.Path() + "/home\nforged";
    const std::string directory = home + "/.glyphwell";
    const std::string logged = runtime_.Path() + "/home\\nforged/.glyphwell";
    const bool root = geteuid() == 0;
    struct Case {
        const char* what;
        std::function<void()> prepare; ///< run before the lookup, in an empty home
        std::string refusal;           ///< empty: accepted
    } cases[] = {
        {"created when missing", [] {}, ""},
        {"kept when it is ours", [&] { mkdir(directory.c_str(), 0700); }, ""},
        {"open to others", [&] { mkdir(directory.c_str(), 0755); },
         "its mode 0755 lets other users in"},
        {"a symbolic link to our own directory",
         [&] {
             mkdir((home + "/elsewhere").c_str(), 0700);
             symlink((home + "/elsewhere").c_str(), directory.c_str());
         },
         "it is a symbolic link"},
        {"a file", [&] { std::ofstream(directory) << "x"; }, "it is not a directory"},
        {"another user's (needs root)",
         [&] {
             mkdir(directory.c_str(), 0700);
             chown(directory.c_str(), 65534, 65534);
         },
         "it is owned by uid 65534, not 0"},
    };
    const std::string savedHome = getenv("HOME") ? getenv("HOME") : "";
    struct RestoreHome {
        const std::string& saved;
        ~RestoreHome() { saved.empty() ? unsetenv("HOME") : setenv("HOME", saved.c_str(), 1); }
    } restoreHome{savedHome};
    unsetenv("XDG_RUNTIME_DIR");
    for (const Case& test : cases) {
        SCOPED_TRACE(test.what);
        if (test.refusal.find("uid") != std::string::npos && !root) {
            std::cout << "skipped \"" << test.what
                      << "\": needs root to own a file as another user\n";
            continue;
        }
        std::filesystem::remove_all(home);
        ASSERT_EQ(mkdir(home.c_str(), 0700), 0);
        setenv("HOME", (home + "/").c_str(), 1);
        test.prepare();
        LogCapture log;
        const std::string path = glyphwell::port::SocketPathForName("n");
        if (test.refusal.empty()) {
            EXPECT_EQ(path, directory + "/n");
            struct stat status;
            ASSERT_EQ(lstat(directory.c_str(), &status), 0);
            EXPECT_EQ(status.st_mode & 07777, 0700u);
            EXPECT_TRUE(log.Texts().empty());
        } else {
            EXPECT_EQ(path, "");
            EXPECT_EQ(log.Texts(),
                      (std::vector<std::string>{"message port: refused the socket directory " +
                                                logged + ": " + test.refusal}));
        }
    }

    setenv("XDG_RUNTIME_DIR", runtime_.Path().c_str(), 1);
}

TEST_F(MessagePortTest, AnswersEveryRequestOfManyConcurrentClients) {
    constexpr int kClients = 200;
    constexpr int kRequestsEach = 50;
    std::atomic<int> handled{0};
    PortServer server(kName, [&](SInt32, CFDataRef) -> CFDataRef {
        ++handled;
        return nullptr; // unknown message ids get an empty reply
    });
    ASSERT_TRUE(server.Started());
    std::atomic<int> answered{0};
    std::vector<std::thread> clients;
    for (int c = 0; c < kClients; ++c) {
        clients.emplace_back([&, c] {
            CFMessagePortRef remote = CreateRemote(kName);
            if (!remote)
                return;
            for (int r = 0; r < kRequestsEach; ++r) {
                CFDataRef data = CreateCFData(std::to_string(c) + "/" + std::to_string(r));
                CFDataRef reply = nullptr;
                if (CFMessagePortSendRequest(remote, 1000 + r, data, 30, 30, kCFRunLoopDefaultMode,
                                             &reply) == kCFMessagePortSuccess &&
                    reply && CFDataGetLength(reply) == 0)
                    ++answered;
                if (reply)
                    CFRelease(reply);
                CFRelease(data);
            }
            CFRelease(remote);
        });
    }
    for (std::thread& client : clients)
        client.join();
    EXPECT_EQ(answered, kClients * kRequestsEach);
    EXPECT_EQ(handled, kClients * kRequestsEach);
}

TEST_F(MessagePortTest, ServesConnectionsInTurnAndDropsTheQueueOfAClientThatHungUp) {
    std::vector<SInt32> handled;
    LocalPort local(kName, [&](SInt32 msgid, CFDataRef data) {
        handled.push_back(msgid);
        return EchoWithMsgid(msgid, data);
    });
    ASSERT_NE(local.Port(), nullptr);
    const int flood = RawConnect(SocketPath());
    const int other = RawConnect(SocketPath());
    ASSERT_GE(flood, 0);
    ASSERT_GE(other, 0);
    std::string frames;
    for (int i = 0; i < 500; ++i)
        frames += RequestFrame(1, "");
    ASSERT_TRUE(RawWrite(flood, frames));
    ASSERT_TRUE(RawWrite(other, RequestFrame(2, "")));
    // The other client is served within the first round, not after the 500.
    ASSERT_TRUE(local.RunUntil([&] { return HasBytes(other); }));
    EXPECT_EQ(RawRead(other, 6), std::string("\x00\x00\x00\x02@2", 6));
    const auto otherAt = std::find(handled.begin(), handled.end(), 2) - handled.begin();
    EXPECT_LE(otherAt, 2);

    // The flooding client hangs up: what it queued is dropped, not worked through.
    close(flood);
    ASSERT_TRUE(local.RunUntil([&] { return !glyphwell::port::IsReceivingRequest(local.Port()); }));
    EXPECT_LT(std::count(handled.begin(), handled.end(), 1), 10);
    ASSERT_TRUE(RawWrite(other, RequestFrame(3, "")));
    ASSERT_TRUE(local.RunUntil([&] { return HasBytes(other); }));
    EXPECT_EQ(RawRead(other, 6), std::string("\x00\x00\x00\x02@3", 6));
    close(other);
}

TEST_F(MessagePortTest, AClientThatShutsItsWritingSideDownStillGetsItsReplies) {
    LogCapture log;
    PortServer server(kName, EchoWithMsgid);
    ASSERT_TRUE(server.Started());
    const std::string midRequest =
        "message port org.glyphwell.Test.Port: a client disconnected in the middle of a request";
    struct Case {
        std::string sent;    ///< before the shutdown
        std::string replies; ///< then the end of the stream
        std::vector<std::string> lines;
    } cases[] = {
        {RequestFrame(1, "q"), std::string("\x00\x00\x00\x03q@1", 7), {}},
        {RequestFrame(1, "") + RequestFrame(2, "x") + std::string("\x00\x00\x00\x03\x00", 5),
         std::string("\x00\x00\x00\x02@1\x00\x00\x00\x03x@2", 13),
         {midRequest}},
    };
    for (const Case& test : cases) {
        log.Clear();
        const int client = RawConnect(SocketPath());
        ASSERT_GE(client, 0);
        ASSERT_TRUE(RawWrite(client, test.sent));
        ASSERT_EQ(shutdown(client, SHUT_WR), 0);
        EXPECT_EQ(RawRead(client, test.replies.size()), test.replies);
        EXPECT_TRUE(RawSeesClose(client)) << "closed once everything is answered";
        close(client);
        EXPECT_EQ(log.Texts(), test.lines);
    }
}

TEST_F(MessagePortTest, ClosesARequestThatStalledButNotOneThatKeepsComing) {
    LogCapture log;
    LocalPort local(kName, EchoWithMsgid);
    ASSERT_NE(local.Port(), nullptr);
    glyphwell::port::SetStallTimeout(local.Port(), std::chrono::milliseconds(300));
    const int stalled = RawConnect(SocketPath());
    const int slow = RawConnect(SocketPath());
    ASSERT_GE(stalled, 0);
    ASSERT_GE(slow, 0);
    ASSERT_TRUE(RawWrite(stalled, std::string("\x00\x00\x00\x01\x00", 5)));
    ASSERT_TRUE(local.RunUntil([&] { return glyphwell::port::IsReceivingRequest(local.Port()); }));

    // The slow client sends a byte every 60 ms, 0.72 s in all: more than the timeout.
    const std::string frame = RequestFrame(2, "abcd");
    for (char byte : frame) {
        ASSERT_TRUE(RawWrite(slow, std::string(1, byte)));
        const auto next = std::chrono::steady_clock::now() + std::chrono::milliseconds(60);
        local.RunUntil([&] { return std::chrono::steady_clock::now() >= next; });
    }
    ASSERT_TRUE(local.RunUntil([&] { return !glyphwell::port::IsReceivingRequest(local.Port()); }));
    EXPECT_EQ(RawRead(slow, 10), std::string("\x00\x00\x00\x06"
                                             "abcd@2",
                                             10));
    EXPECT_TRUE(RawSeesClose(stalled));
    EXPECT_EQ(log.Texts(), (std::vector<std::string>{
                               "message port org.glyphwell.Test.Port: closed a connection whose "
                               "request made no progress for 0.3 s"}));
    close(stalled);
    close(slow);
}

TEST_F(MessagePortTest, BoundsTheBytesHeldByUnfinishedRequests) {
    LogCapture log;
    LocalPort local(kName, EchoWithMsgid);
    ASSERT_NE(local.Port(), nullptr);
    glyphwell::port::SetUnfinishedRequestLimit(local.Port(), 56320);
    // Three unfinished requests of 20, 30 and 10 KiB: any two fit, all three do not, and the
    // one holding the most goes.
    struct Client {
        size_t sent, announced;
        int descriptor = -1;
    } clients[] = {{20480, 30720}, {30720, 30720 + 1}, {10240, 10240 + 1}};
    for (Client& client : clients) {
        client.descriptor = RawConnect(SocketPath());
        ASSERT_GE(client.descriptor, 0);
        std::string frame = RequestFrame(1, std::string(client.announced, 'x'));
        ASSERT_TRUE(RawWrite(client.descriptor, frame.substr(0, 8 + client.sent)));
    }
    ASSERT_TRUE(local.RunUntil([&] { return !log.Texts().empty(); }));
    EXPECT_TRUE(RawSeesClose(clients[1].descriptor));
    EXPECT_EQ(log.Texts(), (std::vector<std::string>{
                               "message port org.glyphwell.Test.Port: unfinished requests held "
                               "61464 bytes (the limit is 56320); closed the connection holding "
                               "30728 of them"}));
    // The others go on: the first finishes its request and is answered.
    ASSERT_TRUE(RawWrite(clients[0].descriptor, std::string(10240, 'x')));
    ASSERT_TRUE(local.RunUntil([&] { return HasBytes(clients[0].descriptor); }));
    EXPECT_EQ(RawRead(clients[0].descriptor, 4), std::string("\x00\x00\x78\x02", 4));
    for (const Client& client : clients)
        close(client.descriptor);
}

namespace {

std::atomic<int> failingSendCalls{0};

/// Sends the first 3 bytes of a reply for real, then fails as a broken device would.
ssize_t SendThenFail(int descriptor, const msghdr* message, int flags) {
    if (failingSendCalls++ > 0) {
        errno = EIO;
        return -1;
    }
    return send(descriptor, message->msg_iov[0].iov_base, 3, flags);
}

} // namespace

TEST_F(MessagePortTest, AReplyWriteThatFailsClosesOnlyThatConnection) {
    LogCapture log;
    const std::string large(8u << 20, 'r');
    PortServer server(kName, [&](SInt32 msgid, CFDataRef data) {
        return msgid == 9 ? CreateCFData(large) : EchoWithMsgid(msgid, data);
    });
    ASSERT_TRUE(server.Started());
    struct Case {
        const char* what;
        glyphwell::port::ReplySendFunction send;
        size_t readBeforeClosing; ///< 0: reads until the server closes
        std::string line;
    } cases[] = {
        {"the write fails", SendThenFail, 0,
         "message port org.glyphwell.Test.Port: cannot send a reply: Input/output error; closed "
         "its connection"},
        {"the client closes with the reply unread", nullptr, 4,
         "message port org.glyphwell.Test.Port: a client went away in the middle of its reply"},
    };
    for (const Case& test : cases) {
        SCOPED_TRACE(test.what);
        log.Clear();
        failingSendCalls = 0;
        glyphwell::port::SetReplySendFunctionForTesting(test.send);
        const int client = RawConnect(SocketPath());
        ASSERT_GE(client, 0);
        ASSERT_TRUE(RawWrite(client, RequestFrame(9, "")));
        if (test.readBeforeClosing == 0) {
            EXPECT_EQ(RawRead(client, 4), std::string("\x00\x80\x00", 3));
        } else {
            EXPECT_EQ(RawRead(client, test.readBeforeClosing).size(), test.readBeforeClosing);
        }
        close(client);
        ASSERT_TRUE(WaitForLines(log, 1));
        glyphwell::port::SetReplySendFunctionForTesting(nullptr);
        EXPECT_EQ(Send(kName, 1, "others").bytes, "others@1");
        EXPECT_EQ(log.Texts(), (std::vector<std::string>{test.line}));
    }
}

TEST_F(MessagePortTest, RefusesConnectionsOfAProcessBeyondItsLimitWithOneLogLine) {
    LogCapture log;
    LocalPort local(kName, EchoWithMsgid);
    ASSERT_NE(local.Port(), nullptr);
    glyphwell::port::SetConnectionLimitPerProcess(local.Port(), 2);
    int clients[4];
    for (int& client : clients)
        ASSERT_GE(client = RawConnect(SocketPath()), 0);
    ASSERT_TRUE(local.RunUntil([&] { return HasBytes(clients[2]) && HasBytes(clients[3]); }));
    EXPECT_TRUE(RawSeesClose(clients[2]));
    EXPECT_TRUE(RawSeesClose(clients[3]));
    EXPECT_EQ(log.Texts(), (std::vector<std::string>{
                               "message port org.glyphwell.Test.Port: refused a connection from "
                               "process " +
                               std::to_string(getpid()) + ", which holds 2 already"}));
    // The admitted ones are served, and a closed one makes room for a new one.
    ASSERT_TRUE(RawWrite(clients[1], RequestFrame(5, "b")));
    ASSERT_TRUE(local.RunUntil([&] { return HasBytes(clients[1]); }));
    EXPECT_EQ(RawRead(clients[1], 7), std::string("\x00\x00\x00\x03"
                                                  "b@5",
                                                  7));
    close(clients[0]);
    close(clients[2]);
    close(clients[3]);
    ASSERT_TRUE(local.RunUntil([&] { return !glyphwell::port::IsReceivingRequest(local.Port()); }));
    const int next = RawConnect(SocketPath());
    ASSERT_TRUE(RawWrite(next, RequestFrame(6, "c")));
    ASSERT_TRUE(local.RunUntil([&] { return HasBytes(next); }));
    EXPECT_EQ(RawRead(next, 7), std::string("\x00\x00\x00\x03"
                                            "c@6",
                                            7));
    EXPECT_EQ(log.Texts().size(), 1u);
    close(next);
    close(clients[1]);
}

namespace {

std::atomic<int> failingAccepts{0};

/// Fails the next `failingAccepts` calls as a process out of descriptors would.
int AcceptOrRunOut(int descriptor, sockaddr* address, socklen_t* length, int flags) {
    if (failingAccepts > 0) {
        --failingAccepts;
        errno = EMFILE;
        return -1;
    }
    return accept4(descriptor, address, length, flags);
}

} // namespace

TEST_F(MessagePortTest, OutOfDescriptorsRefusesAClientOrWaitsForAConnectionToClose) {
    LogCapture log;
    LocalPort local(kName, EchoWithMsgid);
    ASSERT_NE(local.Port(), nullptr);
    const int first = RawConnect(SocketPath());
    ASSERT_TRUE(RawWrite(first, RequestFrame(1, "a")));
    ASSERT_TRUE(local.RunUntil([&] { return HasBytes(first); }));
    ASSERT_EQ(RawRead(first, 7).size(), 7u);
    glyphwell::port::SetAcceptFunctionForTesting(AcceptOrRunOut);

    // With its spare descriptor the port accepts the client only to refuse it.
    failingAccepts = 1;
    const int refused = RawConnect(SocketPath());
    ASSERT_TRUE(local.RunUntil([&] { return HasBytes(refused); }));
    EXPECT_TRUE(RawSeesClose(refused));
    close(refused);

    // When even that fails, the port stops accepting until a connection closes, then serves the
    // client that waited.
    failingAccepts = 2;
    const int waiting = RawConnect(SocketPath());
    ASSERT_TRUE(RawWrite(waiting, RequestFrame(7, "d")));
    ASSERT_TRUE(local.RunUntil([&] { return log.Texts().size() == 2; }));
    const auto until = std::chrono::steady_clock::now() + std::chrono::milliseconds(300);
    local.RunUntil([&] { return HasBytes(waiting) || std::chrono::steady_clock::now() > until; });
    EXPECT_FALSE(HasBytes(waiting));
    close(first);
    ASSERT_TRUE(local.RunUntil([&] { return HasBytes(waiting); }));
    glyphwell::port::SetAcceptFunctionForTesting(nullptr);
    EXPECT_EQ(RawRead(waiting, 7), std::string("\x00\x00\x00\x03"
                                               "d@7",
                                               7));
    EXPECT_EQ(log.Texts(),
              (std::vector<std::string>{
                  "message port org.glyphwell.Test.Port: out of file descriptors; refused a "
                  "connection",
                  "message port org.glyphwell.Test.Port: out of file descriptors; accepting again "
                  "when a connection closes"}));
    close(waiting);
}
