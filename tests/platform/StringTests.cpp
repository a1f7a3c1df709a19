#include <gtest/gtest.h>

#include <optional>
#include <string>
#include <thread>
#include <tuple>
#include <vector>

#include "platform/CFString.h"
#include "tests/platform/ContainerTestSupport.h"
#include "tests/support/LogCapture.h"
#include "tests/support/Values.h"

using glyphwell::testing::LogCapture;
using glyphwell::testing::Own;
using glyphwell::testing::Owned;
using glyphwell::testing::TextOf;
using glyphwell::testing::Units;
using namespace std::string_literals;

namespace {

Owned<CFStringRef> FromBytes(const std::string& bytes, CFStringEncoding encoding,
                             bool external = false) {
    return Own(CFStringCreateWithBytes(nullptr, reinterpret_cast<const UInt8*>(bytes.data()),
                                       CFIndex(bytes.size()), encoding, external));
}

Owned<CFStringRef> FromUnits(const std::u16string& units) {
    return Own(CFStringCreateWithCharacters(nullptr, reinterpret_cast<const UniChar*>(units.data()),
                                            CFIndex(units.size())));
}

/// The outcome of CFStringGetBytes over the whole string into a buffer of `capacity` bytes.
struct Converted {
    CFIndex units;
    std::string bytes;
    bool operator==(const Converted&) const = default;
};

Converted Convert(CFStringRef string, CFStringEncoding encoding, size_t capacity,
                  UInt8 lossByte = 0, bool external = false) {
    std::string buffer(capacity, '\0');
    CFIndex used = -1;
    CFIndex units = CFStringGetBytes(string, CFRangeMake(0, CFStringGetLength(string)), encoding,
                                     lossByte, external, reinterpret_cast<UInt8*>(buffer.data()),
                                     CFIndex(capacity), &used);
    buffer.resize(size_t(used));
    return {units, buffer};
}

TEST(StringFromBytes, DecodesEachEncodingAndByteOrderMarkRules) {
    const CFStringEncoding utf8 = kCFStringEncodingUTF8, utf16 = kCFStringEncodingUTF16;
    const struct Case {
        std::string bytes;
        CFStringEncoding encoding;
        bool external;
        std::optional<std::u16string> units; ///< none: refused
    } cases[] = {
        {"a\xC3\xA9\xE2\x82\xAC\xF0\x9F\x98\x80", utf8, false, u"a\u00E9\u20AC\U0001F600"},
        {"\x7F\xC2\x80\xDF\xBF\xE0\xA0\x80\xED\x9F\xBF\xEE\x80\x80\xEF\xBF\xBF\xF0\x90\x80\x80"
         "\xF4\x8F\xBF\xBF",
         utf8, false, u"\x7F\x80\u07FF\u0800\uD7FF\uE000\uFFFF\U00010000\U0010FFFF"},
        // UTF-8: the mark goes only for an external representation.
        {"\xEF\xBB\xBF\x61", utf8, true, u"a"},
        {"\xEF\xBB\xBF\x61", utf8, false, u"\uFEFFa"},
        // UTF-16: a mark is honoured and removed; without one, external means big-endian.
        {"\x00\x61\x00\x62"s, utf16, true, u"ab"},
        {"\xFF\xFE\x61\x00"s, utf16, true, u"a"},
        {"\xFE\xFF\x00\x61"s, utf16, false, u"a"},
        {"\x61\x00"s, utf16, false, u"a"},
        {"\x00\x61"s, kCFStringEncodingUTF16BE, false, u"a"},
        {"\xFE\xFF\x00\x61"s, kCFStringEncodingUTF16BE, true, u"a"},
        {"\x61\x00"s, kCFStringEncodingUTF16LE, false, u"a"},
        {"\x00\x61\x00"s, utf16, false, std::nullopt},
        {"a\x80", kCFStringEncodingASCII, false, std::nullopt},
        {"a\xE9", kCFStringEncodingISOLatin1, false, u"a\u00E9"},
        {"\x80\x8E\xA5", kCFStringEncodingMacRoman, false, u"\u00C4\u00E9\u2022"},
        {"\x00\x01\xF6\x00"s, kCFStringEncodingUTF32BE, false, u"\U0001F600"},
        {"\x00\xF6\x01\x00"s, kCFStringEncodingUTF32LE, false, u"\U0001F600"},
        {"\x00\x11\x00\x00"s, kCFStringEncodingUTF32BE, false, std::nullopt},
        {"\x00\x00\xD8\x00"s, kCFStringEncodingUTF32BE, false, std::nullopt},
        {"abc", kCFStringEncodingInvalidId, false, std::nullopt},
    };
    for (const Case& row : cases) {
        SCOPED_TRACE(testing::Message() << row.encoding << " " << row.bytes);
        auto string = FromBytes(row.bytes, row.encoding, row.external);
        EXPECT_EQ(string ? std::optional(Units(string.get())) : std::nullopt, row.units);
    }
    // Overlongs, surrogates, out of range, stray and truncated sequences; the last one after the
    // eight-byte ASCII path.
    for (const char* bytes :
         {"\xC0\xAF", "\xC1\xBF", "\xE0\x80\xAF", "\xE0\x9F\xBF", "\xF0\x80\x80\xAF",
          "\xF0\x8F\xBF\xBF", "\xED\xA0\x80", "\xED\xBF\xBF", "\xF4\x90\x80\x80",
          "\xF5\x80\x80\x80", "\xFF", "\x80", "\xE2\x82", "\xF0\x9F\x98", "\xC3", "\xC3\x41",
          "abcdefghijklmnop\xC0\xAF"})
        EXPECT_FALSE(FromBytes(bytes, utf8)) << "bytes: " << bytes;
}

TEST(StringGetBytes, RoomyAndExactBuffersGiveTheSameUTF8) {
    // ASCII runs of every length up to 40 around each width of character: a buffer with room
    // for 3 bytes per unit and one of exactly the UTF-8 size take different paths. The text is
    // held as UTF-16 units, so that it is converted rather than copied.
    for (const char* other : {"\xC3\xA9", "\xE2\x82\xAC", "\xF0\x9F\x98\x80"}) {
        for (size_t run = 0; run <= 40; ++run) {
            std::string text;
            for (size_t i = 0; i < run; ++i)
                text += char('a' + i % 26);
            text = text + other + text.substr(0, run / 2) + other;
            auto string = FromUnits(Units(FromBytes(text, kCFStringEncodingUTF8).get()));
            const Converted whole{CFStringGetLength(string.get()), text};
            EXPECT_EQ(Convert(string.get(), kCFStringEncodingUTF8, 3 * text.size()), whole) << run;
            EXPECT_EQ(Convert(string.get(), kCFStringEncodingUTF8, text.size()), whole) << run;
        }
    }
}

// A unit that does not fit or cannot be converted ends the conversion unless a loss byte stands
// in; a pair is never cut; only external UTF-16 gets a byte order mark.
TEST(StringGetBytes, ConvertsWholeUnitsIntoTheBufferAndReportsHowFarItGot) {
    const CFStringEncoding utf8 = kCFStringEncodingUTF8, utf16 = kCFStringEncodingUTF16,
                           be16 = kCFStringEncodingUTF16BE, be32 = kCFStringEncodingUTF32BE,
                           le32 = kCFStringEncodingUTF32LE;
    auto mixed = FromBytes("a\xE2\x82\xAC\xF0\x9F\x98\x80", utf8);
    auto ascii = FromBytes("abcdefghijklmnopqrst", utf8);
    auto lone = FromUnits(u"ab\xD800"
                          u"c\xDC00");
    auto accented = FromUnits(u"a\u00E9\U0001F600b"), astral = FromUnits(u"a\U0001F600");
    const struct Case {
        CFStringRef string;
        CFStringEncoding encoding;
        size_t capacity;
        UInt8 loss;
        bool external;
        Converted result;
    } cases[] = {
        {mixed.get(), utf8, 8, 0, false, {4, "a\xE2\x82\xAC\xF0\x9F\x98\x80"}},
        {mixed.get(), utf8, 4, 0, false, {2, "a\xE2\x82\xAC"}},
        {mixed.get(), utf8, 7, 0, false, {2, "a\xE2\x82\xAC"}},
        {mixed.get(), utf8, 3, 0, false, {1, "a"}},
        {ascii.get(), utf8, 13, 0, false, {13, "abcdefghijklm"}},
        {lone.get(), utf8, 16, 0, false, {2, "ab"}},
        {lone.get(), utf8, 16, '?', false, {5, "ab?c?"}},
        {accented.get(), kCFStringEncodingASCII, 16, 0, false, {1, "a"}},
        {accented.get(), kCFStringEncodingASCII, 16, '?', false, {5, "a??b"}}, // one for the pair
        {accented.get(), kCFStringEncodingISOLatin1, 16, 0, false, {2, "a\xE9"}},
        {accented.get(), kCFStringEncodingMacRoman, 16, 0, false, {2, "a\x8E"}},
        {astral.get(), utf8, 16, 0, true, {3, "a\xF0\x9F\x98\x80"}},
        {astral.get(), utf16, 16, 0, true, {3, "\xFF\xFE\x61\x00\x3D\xD8\x00\xDE"s}},
        {astral.get(), utf16, 16, 0, false, {3, "\x61\x00\x3D\xD8\x00\xDE"s}},
        {astral.get(), be16, 16, 0, true, {3, "\x00\x61\xD8\x3D\xDE\x00"s}},
        {astral.get(), be32, 16, 0, false, {3, "\x00\x00\x00\x61\x00\x01\xF6\x00"s}},
        {astral.get(), le32, 16, 0, false, {3, "\x61\x00\x00\x00\x00\xF6\x01\x00"s}},
    };
    for (const Case& row : cases) {
        SCOPED_TRACE(testing::Message() << row.encoding << " into " << row.capacity);
        EXPECT_EQ(Convert(row.string, row.encoding, row.capacity, row.loss, row.external),
                  row.result);
    }
    // Without a buffer: the units and bytes a range would take; half a pair at the end of the
    // range converts nothing.
    for (const auto& [range, units, used] :
         {std::tuple{CFRangeMake(0, 4), 4, 8}, std::tuple{CFRangeMake(2, 1), 0, 0}}) {
        CFIndex taken = -1;
        EXPECT_EQ(CFStringGetBytes(mixed.get(), range, utf8, 0, false, nullptr, 0, &taken), units);
        EXPECT_EQ(taken, used);
    }
}

TEST(StringSizes, MaximumSizesPerEncodingAndFileSystemRepresentation) {
    const std::pair<CFStringEncoding, CFIndex> sizes[] = {
        {kCFStringEncodingUTF8, 30},
        {kCFStringEncodingUTF16, 20},
        {kCFStringEncodingUTF32LE, 40},
        {kCFStringEncodingMacRoman, 10},
        {kCFStringEncodingInvalidId, kCFNotFound}};
    for (const auto& [encoding, size] : sizes)
        EXPECT_EQ(CFStringGetMaximumSizeForEncoding(10, encoding), size) << encoding;
    auto path = FromBytes("/tmp/\xC3\xA9", kCFStringEncodingUTF8);
    EXPECT_EQ(CFStringGetMaximumSizeOfFileSystemRepresentation(path.get()), 19);
    char exact[8];
    ASSERT_TRUE(CFStringGetFileSystemRepresentation(path.get(), exact, sizeof exact));
    EXPECT_STREQ(exact, "/tmp/\xC3\xA9");
    char shortBuffer[7];
    EXPECT_FALSE(CFStringGetFileSystemRepresentation(path.get(), shortBuffer, sizeof shortBuffer));
    EXPECT_FALSE(CFStringGetCString(FromUnits(u"a\xD800").get(), exact, sizeof exact,
                                    kCFStringEncodingUTF8));
}

TEST(ConstantString, SameTextGivesTheSameImmortalReference) {
    CFStringRef first = CFSTR("glyphwell constant");
    EXPECT_EQ(first, CFSTR("glyphwell constant"));
    EXPECT_NE(first, CFSTR("glyphwell constant!"));
    CFRelease(first);
    CFRelease(first);
    EXPECT_EQ(CFStringGetLength(first), 18);
    EXPECT_TRUE(CFEqual(first, FromBytes("glyphwell constant", kCFStringEncodingUTF8).get()));
    EXPECT_EQ(Units(CFSTR("\xC3\xA9\xF0\x9F\x98\x80")), u"\u00E9\U0001F600");

    std::vector<CFStringRef> seen(8);
    std::vector<std::thread> threads;
    for (size_t i = 0; i < seen.size(); ++i)
        threads.emplace_back([&seen, i] { seen[i] = CFSTR("made on many threads"); });
    for (std::thread& thread : threads)
        thread.join();
    EXPECT_EQ(seen, std::vector<CFStringRef>(8, seen[0]));
}

TEST(StringCompare, OrdersByUnitsFoldsOnlyASCIILettersAndFindsWithOptions) {
    const CFOptionFlags fold = kCFCompareCaseInsensitive;
    // Unit order, not code point order: U+FF21 sorts after the surrogates of U+1F600.
    auto fullwidth = FromUnits(u"\uFF21"), astral = FromUnits(u"\U0001F600");
    const struct {
        CFStringRef a, b;
        CFOptionFlags options;
        CFComparisonResult order;
    } orders[] = {
        {CFSTR("a"), CFSTR("b"), 0, kCFCompareLessThan},
        {CFSTR("abc"), CFSTR("ab"), 0, kCFCompareGreaterThan},
        {CFSTR("ABC"), CFSTR("abc"), 0, kCFCompareLessThan},
        {CFSTR("ABC"), CFSTR("abc"), fold, kCFCompareEqualTo},
        {CFSTR("\xC3\x89"), CFSTR("\xC3\xA9"), fold, kCFCompareLessThan},
        {fullwidth.get(), astral.get(), 0, kCFCompareGreaterThan},
    };
    for (const auto& row : orders)
        EXPECT_EQ(CFStringCompare(row.a, row.b, row.options), row.order) << TextOf(row.a);
    EXPECT_EQ(CFStringCompareWithOptions(CFSTR("xxabc"), CFSTR("ABC"), CFRangeMake(2, 3), fold),
              kCFCompareEqualTo);

    const CFOptionFlags back = kCFCompareBackwards, anchored = kCFCompareAnchored;
    const struct {
        CFStringRef find;
        CFOptionFlags options;
        CFIndex location, length;
    } finds[] = {{CFSTR("bc"), 0, 1, 2},
                 {CFSTR("bc"), back, 4, 2},
                 {CFSTR("bc"), anchored, -1, 0},
                 {CFSTR("ab"), anchored, 0, 2},
                 {CFSTR("bc"), anchored | back, 4, 2},
                 {CFSTR("BC"), fold, 1, 2},
                 {CFSTR("BC"), 0, -1, 0},
                 {CFSTR(""), 0, -1, 0},
                 {CFSTR("abcabcd"), 0, -1, 0}};
    CFStringRef text = CFSTR("abcabc");
    for (const auto& row : finds) {
        const CFRange range = CFStringFind(text, row.find, row.options);
        EXPECT_EQ(std::pair(range.location, range.length),
                  std::pair(row.location < 0 ? kCFNotFound : row.location, row.length))
            << TextOf(row.find) << " " << row.options;
    }
    CFRange found{};
    EXPECT_TRUE(CFStringFindWithOptions(text, CFSTR("ab"), CFRangeMake(1, 5), 0, &found));
    EXPECT_EQ(found.location, 3);
    EXPECT_FALSE(CFStringFindWithOptions(text, CFSTR("ab"), CFRangeMake(1, 3), 0, &found));
    EXPECT_EQ((std::vector<bool>{bool(CFStringHasPrefix(text, CFSTR("abc"))),
                                 bool(CFStringHasPrefix(text, CFSTR("bc"))),
                                 bool(CFStringHasSuffix(text, CFSTR("cabc"))),
                                 bool(CFStringHasSuffix(text, CFSTR("ab")))}),
              (std::vector<bool>{true, false, true, false}));
}

TEST(MutableString, EditsInPlace) {
    auto string = Own(CFStringCreateMutable(nullptr, 0));
    CFStringAppend(string.get(), CFSTR("held"));
    CFStringAppendCString(string.get(), " w\xC3\xB6rld", kCFStringEncodingUTF8);
    CFStringInsert(string.get(), 0, CFSTR("<"));
    CFStringReplace(string.get(), CFRangeMake(1, 4), CFSTR("hello"));
    CFStringDelete(string.get(), CFRangeMake(0, 1));
    CFStringAppend(string.get(), string.get());
    EXPECT_EQ(Units(string.get()), u"hello w\u00F6rldhello w\u00F6rld");
}
// Equality and hashing across the kept forms are the string form tests'.
TEST(StringValue, HashFollowsEditsDescriptionAndFormat) {
    auto immutable = FromBytes("caf\xC3\xA9", kCFStringEncodingUTF8);
    // The hash follows a mutable string's edits; an immutable string's stays (it is kept).
    auto edited = Own(CFStringCreateMutableCopy(nullptr, 0, CFSTR("caf")));
    const CFHashCode before = CFHash(edited.get());
    EXPECT_EQ(before, CFHash(CFSTR("caf")));
    CFStringAppendCharacters(edited.get(), reinterpret_cast<const UniChar*>(u"\u00E9"), 1);
    EXPECT_NE(CFHash(edited.get()), before);
    EXPECT_EQ(CFHash(edited.get()), CFHash(immutable.get()));
    EXPECT_EQ(CFHash(immutable.get()), CFHash(immutable.get()));

    auto description = Own(CFCopyDescription(immutable.get()));
    EXPECT_TRUE(CFEqual(description.get(), immutable.get()));

    auto formatted = Own(
        CFStringCreateWithFormat(nullptr, nullptr, CFSTR("%d-%s-%@"), 7, "x", CFSTR("\xC3\xA9")));
    EXPECT_EQ(Units(formatted.get()), u"7-x-\u00E9");
}

} // namespace
