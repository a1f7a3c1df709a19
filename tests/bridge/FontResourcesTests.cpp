// The fontconfig patterns that bus clients send, read into languages and families.
#include <gtest/gtest.h>

#include "bridge/QZFontResources.h"

namespace {

TEST(FontResources, ReadsLanguagesAndFamiliesAndRefusesWhatCannotBeServed) {
    struct Case {
        std::string resource;
        bool served;
        std::vector<std::string> languages;
        std::vector<std::string> families;
    };
    const std::vector<Case> cases = {
        {":lang=ja", true, {"ja"}, {}},
        {":lang=zh_CN,ko", true, {"zh-cn", "ko"}, {}},
        {":lang=und-zsye:weight=200", true, {"und-zsye"}, {}},
        {"Noto Sans, Noto\\-Serif-12:style=Bold", true, {}, {"Noto Sans", "Noto-Serif"}},
        {":family=A\\:B,C:lang=th", true, {"th"}, {"A:B", "C"}},
        {":weight=200:bold", false, {}, {}},
        {":lang=ja,x", false, {}, {}},
        {":lang=", false, {}, {}},
        {"", false, {}, {}},
        {":lang=ja\xff", false, {}, {}},
        {":lang=ja" + std::string(kMaximumResourceSize, ' '), false, {}, {}},
    };
    for (const Case& test : cases) {
        SCOPED_TRACE(test.resource);
        QZFontResourceWants wants;
        EXPECT_EQ(QZAddFontResource(test.resource, wants), test.served);
        EXPECT_EQ(wants.languages, test.languages);
        EXPECT_EQ(wants.families, test.families);
    }
}

TEST(FontResources, MergesEachWantOnceWithinTheLimit) {
    QZFontResourceWants wants;
    for (int i = 0; i < 100; ++i)
        QZAddFontResource(":lang=ja,ko:family=F" + std::to_string(i), wants);
    EXPECT_EQ(wants.languages, (std::vector<std::string>{"ja", "ko"}));
    EXPECT_EQ(wants.families.size(), QZFontResourceWants::kMaximumWanted);
}

} // namespace
