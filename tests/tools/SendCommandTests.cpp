// The verbs that talk to a port: against a local port served on a thread of the test.
#include <gtest/gtest.h>

#include <nlohmann/json.hpp>

#include "support/PortTestSupport.h"
#include "tests/tools/ToolRun.h"

using namespace glyphwell::testing;

namespace {

const char kName[] = "org.glyphwell.Test.Tool";

/// Replies with the request's own bytes (or `reply`) and remembers the last request.
class EchoServer {
public:
    EchoServer()
        : server_(kName, [this](SInt32 msgid, CFDataRef data) -> CFDataRef {
              std::lock_guard<std::mutex> lock(mutex_);
              lastMsgid = msgid;
              lastRequest = BytesOf(data);
              return reply.empty() ? CFDataCreateCopy(kCFAllocatorDefault, data)
                                   : CreateCFData(reply);
          }) {}

    bool Started() const { return server_.Started(); }
    /// Read and written under `mutex_`, that is between requests.
    std::string reply; ///< empty: echo
    SInt32 lastMsgid = 0;
    std::string lastRequest;

private:
    std::mutex mutex_;
    PortServer server_;
};

class SendCommandTest : public ::testing::Test {
protected:
    TemporaryRuntimeDirectory runtime_;
};

} // namespace

TEST_F(SendCommandTest, PrintsTheReplyOrSaysWhyThereIsNone) {
    EXPECT_EQ(Invoke({"send", "--msgid", "1", "--name", kName}, "{}"),
              (ToolResult{
                  1, "", "glyphwell send: nothing answers on the port org.glyphwell.Test.Tool\n"}));

    EchoServer server;
    ASSERT_TRUE(server.Started());
    const std::string tagged = R"({"a": [1, {"$data": "3q0="}]})";
    const std::string unreadable = "ERROR: Quzel got corrupted data. (cftype)\n"
                                   "*** don't how to resurrect type 99999\n"
                                   "glyphwell send: the reply is not a readable value\n";
    struct Case {
        std::vector<std::string> options; ///< after --msgid
        std::string input;
        std::string reply; ///< empty: the request's own bytes
        int status;
        std::string out;
        std::string err;
    } cases[] = {
        {{"-7", "--compact"}, tagged, "", 0, "{\"a\":[1,{\"$data\":\"3q0=\"}]}\n", ""},
        {{"99", "--empty"}, "", "", 0, "", "glyphwell send: the reply is empty\n"},
        {{"1"}, "{}", "xyz", 1, "null\n", unreadable},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.options[0]);
        server.reply = c.reply;
        std::vector<std::string> arguments = {"send", "--name", kName, "--msgid"};
        arguments.insert(arguments.end(), c.options.begin(), c.options.end());
        EXPECT_EQ(Invoke(arguments, c.input), (ToolResult{c.status, c.out, c.err}));
        EXPECT_EQ(server.lastMsgid, std::stoi(c.options[0]));
        if (c.input.empty()) {
            EXPECT_EQ(server.lastRequest, "");
        }
    }
}

TEST_F(SendCommandTest, AskActivationBuildsTheMessageId1Request) {
    const ToolResult result =
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
    const ToolResult reply = Invoke(
        {"encode"},
        R"({"QZUIPropertyResult": {"$number": 1, "$type": 7}, "QZUIPropertySuppress": {"$number": 0, "$type": 7}})");
    ASSERT_EQ(reply.status, 0) << reply.err;
    server.reply = reply.out;
    const ToolResult result = Invoke({"ask-download", "--name", kName, "--compact", "--font",
                                      "ExampleSans-Regular:Example Sans", "Other-Bold", "--app",
                                      "Writer", "--pid", "4242", "--suppress"});
    EXPECT_EQ(result, (ToolResult{0,
                                  "{\"QZUIPropertyResult\":{\"$number\":1,\"$type\":7},"
                                  "\"QZUIPropertySuppress\":{\"$number\":0,\"$type\":7}}\n",
                                  ""}));
    EXPECT_EQ(server.lastMsgid, 2);
    const ToolResult request = Invoke({"decode", "--compact"}, server.lastRequest);
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
        {{"encode", "--bogus"}, nullptr},
        {{"decode", "--expect", "bogus"}, nullptr},
    };
    for (const Case& c : cases) {
        const ToolResult result = Invoke(c.arguments, "{}");
        EXPECT_EQ(result.status, 2) << c.arguments.back();
        if (c.message) {
            EXPECT_EQ(result.err, c.message);
        }
    }
}
