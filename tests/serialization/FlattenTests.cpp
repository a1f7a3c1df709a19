// The writer: the exact bytes of every kind, texts and URLs a reader would refuse, failures
// and their log lines, the size estimates and the byte-order primitives.
#include <gtest/gtest.h>

#include <string>

#include "serialization/TCFFlattenContext.h"
#include "support/FlattenedBytes.h"
#include "support/LogCapture.h"
#include "support/Values.h"

using namespace glyphwell::testing;
using Lines = std::vector<std::string>;

namespace {

std::string Flattened(CFTypeRef value) {
    return ToHex(FlattenedBytes(value));
}

const char kStringFailed[] = "ERROR: Quzel::TCFFlattenContext::FlattenCFString failed.";

} // namespace

TEST(FlattenKinds, WritesTheDocumentedBytesForEveryKind) {
    Ref a = Str("a"), domain = Str("D"), inner = Array({kCFBooleanFalse});
    Ref base(CFURLCreateWithString(nullptr, CFSTR("http://h/a/b"), nullptr));
    const UInt8 bytes[] = {0xDE, 0xAD, 0x00};
    const CFUUIDBytes uuidBytes = {0, 1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12, 13, 14, 15};
    auto unconvertible = [](size_t before) { // long texts are converted in the output itself
        std::vector<UniChar> units(before, 'x');
        units.push_back(0xD800);
        return Ref(CFStringCreateWithCharacters(nullptr, units.data(), CFIndex(units.size())));
    };
    const std::string longURL = "http://h/" + Repeat("a", 0x100000);
    const struct {
        Ref value;
        const char* hex;
        Lines log = {};
    } rows[] = {
        {Str("abc"), "00 00 00 07 00 00 00 03 61 62 63"},
        {Dict({}), "00 00 00 10 00 00 00 00"},
        {Ref(CFRetain(kCFBooleanTrue)), "00 00 01 03 00 00 00 01 01"},
        {Ref(CFRetain(kCFBooleanFalse)), "00 00 01 03 00 00 00 01 00"},
        {Num<int32_t>(kCFNumberSInt32Type, 1), "00 00 00 16 00 00 00 03 00 00 00 04 00 00 00 01"},
        {Num<double>(kCFNumberFloat64Type, 1.0),
         "00 00 00 16 00 00 00 06 00 00 00 08 3F F0 00 00 00 00 00 00"},
        {Dict({{a.get(), kCFBooleanTrue}}),
         "00 00 00 10 00 00 00 01 00 00 00 07 00 00 00 01 61 00 00 01 03 00 00 00 01 01"},
        {Ref(CFDataCreate(nullptr, nullptr, 0)), "00 00 00 12 00 00 00 00"},
        {Ref(CFDataCreate(nullptr, bytes, 3)), "00 00 00 12 00 00 00 03 DE AD 00"},
        {Num<int8_t>(kCFNumberCharType, -2), "00 00 00 16 00 00 00 07 00 00 00 01 FE"},
        {Num<int16_t>(kCFNumberShortType, 0x1234), "00 00 00 16 00 00 00 08 00 00 00 02 12 34"},
        {Num<int64_t>(kCFNumberLongType, -1),
         "00 00 00 16 00 00 00 0A 00 00 00 08 FF FF FF FF FF FF FF FF"},
        {Num<float>(kCFNumberFloat32Type, 1.5f), "00 00 00 16 00 00 00 05 00 00 00 04 3F C0 00 00"},
        {Ref(CFUUIDCreateFromUUIDBytes(nullptr, uuidBytes)),
         "00 00 01 02 00 00 00 10 00 01 02 03 04 05 06 07 08 09 0A 0B 0C 0D 0E 0F"},
        // The empty BMP bitmap compresses to 12 bytes: format 0, length 8192, literal 0, fill
        // 4096.
        {Ref(CFCharacterSetCreateMutable(nullptr)),
         "00 00 00 1B 00 00 00 0C 00 00 00 00 00 20 00 00 00 00 00 10"},
        {Array({}), "00 00 00 11 00 00 00 00"},
        {Set({}), "00 00 01 00 00 00 00 00"},
        // Errors keep the code cut to 32 bits and lose their user info.
        {Ref(CFErrorCreate(nullptr, domain.as<CFStringRef>(), 0x100000002L,
                           Dict({{domain.get(), kCFBooleanTrue}}).as<CFDictionaryRef>())),
         "00 00 01 04 00 00 00 02 00 00 00 07 00 00 00 01 44"},
        // Relative URLs are written as their absolute form.
        {Ref(CFURLCreateWithString(nullptr, CFSTR("c?q"), base.as<CFURLRef>())),
         "00 00 01 01 00 00 00 0E 68 74 74 70 3A 2F 2F 68 2F 61 2F 63 3F 71"},
        {Ref(CFURLCreateWithBytes(nullptr, nullptr, 0, kCFStringEncodingUTF8, nullptr)),
         "00 00 01 01 00 00 00 00"},
        // Containers depth first, in order.
        {Array({a.get(), inner.get(), kCFBooleanTrue}),
         "00 00 00 11 00 00 00 03 00 00 00 07 00 00 00 01 61 00 00 00 11 00 00 00 01 00 00 01 03 "
         "00 00 00 01 00 00 00 01 03 00 00 00 01 01"},
        {Str("\xF0\x9F\x98\x80"), "00 00 00 07 00 00 00 04 F0 9F 98 80"},
        // What a reader would refuse or the text cannot be converted is written empty, and the
        // stream goes on.
        {Array({unconvertible(0).get(), kCFBooleanTrue}),
         "00 00 00 11 00 00 00 02 00 00 00 07 00 00 00 00 00 00 01 03 00 00 00 01 01",
         {kStringFailed}},
        {Array({unconvertible(100).get(), kCFBooleanTrue}),
         "00 00 00 11 00 00 00 02 00 00 00 07 00 00 00 00 00 00 01 03 00 00 00 01 01",
         {kStringFailed}},
        {Ref(CFURLCreateWithBytes(nullptr, reinterpret_cast<const UInt8*>(longURL.data()),
                                  CFIndex(longURL.size()), kCFStringEncodingUTF8, nullptr)),
         "00 00 01 01 00 00 00 00",
         {"ERROR: Quzel::TCFFlattenContext::FlattenCFURL failed."}},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.hex);
        LogCapture log;
        EXPECT_EQ(Flattened(row.value.get()), row.hex);
        EXPECT_EQ(log.Texts(), row.log);
    }
    EXPECT_EQ(Flattened(nullptr), "");
}

TEST(FlattenStrings, TextsUpToWhatAReaderTakesAreWrittenWholeAndLongerOnesAsEmpty) {
    // The limit is 0x100000 bytes, and units: 0x40000 astral characters are 0x80000 units but
    // exactly 0x100000 bytes. Longer texts are written as empty with one line each, since a
    // reader refusing them would lose the rest of the stream.
    const struct {
        std::string text;
        bool fits;
    } rows[] = {
        {Repeat("x", 0x100000), true},         {Repeat("\xF0\x9F\x98\x80", 0x40000), true},
        {Repeat("x", 0x100001), false},        {Repeat("\xF0\x9F\x98\x80", 0x40000) + "x", false},
        {Repeat("\xC3\xA9", 0x100000), false},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(testing::Message() << row.text.size() << " bytes");
        LogCapture log;
        const std::vector<uint8_t> bytes = FlattenedBytes(Str(row.text).get());
        EXPECT_EQ(ToHex(bytes.data(), 8),
                  row.fits ? "00 00 00 07 00 10 00 00" : "00 00 00 07 00 00 00 00");
        EXPECT_EQ(bytes.size(), row.fits ? 8 + 0x100000u : 8u);
        EXPECT_EQ(log.Texts(), row.fits ? Lines{} : Lines{kStringFailed});
        for (const auto& line : log.Lines())
            EXPECT_TRUE(line.channel == glyphwell::LogChannel::System && line.level == 3);
    }
}

TEST(FlattenFailure, UnsupportedValueEmptiesOnlyWhatTheContextWrote) {
    LogCapture log;
    Ref date(CFDateCreate(nullptr, 0));
    Ref buffer(CFDataCreateMutable(nullptr, 0));
    const UInt8 prefix[] = {0xAA, 0xBB};
    CFDataAppendBytes(const_cast<__CFData*>(buffer.as<CFDataRef>()), prefix, 2);
    {
        TCFFlattenContext context(const_cast<__CFData*>(buffer.as<CFDataRef>()), false);
        context.Flatten(Array({kCFBooleanTrue, date.get(), kCFBooleanFalse}).get());
        EXPECT_EQ(context.GetLength(), 2);
        context.Flatten(kCFBooleanTrue); // ignored once the job failed
    }
    EXPECT_EQ(ToHex(buffer.as<CFDataRef>()), "AA BB");
    ASSERT_EQ(log.Texts().size(), 1u);
    const std::string line = log.Texts()[0];
    const std::string expectedStart =
        "*** don't know how to flatten type " + std::to_string(CFDateGetTypeID()) + " (object ";
    EXPECT_EQ(line.substr(0, expectedStart.size()), expectedStart);
    EXPECT_EQ(line.back(), ')');
}

namespace {
/// Sees every nested string: the per-kind writers must reach it through the virtual table.
class StringCountingContext : public TCFFlattenContext {
public:
    using TCFFlattenContext::TCFFlattenContext;
    int strings = 0;
    void FlattenCFString(__CFString const* string) override {
        ++strings;
        TCFFlattenContext::FlattenCFString(string);
    }
};
} // namespace

TEST(FlattenContext, RetainsOrAdoptsTheBufferAndWritesThroughTheVirtualWriters) {
    CFMutableDataRef buffer = CFDataCreateMutable(nullptr, 0);
    {
        StringCountingContext context(buffer, false);
        EXPECT_EQ(CFGetRetainCount(buffer), 2);
        EXPECT_EQ(context.GetStream(), buffer);
        Ref a = Str("a"), b = Str("b"), domain = Str("d");
        Ref error(CFErrorCreate(nullptr, domain.as<CFStringRef>(), 1, nullptr));
        context.Flatten(Dict({{a.get(), Array({b.get(), error.get()}).get()}}).get());
        EXPECT_EQ(context.strings, 3);
    }
    EXPECT_EQ(CFGetRetainCount(buffer), 1);
    CFRetain(buffer);
    CFDataSetLength(buffer, 0);
    {
        // The byte-order primitives swap each element in the output and leave the source alone.
        TCFFlattenContext context(buffer, true);
        const uint16_t values[] = {0x0102, 0x0304};
        context.StreamOut(values, 2, 2);
        context.StreamOutCFIndex(-2L);
        context.StreamOutCFIndex(0x1FFFFFFFFL);
        EXPECT_EQ(values[0], 0x0102);
    }
    EXPECT_EQ(CFGetRetainCount(buffer), 1);
    EXPECT_EQ(ToHex(buffer), "01 02 03 04 FF FF FF FE FF FF FF FF");
    CFRelease(buffer);
}

namespace {

void AppendBigEndian(std::vector<uint8_t>& bytes, uint32_t value) {
    for (int shift = 24; shift >= 0; shift -= 8)
        bytes.push_back(uint8_t(value >> shift));
}

void AppendText(std::vector<uint8_t>& bytes, const std::string& text) {
    AppendBigEndian(bytes, 7);
    AppendBigEndian(bytes, uint32_t(text.size()));
    bytes.insert(bytes.end(), text.begin(), text.end());
}

std::vector<uint8_t> BytesOf(CFDataRef data) {
    const UInt8* bytes = CFDataGetBytePtr(data);
    return std::vector<uint8_t>(bytes, bytes + CFDataGetLength(data));
}

} // namespace

TEST(FlattenBuffer, TextsOfEveryShortLengthComeOutWholeAsTheBufferGrowsOnEitherPath) {
    // 3,000 texts of 0 to 70 bytes (every case of the short copy), some held as UTF-16 and some
    // not ASCII: about 120 kB, so the buffer outgrows its first and its second room.
    std::vector<Ref> texts;
    std::vector<const void*> values;
    std::vector<uint8_t> expected;
    AppendBigEndian(expected, 17);
    AppendBigEndian(expected, 3000);
    for (int i = 0; i < 3000; ++i) {
        std::string text;
        std::u16string units;
        for (int j = 0; j < i % 71; ++j) {
            text += char('a' + (i + j) % 26);
            units += char16_t(text.back());
        }
        if (i % 13 == 5) {
            text += "\xC3\xA9";
            units += u'\u00E9';
        }
        if (i % 7 == 3) {
            texts.emplace_back(CFStringCreateWithCharacters(
                nullptr, reinterpret_cast<const UniChar*>(units.data()), CFIndex(units.size())));
        } else {
            texts.push_back(Str(text));
        }
        values.push_back(texts.back().get());
        AppendText(expected, text);
    }
    Ref array(
        CFArrayCreate(nullptr, values.data(), CFIndex(values.size()), &kCFTypeArrayCallBacks));
    EXPECT_EQ(FlattenedBytes(array.get()), expected);
    // A subclass sees every text through its own writer, with the same bytes.
    Ref buffer(CFDataCreateMutable(nullptr, 0));
    {
        StringCountingContext context(const_cast<__CFData*>(buffer.as<CFDataRef>()), false);
        context.Flatten(array.get());
        EXPECT_EQ(context.strings, 3000);
    }
    EXPECT_EQ(BytesOf(buffer.as<CFDataRef>()), expected);
}

TEST(FlattenBuffer, CallersMayChangeTheBufferBetweenCallsOrWriteItIntoItself) {
    Ref buffer(CFDataCreateMutable(nullptr, 0));
    auto* data = const_cast<__CFData*>(buffer.as<CFDataRef>());
    // A prefix larger than the first room, so that writing the buffer into itself moves it.
    const std::vector<uint8_t> prefix(3000, 0xAB);
    CFDataAppendBytes(data, prefix.data(), CFIndex(prefix.size()));
    std::vector<uint8_t> expected = prefix;
    {
        TCFFlattenContext context(data, false);
        context.Flatten(Array({buffer.get()}).get());
        AppendBigEndian(expected, 17);
        AppendBigEndian(expected, 1);
        const std::vector<uint8_t> before = expected; // the data holds what was written so far
        AppendBigEndian(expected, 18);
        AppendBigEndian(expected, uint32_t(before.size()));
        expected.insert(expected.end(), before.begin(), before.end());
        EXPECT_EQ(context.GetLength(), CFIndex(expected.size()));

        const UInt8 mark = 0xCC;
        CFDataAppendBytes(data, &mark, 1);
        expected.push_back(mark);
        context.Flatten(Str("a").get());
        AppendText(expected, "a");
        // All of its own bytes again, which needs a larger block.
        context.StreamOut(CFDataGetBytePtr(data), 1, CFDataGetLength(data));
        const std::vector<uint8_t> whole = expected;
        expected.insert(expected.end(), whole.begin(), whole.end());
    }
    EXPECT_EQ(BytesOf(buffer.as<CFDataRef>()), expected);
}

TEST(FlattenBuffer, ABufferThatCannotTakeBytesFailsTheJobWithoutWritingAnywhere) {
    const UInt8 bytes[] = {0xAA};
    Ref frozen(CFDataCreate(nullptr, bytes, 1));
    for (__CFData* buffer : {const_cast<__CFData*>(frozen.as<CFDataRef>()), (__CFData*)nullptr}) {
        LogCapture log;
        TCFFlattenContext context(buffer, false);
        context.Flatten(Array({Str("a").get(), Str(Repeat("b", 5000)).get()}).get());
        context.StreamOutCFIndex(7);
        EXPECT_TRUE(context.HasFailed());
        // Reported by the platform once per public call, and nothing else is tried.
        const Lines lines = log.Texts();
        ASSERT_EQ(lines.size(), 4u);
        EXPECT_EQ(lines[0].rfind("*** Assertion failure in DataReserveTail, ", 0), 0u);
        EXPECT_EQ(lines[3],
                  "Invalid parameter not satisfying: object != nullptr && object->isMutable");
    }
    EXPECT_EQ(ToHex(frozen.as<CFDataRef>()), "AA");
}

TEST(FlattenEstimates, MatchTheBytesWrittenExceptForStringsAndCharacterSets) {
    Ref a = Str("a");
    const UInt8 bytes[] = {1, 2, 3};
    Ref data(CFDataCreate(nullptr, bytes, 3));
    Ref url(CFURLCreateWithString(nullptr, CFSTR("file:///x"), nullptr));
    const CFUUIDBytes uuidBytes = {};
    Ref uuid(CFUUIDCreateFromUUIDBytes(nullptr, uuidBytes));
    Ref value = Dict({{a.get(), Array({data.get(), url.get(), uuid.get(), kCFBooleanTrue,
                                       Num<int32_t>(kCFNumberSInt32Type, 5).get()})
                                    .get()}});
    // The key's estimate is 3 bytes per unit + 8 = 11, 2 more than it takes; nothing is
    // estimated for a value that cannot be written.
    Ref date(CFDateCreate(nullptr, 0));
    Ref set(CFCharacterSetCreateWithCharactersInRange(nullptr, CFRangeMake(0x1F600, 2)));
    const std::vector<CFIndex> estimates = {
        TCFFlattenContext::EstimateSize(value.get()), TCFFlattenContext::EstimateSize(nullptr),
        TCFFlattenContext::EstimateSize(date.get()), TCFFlattenContext::EstimateSize(set.get())};
    EXPECT_EQ(estimates, (std::vector<CFIndex>{CFIndex(FlattenedBytes(value.get()).size()) + 2, 0,
                                               0, 8200 + 8193}));
}
