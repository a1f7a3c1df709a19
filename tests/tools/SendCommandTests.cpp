// The verbs that talk to a port: against a local port served on a thread of the test.
#include <gtest/gtest.h>

#include <nlohmann/json.hpp>
#include <sstream>

#include "support/PortTestSupport.h"
#include "tools/Commands.h"

using namespace glyphwell::testing;

namespace {

const char kName[] = "org.glyphwell.Test.Tool";

struct Result {
    int status;
    std::string out;
    std::string err;
};

Result Invoke(std::vector<std::string> arguments, const std::string& input = "") {
    std::istringstream in(input);
    std::ostringstream out, err;
    const int status = glyphwell::tools::RunTool(arguments, in, out, err);
    return {status, out.str(), err.str()};
}

/// A server that replies with the request's own bytes and remembers the last message id.
class EchoServer {
public:
    EchoServer()
        : server_(kName, [this](SInt32 msgid, CFDataRef data) -> CFDataRef {
              lastMsgid = msgid;
              lastLength = CFDataGetLength(data);
              std::lock_guard<std::mutex> lock(mutex_);
              lastRequest_ = BytesOf(data);
              return reply_.empty() ? CFDataCreateCopy(kCFAllocatorDefault, data)
                                    : CreateCFData(reply_);
          }) {}

    bool Started() const { return server_.Started(); }
    /// Answers later requests with these bytes instead.
    void SetReply(const std::string& bytes) {
        std::lock_guard<std::mutex> lock(mutex_);
        reply_ = bytes;
    }

    std::string LastRequest() {
        std::lock_guard<std::mutex> lock(mutex_);
        return lastRequest_;
    }

    std::atomic<SInt32> lastMsgid{0};
    std::atomic<CFIndex> lastLength{-1};

private:
    std::mutex mutex_;
    std::string reply_;
    std::string lastRequest_;
    PortServer server_;
};

class SendCommandTest : public ::testing::Test {
protected:
    TemporaryRuntimeDirectory runtime_;
};

} // namespace

TEST_F(SendCommandTest, PrintsTheReplyToATaggedJSONRequest) {
    EchoServer server;
    ASSERT_TRUE(server.Started());
    const Result result = Invoke({"send", "--msgid", "-7", "--name", kName, "--compact"},
                                 R"({"a": [1, {"$data": "3q0="}]})");
    EXPECT_EQ(result.status, 0) << result.err;
    EXPECT_EQ(result.out, "{\"a\":[1,{\"$data\":\"3q0=\"}]}\n");
    EXPECT_EQ(result.err, "");
    EXPECT_EQ(server.lastMsgid, -7);
}

TEST_F(SendCommandTest, SaysSoWhenTheReplyIsEmpty) {
    EchoServer server;
    ASSERT_TRUE(server.Started());
    const Result result = Invoke({"send", "--msgid", "99", "--empty", "--name", kName});
    EXPECT_EQ(result.status, 0);
    EXPECT_EQ(result.out, "");
    EXPECT_EQ(result.err, "glyphwell send: the reply is empty\n");
    EXPECT_EQ(server.lastMsgid, 99);
    EXPECT_EQ(server.lastLength, 0);
}

TEST_F(SendCommandTest, FailsWhenNothingListensOrTheReplyIsUnreadable) {
    Result result = Invoke({"send", "--msgid", "1", "--name", kName}, "{}");
    EXPECT_EQ(result.status, 1);
    EXPECT_EQ(result.err, "glyphwell send: nothing answers on the port org.glyphwell.Test.Tool\n");

    EchoServer server;
    ASSERT_TRUE(server.Started());
    server.SetReply("xyz");
    result = Invoke({"send", "--msgid", "1", "--name", kName}, "{}");
    EXPECT_EQ(result.status, 1);
    const std::string last = "glyphwell send: the reply is not a readable value\n";
    ASSERT_GE(result.err.size(), last.size());
    EXPECT_EQ(result.err.substr(result.err.size() - last.size()), last);
}

TEST_F(SendCommandTest, AskActivationBuildsTheMessageId1Request) {
    const Result result =
        Invoke({"ask-activation", "--dry-run", "--compact", "--font", "Example-Bold", "--app",
                "Writer", "--bundle", "/usr/share/applications/writer.desktop", "--candidate",
                "/fonts/A Font.otf", "/fonts/b.ttf"});
    ASSERT_EQ(result.status, 0) << result.err;
    EXPECT_EQ(nlohmann::json::parse(result.out), nlohmann::json::parse(R"({
        "QZUIPropertyApplicationName": "Writer",
        "QZUIPropertyBundleURL": {"$url": "file:///usr/share/applications/writer.desktop"},
        "QZUIPropertyFontName": "Example-Bold",
        "QZUIPropertyRequestDictionary": {"NSFontNameAttribute": "Example-Bold"},
        "QZUIPropertyCandidateFontURLs": [{"$url": "file:///fonts/A%20Font.otf"},
                                          {"$url": "file:///fonts/b.ttf"}]
    })"));
}

TEST_F(SendCommandTest, AskDownloadSendsTheMessageId2Request) {
    EchoServer server;
    ASSERT_TRUE(server.Started());
    // {"QZUIPropertyResult": number 1 of type 7, "QZUIPropertySuppress": number 0 of type 7}
    const Result reply = Invoke(
        {"encode"},
        R"({"QZUIPropertyResult": {"$number": 1, "$type": 7}, "QZUIPropertySuppress": {"$number": 0, "$type": 7}})");
    ASSERT_EQ(reply.status, 0) << reply.err;
    server.SetReply(reply.out);
    const Result result = Invoke({"ask-download", "--name", kName, "--compact", "--font",
                                  "ExampleSans-Regular:Example Sans", "Other-Bold", "--app",
                                  "Writer", "--pid", "4242", "--suppress"});
    ASSERT_EQ(result.status, 0) << result.err;
    EXPECT_EQ(server.lastMsgid, 2);
    EXPECT_EQ(result.out, "{\"QZUIPropertyResult\":{\"$number\":1,\"$type\":7},"
                          "\"QZUIPropertySuppress\":{\"$number\":0,\"$type\":7}}\n");
    const Result request = Invoke({"decode", "--compact"}, server.LastRequest());
    ASSERT_EQ(request.status, 0) << request.err;
    EXPECT_EQ(nlohmann::json::parse(request.out), nlohmann::json::parse(R"({
        "QZUIPropertyApplicationName": "Writer",
        "QZUIPropertyProcessID": {"$number": 4242, "$type": 9},
        "QZUIPropertyFontProperties": [
            {"NSFontNameAttribute": "ExampleSans-Regular", "NSFontFamilyAttribute": "Example Sans"},
            {"NSFontNameAttribute": "Other-Bold"}
        ],
        "QZUIPropertySuppress": true
    })"));
}

TEST_F(SendCommandTest, RejectsIncompleteCommandLines) {
    struct Case {
        std::vector<std::string> arguments;
        const char* message; // the whole of standard error, or null to check the status only
    } cases[] = {
        {{"send", "--name", kName}, "glyphwell send: --msgid is required\n"},
        {{"send", "--msgid", "4294967296"}, nullptr},
        {{"send", "--msgid", "1", "--timeout", "soon"},
         "glyphwell send: --timeout takes seconds or \"forever\", not soon\n"},
        {{"send", "--msgid", "1", "--timeout", "-1"},
         "glyphwell send: --timeout takes seconds or \"forever\", not -1\n"},
        {{"send", "--msgid", "1", "--timeout", "inf"},
         "glyphwell send: --timeout takes seconds or \"forever\", not inf\n"},
        {{"send", "--msgid", "1", "--send-timeout", "nan"}, nullptr},
        {{"ask-activation", "--font", "X"},
         "glyphwell ask-activation: give the font files with --candidate\n"},
        {{"ask-download", "--font"}, nullptr},
        {{"ask-download", "--font", ":Family"},
         "glyphwell ask-download: :Family has no PostScript name\n"},
        {{"ask-download", "--font", "A", "--pid", "x"},
         "glyphwell ask-download: --pid needs a process id\n"},
        {{"ask-download", "--font", "A", "--send-timeout", "1"},
         "glyphwell ask-download: unknown argument --send-timeout\n"},
        {{"ask-activation", "--candidate", "/a.ttf", "--bundle"},
         "glyphwell ask-activation: --bundle needs a value\n"},
    };
    for (const Case& c : cases) {
        const Result result = Invoke(c.arguments, "{}");
        EXPECT_EQ(result.status, 2) << c.arguments.back();
        if (c.message)
            EXPECT_EQ(result.err, c.message);
    }
}
