// String utilities: tilde expansion against the password database, regional suffixes and the
// language fallback, four-character codes, null-safe equality and the shared unique strings.
#include <pwd.h>
#include <string>
#include <unistd.h>

#include <gtest/gtest.h>

#include "cfutil/CFStringUtilities.h"
#include "cfutil/FileTestSupport.h"
#include "cfutil/TCFString.h"
#include "platform/HomeDirectory.h"
#include "support/ScopedEnvironment.h"
#include "support/Values.h"

using glyphwell::testing::Ref;
using glyphwell::testing::Str;
using glyphwell::testing::TextOf;

namespace {

std::string Expand(const std::string& path) {
    Ref input = Str(path);
    Ref expanded(TCFStr::CreateStringByExpandingTildeInPath(input.as<CFStringRef>()));
    return TextOf(expanded.get());
}

std::string WithoutSuffix(const std::string& language) {
    Ref input = Str(language);
    Ref base(TCFStr(input.as<CFStringRef>()).CreateSubstringWithoutRegionalSuffix());
    return TextOf(base.get());
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

TEST(TildeExpansion, NamedUserHomeComesFromThePasswordDatabase) {
    passwd* root = getpwnam("root");
    ASSERT_NE(root, nullptr);
    std::string home = root->pw_dir;
    EXPECT_EQ(Expand("~root"), home);
    EXPECT_EQ(Expand("~root/x/y"), home + "/x/y");
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

TEST(TildeExpansion, PathsWithoutLeadingTildeOrKnownUserAreReturnedRetained) {
    for (const char* text :
         {"", "a~b", "/abs/~", "~no-such-user-glyphwell/x", "~no-such-user-glyphwell"}) {
        Ref input = Str(text);
        CFIndex before = CFGetRetainCount(input.get());
        CFStringRef result = TCFStr::CreateStringByExpandingTildeInPath(input.as<CFStringRef>());
        EXPECT_EQ(result, input.get()) << text;
        EXPECT_EQ(CFGetRetainCount(input.get()), before + 1) << text;
        CFRelease(result);
    }
}

TEST(RegionalSuffix, CutsAtFirstUnderscoreElseFirstHyphen) {
    EXPECT_EQ(WithoutSuffix("en_US"), "en");
    EXPECT_EQ(WithoutSuffix("pt-BR"), "pt");
    EXPECT_EQ(WithoutSuffix("en-US_POSIX"), "en-US");
    EXPECT_EQ(WithoutSuffix("_x"), "");
}

TEST(RegionalSuffix, ChineseAndPlainIdentifiersStayWholeAndRetained) {
    for (const char* text : {"zh_CN", "zh-Hant", "en", "zh"}) {
        Ref input = Str(text);
        CFIndex before = CFGetRetainCount(input.get());
        CFStringRef result = TCFStr(input.as<CFStringRef>()).CreateSubstringWithoutRegionalSuffix();
        EXPECT_EQ(result, input.get()) << text;
        EXPECT_EQ(CFGetRetainCount(input.get()), before + 1) << text;
        CFRelease(result);
    }
    EXPECT_EQ(TCFStr(nullptr).CreateSubstringWithoutRegionalSuffix(), nullptr);
}

TEST(LanguageLookup, FallsBackOnceToTheBaseLanguage) {
    Ref english = Str("English"), chinese = Str("Chinese"), brazilian = Str("Brazilian");
    Ref table = glyphwell::testing::Dict({{CFSTR("en"), english.get()},
                                          {CFSTR("zh"), chinese.get()},
                                          {CFSTR("pt_BR"), brazilian.get()}});
    auto lookup = [&](const char* language) {
        Ref key = Str(language);
        return CFDictionary::GetValueForLanguage(table.as<CFDictionaryRef>(),
                                                 key.as<CFStringRef>());
    };
    EXPECT_EQ(lookup("en_GB"), english.get());
    EXPECT_EQ(lookup("en-AU"), english.get());
    EXPECT_EQ(lookup("en"), english.get());
    EXPECT_EQ(lookup("pt_BR"), brazilian.get());
    EXPECT_EQ(lookup("pt"), nullptr);
    EXPECT_EQ(lookup("zh_TW"), nullptr);
    EXPECT_EQ(lookup("fr"), nullptr);
    EXPECT_EQ(CFDictionary::GetValueForLanguage(nullptr, CFSTR("en")), nullptr);
    EXPECT_EQ(CFDictionary::GetValue(nullptr, CFSTR("en")), nullptr);
    EXPECT_EQ(CFDictionary::GetValue(table.as<CFDictionaryRef>(), CFSTR("zh")), chinese.get());
}

TEST(StringEquality, NullsAndDistinctEqualStrings) {
    Ref a = Str("same"), b = Str("same"), c = Str("other");
    EXPECT_TRUE(StringEqual(nullptr, nullptr));
    EXPECT_FALSE(StringEqual(a.as<CFStringRef>(), nullptr));
    EXPECT_FALSE(StringEqual(nullptr, a.as<CFStringRef>()));
    EXPECT_TRUE(StringEqual(a.as<CFStringRef>(), b.as<CFStringRef>()));
    EXPECT_FALSE(StringEqual(a.as<CFStringRef>(), c.as<CFStringRef>()));
}

TEST(FourCharacterCode, ReadsBytesMostSignificantFirstAsMacRoman) {
    Ref text(CFString::CopyAsString(0x74657874));
    EXPECT_EQ(TextOf(text.get()), "text");
    Ref stopped(CFString::CopyAsString(0x61006364));
    EXPECT_EQ(TextOf(stopped.get()), "a");
    Ref empty(CFString::CopyAsString(0));
    EXPECT_EQ(TextOf(empty.get()), "");
    // Mac Roman 0x8E is e with acute accent, 0xA5 a bullet.
    Ref accented(CFString::CopyAsString(0x8EA52020));
    EXPECT_EQ(TextOf(accented.get()), "\xC3\xA9\xE2\x80\xA2  ");
    TCFString adopted(UInt32(0x41424344));
    EXPECT_EQ(TextOf(adopted), "ABCD");
}

TEST(UniqueString, EqualTextsShareOneString) {
    Ref a = Str("glyphwell-unique-text"), b = Str("glyphwell-unique-text");
    CFStringRef first = TCFStr(a.as<CFStringRef>()).GetUniqueString();
    CFStringRef second = TCFStr(b.as<CFStringRef>()).GetUniqueString();
    ASSERT_NE(first, nullptr);
    EXPECT_EQ(first, second);
    EXPECT_EQ(TextOf(first), "glyphwell-unique-text");
    EXPECT_EQ(TCFStr(nullptr).GetUniqueString(), nullptr);
}
