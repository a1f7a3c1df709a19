// The client library against real sockets: a scripted server answering exact bytes, and the
// platform's own port server.
#include <gtest/gtest.h>
#include <poll.h>

#include <thread>

#include "cfutil/TCFRetained.h"
#include "glyphwell/client.h"
#include "platform/CFData.h"
#include "platform/CFMessagePort.h"
#include "platform/CFRunLoop.h"
#include "support/PortTestSupport.h"

using namespace glyphwell::testing;

namespace {

const char kName[] = "org.glyphwell.Test.Client";

std::string Big32(uint32_t value) {
    return {char(value >> 24), char(value >> 16), char(value >> 8), char(value)};
}
uint32_t Length(const std::string& big32) {
    const auto* b = reinterpret_cast<const unsigned char*>(big32.data());
    return uint32_t(b[0]) << 24 | b[1] << 16 | b[2] << 8 | b[3];
}
std::string String(const std::string& text) {
    return Big32(7) + Big32(uint32_t(text.size())) + text;
}
/// A number of type 7 (one byte).
std::string Answer(char value) {
    return Big32(0x16) + Big32(7) + Big32(1) + std::string(1, value);
}
/// The reply dictionary {Result, Suppress} plus `extra` entries (already flattened pairs).
std::string Reply(char result, char suppress, int extraCount = 0, const std::string& extra = "") {
    return Big32(0x10) + Big32(2 + extraCount) + String("QZUIPropertyResult") + Answer(result) +
           String("QZUIPropertySuppress") + Answer(suppress) + extra;
}

using Request = std::unique_ptr<glyphwell_request, decltype(&glyphwell_request_free)>;

Request NewRequest(int question) {
    return Request(glyphwell_request_new(question), glyphwell_request_free);
}
Request DownloadRequest() {
    Request request = NewRequest(GLYPHWELL_ASK_DOWNLOAD);
    glyphwell_request_add_font(request.get(), "Example-Bold", "Example");
    return request;
}

/// Listens on the test port's socket; for one connection reads the request frame, then writes
/// `answer` and, with `hold`, waits for the client to hang up before closing.
class ScriptedServer {
public:
    ScriptedServer(std::string answer, bool hold = false)
        : listener_(RawListen(glyphwell::port::SocketPathForName(kName))) {
        thread_ = std::thread([this, answer, hold] {
            const int connection = accept(listener_, nullptr, nullptr);
            if (connection < 0)
                return;
            request = RawRead(connection, 8);
            if (request.size() == 8)
                request += RawRead(connection, Length(request.substr(4)));
            RawWrite(connection, answer);
            if (hold)
                RawRead(connection, 1, -1);
            close(connection);
        });
    }
    ~ScriptedServer() {
        Join();
        close(listener_);
        unlink(glyphwell::port::SocketPathForName(kName).c_str());
    }
    std::string request; ///< the whole request frame, readable after the call ended
    void Join() {
        if (thread_.joinable())
            thread_.join();
    }

private:
    int listener_;
    std::thread thread_;
};

class ClientTest : public ::testing::Test {
protected:
    TemporaryRuntimeDirectory runtime_;
};

} // namespace

TEST_F(ClientTest, RefusesRequestsTheirQuestionDoesNotTake) {
    EXPECT_EQ(glyphwell_request_new(3), nullptr);
    Request activation = NewRequest(GLYPHWELL_ASK_ACTIVATION);
    Request download = NewRequest(GLYPHWELL_ASK_DOWNLOAD);
    const void* bytes = nullptr;
    size_t length = 0;
    struct Case {
        const char* what;
        int status;
    } cases[] = {
        {"null request", glyphwell_request_set_application_name(nullptr, "A")},
        {"name not UTF-8", glyphwell_request_set_application_name(download.get(), "\xff")},
        {"empty PostScript name", glyphwell_request_add_font(download.get(), "", nullptr)},
        {"candidate on a download", glyphwell_request_add_candidate_file(download.get(), "/a")},
        {"pid on an activation", glyphwell_request_set_process_id(activation.get(), 1)},
        {"suppress on an activation", glyphwell_request_set_suppress(activation.get(), 1)},
        {"download without fonts", glyphwell_request_get_bytes(download.get(), &bytes, &length)},
        {"activation without files",
         glyphwell_request_get_bytes(activation.get(), &bytes, &length)},
    };
    for (const Case& c : cases)
        EXPECT_EQ(c.status, GLYPHWELL_ERROR_INVALID_ARGUMENT) << c.what;
    ASSERT_EQ(glyphwell_request_add_font(activation.get(), "A-Bold", nullptr), GLYPHWELL_OK);
    EXPECT_EQ(glyphwell_request_add_font(activation.get(), "B-Bold", nullptr),
              GLYPHWELL_ERROR_INVALID_ARGUMENT);
    glyphwell_reply* reply = reinterpret_cast<glyphwell_reply*>(1);
    EXPECT_EQ(glyphwell_request_send(download.get(), kName, 100, &reply),
              GLYPHWELL_ERROR_INVALID_ARGUMENT);
    EXPECT_EQ(reply, nullptr);
}

TEST_F(ClientTest, ReportsEachFailureOfTheExchange) {
    // Both clients of the wire codec, the library and the platform's remote port, meet each
    // server; the port hands any whole reply out without reading it.
    struct Case {
        const char* what;
        bool server;
        std::string answer;
        bool hold;
        int status;
        SInt32 portStatus;
    } cases[] = {
        {"nothing listens", false, "", false, GLYPHWELL_ERROR_NOT_RUNNING, 0},
        {"no reply in time", true, "", true, GLYPHWELL_ERROR_TIMED_OUT,
         kCFMessagePortReceiveTimeout},
        {"closed before replying", true, "", false, GLYPHWELL_ERROR_DISCONNECTED,
         kCFMessagePortBecameInvalidError},
        {"closed inside the reply", true, Big32(10) + "abc", false, GLYPHWELL_ERROR_DISCONNECTED,
         kCFMessagePortBecameInvalidError},
        {"empty reply", true, Big32(0), false, GLYPHWELL_ERROR_MALFORMED_REPLY,
         kCFMessagePortSuccess},
        {"not a value", true, Big32(3) + "xyz", false, GLYPHWELL_ERROR_MALFORMED_REPLY,
         kCFMessagePortSuccess},
        {"frame over the limit", true, Big32(0xFFFFFFFF), true, GLYPHWELL_ERROR_MALFORMED_REPLY,
         kCFMessagePortTransportError},
        {"no Result", true, Big32(8) + Big32(0x10) + Big32(0), false,
         GLYPHWELL_ERROR_MALFORMED_REPLY, kCFMessagePortSuccess},
        {"a dictionary cut short", true, Big32(12) + Reply(1, 0).substr(0, 12), false,
         GLYPHWELL_ERROR_MALFORMED_REPLY, kCFMessagePortSuccess},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.what);
        std::optional<ScriptedServer> server;
        if (c.server)
            server.emplace(c.answer, c.hold);
        Request request = DownloadRequest();
        glyphwell_reply* reply = nullptr;
        EXPECT_EQ(glyphwell_request_send(request.get(), kName, 300, &reply), c.status);
        EXPECT_EQ(reply, nullptr);
        EXPECT_STRNE(glyphwell_status_text(c.status), "unknown status");

        if (c.server)
            server.emplace(c.answer, c.hold);
        TCFAdopted<CFMessagePortRef> port(
            CFMessagePortCreateRemote(kCFAllocatorDefault, CFSTR("org.glyphwell.Test.Client")));
        EXPECT_EQ(bool(port.Get()), c.server);
        CFDataRef data = nullptr;
        if (port.Get())
            EXPECT_EQ(
                CFMessagePortSendRequest(port, 9, nullptr, 1, 0.3, kCFRunLoopDefaultMode, &data),
                c.portStatus);
        TCFAdopted<CFDataRef> owned(data);
        std::string body = "<none>";
        if (data)
            body.assign(reinterpret_cast<const char*>(CFDataGetBytePtr(data)),
                        size_t(CFDataGetLength(data)));
        const bool answered = c.server && c.portStatus == kCFMessagePortSuccess;
        EXPECT_EQ(body, answered ? c.answer.substr(4) : "<none>");
    }
}

TEST_F(ClientTest, AnAgentTooBusyToAcceptFailsACallAtOnceAndASendAtItsTimeout) {
    // A listener whose queue of connections is full: a connect cannot even begin.
    const std::string path = glyphwell::port::SocketPathForName(kName);
    const int listener = RawListen(path);
    ASSERT_EQ(listen(listener, 0), 0);
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::memcpy(address.sun_path, path.c_str(), path.size());
    std::vector<int> queued;
    do
        queued.push_back(socket(AF_UNIX, SOCK_STREAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0));
    while (queued.size() < 64 &&
           connect(queued.back(), reinterpret_cast<sockaddr*>(&address), sizeof address) == 0);
    ASSERT_EQ(errno, EAGAIN);
    Request request = DownloadRequest();
    glyphwell_call* call = reinterpret_cast<glyphwell_call*>(1);
    EXPECT_EQ(glyphwell_call_start(request.get(), kName, &call), GLYPHWELL_ERROR_TRANSPORT);
    EXPECT_EQ(errno, EAGAIN);
    EXPECT_EQ(call, nullptr);
    glyphwell_reply* reply = nullptr;
    EXPECT_EQ(glyphwell_request_send(request.get(), kName, 100, &reply), GLYPHWELL_ERROR_TIMED_OUT);
    for (const int descriptor : queued)
        close(descriptor);
    close(listener);
    unlink(path.c_str());
}

TEST_F(ClientTest, SendsTheFlattenedRequestAndReadsTheAnswers) {
    // An activation reply passes the candidate URLs back.
    const std::string url = "file:///fonts/A%20Font.otf";
    const std::string candidates = String("QZUIPropertyCandidateFontURLs") + Big32(0x11) +
                                   Big32(1) + Big32(0x101) + Big32(uint32_t(url.size())) + url;
    const std::string answer = Reply(1, 1, 1, candidates);
    ScriptedServer server(Big32(uint32_t(answer.size())) + answer);
    Request request = NewRequest(GLYPHWELL_ASK_ACTIVATION);
    ASSERT_EQ(glyphwell_request_add_candidate_file(request.get(), "/fonts/A Font.otf"), 0);
    ASSERT_EQ(glyphwell_request_add_font(request.get(), "A-Bold", "A"), 0);
    glyphwell_reply* raw = nullptr;
    ASSERT_EQ(glyphwell_request_send(request.get(), kName, -1, &raw), GLYPHWELL_OK);
    std::unique_ptr<glyphwell_reply, decltype(&glyphwell_reply_free)> reply(raw,
                                                                            glyphwell_reply_free);
    EXPECT_EQ(glyphwell_reply_get_result(raw), 1);
    EXPECT_EQ(glyphwell_reply_get_suppress(raw), 1);
    ASSERT_EQ(glyphwell_reply_get_candidate_count(raw), 1u);
    EXPECT_STREQ(glyphwell_reply_get_candidate_url(raw, 0), url.c_str());
    EXPECT_EQ(glyphwell_reply_get_candidate_url(raw, 1), nullptr);
    server.Join();
    const void* bytes = nullptr;
    size_t length = 0;
    ASSERT_EQ(glyphwell_request_get_bytes(request.get(), &bytes, &length), GLYPHWELL_OK);
    EXPECT_EQ(server.request,
              RequestFrame(1, std::string(static_cast<const char*>(bytes), length)));
}

// A main loop's view: poll the descriptor for the events asked, dispatch, until the answer; the
// platform's own port server answers.
TEST_F(ClientTest, AnswersThroughTheDescriptorOfAMainLoop) {
    // The server answers only once the client waits for the reply, so that both stages are seen.
    std::promise<void> awaited;
    std::shared_future<void> released = awaited.get_future().share();
    PortServer server(kName, [released](SInt32 msgid, CFDataRef) -> CFDataRef {
        released.wait();
        return msgid == 2 ? CreateCFData(Reply(0, 1)) : nullptr;
    });
    ASSERT_TRUE(server.Started());
    Request request = DownloadRequest();
    glyphwell_call* call = nullptr;
    ASSERT_EQ(glyphwell_call_start(request.get(), kName, &call), GLYPHWELL_OK);
    request.reset(); // the call keeps its own bytes
    const int fd = glyphwell_call_get_fd(call);
    ASSERT_GE(fd, 0);
    EXPECT_EQ(glyphwell_call_get_events(call), POLLOUT);
    glyphwell_reply* reply = nullptr;
    int status = GLYPHWELL_IN_PROGRESS;
    bool sawRead = false;
    while (status == GLYPHWELL_IN_PROGRESS) {
        pollfd entry{fd, glyphwell_call_get_events(call), 0};
        if (entry.events == POLLIN && !sawRead) {
            sawRead = true;
            awaited.set_value();
        }
        ASSERT_NE(entry.events, 0);
        ASSERT_EQ(poll(&entry, 1, 10000), 1);
        EXPECT_EQ(glyphwell_call_get_fd(call), fd);
        status = glyphwell_call_dispatch(call, &reply);
    }
    ASSERT_EQ(status, GLYPHWELL_OK);
    EXPECT_EQ(glyphwell_reply_get_result(reply), 0);
    EXPECT_EQ(glyphwell_reply_get_suppress(reply), 1);
    EXPECT_EQ(glyphwell_reply_get_candidate_count(reply), 0u);
    glyphwell_reply_free(reply);
    // Once ended, the call says the same again, without a second reply.
    EXPECT_EQ(glyphwell_call_dispatch(call, &reply), GLYPHWELL_OK);
    EXPECT_EQ(reply, nullptr);
    EXPECT_EQ(glyphwell_call_get_events(call), 0);
    glyphwell_call_free(call);
}
