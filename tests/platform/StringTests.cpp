#include <gtest/gtest.h>

#include <string>
#include <thread>
#include <vector>

#include "platform/CFString.h"
#include "tests/platform/ContainerTestSupport.h"
#include "tests/support/LogCapture.h"
#include "tests/support/Values.h"

using glyphwell::testing::LogCapture;
using glyphwell::testing::Own;
using glyphwell::testing::Owned;
using glyphwell::testing::Units;

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

TEST(StringFromUTF8, DecodesEverySequenceLengthAndAstralCharactersAsPairs) {
    auto string = FromBytes("a\xC3\xA9\xE2\x82\xAC\xF0\x9F\x98\x80", kCFStringEncodingUTF8);
    ASSERT_TRUE(string);
    EXPECT_EQ(Units(string.get()), (std::u16string{0x61, 0xE9, 0x20AC, 0xD83D, 0xDE00}));
}

TEST(StringFromUTF8, AcceptsTheBoundaryCodePoints) {
    auto string = FromBytes("\x7F\xC2\x80\xDF\xBF\xE0\xA0\x80\xED\x9F\xBF\xEE\x80\x80\xEF\xBF\xBF"
                            "\xF0\x90\x80\x80\xF4\x8F\xBF\xBF",
                            kCFStringEncodingUTF8);
    ASSERT_TRUE(string);
    EXPECT_EQ(Units(string.get()), (std::u16string{0x7F, 0x80, 0x7FF, 0x800, 0xD7FF, 0xE000, 0xFFFF,
                                                   0xD800, 0xDC00, 0xDBFF, 0xDFFF}));
}

TEST(StringFromUTF8, RejectsOverlongsSurrogatesOutOfRangeAndTruncatedSequences) {
    const char* const malformed[] = {
        "\xC0\xAF",
        "\xC1\xBF",
        "\xE0\x80\xAF",
        "\xE0\x9F\xBF",
        "\xF0\x80\x80\xAF",
        "\xF0\x8F\xBF\xBF",
        "\xED\xA0\x80",
        "\xED\xBF\xBF",
        "\xF4\x90\x80\x80",
        "\xF5\x80\x80\x80",
        "\xFF",
        "\x80",
        "\xE2\x82",
        "\xF0\x9F\x98",
        "\xC3",
        "\xC3\x41",
        "abcdefghijklmnop\xC0\xAF", // after the eight-byte ASCII path
    };
    for (const char* bytes : malformed)
        EXPECT_FALSE(FromBytes(bytes, kCFStringEncodingUTF8)) << "bytes: " << bytes;
}

TEST(StringFromBytes, ByteOrderMarkRules) {
    // UTF-8: the mark goes only for an external representation.
    EXPECT_EQ(Units(FromBytes("\xEF\xBB\xBF"
                              "a",
                              kCFStringEncodingUTF8, true)
                        .get()),
              u"a");
    EXPECT_EQ(Units(FromBytes("\xEF\xBB\xBF"
                              "a",
                              kCFStringEncodingUTF8)
                        .get()),
              u"\uFEFFa");
    // UTF-16: a mark is honoured and removed; without one, external means big-endian.
    using namespace std::string_literals;
    EXPECT_EQ(Units(FromBytes("\x00\x61\x00\x62"s, kCFStringEncodingUTF16, true).get()), u"ab");
    EXPECT_EQ(Units(FromBytes("\xFF\xFE\x61\x00"s, kCFStringEncodingUTF16, true).get()), u"a");
    EXPECT_EQ(Units(FromBytes("\xFE\xFF\x00\x61"s, kCFStringEncodingUTF16).get()), u"a");
    EXPECT_EQ(Units(FromBytes("\x61\x00"s, kCFStringEncodingUTF16).get()), u"a");
    EXPECT_EQ(Units(FromBytes("\x00\x61"s, kCFStringEncodingUTF16BE).get()), u"a");
    EXPECT_EQ(Units(FromBytes("\xFE\xFF\x00\x61"s, kCFStringEncodingUTF16BE, true).get()), u"a");
    EXPECT_EQ(Units(FromBytes("\x61\x00"s, kCFStringEncodingUTF16LE).get()), u"a");
    EXPECT_FALSE(FromBytes("\x00\x61\x00"s, kCFStringEncodingUTF16));
}

TEST(StringFromBytes, SingleByteAndUTF32Encodings) {
    using namespace std::string_literals;
    EXPECT_FALSE(FromBytes("a\x80", kCFStringEncodingASCII));
    EXPECT_EQ(Units(FromBytes("a\xE9", kCFStringEncodingISOLatin1).get()), u"a\u00E9");
    EXPECT_EQ(Units(FromBytes("\x80\x8E\xA5", kCFStringEncodingMacRoman).get()),
              u"\u00C4\u00E9\u2022");
    EXPECT_EQ(Units(FromBytes("\x00\x01\xF6\x00"s, kCFStringEncodingUTF32BE).get()), u"\U0001F600");
    EXPECT_EQ(Units(FromBytes("\x00\xF6\x01\x00"s, kCFStringEncodingUTF32LE).get()), u"\U0001F600");
    EXPECT_FALSE(FromBytes("\x00\x11\x00\x00"s, kCFStringEncodingUTF32BE));
    EXPECT_FALSE(FromBytes("\x00\x00\xD8\x00"s, kCFStringEncodingUTF32BE));
    EXPECT_FALSE(FromBytes("abc", kCFStringEncodingInvalidId));
}

TEST(StringGetBytes, CountsUnitsAndBytesWithoutABuffer) {
    auto string = FromBytes("a\xE2\x82\xAC\xF0\x9F\x98\x80", kCFStringEncodingUTF8);
    CFIndex used = -1;
    EXPECT_EQ(CFStringGetBytes(string.get(), CFRangeMake(0, 4), kCFStringEncodingUTF8, 0, true,
                               nullptr, 0, &used),
              4);
    EXPECT_EQ(used, 8);
    Converted all = Convert(string.get(), kCFStringEncodingUTF8, 8);
    EXPECT_EQ(all.units, 4);
    EXPECT_EQ(all.bytes, "a\xE2\x82\xAC\xF0\x9F\x98\x80");
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
            const CFIndex length = CFStringGetLength(string.get());
            Converted roomy = Convert(string.get(), kCFStringEncodingUTF8, 3 * size_t(length));
            Converted exact = Convert(string.get(), kCFStringEncodingUTF8, text.size());
            EXPECT_EQ(roomy.units, length) << run;
            EXPECT_EQ(roomy.bytes, text) << run;
            EXPECT_EQ(exact.units, length) << run;
            EXPECT_EQ(exact.bytes, text) << run;
        }
    }
}

TEST(StringGetBytes, StopsBeforeAUnitThatDoesNotFitAndKeepsPairsWhole) {
    auto string = FromBytes("a\xE2\x82\xAC\xF0\x9F\x98\x80", kCFStringEncodingUTF8);
    for (size_t capacity : {4, 5, 6, 7}) {
        Converted part = Convert(string.get(), kCFStringEncodingUTF8, capacity);
        EXPECT_EQ(part.units, 2) << capacity;
        EXPECT_EQ(part.bytes, "a\xE2\x82\xAC") << capacity;
    }
    EXPECT_EQ(Convert(string.get(), kCFStringEncodingUTF8, 3).bytes, "a");
    auto ascii = FromBytes("abcdefghijklmnopqrst", kCFStringEncodingUTF8);
    EXPECT_EQ(Convert(ascii.get(), kCFStringEncodingUTF8, 13).bytes, "abcdefghijklm");
    // Half a pair at the end of the range cannot be converted.
    CFIndex used = -1;
    EXPECT_EQ(CFStringGetBytes(string.get(), CFRangeMake(2, 1), kCFStringEncodingUTF8, 0, false,
                               nullptr, 0, &used),
              0);
    EXPECT_EQ(used, 0);
}

TEST(StringGetBytes, StopsAtAnUnconvertibleUnitUnlessALossByteStandsIn) {
    auto lone = FromUnits(u"ab\xD800"
                          u"c\xDC00");
    Converted strict = Convert(lone.get(), kCFStringEncodingUTF8, 16);
    EXPECT_EQ(strict.units, 2);
    EXPECT_EQ(strict.bytes, "ab");
    Converted lossy = Convert(lone.get(), kCFStringEncodingUTF8, 16, '?');
    EXPECT_EQ(lossy.units, 5);
    EXPECT_EQ(lossy.bytes, "ab?c?");

    auto accented = FromUnits(u"a\u00E9\U0001F600b");
    EXPECT_EQ(Convert(accented.get(), kCFStringEncodingASCII, 16).bytes, "a");
    Converted ascii = Convert(accented.get(), kCFStringEncodingASCII, 16, '?');
    EXPECT_EQ(ascii.units, 5);
    EXPECT_EQ(ascii.bytes, "a??b"); // one loss byte for the whole pair
    EXPECT_EQ(Convert(accented.get(), kCFStringEncodingISOLatin1, 16).bytes, "a\xE9");
    EXPECT_EQ(Convert(accented.get(), kCFStringEncodingMacRoman, 16).bytes, "a\x8E");
}

TEST(StringGetBytes, WritesAByteOrderMarkOnlyForExternalUTF16) {
    using namespace std::string_literals;
    auto string = FromUnits(u"a\U0001F600");
    EXPECT_EQ(Convert(string.get(), kCFStringEncodingUTF8, 16, 0, true).bytes, "a\xF0\x9F\x98\x80");
    EXPECT_EQ(Convert(string.get(), kCFStringEncodingUTF16, 16, 0, true).bytes,
              "\xFF\xFE\x61\x00\x3D\xD8\x00\xDE"s);
    EXPECT_EQ(Convert(string.get(), kCFStringEncodingUTF16, 16).bytes, "\x61\x00\x3D\xD8\x00\xDE"s);
    EXPECT_EQ(Convert(string.get(), kCFStringEncodingUTF16BE, 16, 0, true).bytes,
              "\x00\x61\xD8\x3D\xDE\x00"s);
    EXPECT_EQ(Convert(string.get(), kCFStringEncodingUTF32BE, 16).bytes,
              "\x00\x00\x00\x61\x00\x01\xF6\x00"s);
    EXPECT_EQ(Convert(string.get(), kCFStringEncodingUTF32LE, 16).bytes,
              "\x61\x00\x00\x00\x00\xF6\x01\x00"s);
}

TEST(StringGetBytes, RangeOutsideTheStringIsReportedAndConvertsNothing) {
    LogCapture log;
    auto string = FromBytes("abc", kCFStringEncodingUTF8);
    CFIndex used = -1;
    EXPECT_EQ(CFStringGetBytes(string.get(), CFRangeMake(2, 2), kCFStringEncodingUTF8, 0, false,
                               nullptr, 0, &used),
              0);
    EXPECT_EQ(used, 0);
    ASSERT_EQ(log.Texts().size(), 2u);
    EXPECT_EQ(log.Texts()[1].rfind("Invalid parameter not satisfying: ", 0), 0u);
}

TEST(StringSizes, MaximumSizesPerEncodingAndFileSystemRepresentation) {
    EXPECT_EQ(CFStringGetMaximumSizeForEncoding(10, kCFStringEncodingUTF8), 30);
    EXPECT_EQ(CFStringGetMaximumSizeForEncoding(10, kCFStringEncodingUTF16), 20);
    EXPECT_EQ(CFStringGetMaximumSizeForEncoding(10, kCFStringEncodingUTF32LE), 40);
    EXPECT_EQ(CFStringGetMaximumSizeForEncoding(10, kCFStringEncodingMacRoman), 10);
    EXPECT_EQ(CFStringGetMaximumSizeForEncoding(10, kCFStringEncodingInvalidId), kCFNotFound);

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
    for (CFStringRef string : seen)
        EXPECT_EQ(string, seen[0]);
}

TEST(StringCompare, OrdersByUnitsAndFoldsOnlyASCIILetters) {
    EXPECT_EQ(CFStringCompare(CFSTR("a"), CFSTR("b"), 0), kCFCompareLessThan);
    EXPECT_EQ(CFStringCompare(CFSTR("abc"), CFSTR("ab"), 0), kCFCompareGreaterThan);
    EXPECT_EQ(CFStringCompare(CFSTR("ABC"), CFSTR("abc"), 0), kCFCompareLessThan);
    EXPECT_EQ(CFStringCompare(CFSTR("ABC"), CFSTR("abc"), kCFCompareCaseInsensitive),
              kCFCompareEqualTo);
    EXPECT_NE(CFStringCompare(CFSTR("\xC3\x89"), CFSTR("\xC3\xA9"), kCFCompareCaseInsensitive),
              kCFCompareEqualTo);
    // Unit order, not code point order: U+FF21 sorts after the surrogates of U+1F600.
    EXPECT_EQ(CFStringCompare(FromUnits(u"\uFF21").get(), FromUnits(u"\U0001F600").get(), 0),
              kCFCompareGreaterThan);
    EXPECT_EQ(CFStringCompareWithOptions(CFSTR("xxabc"), CFSTR("ABC"), CFRangeMake(2, 3),
                                         kCFCompareCaseInsensitive),
              kCFCompareEqualTo);
}

TEST(StringFind, HonoursBackwardsAnchoredAndCaseInsensitive) {
    auto expectRange = [](CFRange range, CFIndex location, CFIndex length) {
        EXPECT_EQ(range.location, location);
        EXPECT_EQ(range.length, length);
    };
    CFStringRef text = CFSTR("abcabc");
    expectRange(CFStringFind(text, CFSTR("bc"), 0), 1, 2);
    expectRange(CFStringFind(text, CFSTR("bc"), kCFCompareBackwards), 4, 2);
    expectRange(CFStringFind(text, CFSTR("bc"), kCFCompareAnchored), kCFNotFound, 0);
    expectRange(CFStringFind(text, CFSTR("ab"), kCFCompareAnchored), 0, 2);
    expectRange(CFStringFind(text, CFSTR("bc"), kCFCompareAnchored | kCFCompareBackwards), 4, 2);
    expectRange(CFStringFind(text, CFSTR("BC"), kCFCompareCaseInsensitive), 1, 2);
    expectRange(CFStringFind(text, CFSTR("BC"), 0), kCFNotFound, 0);
    expectRange(CFStringFind(text, CFSTR(""), 0), kCFNotFound, 0);
    expectRange(CFStringFind(text, CFSTR("abcabcd"), 0), kCFNotFound, 0);

    CFRange found{};
    EXPECT_TRUE(CFStringFindWithOptions(text, CFSTR("ab"), CFRangeMake(1, 5), 0, &found));
    expectRange(found, 3, 2);
    EXPECT_FALSE(CFStringFindWithOptions(text, CFSTR("ab"), CFRangeMake(1, 3), 0, &found));

    EXPECT_TRUE(CFStringHasPrefix(text, CFSTR("abc")));
    EXPECT_FALSE(CFStringHasPrefix(text, CFSTR("bc")));
    EXPECT_TRUE(CFStringHasSuffix(text, CFSTR("cabc")));
    EXPECT_FALSE(CFStringHasSuffix(text, CFSTR("ab")));
}

TEST(MutableString, EditsInPlaceAndIgnoresBadRangesAndImmutableStrings) {
    auto string = Own(CFStringCreateMutable(nullptr, 0));
    CFStringAppend(string.get(), CFSTR("held"));
    CFStringAppendCString(string.get(), " w\xC3\xB6rld", kCFStringEncodingUTF8);
    CFStringInsert(string.get(), 0, CFSTR("<"));
    CFStringReplace(string.get(), CFRangeMake(1, 4), CFSTR("hello"));
    CFStringDelete(string.get(), CFRangeMake(0, 1));
    CFStringAppend(string.get(), string.get());
    EXPECT_EQ(Units(string.get()), u"hello w\u00F6rldhello w\u00F6rld");

    LogCapture log;
    CFStringDelete(string.get(), CFRangeMake(20, 5));
    EXPECT_EQ(CFStringGetLength(string.get()), 22);
    auto fixed = FromBytes("fixed", kCFStringEncodingUTF8);
    CFStringAppend(const_cast<CFMutableStringRef>(fixed.get()), CFSTR("!"));
    EXPECT_EQ(Units(fixed.get()), u"fixed");
    EXPECT_EQ(log.Texts().size(), 4u); // two assertion reports, two lines each
}

TEST(StringValue, EqualityHashDescriptionAndFormat) {
    auto immutable = FromBytes("caf\xC3\xA9", kCFStringEncodingUTF8);
    auto mutableCopy = Own(CFStringCreateMutableCopy(nullptr, 0, immutable.get()));
    EXPECT_TRUE(CFEqual(immutable.get(), mutableCopy.get()));
    EXPECT_EQ(CFHash(immutable.get()), CFHash(mutableCopy.get()));
    EXPECT_FALSE(CFEqual(immutable.get(), CFSTR("cafe")));
    EXPECT_EQ(CFGetTypeID(immutable.get()), CFStringGetTypeID());

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
