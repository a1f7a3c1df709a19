// The reader on hand-made streams: what each stream reads as, the exact log lines, and whether
// the stream counts as corrupt.
#include <gtest/gtest.h>

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

const std::string kCorrupt = "ERROR: Quzel got corrupted data. (";
const std::string kTruncating =
    "*** ResurrectCFDictionary missing either a key or a value, truncating dictionary";
const std::string kUnknown = "*** don't how to resurrect type ";
const std::string kUnexpected = "Quzel encounters an unexpected type. (";

std::string Corrupt(const std::string& label) {
    return kCorrupt + label + ")";
}

/// What a read of `bytes` as `expected` gave: the value, the log lines and the corrupt flag.
struct Read {
    Ref value;
    Lines log;
    bool corrupted = false;
};

Read ReadAs(const std::vector<uint8_t>& bytes, TCFType expected = kTCFTypeAny) {
    LogCapture capture;
    TCFResurrectContext context(bytes.data(), bytes.size());
    Read result;
    result.value = Ref(context.Resurrect(expected));
    result.log = capture.Texts();
    result.corrupted = context.IsCorrupted();
    return result;
}

} // namespace

TEST(Resurrect, EachStreamReadsAsItsValueWithItsExactLogLines) {
    const auto A = kTCFTypeAny, D = kTCFTypeDictionary;
    const struct {
        const char* hex;
        TCFType expected;
        const char* written; // the value read, written again: "" for null, "=" for the same bytes
        Lines log = {};      // a corrupt stream's lines start with its one report
    } rows[] = {
        {"00 00 00 07 00 00 00 03 61 62 63", kTCFTypeString, "="},
        {"00 00 00 07 00 00 00 03 61 62 63", D, "", {kUnexpected + "7, 16)"}},
        {"00 01 86 9F", A, "", {kUnknown + "99999"}},
        {"00 00 00 00", A, "", {kUnknown + "0"}},
        {"FF FF FF FF", A, "", {kUnknown + "-1"}},
        {"00 01 86 9F", D, "", {kUnexpected + "99999, 16)"}},
        {"00 00 00 00", D, "", {kUnexpected + "0, 16)"}},
        {"FF FF FF FF", D, "", {kUnexpected + "-1, 16)"}},
        // Strings: a short body reads as zero bytes; bad lengths give the empty string; a
        // byte-order mark is not text; invalid UTF-8 is a null element that loses its array.
        {"00 00 00 07 00 00 00 03 61 62", A, "00 00 00 07 00 00 00 03 00 00 00", {Corrupt("data")}},
        {"00 00 00 07 00 00 00 00", A, "="},
        {"00 00 00 07 FF FF FF FF", A, "00 00 00 07 00 00 00 00", {Corrupt("cfstr")}},
        {"00 00 00 07 00 10 00 01", A, "00 00 00 07 00 00 00 00", {Corrupt("cfstr")}},
        {"00 00 00 07 00 00 00 04 EF BB BF 78", A, "00 00 00 07 00 00 00 01 78"},
        {"00 00 00 07 00 00 00 03 EF BB BF", A, "00 00 00 07 00 00 00 00"},
        {"00 00 00 11 00 00 00 01 00 00 00 07 00 00 00 02 C3 28",
         A,
         "",
         {"string \xC3( (length 2 : 2) could not be converted to CFString!"}},
        // Numbers: a bad width reads as 0 of the type; an unknown type code is a long of the
        // signed value, swapped only for widths 2, 4 and 8.
        {"00 00 00 16 00 00 00 03 00 00 00 09",
         A,
         "00 00 00 16 00 00 00 03 00 00 00 04 00 00 00 00",
         {Corrupt("cfnum")}},
        {"00 00 00 16 00 00 00 04 00 00 00 08 00 00",
         A,
         "00 00 00 16 00 00 00 04 00 00 00 08 00 00 00 00 00 00 00 00",
         {Corrupt("data")}},
        {"00 00 00 16 00 00 00 63 00 00 00 02 FF FE", A,
         "00 00 00 16 00 00 00 0A 00 00 00 08 FF FF FF FF FF FF FF FE"},
        {"00 00 00 16 FF FF FF FF 00 00 00 03 01 02 03", A,
         "00 00 00 16 00 00 00 0A 00 00 00 08 00 00 00 00 00 03 02 01"},
        // Booleans, data, UUIDs, errors and URLs.
        {"00 00 01 03 00 00 00 01 07", A, "00 00 01 03 00 00 00 01 01"},
        {"00 00 01 03 00 00 00 02 01", A, "00 00 01 03 00 00 00 01 00", {Corrupt("cfbool")}},
        {"00 00 00 12 00 00 00 02 AB CD", A, "="},
        {"00 00 00 12 00 00 00 03 AB CD", A, "", {Corrupt("cfdata")}},
        {"00 00 00 12 00 00 00 00", A, "="},
        {"00 00 01 02 00 00 00 00", A, ""},
        {"00 00 01 02 00 00 00 0F", A, "", {Corrupt("cfuuid")}},
        {"00 00 01 04 FF FF FF FE 00 00 00 07 00 00 00 01 44", A, "="},
        {"00 00 01 04 00 00 00 01 00 00 00 07 00 00 00 00", A, ""}, // no domain
        {"00 00 00 11 00 00 00 01 00 00 01 01 00 00 00 00", A, "="},
        {"00 00 01 01 00 10 00 01", A, "00 00 01 01 00 00 00 00", {Corrupt("cfurl")}},
        // Containers: an array missing an element is lost, also when its count is huge (without
        // reserving memory for it); bad set and dictionary counts give empty ones (a set's with
        // the array's label); a value that cannot be read truncates a dictionary.
        {"00 00 00 11 00 00 00 03 00 00 01 03 00 00 00 01 01 00 00 01 03 00 00 00 01 00",
         A,
         "",
         {Corrupt("cftype"), kUnknown + "99999"}},
        {"00 00 00 11 00 A0 00 00 00 00 01 03 00 00 00 01 01",
         A,
         "",
         {Corrupt("cftype"), kUnknown + "99999"}},
        {"00 00 01 00 00 A0 00 01", A, "00 00 01 00 00 00 00 00", {Corrupt("cfarray")}},
        {"00 00 00 10 FF FF FF FF", A, "00 00 00 10 00 00 00 00", {Corrupt("cfdict")}},
        {"00 00 00 10 00 00 00 02 00 00 00 07 00 00 00 01 61 00 00 00 63 00 00 00 07 00 00 00 01 "
         "62 00 00 01 03 00 00 00 01 01",
         D,
         "00 00 00 10 00 00 00 00",
         {kUnknown + "99", kTruncating}},
        // Corruption is reported once per stream.
        {"00 00 00 10 00 00 00 02 00 00 00 07 FF FF FF FF 00 00 00 07",
         A,
         "00 00 00 10 00 00 00 00",
         {Corrupt("cfstr"), kTruncating}},
        // Character sets: only a header claiming a plausible bitmap length is decompressed; the
        // cursor moves past any payload.
        {"00 00 00 1B 00 00 00 0C 00 00 00 00 10 00 00 00 00 00 08 00", A, ""},
        {"00 00 00 11 00 00 00 02 00 00 00 1B 00 00 00 02 01 02 00 00 01 03 00 00 00 01 01", A, ""},
        {"00 00 00 1B 00 00 00 05 00", A, "", {Corrupt("cfcharset")}},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(testing::Message() << row.hex << " as " << row.expected);
        const Read read = ReadAs(Hex(row.hex), row.expected);
        const std::string written = row.written;
        EXPECT_EQ(ToHex(FlattenedBytes(read.value.get())), written == "=" ? row.hex : written);
        EXPECT_EQ(read.log, row.log);
        EXPECT_EQ(read.corrupted, !row.log.empty() && row.log[0].starts_with(kCorrupt));
    }
}

TEST(Resurrect, EmptyAndEqualTextsAreSharedStrings) {
    const Read pair = ReadAs(Hex("00 00 00 11 00 00 00 02 00 00 00 07 00 00 00 02 68 69 00 00 00 "
                                 "07 00 00 00 02 68 69"));
    ASSERT_TRUE(pair.value);
    EXPECT_EQ((std::vector{ReadAs(Hex("00 00 00 07 00 00 00 00")).value.get(),
                           ReadAs(Hex("00 00 00 07 FF FF FF FF")).value.get(),
                           CFArrayGetValueAtIndex(pair.value.as<CFArrayRef>(), 0)}),
              (std::vector<CFTypeRef>{CFSTR(""), CFSTR(""),
                                      CFArrayGetValueAtIndex(pair.value.as<CFArrayRef>(), 1)}));
}

TEST(Resurrect, EmptyRangeReportsTypeAndNullBytesReadNothing) {
    LogCapture capture;
    const unsigned char byte = 0;
    EXPECT_EQ(TCFResurrectContext(&byte, 0).RetrieveCFDictionary(), nullptr);
    EXPECT_EQ(capture.Texts(), (Lines{Corrupt("cftype"), kUnexpected + "99999, 16)"}));
    capture.Clear();
    TCFResurrectContext none(static_cast<const unsigned char*>(nullptr), 10);
    EXPECT_EQ(none.RetrieveCFDictionary(), nullptr);
    EXPECT_EQ(none.Resurrect(kTCFTypeAny), nullptr);
    EXPECT_TRUE(capture.Texts().empty());

    const auto bytes = Hex("00 00 01 03 00 00 00 01 01");
    TCFResurrectContext byAddress(reinterpret_cast<unsigned long>(bytes.data()), bytes.size());
    EXPECT_EQ(byAddress.RetrieveCFBoolean(), kCFBooleanTrue);
}

TEST(Resurrect, TextEndingTheBytesIsReadWithoutPassingTheEnd) {
    // Exactly the eleven bytes on the heap, with no terminator after the text: the text is read
    // in place, and the sanitizer would report a read past the block.
    std::unique_ptr<unsigned char[]> bytes(
        new unsigned char[11]{0, 0, 0, 7, 0, 0, 0, 3, 'e', 'n', 'd'});
    TCFResurrectContext context(bytes.get(), 11);
    Ref value(context.RetrieveCFString());
    EXPECT_EQ(TextOf(value.get()), "end");
    EXPECT_FALSE(context.IsCorrupted());
}

TEST(Resurrect, DictionaryBeyondThirtyPairsKeepsEveryPairBeforeTheCut) {
    // 40 pairs of 20 bytes each ("kNN" and a boolean), cut after the 35th: the element tables
    // have grown past their 30 inline entries by then.
    Ref whole(CFDictionaryCreateMutable(nullptr, 0, &kCFTypeDictionaryKeyCallBacks,
                                        &kCFTypeDictionaryValueCallBacks));
    for (int i = 0; i < 40; ++i)
        CFDictionarySetValue(const_cast<CFMutableDictionaryRef>(whole.as<CFDictionaryRef>()),
                             Str((i < 10 ? "k0" : "k") + std::to_string(i)).get(),
                             i % 2 ? kCFBooleanTrue : kCFBooleanFalse);
    auto bytes = FlattenedBytes(whole.get());
    ASSERT_EQ(bytes.size(), 8u + 40 * 20);
    EXPECT_TRUE(CFEqual(ReadAs(bytes, kTCFTypeDictionary).value.get(), whole.get()));

    bytes.resize(8 + 35 * 20);
    const Read cut = ReadAs(bytes, kTCFTypeDictionary);
    ASSERT_TRUE(cut.value);
    EXPECT_EQ(CFDictionaryGetCount(cut.value.as<CFDictionaryRef>()), 35);
    EXPECT_EQ(CFDictionaryGetValue(cut.value.as<CFDictionaryRef>(), CFSTR("k34")), kCFBooleanFalse);
    EXPECT_EQ(cut.log, (Lines{Corrupt("cftype"), kUnknown + "99999", kTruncating}));
}

TEST(Resurrect, AcceptsDeepNestingAndRejectsDeeperAsCorrupt) {
    auto nested = [](unsigned levels) { // arrays of one array, the innermost empty
        std::vector<uint8_t> bytes;
        for (unsigned i = 0; i < levels; ++i)
            bytes.insert(bytes.end(), {0, 0, 0, 0x11, 0, 0, 0, i + 1 < levels});
        return bytes;
    };
    // The deepest accepted value reads, writes back the same bytes and is released.
    const auto deepest = nested(TCFResurrectContext::kMaxNestingDepth);
    const Read deep = ReadAs(deepest);
    EXPECT_EQ(FlattenedBytes(deep.value.get()), deepest);
    EXPECT_TRUE(deep.log.empty());
    const Read deeper = ReadAs(nested(TCFResurrectContext::kMaxNestingDepth + 1));
    EXPECT_FALSE(deeper.value);
    EXPECT_EQ(deeper.log, Lines{Corrupt("depth")});
    // Far deeper input is refused just the same, without exhausting the stack.
    EXPECT_EQ(ReadAs(nested(200000)).log, Lines{Corrupt("depth")});
}
