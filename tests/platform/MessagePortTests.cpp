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
#include <optional>
#include <vector>

#include "platform/CFMessagePort.h"
#include "platform/CFRunLoop.h"
#include "platform/PlatformTesting.h"
#include "protocol/MessagePortWire.h"
#include "support/LogCapture.h"
#include "support/PortTestSupport.h"
#include "support/ScopedEnvironment.h"
#include "support/Values.h"

using namespace glyphwell::testing;
using glyphwell::PollRunLoopDriver;
using Lines = std::vector<std::string>;

namespace {

const char kName[] = "org.glyphwell.Test.Port";
const std::string kPrefix = std::string("message port ") + kName + ": ";

/// The bytes of hex text such as "00 00 00 01", as a string.
std::string HexText(const std::string& hex) {
    const std::vector<uint8_t> bytes = Hex(hex);
    return std::string(bytes.begin(), bytes.end());
}

/// A remote port for `name`, or null when nothing listens there.
Ref Remote(const std::string& name) {
    Ref portName(CreateCFString(name));
    return Ref(CFMessagePortCreateRemote(kCFAllocatorDefault, portName.as<CFStringRef>()));
}

struct Reply {
    SInt32 status;
    std::string bytes; ///< "<null>" for no reply
    bool operator==(const Reply&) const = default;
};

/// One request through `remote`.
Reply Request(const Ref& remote, SInt32 msgid, const std::optional<std::string>& body,
              CFTimeInterval sendTimeout = 10, CFTimeInterval receiveTimeout = 10) {
    Ref data(body ? CreateCFData(*body) : nullptr);
    CFDataRef reply = nullptr;
    const SInt32 status =
        CFMessagePortSendRequest(remote.as<CFMessagePortRef>(), msgid, data.as<CFDataRef>(),
                                 sendTimeout, receiveTimeout, kCFRunLoopDefaultMode, &reply);
    Ref owned(reply);
    return {status, reply ? BytesOf(reply) : "<null>"};
}

/// One request through a new remote port for `name`.
Reply Send(const std::string& name, SInt32 msgid, const std::string& body,
           CFTimeInterval receiveTimeout = 10) {
    Ref remote = Remote(name);
    return remote ? Request(remote, msgid, body, 10, receiveTimeout) : Reply{-100, {}};
}

std::future<Reply> SendLater(SInt32 msgid, const std::string& body) {
    return std::async(std::launch::async, [msgid, body] { return Send(kName, msgid, body); });
}

bool IsReady(std::future<Reply>& reply) {
    return reply.wait_for(std::chrono::seconds(0)) == std::future_status::ready;
}

/// True when `descriptor` has bytes to read (or its end) within `timeoutMs`.
bool HasBytes(int descriptor, int timeoutMs = 0) {
    pollfd entry{descriptor, POLLIN, 0};
    return poll(&entry, 1, timeoutMs) > 0;
}

/// Waits up to 10 s for `condition`, running `round` between checks; false when time ran out.
bool WaitFor(
    const std::function<bool()>& condition, const std::function<void()>& round = [] {
        std::this_thread::sleep_for(std::chrono::milliseconds(2));
    }) {
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(10);
    bool done = false;
    while (!(done = condition()) && std::chrono::steady_clock::now() < deadline)
        round();
    return done; // each condition is asked once per round: some reap or consume what they see
}

/// A local port on the test's own thread; the test runs its driver.
class LocalPort {
public:
    using Handler = std::function<CFDataRef(SInt32 msgid, CFDataRef data)>;

    LocalPort(const std::string& name, Handler handler) : handler_(std::move(handler)) {
        glyphwell::SetRunLoopDriver(&driver_);
        Ref portName(CreateCFString(name));
        CFMessagePortContext context{0, this, nullptr, nullptr, nullptr};
        port_ = CFMessagePortCreateLocal(kCFAllocatorDefault, portName.as<CFStringRef>(), Callback,
                                         &context, nullptr);
        EXPECT_NE(port_, nullptr) << "cannot create the local port";
        if (port_) {
            Ref source(CFMessagePortCreateRunLoopSource(kCFAllocatorDefault, port_, 0));
            CFRunLoopAddSource(CFRunLoopGetCurrent(), source.as<CFRunLoopSourceRef>(),
                               kCFRunLoopCommonModes);
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
        return WaitFor(done, [this] { driver_.RunOnce(10); });
    }

    /// Runs the loop until `client` has bytes to read, then reads up to `count` of them.
    std::string Answer(int client, size_t count) {
        RunUntil([&] { return HasBytes(client); });
        return RawRead(client, count);
    }

    /// Writes `frame` from `client`, then reads up to `count` bytes of the answer.
    std::string Ask(int client, const std::string& frame, size_t count) {
        return RawWrite(client, frame) ? Answer(client, count) : "<not sent>";
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

/// Saves descriptor 3 (where systemd passes the first socket) and restores it when it ends.
struct PassedDescriptor {
    PassedDescriptor() : saved(fcntl(3, F_GETFD) >= 0 ? fcntl(3, F_DUPFD_CLOEXEC, 10) : -1) {}
    ~PassedDescriptor() { saved >= 0 ? (dup2(saved, 3), close(saved)) : close(3); }
    /// Moves `descriptor` to 3.
    bool Install(int descriptor) {
        const bool moved = descriptor == 3 || dup2(descriptor, 3) == 3;
        if (descriptor != 3)
            close(descriptor);
        return moved;
    }
    const int saved;
};

/// A raw client connection, closed when it goes.
struct Client {
    explicit Client(const std::string& path) : fd(RawConnect(path)) { EXPECT_GE(fd, 0); }
    Client(const Client&) = delete;
    ~Client() { Close(); }
    void Close() { fd >= 0 && close(std::exchange(fd, -1)); }
    operator int() const { return fd; }
    int fd;
};

class MessagePortTest : public ::testing::Test {
protected:
    std::string SocketPath() const { return runtime_.Path() + "/" + kName; }
    Client Connect() const { return Client(SocketPath()); }

    TemporaryRuntimeDirectory runtime_;
};

} // namespace

TEST_F(MessagePortTest, AnswersEveryRequestOfManyConcurrentClients) {
    std::atomic<int> handled{0};
    PortServer server(kName, [&](SInt32 msgid, CFDataRef data) -> CFDataRef {
        ++handled;
        return msgid % 2 ? EchoWithMsgid(msgid, data) : nullptr; // null: an empty reply
    });
    ASSERT_TRUE(server.Started());
    std::atomic<int> answered{0};
    std::vector<std::thread> clients;
    for (int c = 0; c < 200; ++c) {
        clients.emplace_back([&, c] {
            Ref remote = Remote(kName);
            for (int r = 0; remote && r < 50; ++r) {
                const std::string body = std::to_string(c) + "/" + std::to_string(r);
                const SInt32 msgid = r - 25;
                const std::string reply = msgid % 2 ? body + "@" + std::to_string(msgid) : "";
                answered += Request(remote, msgid, body, 30, 30) == Reply{0, reply};
            }
        });
    }
    for (std::thread& client : clients)
        client.join();
    EXPECT_EQ(answered, 200 * 50);
    EXPECT_EQ(handled, 200 * 50);
    EXPECT_EQ(Request(Remote(kName), 3, std::nullopt, 5, 5), (Reply{0, "@3"})); // no data
}

TEST_F(MessagePortTest, AnswersPipelinedFramesOneAtATimeWithExactBytes) {
    Lines events;
    LocalPort local(kName, [&](SInt32 msgid, CFDataRef data) {
        events.push_back("enter " + std::to_string(msgid));
        if (msgid == 1) { // spin the loop a while: the second frame has arrived but must wait
            int rounds = 0;
            local.RunUntil([&] { return ++rounds > 20; });
        }
        events.push_back("leave " + std::to_string(msgid));
        return EchoWithMsgid(msgid, data);
    });
    Client client = Connect();
    // msgid 1 with "ab", then msgid -1 with no body, in one write.
    ASSERT_TRUE(RawWrite(client, HexText("00 00 00 01 00 00 00 02 61 62 FF FF FF FF 00 00 00 00")));
    ASSERT_TRUE(local.RunUntil([&] { return events.size() == 4; }));
    EXPECT_EQ(events, (Lines{"enter 1", "leave 1", "enter -1", "leave -1"}));
    EXPECT_EQ(RawRead(client, 15),
              HexText("00 00 00 04") + "ab@1" + HexText("00 00 00 03") + "@-1");
}

TEST_F(MessagePortTest, PortsAndSourcesArePropertyValues) {
    LocalPort local(kName, EchoWithMsgid);
    EXPECT_NE(access((SocketPath() + ".lock").c_str(), F_OK), 0) << "the lock file is gone";
    EXPECT_EQ(TextOf(Ref(CFCopyTypeIDDescription(CFGetTypeID(local.Port()))).get()),
              "CFMessagePort");
    EXPECT_FALSE(CFMessagePortIsRemote(local.Port()));

    // The port has one source, which the run loop holds.
    Ref source(CFMessagePortCreateRunLoopSource(kCFAllocatorDefault, local.Port(), 0));
    Ref again(CFMessagePortCreateRunLoopSource(kCFAllocatorDefault, local.Port(), 0));
    EXPECT_EQ(source.get(), again.get());
    const auto inLoop = [&] {
        return CFRunLoopContainsSource(CFRunLoopGetCurrent(), source.as<CFRunLoopSourceRef>(),
                                       kCFRunLoopCommonModes);
    };
    EXPECT_TRUE(inLoop());

    // Invalidating stops listening, removes the socket file and leaves the run loop.
    CFMessagePortInvalidate(local.Port());
    EXPECT_FALSE(CFMessagePortIsValid(local.Port()));
    EXPECT_FALSE(CFRunLoopSourceIsValid(source.as<CFRunLoopSourceRef>()));
    EXPECT_FALSE(inLoop());
    EXPECT_NE(access(SocketPath().c_str(), F_OK), 0);
    EXPECT_EQ(CFMessagePortCreateRunLoopSource(kCFAllocatorDefault, local.Port(), 0), nullptr);
}

TEST_F(MessagePortTest, NestedRequestFromAnotherClientIsAnsweredFirst) {
    Lines events;
    std::shared_ptr<glyphwell::port::PendingRequest> outer;
    std::future<Reply> inner;
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
        EXPECT_TRUE(local.RunUntil([&] { return IsReady(inner); }));
        events.push_back("inner answered");
        EXPECT_EQ(glyphwell::port::CurrentRequest(), outer);
        return CreateCFData("outer");
    });

    std::future<Reply> first = SendLater(1, "");
    ASSERT_TRUE(local.RunUntil([&] { return IsReady(first); }));
    EXPECT_EQ(first.get().bytes, "outer");
    EXPECT_EQ(inner.get().bytes, "inner");
    EXPECT_EQ(events, (Lines{"outer entered", "inner handled", "inner answered"}));
    EXPECT_EQ(glyphwell::port::CurrentRequest(), nullptr);
}

TEST_F(MessagePortTest, ClientLeavingWithdrawsItsRequestAndItsReplyIsDropped) {
    LogCapture log;
    std::optional<Client> client;
    int withdrawals = 0;
    bool returned = false;
    std::shared_ptr<glyphwell::port::PendingRequest> request;
    LocalPort local(kName, [&](SInt32 msgid, CFDataRef) -> CFDataRef {
        if (msgid != 7)
            return CreateCFData("still serving");
        request = glyphwell::port::CurrentRequest();
        request->SetWithdrawalHandler([&] { ++withdrawals; });
        client->Close(); // the client gives up while its question is up
        EXPECT_TRUE(local.RunUntil([&] { return request->IsWithdrawn(); }));
        returned = true;
        return CreateCFData("nobody reads this");
    });
    client.emplace(SocketPath());
    ASSERT_TRUE(RawWrite(*client, RequestFrame(7, "question")));
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
    EXPECT_EQ(log.Texts(), Lines{kPrefix + "refused a connection from uid 65534"});
}

// A connection that ends badly (or half-closes) costs at most one log line, and only its own
// requests: each case is followed by a whole request from another client.
TEST_F(MessagePortTest, ConnectionsEndingMidRequestLogOneLineAndLeaveTheOthersServed) {
    LogCapture log;
    std::atomic<int> handled{0};
    PortServer server(kName, [&](SInt32 msgid, CFDataRef data) {
        ++handled;
        return EchoWithMsgid(msgid, data);
    });
    ASSERT_TRUE(server.Started());
    const std::string mid = kPrefix + "a client disconnected in the middle of a request";
    const std::string over = kPrefix + "closed a connection whose request announced 67108865 "
                                       "bytes (the limit is 67108864)";
    enum End { ServerCloses, ClientCloses, ClientShutsDown };
    const struct Case {
        std::string bytes;
        End end;
        std::string replies; ///< before the end of the stream
        int handled;
        Lines lines;
    } cases[] = {
        {HexText("00 00 00 01 04 00 00 01"), ServerCloses, "", 0, {over}},         // 64 MiB + 1
        {HexText("00 00 00 01 00 00 00 0A 61 62 63"), ClientCloses, "", 0, {mid}}, // body cut
        {HexText("00 00 00 01 00"), ClientCloses, "", 0, {mid}},                   // header cut
        {HexText("00 00 00 01 04 00 00 00"), ClientCloses, "", 0, {mid}},          // the limit
        {RequestFrame(1, "q"), ClientShutsDown, HexText("00 00 00 03") + "q@1", 1, {}},
        {RequestFrame(1, "") + RequestFrame(2, "x") + HexText("00 00 00 03 00"),
         ClientShutsDown,
         HexText("00 00 00 02") + "@1" + HexText("00 00 00 03") + "x@2",
         2,
         {mid}},
    };
    for (const Case& test : cases) {
        SCOPED_TRACE(ToHex(reinterpret_cast<const uint8_t*>(test.bytes.data()), test.bytes.size()));
        log.Clear();
        handled = 0;
        Client client = Connect();
        ASSERT_TRUE(RawWrite(client, test.bytes));
        if (test.end == ClientShutsDown) {
            ASSERT_EQ(shutdown(client, SHUT_WR), 0);
        }
        EXPECT_EQ(RawRead(client, test.replies.size()), test.replies);
        if (test.end != ClientCloses) {
            EXPECT_TRUE(RawSeesClose(client)) << "closed once everything is answered";
        }
        client.Close();
        ASSERT_TRUE(WaitFor([&] { return log.Texts().size() >= test.lines.size(); }));
        EXPECT_EQ(handled, test.handled);
        EXPECT_EQ(Send(kName, 3, "whole").bytes, "whole@3");
        EXPECT_EQ(log.Texts(), test.lines);
    }
}

TEST_F(MessagePortTest, WritesALargeReplyWithoutHoldingUpOtherClients) {
    std::string large(8u << 20, '\0');
    for (size_t i = 0; i < large.size(); ++i)
        large[i] = char(i * 7 + (i >> 12));
    PortServer server(kName, [&](SInt32 msgid, CFDataRef data) {
        return msgid == 9 ? CreateCFData(large) : EchoWithMsgid(msgid, data);
    });
    ASSERT_TRUE(server.Started());
    Client slowReader = Connect();
    ASSERT_TRUE(RawWrite(slowReader, RequestFrame(9, "")));
    ASSERT_TRUE(HasBytes(slowReader, 10000)) << "the large reply has begun";

    EXPECT_EQ(Send(kName, 1, "quick", 5).bytes, "quick@1");
    const std::string received = RawRead(slowReader, 4 + large.size(), 10000);
    ASSERT_EQ(received.size(), 4 + large.size());
    EXPECT_EQ(received.substr(0, 4), std::string("\x00\x80\x00\x00", 4));
    EXPECT_TRUE(received.compare(4, std::string::npos, large) == 0);
}

TEST_F(MessagePortTest, TakesOverAStaleSocketButNeitherALiveServerNorAnotherFile) {
    const int stale = RawListen(SocketPath());
    ASSERT_GE(stale, 0);
    close(stale); // the file stays, nothing listens
    Ref name(CreateCFString(kName));
    Boolean shouldFreeInfo = false;
    {
        PortServer server(kName, EchoWithMsgid);
        ASSERT_TRUE(server.Started());
        EXPECT_EQ(Send(kName, 1, "x").bytes, "x@1");

        LogCapture log;
        EXPECT_EQ(CFMessagePortCreateLocal(kCFAllocatorDefault, name.as<CFStringRef>(), nullptr,
                                           nullptr, &shouldFreeInfo),
                  nullptr);
        EXPECT_TRUE(shouldFreeInfo);
        // The caller logs what a taken name means (the agent: one line of its own).
        EXPECT_TRUE(log.Texts().empty());
        EXPECT_EQ(access(SocketPath().c_str(), F_OK), 0) << "the live server's socket stays";
        EXPECT_NE(access((SocketPath() + ".lock").c_str(), F_OK), 0) << "no lock file left";
    }
    Ref next(CFMessagePortCreateLocal(kCFAllocatorDefault, name.as<CFStringRef>(), nullptr, nullptr,
                                      &shouldFreeInfo));
    EXPECT_TRUE(next);
    EXPECT_FALSE(shouldFreeInfo);
    CFMessagePortInvalidate(next.as<CFMessagePortRef>());

    // In a runtime directory whose path could forge a log line, the line shows it escaped.
    ScopedEnvironment environment;
    const std::string directory = runtime_.Path() + "/run\nforged";
    ASSERT_EQ(mkdir(directory.c_str(), 0700), 0);
    environment.Set("XDG_RUNTIME_DIR", directory.c_str());
    LogCapture log;
    std::ofstream(directory + "/" + kName) << "keep me";
    EXPECT_EQ(CFMessagePortCreateLocal(kCFAllocatorDefault, name.as<CFStringRef>(), nullptr,
                                       nullptr, nullptr),
              nullptr);
    EXPECT_EQ(log.Texts(), Lines{kPrefix + runtime_.Path() + "/run\\nforged/" + kName +
                                 " exists and is not a socket"});
    std::ifstream kept(directory + "/" + kName);
    std::string text;
    std::getline(kept, text);
    EXPECT_EQ(text, "keep me");
}

TEST_F(MessagePortTest, ReceiveTimeoutLeavesThePortUsableForTheNextRequest) {
    std::atomic<bool> late{false};
    PortServer server(kName, [&](SInt32 msgid, CFDataRef data) {
        if (msgid == 5)
            WaitFor([&] { return late.load(); });
        return EchoWithMsgid(msgid, data);
    });
    ASSERT_TRUE(server.Started());
    Ref remote = Remote(kName);
    ASSERT_TRUE(remote);
    Ref slow(CreateCFData("slow")), marker(CreateCFData("not cleared"));
    CFDataRef reply = marker.as<CFDataRef>();
    EXPECT_EQ(CFMessagePortSendRequest(remote.as<CFMessagePortRef>(), 5, slow.as<CFDataRef>(), 1,
                                       0.05, kCFRunLoopDefaultMode, &reply),
              kCFMessagePortReceiveTimeout);
    EXPECT_EQ(reply, nullptr);
    EXPECT_TRUE(CFMessagePortIsValid(remote.as<CFMessagePortRef>()));

    // The late reply to "slow" is never taken for this one's.
    late = true;
    EXPECT_EQ(Request(remote, 6, "fast", 1, kCFMessagePortWaitForever), (Reply{0, "fast@6"}));
}

TEST_F(MessagePortTest, ReportsEachWayAServerCanFail) {
    const int listener = RawListen(SocketPath());
    ASSERT_GE(listener, 0);
    Ref remote = Remote(kName);
    ASSERT_TRUE(remote);
    // How replies fail (none, cut short, too long) is the client tests' table, for this port's
    // client and the client library alike.

    // A server that never reads: a request too large for the socket buffers cannot be sent.
    EXPECT_EQ(Request(remote, 1, std::string(16u << 20, 'x'), 0.1, 1).status,
              kCFMessagePortSendTimeout);

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
    std::future<Ref> busy = std::async(std::launch::async, [] { return Remote(kName); });
    const bool prompt = busy.wait_for(std::chrono::seconds(5)) == std::future_status::ready;
    EXPECT_TRUE(prompt) << "waited for the server to accept";
    while (!prompt && busy.wait_for(std::chrono::milliseconds(10)) != std::future_status::ready)
        close(accept(listener, nullptr, nullptr)); // lets the waiting connect through
    Ref busyRemote = busy.get();
    ASSERT_TRUE(busyRemote);
    EXPECT_EQ(Request(busyRemote, 1, "x", 0.1, 1).status, kCFMessagePortSendTimeout);
    for (const int descriptor : queued)
        close(descriptor);

    // Nothing listens any more.
    close(listener);
    EXPECT_EQ(Request(remote, 1, "x", 1, 1).status, kCFMessagePortTransportError);
    CFMessagePortInvalidate(remote.as<CFMessagePortRef>());
    EXPECT_FALSE(CFMessagePortIsValid(remote.as<CFMessagePortRef>()));
    EXPECT_EQ(Request(remote, 1, "x", 1, 1), (Reply{kCFMessagePortIsInvalid, "<null>"}));
    EXPECT_FALSE(Remote("org.glyphwell.Test.Nobody"));
}

TEST_F(MessagePortTest, InvalidatingARemotePortEndsTheRequestWaitingOnIt) {
    std::atomic<int> entered{0}, released{0};
    PortServer server(kName, [&](SInt32 msgid, CFDataRef data) {
        const int request = ++entered;
        WaitFor([&] { return released >= request; }); // until the test has seen the request end
        return EchoWithMsgid(msgid, data);
    });
    ASSERT_TRUE(server.Started());
    // Once with a blocking wait, once with a poll-based one.
    for (CFTimeInterval timeout : {kCFMessagePortWaitForever, 60.0}) {
        Ref remote = Remote(kName);
        ASSERT_TRUE(remote);
        const int before = entered;
        std::future<Reply> waiting = std::async(
            std::launch::async, [&remote, timeout] { return Request(remote, 1, "", 1, timeout); });
        ASSERT_TRUE(WaitFor([&] { return entered > before; })) << "the request never arrived";
        CFMessagePortInvalidate(remote.as<CFMessagePortRef>());
        ASSERT_EQ(waiting.wait_for(std::chrono::seconds(5)), std::future_status::ready);
        EXPECT_EQ(waiting.get().status, kCFMessagePortIsInvalid);
        ++released;
    }
}

TEST_F(MessagePortTest, ServesOnlyAListeningSocketHandedOverForThisProcess) {
    const struct Case {
        const char* what;
        bool listening; ///< descriptor 3 listens at the port's path; else a connected socket
        int otherPid;   ///< added to this process's id in LISTEN_PID
        std::string line;
    } cases[] = {
        {"for this process", true, 0, ""},
        {"for another process", false, 1, ""},
        {"not listening", false, 0,
         kPrefix + "descriptor 3 from the service manager is not a listening Unix stream socket; "
                   "not using it"},
    };
    for (const Case& test : cases) {
        SCOPED_TRACE(test.what);
        LogCapture log;
        PassedDescriptor passed;
        int pair[2] = {-1, -1};
        if (test.listening) {
            ASSERT_TRUE(passed.Install(RawListen(SocketPath())));
        } else {
            ASSERT_EQ(socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, pair), 0);
            close(pair[1]);
            ASSERT_TRUE(passed.Install(pair[0]));
        }
        setenv("LISTEN_PID", std::to_string(getpid() + test.otherPid).c_str(), 1);
        setenv("LISTEN_FDS", "1", 1);
        setenv("LISTEN_FDNAMES", "glyphwell-ui-agent.socket", 1);
        {
            PortServer server(kName, EchoWithMsgid);
            ASSERT_TRUE(server.Started());
            for (const char* variable : {"LISTEN_PID", "LISTEN_FDS", "LISTEN_FDNAMES"})
                EXPECT_EQ(getenv(variable), nullptr) << variable;
            EXPECT_EQ(Send(kName, 8, "activated").bytes, "activated@8");
        }
        const bool used = test.listening && test.otherPid == 0;
        // A used socket belongs to the service manager: its file stays, the port's descriptor
        // goes. A descriptor the port did not take stays open.
        EXPECT_EQ(access(SocketPath().c_str(), F_OK) == 0, used);
        EXPECT_EQ(fcntl(3, F_GETFD) >= 0, !used);
        EXPECT_EQ(log.Texts(), test.line.empty() ? Lines{} : Lines{test.line});
        unlink(SocketPath().c_str());
    }
}

TEST_F(MessagePortTest,
       SocketsNeedASafeNameAndLiveInAPrivateDirectoryOfTheHomeWithoutARuntimeDirectory) {
    // A home whose name holds a newline: the log line must not be forged by it.
    const std::string home = runtime_.Path() + "/home\nforged";
    const std::string directory = home + "/.glyphwell";
    const std::string logged = runtime_.Path() + "/home\\nforged/.glyphwell";
    using glyphwell::port::SocketPathForName;
    EXPECT_EQ(SocketPathForName(kName), runtime_.Path() + "/" + kName);
    for (const std::string& bad : Lines{"", ".", "..", "a/b", std::string(120, 'n')})
        EXPECT_EQ(SocketPathForName(bad), "") << "a name that is not safe: " << bad;
    const struct Case {
        const char* what;
        char kind; ///< what is at the directory's path first: nothing, a directory, a link, a file
        mode_t mode;         ///< of the directory
        uid_t owner;         ///< of the directory
        std::string refusal; ///< empty: accepted
    } cases[] = {
        {"created when missing", '-', 0, 0, ""},
        {"kept when it is ours", 'd', 0700, geteuid(), ""},
        {"open to others", 'd', 0755, geteuid(), "its mode 0755 lets other users in"},
        {"a symbolic link to our own directory", 'l', 0700, geteuid(), "it is a symbolic link"},
        {"a file", 'f', 0, 0, "it is not a directory"},
        {"another user's (needs root)", 'd', 0700, 65534, "it is owned by uid 65534, not 0"},
    };
    ScopedEnvironment environment;
    environment.Set("XDG_RUNTIME_DIR", nullptr);
    for (const Case& test : cases) {
        SCOPED_TRACE(test.what);
        if (test.owner != geteuid() && geteuid() != 0) // the last row: the others have run
            GTEST_SKIP() << "needs root to give the directory to another user";
        std::filesystem::remove_all(home);
        ASSERT_EQ(mkdir(home.c_str(), 0700), 0);
        environment.Set("HOME", (home + "/").c_str());
        const std::string made = test.kind == 'l' ? home + "/elsewhere" : directory;
        bool prepared = true;
        if (test.kind == 'd' || test.kind == 'l')
            prepared =
                mkdir(made.c_str(), test.mode) == 0 && chown(made.c_str(), test.owner, -1) == 0;
        if (test.kind == 'l')
            prepared = prepared && symlink(made.c_str(), directory.c_str()) == 0;
        if (test.kind == 'f')
            prepared = bool(std::ofstream(directory) << "x");
        ASSERT_TRUE(prepared);
        LogCapture log;
        const std::string path = SocketPathForName("n");
        if (test.refusal.empty()) {
            EXPECT_EQ(path, directory + "/n");
            struct stat status;
            ASSERT_EQ(lstat(directory.c_str(), &status), 0);
            EXPECT_EQ(status.st_mode & 07777, 0700u);
            EXPECT_TRUE(log.Texts().empty());
        } else {
            EXPECT_EQ(path, "");
            EXPECT_EQ(log.Texts(), Lines{"message port: refused the socket directory " + logged +
                                         ": " + test.refusal});
        }
    }
}

TEST_F(MessagePortTest, ServesConnectionsInTurnAndDropsTheQueueOfAClientThatHungUp) {
    std::vector<SInt32> handled;
    LocalPort local(kName, [&](SInt32 msgid, CFDataRef data) {
        handled.push_back(msgid);
        return EchoWithMsgid(msgid, data);
    });
    Client flood = Connect(), other = Connect();
    std::string frames;
    for (int i = 0; i < 500; ++i)
        frames += RequestFrame(1, "");
    ASSERT_TRUE(RawWrite(flood, frames));
    ASSERT_TRUE(RawWrite(other, RequestFrame(2, "")));
    // The other client is served within the first round, not after the 500.
    EXPECT_EQ(local.Answer(other, 6), HexText("00 00 00 02") + "@2");
    EXPECT_LE(std::find(handled.begin(), handled.end(), 2) - handled.begin(), 2);

    // The flooding client hangs up: what it queued is dropped, not worked through.
    flood.Close();
    ASSERT_TRUE(local.RunUntil([&] { return !glyphwell::port::IsReceivingRequest(local.Port()); }));
    EXPECT_LT(std::count(handled.begin(), handled.end(), 1), 10);
    EXPECT_EQ(local.Ask(other, RequestFrame(3, ""), 6), HexText("00 00 00 02") + "@3");
}

TEST_F(MessagePortTest, ClosesARequestThatStalledButNotOneThatKeepsComing) {
    LogCapture log;
    LocalPort local(kName, EchoWithMsgid);
    glyphwell::port::SetStallTimeout(local.Port(), std::chrono::seconds(1));
    Client stalled = Connect(), slow = Connect();
    ASSERT_TRUE(RawWrite(stalled, std::string("\x00\x00\x00\x01\x00", 5)));
    ASSERT_TRUE(local.RunUntil([&] { return glyphwell::port::IsReceivingRequest(local.Port()); }));

    // The slow client, started after the stalled one, sends a byte every 50 ms until the stalled
    // one is closed (its end becomes readable): longer than the timeout in all, never idle as long.
    const std::string payload(200, 'p');
    const std::string frame = RequestFrame(2, payload);
    size_t sent = 0;
    while (!HasBytes(stalled) && sent < frame.size()) {
        ASSERT_TRUE(RawWrite(slow, frame.substr(sent++, 1)));
        const auto next = std::chrono::steady_clock::now() + std::chrono::milliseconds(50);
        local.RunUntil(
            [&] { return HasBytes(stalled) || std::chrono::steady_clock::now() >= next; });
    }
    ASSERT_LT(sent, frame.size()) << "the stalled request was not closed";
    EXPECT_TRUE(RawSeesClose(stalled));
    ASSERT_TRUE(RawWrite(slow, frame.substr(sent)));
    EXPECT_EQ(local.Answer(slow, 206), HexText("00 00 00 ca") + payload + "@2");
    EXPECT_EQ(log.Texts(),
              Lines{kPrefix + "closed a connection whose request made no progress for 1 s"});
}

TEST_F(MessagePortTest, BoundsTheBytesHeldByUnfinishedRequests) {
    LogCapture log;
    LocalPort local(kName, EchoWithMsgid);
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
    EXPECT_EQ(log.Texts(), Lines{kPrefix + "unfinished requests held 61464 bytes (the limit is "
                                           "56320); closed the connection holding 30728 of them"});
    // The others go on: the first finishes its request and is answered.
    EXPECT_EQ(local.Ask(clients[0].descriptor, std::string(10240, 'x'), 4), HexText("00 00 78 02"));
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
    const struct Case {
        const char* what;
        glyphwell::port::ReplySendFunction send;
        std::string read; ///< what the client reads before it closes
        std::string line;
    } cases[] = {
        {"the write fails", SendThenFail, std::string("\x00\x80\x00", 3),
         kPrefix + "cannot send a reply: Input/output error; closed its connection"},
        {"the client closes with the reply unread", nullptr, std::string("\x00\x80\x00\x00", 4),
         kPrefix + "a client went away in the middle of its reply"},
    };
    for (const Case& test : cases) {
        SCOPED_TRACE(test.what);
        log.Clear();
        failingSendCalls = 0;
        glyphwell::port::SetReplySendFunctionForTesting(test.send);
        Client client = Connect();
        ASSERT_TRUE(RawWrite(client, RequestFrame(9, "")));
        EXPECT_EQ(RawRead(client, 4), test.read); // the failed write: up to the server's close
        client.Close();
        ASSERT_TRUE(WaitFor([&] { return !log.Texts().empty(); }));
        glyphwell::port::SetReplySendFunctionForTesting(nullptr);
        EXPECT_EQ(Send(kName, 1, "others").bytes, "others@1");
        EXPECT_EQ(log.Texts(), Lines{test.line});
    }
}

TEST_F(MessagePortTest, RefusesConnectionsOfAProcessBeyondItsLimitWithOneLogLine) {
    LogCapture log;
    LocalPort local(kName, EchoWithMsgid);
    glyphwell::port::SetConnectionLimitPerProcess(local.Port(), 2);
    Client clients[4] = {Connect(), Connect(), Connect(), Connect()};
    ASSERT_TRUE(local.RunUntil([&] { return HasBytes(clients[2]) && HasBytes(clients[3]); }));
    EXPECT_TRUE(RawSeesClose(clients[2]));
    EXPECT_TRUE(RawSeesClose(clients[3]));
    EXPECT_EQ(log.Texts(), Lines{kPrefix + "refused a connection from process " +
                                 std::to_string(getpid()) + ", which holds 2 already"});
    // The admitted ones are served, and a closed one makes room for a new one.
    EXPECT_EQ(local.Ask(clients[1], RequestFrame(5, "b"), 7), HexText("00 00 00 03") + "b@5");
    for (const int i : {0, 2, 3})
        clients[i].Close();
    ASSERT_TRUE(local.RunUntil([&] { return !glyphwell::port::IsReceivingRequest(local.Port()); }));
    EXPECT_EQ(local.Ask(Connect(), RequestFrame(6, "c"), 7), HexText("00 00 00 03") + "c@6");
    EXPECT_EQ(log.Texts().size(), 1u);
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
    Client first = Connect();
    ASSERT_EQ(local.Ask(first, RequestFrame(1, "a"), 7).size(), 7u);
    glyphwell::port::SetAcceptFunctionForTesting(AcceptOrRunOut);

    // With its spare descriptor the port accepts the client only to refuse it.
    failingAccepts = 1;
    Client refused = Connect();
    ASSERT_TRUE(local.RunUntil([&] { return HasBytes(refused); }));
    EXPECT_TRUE(RawSeesClose(refused));

    // When even that fails, the port stops accepting until a connection closes, then serves the
    // client that waited.
    failingAccepts = 2;
    Client waiting = Connect();
    ASSERT_TRUE(RawWrite(waiting, RequestFrame(7, "d")));
    ASSERT_TRUE(local.RunUntil([&] { return log.Texts().size() == 2; }));
    // Two round trips on the open connection give the loop turns in which it could accept.
    for (int round = 0; round < 2; ++round)
        ASSERT_EQ(local.Ask(first, RequestFrame(1, "a"), 7).size(), 7u);
    EXPECT_FALSE(HasBytes(waiting));
    first.Close();
    EXPECT_EQ(local.Answer(waiting, 7), HexText("00 00 00 03") + "d@7");
    glyphwell::port::SetAcceptFunctionForTesting(nullptr);
    EXPECT_EQ(
        log.Texts(),
        (Lines{kPrefix + "out of file descriptors; refused a connection",
               kPrefix + "out of file descriptors; accepting again when a connection closes"}));
}
