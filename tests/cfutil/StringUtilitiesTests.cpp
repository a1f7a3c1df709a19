// String utilities: tilde expansion against the password database, regional suffixes and the
// language fallback, four-character codes and null-safe equality.
#include <pwd.h>
#include <string>
#include <unistd.h>
#include <vector>

#include <gtest/gtest.h>

#include "cfutil/CFStringUtilities.h"
#include "cfutil/FileTestSupport.h"
#include "cfutil/TCFRetained.h"
#include "cfutil/TCFString.h"
#include "platform/HomeDirectory.h"
#include "support/ScopedEnvironment.h"
#include "support/Values.h"

using namespace glyphwell::testing;

namespace {

std::string Expand(const std::string& path) {
    Ref input = Str(path);
    Ref expanded(TCFStr::CreateStringByExpandingTildeInPath(input.as<CFStringRef>()));
    return TextOf(expanded.get());
}

} // namespace

// The current user's home is $HOME when it is set and absolute, else the password database's;
// tilde expansion follows it.
TEST(HomeDirectory, HomeVariableWhenAbsoluteElsePasswordDatabase) {
    const std::string database = glyphwell::PasswordDatabaseHome(nullptr);
    ASSERT_FALSE(database.empty());
    ASSERT_NE(database, "/");
    const struct {
        const char* home;
        std::string expected;
    } rows[] = {
        {nullptr, database},
        {"", database},
        {"relative/home", database},
        {"/srv/elsewhere", "/srv/elsewhere"},
    };
    glyphwell::testing::ScopedEnvironment environment;
    for (const auto& row : rows) {
        environment.Set("HOME", row.home);
        SCOPED_TRACE(row.home ? row.home : "(unset)");
        EXPECT_EQ(glyphwell::HomeDirectory(), row.expected);
        EXPECT_EQ(Expand("~"), row.expected);
        EXPECT_EQ(Expand("~/"), row.expected + "/");
        EXPECT_EQ(Expand("~/Documents/a~b/../c"), row.expected + "/Documents/a~b/../c");
    }
}

TEST(TildeExpansion, HomeOfRootDirectoryStaysASingleSlash) {
    setpwent();
    std::string user;
    while (passwd* entry = getpwent()) {
        if (std::string(entry->pw_dir) == "/") {
            user = entry->pw_name;
            break;
        }
    }
    endpwent();
    if (user.empty())
        GTEST_SKIP() << "no account with / as its home directory";
    EXPECT_EQ(Expand("~" + user), "/");
    EXPECT_EQ(Expand("~" + user + "/etc"), "//etc");
}

TEST(TildeExpansion, NamedUserHomeComesFromThePasswordDatabaseElseThePathIsReturnedRetained) {
    passwd* root = getpwnam("root");
    ASSERT_NE(root, nullptr);
    const std::string home = root->pw_dir;
    EXPECT_EQ(Expand("~root"), home);
    EXPECT_EQ(Expand("~root/x/y"), home + "/x/y");
    for (const char* text :
         {"", "a~b", "/abs/~", "~no-such-user-glyphwell/x", "~no-such-user-glyphwell"}) {
        Ref input = Str(text);
        const CFIndex before = CFGetRetainCount(input.get());
        Ref result(TCFStr::CreateStringByExpandingTildeInPath(input.as<CFStringRef>()));
        EXPECT_EQ((std::pair{result.get(), CFGetRetainCount(input.get())}),
                  (std::pair{input.get(), before + 1}))
            << text;
    }
}

TEST(RegionalSuffix, CutsAtFirstUnderscoreElseHyphenAndKeepsChineseWhole) {
    const std::pair<const char*, const char*> rows[] = {
        {"en_US", "en"},    {"pt-BR", "pt"},      {"en-US_POSIX", "en-US"}, {"_x", ""},
        {"zh_CN", nullptr}, {"zh-Hant", nullptr}, {"en", nullptr},          {"zh", nullptr},
    };
    for (const auto& [text, expected] : rows) {
        Ref input = Str(text);
        Ref result(TCFStr(input.as<CFStringRef>()).CreateSubstringWithoutRegionalSuffix());
        EXPECT_EQ(TextOf(result.get()), expected ? expected : text);
        EXPECT_TRUE(expected || result.get() == input.get()) << text; // the input, retained
    }
    EXPECT_EQ(TCFStr(nullptr).CreateSubstringWithoutRegionalSuffix(), nullptr);
}

TEST(LanguageLookup, FallsBackOnceToTheBaseLanguage) {
    Ref english = Str("English"), chinese = Str("Chinese"), brazilian = Str("Brazilian");
    Ref table = glyphwell::testing::Dict({{CFSTR("en"), english.get()},
                                          {CFSTR("zh"), chinese.get()},
                                          {CFSTR("pt_BR"), brazilian.get()}});
    std::vector<CFTypeRef> found;
    for (const char* language : {"en_GB", "en-AU", "en", "pt_BR", "pt", "zh_TW", "fr"})
        found.push_back(CFDictionary::GetValueForLanguage(table.as<CFDictionaryRef>(),
                                                          Str(language).as<CFStringRef>()));
    EXPECT_EQ(found, (std::vector<CFTypeRef>{english.get(), english.get(), english.get(),
                                             brazilian.get(), nullptr, nullptr, nullptr}));
    EXPECT_EQ(CFDictionary::GetValueForLanguage(nullptr, CFSTR("en")), nullptr);
    EXPECT_EQ(CFDictionary::GetValue(nullptr, CFSTR("en")), nullptr);
    EXPECT_EQ(CFDictionary::GetValue(table.as<CFDictionaryRef>(), CFSTR("zh")), chinese.get());
}

TEST(StringEquality, NullsByIdentityAndStringsByContent) {
    Ref same = Str("same"), alsoSame = Str("same"), other = Str("other");
    const CFStringRef a = same.as<CFStringRef>(), b = alsoSame.as<CFStringRef>();
    const struct {
        CFStringRef first, second;
        bool equal;
    } rows[] = {{nullptr, nullptr, true},
                {a, nullptr, false},
                {nullptr, a, false},
                {a, b, true},
                {a, other.as<CFStringRef>(), false}};
    for (const auto& row : rows) {
        EXPECT_EQ(StringEqual(row.first, row.second), row.equal);
        EXPECT_EQ(TCFSafeEqual(row.first, row.second), row.equal);
    }
}

TEST(FourCharacterCode, ReadsBytesMostSignificantFirstAsMacRoman) {
    // Mac Roman 0x8E is e with acute accent, 0xA5 a bullet; a zero byte ends the text.
    const std::pair<UInt32, std::string> rows[] = {
        {0x74657874, "text"}, {0x61006364, "a"}, {0, ""}, {0x8EA52020, "\xC3\xA9\xE2\x80\xA2  "}};
    for (const auto& [code, expected] : rows)
        EXPECT_EQ(TextOf(Ref(CFString::CopyAsString(code)).get()), expected) << code;
    EXPECT_EQ(TextOf(TCFString(UInt32(0x41424344))), "ABCD");
}
