// The uniquer is process-wide and never forgets, so every test uses texts of its own.
#include <gtest/gtest.h>

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
    const char first[] = "key";
    const char second[] = "key";
    EXPECT_TRUE(utf8Equal(first, first));
    EXPECT_TRUE(utf8Equal(first, second));
    EXPECT_FALSE(utf8Equal(first, "kez"));
    EXPECT_FALSE(utf8Equal(first, "keys"));

    Ref description(utf8CopyDescription("caf\xC3\xA9"));
    EXPECT_EQ(Units(description.as<CFStringRef>()), u"[café]");
}

TEST(StringUniquer, NullAndEmptyInputsYieldNull) {
    const TCFStringUniquer uniquer;
    EXPECT_EQ(uniquer.GetUniqueString(static_cast<const char*>(nullptr), 3), nullptr);
    EXPECT_EQ(uniquer.GetUniqueString("null-empty", 0), nullptr);
    EXPECT_EQ(uniquer.GetUniqueString("null-negative", -1), nullptr);
    EXPECT_EQ(uniquer.GetUniqueString(static_cast<CFStringRef>(nullptr)), nullptr);
}

TEST(StringUniquer, EqualTextsFromDifferentBuffersShareOneString) {
    const std::string first = "shared-text \xC3\xA9";
    const std::string second = first;
    CFStringRef unique = Unique(first);
    ASSERT_NE(unique, nullptr);
    EXPECT_EQ(Units(unique), u"shared-text é");
    EXPECT_EQ(Unique(second), unique);
    const UInt8* bytes = reinterpret_cast<const UInt8*>(second.c_str());
    EXPECT_EQ(TCFStringUniquer().GetUniqueString(bytes, CFIndex(second.size())), unique);
    EXPECT_NE(Unique("shared-text \xC3\xA8"), unique);
}

TEST(StringUniquer, StringFormReturnsTheEarlierReference) {
    CFStringRef earlier = Unique("string-form");
    Ref input = Str("string-form");
    EXPECT_NE(input.get(), earlier);
    EXPECT_EQ(TCFStringUniquer().GetUniqueString(input.as<CFStringRef>()), earlier);

    // A first sighting through the string form enters a string of the table's own.
    Ref fresh = Str("string-form-first");
    CFStringRef unique = TCFStringUniquer().GetUniqueString(fresh.as<CFStringRef>());
    EXPECT_NE(unique, fresh.get());
    EXPECT_EQ(Unique("string-form-first"), unique);
}

TEST(StringUniquer, StringFormHandlesTextsBeyondTheInlineBuffer) {
    std::string text;
    for (int i = 0; i < 150; ++i)
        text += "\xC3\xA9"; // 300 bytes of UTF-8, 150 units
    Ref input = Str(text);
    CFStringRef unique = TCFStringUniquer().GetUniqueString(input.as<CFStringRef>());
    ASSERT_NE(unique, nullptr);
    EXPECT_EQ(CFStringGetLength(unique), 150);
    EXPECT_EQ(Unique(text), unique);
}

TEST(StringUniquer, TextsAgreeingUpToAnEmbeddedZeroShareTheFirstEntry) {
    const std::string first("embedded\0one", 12);
    const std::string second("embedded\0two", 12);
    CFStringRef unique = Unique(first);
    ASSERT_NE(unique, nullptr);
    EXPECT_EQ(Units(unique), std::u16string(u"embedded\0one", 12));
    EXPECT_EQ(Unique(second), unique);
    EXPECT_EQ(Unique("embedded"), unique);
}

TEST(StringUniquer, ReadsNoFurtherThanTheLengthWithoutATerminator) {
    // Exactly three bytes on the heap, with no zero byte after them.
    std::unique_ptr<char[]> bytes(new char[3]{'x', 'y', 'z'});
    CFStringRef unique = TCFStringUniquer().GetUniqueString(bytes.get(), 3);
    ASSERT_NE(unique, nullptr);
    EXPECT_EQ(Units(unique), u"xyz");
    EXPECT_EQ(Unique("xyz"), unique);

    // Every key length the lookup compares in its own way, entered and then found again, each
    // time from a heap block of exactly its size.
    for (size_t length = 1; length <= 24; ++length) {
        std::string key(length, 'q');
        key[0] = '#';
        std::unique_ptr<char[]> first(new char[length]);
        std::unique_ptr<char[]> again(new char[length]);
        std::memcpy(first.get(), key.data(), length);
        std::memcpy(again.get(), key.data(), length);
        CFStringRef entered = TCFStringUniquer().GetUniqueString(first.get(), CFIndex(length));
        ASSERT_NE(entered, nullptr) << length;
        EXPECT_EQ(TCFStringUniquer().GetUniqueString(again.get(), CFIndex(length)), entered)
            << length;
        EXPECT_EQ(CFStringGetLength(entered), CFIndex(length));
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
    EXPECT_EQ(Unique("shared-constant"), unique);
}

TEST(StringUniquer, InvalidUtf8IsLoggedEveryTimeAndNotEntered) {
    LogCapture log;
    EXPECT_EQ(Unique("\xC3("), nullptr);
    EXPECT_EQ(Unique("\xC3("), nullptr);
    const auto lines = log.Lines();
    ASSERT_EQ(lines.size(), 2u);
    for (const auto& line : lines) {
        EXPECT_EQ(line.channel, LogChannel::Platform);
        EXPECT_EQ(line.level, 3);
        EXPECT_EQ(line.text, "string \xC3( (length 2 : 2) could not be converted to CFString!");
    }

    // The byte length in the line stops at an embedded zero.
    log.Clear();
    EXPECT_EQ(Unique(std::string("bad\0\xFF", 5)), nullptr);
    EXPECT_EQ(log.Texts(), std::vector<std::string>{
                               "string bad (length 5 : 3) could not be converted to CFString!"});

    // A later text is entered as usual, and "bad" was not.
    log.Clear();
    EXPECT_NE(Unique("after-invalid"), nullptr);
    CFStringRef bad = Unique("bad");
    ASSERT_NE(bad, nullptr);
    EXPECT_EQ(Units(bad), u"bad");
    EXPECT_TRUE(log.Texts().empty());
}

TEST(StringUniquer, StringWithoutUtf8FormOrTextIsReturnedUnchanged) {
    const UniChar loneSurrogate[] = {u'a', 0xD800};
    Ref unconvertible(CFStringCreateWithCharacters(nullptr, loneSurrogate, 2));
    EXPECT_EQ(TCFStringUniquer().GetUniqueString(unconvertible.as<CFStringRef>()),
              unconvertible.get());

    Ref empty = Str("");
    EXPECT_EQ(TCFStringUniquer().GetUniqueString(empty.as<CFStringRef>()), empty.get());
}

TEST(StringUniquer, ConcurrentCallersGetTheSameStringForEachNewText) {
    constexpr int kTexts = 10000;
    constexpr int kThreads = 4;
    std::vector<std::vector<CFStringRef>> results(kThreads);
    std::vector<std::thread> threads;
    for (int t = 0; t < kThreads; ++t) {
        threads.emplace_back([t, &results] {
            const TCFStringUniquer uniquer;
            std::vector<CFStringRef>& mine = results[size_t(t)];
            mine.resize(kTexts);
            // Half the threads go forwards, half backwards, so that they meet in the middle.
            for (int i = 0; i < kTexts; ++i) {
                const int n = t % 2 ? kTexts - 1 - i : i;
                const std::string text = "concurrent-" + std::to_string(n);
                mine[size_t(n)] = uniquer.GetUniqueString(text.c_str(), CFIndex(text.size()));
            }
        });
    }
    for (std::thread& thread : threads)
        thread.join();

    for (int n = 0; n < kTexts; ++n) {
        ASSERT_NE(results[0][size_t(n)], nullptr);
        for (int t = 1; t < kThreads; ++t)
            ASSERT_EQ(results[size_t(t)][size_t(n)], results[0][size_t(n)]) << n;
    }
    EXPECT_EQ(Units(results[0][1234]), u"concurrent-1234");
    EXPECT_EQ(Unique("concurrent-9999"), results[0][9999]);
}
