// The request and answer that pass between the bridge and its font-choice worker.
#include <gtest/gtest.h>

#include <tuple>

#include "bridge/QZFontChoice.h"

namespace {

TEST(FontChoice, RequestSurvivesTheArgumentsAndBadArgumentsAreRefused) {
    QZFontChoiceRequest request{
        ":1.7",     "org.example.App.desktop", {{"ja", "zh-cn"}, {"Noto Sans", "A=B"}}, 4242, true,
        "test-port"};
    const std::vector<std::string> arguments = QZFontChoiceArguments(request);
    std::vector<const char*> argv;
    for (const std::string& argument : arguments)
        argv.push_back(argument.c_str());
    QZFontChoiceRequest read;
    ASSERT_TRUE(QZParseFontChoiceArguments(int(argv.size()), argv.data(), &read));
    EXPECT_EQ(read.sender, request.sender);
    EXPECT_EQ(read.desktopID, request.desktopID);
    EXPECT_EQ(read.wants.languages, request.wants.languages);
    EXPECT_EQ(read.wants.families, request.wants.families);
    EXPECT_EQ(read.pid, request.pid);
    EXPECT_EQ(read.portName, request.portName);
    EXPECT_TRUE(read.hasPortName);

    for (const char* bad : {"sender", "colour=red", "desktop=a", "pid=0", "pid=12x", "port=p"}) {
        SCOPED_TRACE(bad);
        const char* twice[] = {bad[1] == 'o' ? "port=p" : "desktop=a", bad};
        QZFontChoiceRequest refused;
        EXPECT_FALSE(QZParseFontChoiceArguments(2, twice, &refused));
    }
}

TEST(FontChoice, AnswerSurvivesEncodingAndIncompleteAnswersAreRefused) {
    QZFontChoice choice{"app", "Example App", "/a/app.desktop", {"ja"}, "Noto Sans JP", "xx", {}};
    choice.fonts = {{"NotoSansJP-Regular", "Noto Sans JP"}, {"NotoSansJP-Bold", "Noto Sans JP"}};
    const std::string text = QZEncodeFontChoice(choice);
    QZFontChoice read;
    ASSERT_TRUE(QZDecodeFontChoice(text, &read));
    EXPECT_EQ(QZEncodeFontChoice(read), text);
    EXPECT_EQ(read.fonts, choice.fonts);
    EXPECT_EQ(read.askedLanguages, choice.askedLanguages);

    const std::string noEnd = text.substr(0, text.rfind("end="));
    const std::string cutFamily = noEnd.substr(0, noEnd.rfind("family="));
    const std::string cut = text.substr(0, text.size() - 1);
    const std::string familyFirst = std::string("family=F\0end=\0", 14);
    const std::string afterEnd = text + "name=x" + '\0';
    const std::string unknown = std::string("colour=red\0end=\0", 16);
    for (const std::string& bad : {std::string(), noEnd, cutFamily, cut, familyFirst, afterEnd,
                                   unknown, std::string("garbage")}) {
        SCOPED_TRACE(bad);
        EXPECT_FALSE(QZDecodeFontChoice(bad, &read));
    }
    EXPECT_EQ(QZFontChoiceSize(text), text.size());
    EXPECT_EQ(QZFontChoiceSize(noEnd), std::string::npos);

    // What follows the choice: nothing, the question put, then the call's outcome.
    const std::string asking = QZEncodeQuestionAsking();
    const std::string outcome = QZEncodeQuestionOutcome(-3, 1, "not running");
    QZFontQuestionTail tail;
    for (const auto& [after, asked, ended] : {std::tuple{std::string(), false, false},
                                              {asking, true, false},
                                              {outcome, false, true},
                                              {asking + outcome, true, true}}) {
        SCOPED_TRACE(after);
        ASSERT_TRUE(QZDecodeQuestionTail(after, &tail));
        EXPECT_EQ(tail.asking, asked);
        EXPECT_EQ(tail.ended, ended);
        EXPECT_EQ(tail.status, ended ? -3 : 0);
        EXPECT_EQ(tail.result, ended ? 1 : 0);
        EXPECT_EQ(tail.statusText, ended ? "not running" : "");
    }
    for (const std::string& bad :
         {outcome + asking, asking + asking, outcome + outcome,
          outcome.substr(0, outcome.size() - 1), std::string("status=x\0result=1\0text=\0", 22)}) {
        SCOPED_TRACE(bad);
        EXPECT_FALSE(QZDecodeQuestionTail(bad, &tail));
    }
}

} // namespace
