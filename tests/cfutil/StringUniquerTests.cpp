// The uniquer is process-wide and never forgets, so every test uses texts of its own.
#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include "cfutil/TCFStringUniquer.h"
#include "support/LogCapture.h"
#include "support/Values.h"

using glyphwell::LogChannel;
using namespace glyphwell::testing;

namespace {

CFStringRef Unique(const std::string& bytes) {
    return TCFStringUniquer().GetUniqueString(bytes.c_str(), CFIndex(bytes.size()));
}

} // namespace

TEST(StringUniquerHash, MixesUnsignedBytesUpToTheFirstZeroAndNeverGivesZero) {
    const std::pair<const char*, CFHashCode> rows[] = {
        {"abc", 0xCC946882u},
        {"", 0x04EC889Eu},
        {"a", 0xF095343Bu},
        {"ab", 0x1B7603E0u},
        {"abcd", 0x1FB41116u},
        {"Hello, world", 0x9EC167F0u},
        {"\xC3\xA9", 0x80281D8Cu},
        {"\xFF\x80\x01", 0x9924314Eu},
        {"ab\0cd", 0x1B7603E0u},
        {"\xF7\x9B\x20\x3D\x01\x1B", 0x80000000u}, // these six bytes mix to exactly 0
    };
    for (const auto& [key, hash] : rows)
        EXPECT_EQ(utf8Hash(key), hash) << key;
}

TEST(StringUniquerCallbacks, CompareKeyBytesAndDescribeInBrackets) {
    const char first[] = "key", second[] = "key";
    EXPECT_EQ((std::vector<Boolean>{utf8Equal(first, first), utf8Equal(first, second),
                                    utf8Equal(first, "kez"), utf8Equal(first, "keys")}),
              (std::vector<Boolean>{true, true, false, false}));
    Ref description(utf8CopyDescription("caf\xC3\xA9"));
    EXPECT_EQ(Units(description.as<CFStringRef>()), u"[café]");
}

TEST(StringUniquer, EqualTextsShareOneStringWhateverFormTheyComeIn) {
    const std::string first = "shared-text \xC3\xA9", second = first;
    CFStringRef unique = Unique(first);
    ASSERT_NE(unique, nullptr);
    EXPECT_EQ(Units(unique), u"shared-text é");
    const UInt8* bytes = reinterpret_cast<const UInt8*>(second.c_str());
    const std::vector<CFStringRef> again = {
        Unique(second), TCFStringUniquer().GetUniqueString(bytes, CFIndex(second.size())),
        TCFStringUniquer().GetUniqueString(Str(first).as<CFStringRef>())};
    EXPECT_EQ(again, std::vector<CFStringRef>(3, unique));
    EXPECT_NE(Unique("shared-text \xC3\xA8"), unique);

    // A first sighting through the string form enters a string of the table's own, also beyond
    // the inline conversion buffer (300 bytes of UTF-8 in 150 units).
    for (const std::string& text : {std::string("string-form-first"), Repeat("\xC3\xA9", 150)}) {
        Ref fresh = Str(text);
        CFStringRef entered = TCFStringUniquer().GetUniqueString(fresh.as<CFStringRef>());
        EXPECT_NE(entered, fresh.get());
        EXPECT_EQ(Unique(text), entered);
        EXPECT_TRUE(CFEqual(entered, fresh.get()));
    }

    // Texts agreeing up to an embedded zero share the first entry.
    CFStringRef embedded = Unique(std::string("embedded\0one", 12));
    EXPECT_EQ(Units(embedded), std::u16string(u"embedded\0one", 12));
    EXPECT_EQ((std::vector{Unique(std::string("embedded\0two", 12)), Unique("embedded")}),
              std::vector<CFStringRef>(2, embedded));
}

TEST(StringUniquer, ReadsNoFurtherThanTheLengthWithoutATerminator) {
    // Every key length the lookup compares in its own way, entered and then found again, each
    // time from a heap block of exactly its size with no zero byte after it.
    for (size_t length = 1; length <= 24; ++length) {
        std::string key(length, 'q');
        key[0] = '#';
        std::unique_ptr<char[]> first(new char[length]), again(new char[length]);
        std::memcpy(first.get(), key.data(), length);
        std::memcpy(again.get(), key.data(), length);
        CFStringRef entered = TCFStringUniquer().GetUniqueString(first.get(), CFIndex(length));
        ASSERT_NE(entered, nullptr) << length;
        EXPECT_EQ(TCFStringUniquer().GetUniqueString(again.get(), CFIndex(length)), entered)
            << length;
        EXPECT_EQ(TextOf(entered), key);
    }
}

TEST(StringUniquer, HandsOutSharedConstantsThatReleaseDoesNotDestroy) {
    CFStringRef unique = Unique("shared-constant");
    ASSERT_NE(unique, nullptr);
    EXPECT_EQ(CFGetRetainCount(unique), 0x7fffffffffffffffL);
    for (int i = 0; i < 3; ++i)
        CFRelease(unique); // more releases than anyone retained: still alive
    CFRetain(unique);
    EXPECT_EQ(CFGetRetainCount(unique), 0x7fffffffffffffffL);
    EXPECT_EQ(Units(unique), u"shared-constant");
}

TEST(StringUniquer, InvalidUtf8IsLoggedEveryTimeAndNotEntered) {
    LogCapture log;
    EXPECT_EQ(Unique("\xC3("), nullptr);
    EXPECT_EQ(Unique("\xC3("), nullptr);
    const std::string line = "string \xC3( (length 2 : 2) could not be converted to CFString!";
    EXPECT_EQ(log.Texts(), std::vector<std::string>(2, line));
    for (const auto& record : log.Lines())
        EXPECT_TRUE(record.channel == LogChannel::Platform && record.level == 3);

    // The byte length in the line stops at an embedded zero.
    log.Clear();
    EXPECT_EQ(Unique(std::string("bad\0\xFF", 5)), nullptr);
    EXPECT_EQ(log.Texts(), std::vector<std::string>{
                               "string bad (length 5 : 3) could not be converted to CFString!"});

    // A later text is entered as usual, and "bad" was not.
    log.Clear();
    EXPECT_NE(Unique("after-invalid"), nullptr);
    EXPECT_EQ(TextOf(Unique("bad")), "bad");
    EXPECT_TRUE(log.Texts().empty());
}

TEST(StringUniquer, NoTextGivesNullAndAStringWithoutUTF8FormOrTextComesBackUnchanged) {
    const TCFStringUniquer uniquer;
    EXPECT_EQ((std::vector{uniquer.GetUniqueString(static_cast<const char*>(nullptr), 3),
                           uniquer.GetUniqueString("null-empty", 0),
                           uniquer.GetUniqueString("null-negative", -1),
                           uniquer.GetUniqueString(static_cast<CFStringRef>(nullptr))}),
              std::vector<CFStringRef>(4, nullptr));
    const UniChar loneSurrogate[] = {u'a', 0xD800};
    Ref unconvertible(CFStringCreateWithCharacters(nullptr, loneSurrogate, 2)), empty = Str("");
    EXPECT_EQ(uniquer.GetUniqueString(unconvertible.as<CFStringRef>()), unconvertible.get());
    EXPECT_EQ(uniquer.GetUniqueString(empty.as<CFStringRef>()), empty.get());
}

TEST(StringUniquer, ConcurrentCallersGetTheSameStringForEachNewText) {
    constexpr int kTexts = 10000;
    std::vector<std::vector<CFStringRef>> results(4, std::vector<CFStringRef>(kTexts));
    std::vector<std::thread> threads;
    for (int t = 0; t < 4; ++t) {
        // Half the threads go forwards, half backwards, so that they meet in the middle.
        threads.emplace_back([t, &results] {
            for (int i = 0; i < kTexts; ++i) {
                const int n = t % 2 ? kTexts - 1 - i : i;
                results[size_t(t)][size_t(n)] = Unique("concurrent-" + std::to_string(n));
            }
        });
    }
    for (std::thread& thread : threads)
        thread.join();
    EXPECT_EQ(std::vector(3, results[0]), std::vector(results.begin() + 1, results.end()));
    EXPECT_EQ(std::count(results[0].begin(), results[0].end(), nullptr), 0);
    EXPECT_EQ(Units(results[0][1234]), u"concurrent-1234");
    EXPECT_EQ(Unique("concurrent-9999"), results[0][9999]);
}
