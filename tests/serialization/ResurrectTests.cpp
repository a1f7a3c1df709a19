#include <gtest/gtest.h>

#include <cstring>
#include <memory>
#include <string>
#include <vector>

#include "serialization/TCFFlattenContext.h"
#include "serialization/TCFResurrectContext.h"
#include "support/FlattenedBytes.h"
#include "support/LogCapture.h"
#include "support/Values.h"

using namespace glyphwell::testing;
using Lines = std::vector<std::string>;

namespace {

const char kCorrupt[] = "ERROR: Quzel got corrupted data. (";
const char kTruncating[] =
    "*** ResurrectCFDictionary missing either a key or a value, truncating dictionary";

std::string Corrupt(const std::string& label) {
    return kCorrupt + label + ")";
}

/// Reads `bytes` with `read` and keeps the result and the log lines.
struct Read {
    Ref value;
    Lines log;
    bool corrupted = false;
};

template <class Reader> Read ReadWith(const std::vector<uint8_t>& bytes, Reader read) {
    LogCapture capture;
    TCFResurrectContext context(bytes.data(), bytes.size());
    Read result;
    result.value = Ref(read(context));
    result.log = capture.Texts();
    result.corrupted = context.IsCorrupted();
    return result;
}

Read Any(const std::vector<uint8_t>& bytes) {
    return ReadWith(bytes, [](TCFResurrectContext& c) { return c.Resurrect(kTCFTypeAny); });
}

Read Dictionary(const std::vector<uint8_t>& bytes) {
    return ReadWith(bytes, [](TCFResurrectContext& c) { return c.RetrieveCFDictionary(); });
}

} // namespace

TEST(ResurrectEmptyInput, EmptyRangeReportsTypeAndTheUnexpectedTypeLine) {
    LogCapture capture;
    const unsigned char byte = 0;
    TCFResurrectContext context(&byte, 0);
    EXPECT_EQ(context.RetrieveCFDictionary(), nullptr);
    EXPECT_EQ(capture.Texts(),
              (Lines{Corrupt("cftype"), "Quzel encounters an unexpected type. (99999, 16)"}));
}

TEST(ResurrectEmptyInput, NullBytesReadNothingAndLogNothing) {
    LogCapture capture;
    TCFResurrectContext context(static_cast<const unsigned char*>(nullptr), 10);
    EXPECT_EQ(context.RetrieveCFDictionary(), nullptr);
    EXPECT_EQ(context.Resurrect(kTCFTypeAny), nullptr);
    EXPECT_TRUE(capture.Texts().empty());
}

TEST(ResurrectTopLevel, ReadsTheRequestedKindOrReportsTheMismatch) {
    const auto abc = Hex("00 00 00 07 00 00 00 03 61 62 63");
    const Read string = ReadWith(abc, [](TCFResurrectContext& c) { return c.RetrieveCFString(); });
    EXPECT_EQ(TextOf(string.value.get()), "abc");
    EXPECT_TRUE(string.log.empty());
    const Read wrong = Dictionary(abc);
    EXPECT_FALSE(wrong.value);
    EXPECT_EQ(wrong.log, Lines{"Quzel encounters an unexpected type. (7, 16)"});
    EXPECT_FALSE(wrong.corrupted);
}

TEST(ResurrectTopLevel, UnknownTypeIdsYieldNullWithoutCorruption) {
    const std::pair<const char*, const char*> cases[] = {
        {"00 01 86 9F", "99999"}, {"00 00 00 00", "0"}, {"FF FF FF FF", "-1"}};
    for (const auto& [id, printed] : cases) {
        const Read any = Any(Hex(id));
        EXPECT_FALSE(any.value);
        EXPECT_FALSE(any.corrupted);
        EXPECT_EQ(any.log, Lines{std::string("*** don't how to resurrect type ") + printed});
        EXPECT_EQ(Dictionary(Hex(id)).log,
                  Lines{std::string("Quzel encounters an unexpected type. (") + printed + ", 16)"});
    }
}

TEST(ResurrectStrings, ShortBodyIsReadAsZeroBytes) {
    const Read read = Any(Hex("00 00 00 07 00 00 00 03 61 62"));
    ASSERT_TRUE(read.value);
    EXPECT_EQ(CFStringGetLength(read.value.as<CFStringRef>()), 3);
    EXPECT_EQ(CFStringGetCharacterAtIndex(read.value.as<CFStringRef>(), 0), 0);
    EXPECT_EQ(read.log, Lines{Corrupt("data")});
}

TEST(ResurrectStrings, TextEndingTheBytesIsReadWithoutPassingTheEnd) {
    // Exactly the eleven bytes on the heap, with no terminator after the text: the text is read
    // in place, and the sanitizer would report a read past the block.
    const unsigned char stream[] = {0, 0, 0, 7, 0, 0, 0, 3, 'e', 'n', 'd'};
    std::unique_ptr<unsigned char[]> bytes(new unsigned char[sizeof stream]);
    std::memcpy(bytes.get(), stream, sizeof stream);
    TCFResurrectContext context(bytes.get(), sizeof stream);
    Ref value(context.RetrieveCFString());
    EXPECT_EQ(TextOf(value.get()), "end");
    EXPECT_FALSE(context.IsCorrupted());
}

TEST(ResurrectStrings, LengthsOutsideTheLimitsGiveTheEmptyString) {
    const Read zero = Any(Hex("00 00 00 07 00 00 00 00"));
    EXPECT_EQ(zero.value.get(), CFSTR(""));
    EXPECT_TRUE(zero.log.empty());
    for (const char* count : {"FF FF FF FF", "00 10 00 01"}) {
        const Read bad = Any(Hex(std::string("00 00 00 07 ") + count));
        EXPECT_EQ(bad.value.get(), CFSTR(""));
        EXPECT_EQ(bad.log, Lines{Corrupt("cfstr")});
    }
}

TEST(ResurrectStrings, InvalidUTF8IsANullElementWithoutCorruption) {
    const Read read = Any(Hex("00 00 00 11 00 00 00 01 00 00 00 07 00 00 00 02 C3 28"));
    EXPECT_FALSE(read.value);
    EXPECT_FALSE(read.corrupted);
    EXPECT_EQ(read.log, Lines{"string \xC3( (length 2 : 2) could not be converted to CFString!"});
}

TEST(ResurrectStrings, ByteOrderMarkIsNotPartOfTheText) {
    const Read marked = Any(Hex("00 00 00 07 00 00 00 04 EF BB BF 78"));
    EXPECT_EQ(TextOf(marked.value.get()), "x");
    const Read onlyMark = Any(Hex("00 00 00 07 00 00 00 03 EF BB BF"));
    EXPECT_EQ(onlyMark.value.get(), CFSTR(""));
    EXPECT_TRUE(marked.log.empty());
}

TEST(ResurrectStrings, EqualTextsShareOneObject) {
    const auto bytes = Hex("00 00 00 11 00 00 00 02 00 00 00 07 00 00 00 02 68 69 00 00 00 07 00 "
                           "00 00 02 68 69");
    const Read read = Any(bytes);
    ASSERT_TRUE(read.value);
    EXPECT_EQ(CFArrayGetValueAtIndex(read.value.as<CFArrayRef>(), 0),
              CFArrayGetValueAtIndex(read.value.as<CFArrayRef>(), 1));
}

TEST(ResurrectNumbers, ReadsEveryWidthAndReportsBadOnes) {
    const Read wide = Any(Hex("00 00 00 16 00 00 00 03 00 00 00 09"));
    ASSERT_TRUE(wide.value);
    EXPECT_EQ(CFNumberGetType(wide.value.as<CFNumberRef>()), kCFNumberSInt32Type);
    int32_t value = -1;
    CFNumberGetValue(wide.value.as<CFNumberRef>(), kCFNumberSInt32Type, &value);
    EXPECT_EQ(value, 0);
    EXPECT_EQ(wide.log, Lines{Corrupt("cfnum")});

    const Read shortValue = Any(Hex("00 00 00 16 00 00 00 04 00 00 00 08 00 00"));
    ASSERT_TRUE(shortValue.value);
    EXPECT_EQ(shortValue.log, Lines{Corrupt("data")});
}

TEST(ResurrectNumbers, UnknownTypeCodeBecomesALongOfTheValueRead) {
    const Read read = Any(Hex("00 00 00 16 00 00 00 63 00 00 00 02 FF FE"));
    ASSERT_TRUE(read.value);
    EXPECT_EQ(CFNumberGetType(read.value.as<CFNumberRef>()), kCFNumberLongType);
    long value = 0;
    CFNumberGetValue(read.value.as<CFNumberRef>(), kCFNumberLongType, &value);
    EXPECT_EQ(value, -2);
    EXPECT_TRUE(read.log.empty());
    const Read three = Any(Hex("00 00 00 16 FF FF FF FF 00 00 00 03 01 02 03"));
    CFNumberGetValue(three.value.as<CFNumberRef>(), kCFNumberLongType, &value);
    EXPECT_EQ(value, 0x030201); // widths other than 2, 4 and 8 are not swapped
}

TEST(ResurrectScalars, BooleansDataAndUUIDs) {
    EXPECT_EQ(Any(Hex("00 00 01 03 00 00 00 01 07")).value.get(), kCFBooleanTrue);
    const Read badBool = Any(Hex("00 00 01 03 00 00 00 02 01"));
    EXPECT_EQ(badBool.value.get(), kCFBooleanFalse);
    EXPECT_EQ(badBool.log, Lines{Corrupt("cfbool")});

    const Read data = Any(Hex("00 00 00 12 00 00 00 02 AB CD"));
    EXPECT_EQ(ToHex(data.value.as<CFDataRef>()), "AB CD");
    const Read longData = Any(Hex("00 00 00 12 00 00 00 03 AB CD"));
    EXPECT_FALSE(longData.value);
    EXPECT_EQ(longData.log, Lines{Corrupt("cfdata")});
    EXPECT_EQ(CFDataGetLength(Any(Hex("00 00 00 12 00 00 00 00")).value.as<CFDataRef>()), 0);

    const Read noUUID = Any(Hex("00 00 01 02 00 00 00 00"));
    EXPECT_FALSE(noUUID.value);
    EXPECT_TRUE(noUUID.log.empty());
    const Read badUUID = Any(Hex("00 00 01 02 00 00 00 0F"));
    EXPECT_FALSE(badUUID.value);
    EXPECT_EQ(badUUID.log, Lines{Corrupt("cfuuid")});
}

TEST(ResurrectErrors, NeedANonEmptyDomain) {
    const Read error = Any(Hex("00 00 01 04 FF FF FF FE 00 00 00 07 00 00 00 01 44"));
    ASSERT_TRUE(error.value);
    EXPECT_EQ(CFErrorGetCode(error.value.as<CFErrorRef>()), -2);
    EXPECT_EQ(TextOf(CFErrorGetDomain(error.value.as<CFErrorRef>())), "D");
    const Read empty = Any(Hex("00 00 01 04 00 00 00 01 00 00 00 07 00 00 00 00"));
    EXPECT_FALSE(empty.value);
    EXPECT_TRUE(empty.log.empty());
}

TEST(ResurrectURLs, EmptyAndOverlongURLsAreEmptyRelativeURLs) {
    const Read empty = Any(Hex("00 00 00 11 00 00 00 01 00 00 01 01 00 00 00 00"));
    ASSERT_TRUE(empty.value) << "an array holding an empty URL is not lost";
    CFURLRef url = static_cast<CFURLRef>(CFArrayGetValueAtIndex(empty.value.as<CFArrayRef>(), 0));
    EXPECT_EQ(CFURLGetBytes(url, nullptr, 0), 0);
    const Read bad = Any(Hex("00 00 01 01 00 10 00 01"));
    ASSERT_TRUE(bad.value);
    EXPECT_EQ(bad.log, Lines{Corrupt("cfurl")});
}

TEST(ResurrectContainers, ArrayMissingAnElementIsLost) {
    const Read read = Any(Hex("00 00 00 11 00 00 00 03 00 00 01 03 00 00 00 01 01 00 00 01 03 00 "
                              "00 00 01 00"));
    EXPECT_FALSE(read.value);
    EXPECT_EQ(read.log, (Lines{Corrupt("cftype"), "*** don't how to resurrect type 99999"}));
}

TEST(ResurrectContainers, SetCountsAreReportedWithTheArrayLabel) {
    const Read set = Any(Hex("00 00 01 00 00 A0 00 01"));
    ASSERT_TRUE(set.value);
    EXPECT_EQ(CFGetTypeID(set.value.get()), CFSetGetTypeID());
    EXPECT_EQ(CFSetGetCount(set.value.as<CFSetRef>()), 0);
    EXPECT_EQ(set.log, Lines{Corrupt("cfarray")});
    const Read dict = Any(Hex("00 00 00 10 FF FF FF FF"));
    EXPECT_EQ(CFDictionaryGetCount(dict.value.as<CFDictionaryRef>()), 0);
    EXPECT_EQ(dict.log, Lines{Corrupt("cfdict")});
}

TEST(ResurrectContainers, DictionaryIsTruncatedAtTheFirstMissingPair) {
    Ref a = Str("a"), b = Str("b");
    auto bytes =
        FlattenedBytes(Dict({{a.get(), kCFBooleanTrue}, {b.get(), kCFBooleanFalse}}).get());
    bytes[7] = 3; // the count says three pairs
    const Read read = Dictionary(bytes);
    ASSERT_TRUE(read.value);
    EXPECT_EQ(CFDictionaryGetCount(read.value.as<CFDictionaryRef>()), 2);
    EXPECT_EQ(CFDictionaryGetValue(read.value.as<CFDictionaryRef>(), b.get()), kCFBooleanFalse);
    EXPECT_EQ(read.log,
              (Lines{Corrupt("cftype"), "*** don't how to resurrect type 99999", kTruncating}));
}

TEST(ResurrectContainers, DictionaryBeyondThirtyPairsKeepsEveryPairBeforeTheCut) {
    // 40 pairs of 20 bytes each ("kNN" and a boolean), cut after the 35th: the element tables
    // have grown past their 30 inline entries by then.
    std::vector<Ref> keys;
    std::vector<const void*> keyRefs, valueRefs;
    for (int i = 0; i < 40; ++i) {
        keys.push_back(Str((i < 10 ? "k0" : "k") + std::to_string(i)));
        keyRefs.push_back(keys.back().get());
        valueRefs.push_back(i % 2 ? kCFBooleanTrue : kCFBooleanFalse);
    }
    Ref whole(CFDictionaryCreate(nullptr, keyRefs.data(), valueRefs.data(), 40,
                                 &kCFTypeDictionaryKeyCallBacks, &kCFTypeDictionaryValueCallBacks));
    auto bytes = FlattenedBytes(whole.get());
    ASSERT_EQ(bytes.size(), 8u + 40 * 20);
    EXPECT_TRUE(CFEqual(Dictionary(bytes).value.get(), whole.get()));

    bytes.resize(8 + 35 * 20);
    const Read cut = Dictionary(bytes);
    ASSERT_TRUE(cut.value);
    EXPECT_EQ(CFDictionaryGetCount(cut.value.as<CFDictionaryRef>()), 35);
    EXPECT_EQ(CFDictionaryGetValue(cut.value.as<CFDictionaryRef>(), keyRefs[34]), kCFBooleanFalse);
    EXPECT_EQ(cut.log,
              (Lines{Corrupt("cftype"), "*** don't how to resurrect type 99999", kTruncating}));
}

TEST(ResurrectContainers, UnsupportedValueTruncatesADictionaryAndLeavesTheRestUnread) {
    Read read = Dictionary(Hex("00 00 00 10 00 00 00 02 00 00 00 07 00 00 00 01 61 00 00 00 63 "
                               "00 00 00 07 00 00 00 01 62 00 00 01 03 00 00 00 01 01"));
    ASSERT_TRUE(read.value);
    EXPECT_EQ(CFDictionaryGetCount(read.value.as<CFDictionaryRef>()), 0);
    EXPECT_EQ(read.log, (Lines{"*** don't how to resurrect type 99", kTruncating}));
    EXPECT_FALSE(read.corrupted);
}

TEST(ResurrectContainers, HugeCountInAShortStreamCostsNoMoreThanTheStream) {
    // 10,485,760 elements claimed, one present: the array is lost, without reserving 80 MB.
    const Read read = Any(Hex("00 00 00 11 00 A0 00 00 00 00 01 03 00 00 00 01 01"));
    EXPECT_FALSE(read.value);
    EXPECT_EQ(read.log, (Lines{Corrupt("cftype"), "*** don't how to resurrect type 99999"}));
}

TEST(ResurrectDepth, AcceptsDeepNestingAndRejectsDeeperAsCorrupt) {
    auto nested = [](unsigned levels) {
        std::vector<uint8_t> bytes;
        for (unsigned i = 0; i + 1 < levels; ++i)
            for (uint8_t b : Hex("00 00 00 11 00 00 00 01"))
                bytes.push_back(b);
        for (uint8_t b : Hex("00 00 00 11 00 00 00 00"))
            bytes.push_back(b);
        return bytes;
    };
    const Read deep = Any(nested(TCFResurrectContext::kMaxNestingDepth));
    EXPECT_TRUE(deep.value);
    EXPECT_TRUE(deep.log.empty());
    const Read deeper = Any(nested(TCFResurrectContext::kMaxNestingDepth + 1));
    EXPECT_FALSE(deeper.value);
    EXPECT_EQ(deeper.log, Lines{Corrupt("depth")});
    // Far deeper input is refused just the same, without exhausting the stack.
    EXPECT_EQ(Any(nested(200000)).log, Lines{Corrupt("depth")});
}

TEST(ResurrectCharacterSets, DecompressesOnlyPlausibleBitmaps) {
    Ref set(CFCharacterSetCreateWithCharactersInRange(nullptr, CFRangeMake('A', 26)));
    const Read good = Any(FlattenedBytes(set.get()));
    ASSERT_TRUE(good.value);
    EXPECT_TRUE(CFEqual(good.value.get(), set.get()));

    // A header claiming 16 bytes of output: decompressible, but no bitmap representation.
    const Read implausible =
        Any(Hex("00 00 00 1B 00 00 00 0C 00 00 00 00 10 00 00 00 00 00 08 00"));
    EXPECT_FALSE(implausible.value);
    EXPECT_TRUE(implausible.log.empty());
    const Read garbage = Any(Hex("00 00 00 11 00 00 00 02 00 00 00 1B 00 00 00 02 01 02 00 00 01 "
                                 "03 00 00 00 01 01"));
    EXPECT_FALSE(garbage.value);
    EXPECT_FALSE(garbage.corrupted) << "the cursor moved past the payload";
    const Read overlong = Any(Hex("00 00 00 1B 00 00 00 05 00"));
    EXPECT_EQ(overlong.log, Lines{Corrupt("cfcharset")});
}

TEST(ResurrectCorruption, IsReportedOncePerStream) {
    const Read read = Any(Hex("00 00 00 10 00 00 00 02 00 00 00 07 FF FF FF FF 00 00 00 07"));
    ASSERT_TRUE(read.value);
    EXPECT_EQ(read.log, (Lines{Corrupt("cfstr"), kTruncating}));
}

TEST(ResurrectContext, AddressConstructorReadsTheSameBytes) {
    const auto bytes = Hex("00 00 01 03 00 00 00 01 01");
    TCFResurrectContext context(reinterpret_cast<unsigned long>(bytes.data()), bytes.size());
    EXPECT_EQ(context.RetrieveCFBoolean(), kCFBooleanTrue);
}

TEST(ResurrectExamples, EveryWrittenExampleReadsBackEqual) {
    Ref a = Str("a");
    const std::vector<Ref> values = [&] {
        std::vector<Ref> v;
        v.push_back(Str("abc"));
        v.push_back(Dict({}));
        v.push_back(Num<int32_t>(kCFNumberSInt32Type, 1));
        v.push_back(Num<double>(kCFNumberFloat64Type, 1.0));
        v.push_back(Dict({{a.get(), kCFBooleanTrue}}));
        return v;
    }();
    for (const Ref& value : values) {
        const Read read = Any(FlattenedBytes(value.get()));
        EXPECT_TRUE(CFEqual(read.value.get(), value.get()));
        EXPECT_TRUE(read.log.empty());
    }
    EXPECT_EQ(Any(FlattenedBytes(kCFBooleanTrue)).value.get(), kCFBooleanTrue);
}
