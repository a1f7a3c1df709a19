#include <algorithm>
#include <atomic>
#include <optional>
#include <random>
#include <vector>

#include <gtest/gtest.h>

#include "bitmap/QZBitmapRepresentation.h"
#include "support/Values.h"

namespace {

using Bytes = std::vector<UInt8>;
using glyphwell::testing::Hex;

/// The codec's result as bytes; nullopt for a null data object.
std::optional<Bytes> Apply(CFDataRef (*codec)(const UInt8*, CFIndex), const Bytes& input) {
    CFDataRef data = codec(input.data(), CFIndex(input.size()));
    if (!data)
        return std::nullopt;
    Bytes bytes(CFDataGetBytePtr(data), CFDataGetBytePtr(data) + CFDataGetLength(data));
    CFRelease(data);
    return bytes;
}

std::optional<Bytes> Compress(const Bytes& input) {
    return Apply(QZCreateCompressedBitmapRepresentation, input);
}

std::optional<Bytes> Decompress(const Bytes& input) {
    return Apply(QZCopyUncompressedBitmapRepresentation, input);
}

Bytes Concat(std::initializer_list<Bytes> parts) {
    Bytes all;
    for (const Bytes& part : parts)
        all.insert(all.end(), part.begin(), part.end());
    return all;
}

// Reference codec: a word-by-word transcription of the format, no shortcuts.

Bytes ReferenceCompress(const Bytes& in) {
    auto word = [&](size_t i) { return UInt16(in[2 * i] | in[2 * i + 1] << 8); };
    size_t zeros = 0, ones = 0;
    for (size_t i = 0; i < std::min<size_t>(in.size() / 4, 1000); ++i) {
        const UInt32 w = UInt32(word(2 * i)) | UInt32(word(2 * i + 1)) << 16;
        zeros += w == 0;
        ones += w == 0xFFFFFFFF;
    }
    const UInt16 fill = ones > zeros ? 0xFFFF : 0x0000;
    Bytes out;
    auto put = [&](size_t value, size_t width) {
        for (size_t i = 0; i < width; ++i)
            out.push_back(UInt8(value >> (8 * i)));
    };
    put(fill ? 1 : 0, 4);
    put(in.size(), 4);
    size_t p = 0, remaining = in.size() / 2;
    do {
        const size_t start = p;
        size_t n = std::min<size_t>(remaining, 65535);
        for (;;) {
            while (n > 0 && word(p) != fill)
                ++p, --n;
            if (n > 3 && word(p + 3) != fill)
                p += 4, n -= 4;
            else if (n > 2 && word(p + 2) != fill)
                p += 3, n -= 3;
            else if (n < 2 || word(p + 1) == fill)
                break;
            else
                p += 2, n -= 2;
        }
        put(p - start, 2);
        out.insert(out.end(), in.begin() + 2 * start, in.begin() + 2 * p);
        remaining -= p - start;
        if (remaining > 0) {
            const size_t window = std::min<size_t>(remaining, 65535);
            size_t count = 0;
            while (count < window && word(p + count) == fill)
                ++count;
            put(count, 2);
            p += count;
            remaining -= count;
        }
    } while (remaining > 0);
    if (in.size() % 2)
        out.push_back(in.back());
    return out;
}

/// Compresses `input`, expects exactly the reference encoding, and the input back from it.
void ExpectRoundTrip(const Bytes& input) {
    SCOPED_TRACE(testing::Message() << "input of " << input.size() << " bytes");
    const std::optional<Bytes> compressed = Compress(input);
    ASSERT_TRUE(compressed);
    ASSERT_EQ(*compressed, ReferenceCompress(input));
    ASSERT_EQ(Decompress(*compressed), input);
}

TEST(BitmapCodec, DocumentedExamplesEncodeAndDecodeExactly) {
    Bytes noFill(131070); // no fill word at all: one literal run as long as a run can be
    for (size_t i = 0; i < noFill.size(); ++i)
        noFill[i] = UInt8(i % 251 + 1);
    const struct {
        Bytes input;
        Bytes compressed;
        bool encodes = true; ///< else an input only the decoder sees
    } examples[] = {
        {Bytes(8, 0x00), Hex("00 00 00 00 08 00 00 00 00 00 04 00")},
        {Bytes(8, 0xFF), Hex("01 00 00 00 08 00 00 00 00 00 04 00")},
        {Hex("01 00 00 00 00"), Hex("00 00 00 00 05 00 00 00 01 00 01 00 01 00 00")},
        {Hex("00 00 01 00 00 00 00 00"), Hex("00 00 00 00 08 00 00 00 02 00 00 00 01 00 02 00")},
        {Hex("01 02 03 04 00 00 00 00 00 00 00 00 05 06"),
         Hex("00 00 00 00 0E 00 00 00 02 00 01 02 03 04 04 00 01 00 05 06")},
        // An empty and a full Basic Multilingual Plane: a literal count 0 and one fill run.
        {Bytes(8192, 0x00), Hex("00 00 00 00 00 20 00 00 00 00 00 10")},
        {Bytes(8192, 0xFF), Hex("01 00 00 00 00 20 00 00 00 00 00 10")},
        // One byte: an empty word range still gets its literal count, then the byte.
        {Hex("7A"), Hex("00 00 00 00 01 00 00 00 00 00 7A")},
        // One to three fill words between other words stay in the literal run.
        {Hex("11 11 00 00 22 22 00 00 00 00 33 33 00 00 00 00 00 00 44 44"),
         Hex("00 00 00 00 14 00 00 00 0A 00 11 11 00 00 22 22 00 00 00 00 33 33 00 00 00 00 00 "
             "00 44 44")},
        // Four fill words in a row end the literal run.
        {Hex("11 11 00 00 00 00 00 00 00 00 44 44"),
         Hex("00 00 00 00 0C 00 00 00 01 00 11 11 04 00 01 00 44 44")},
        // Fill words reaching the end of the input end the literal run, however few.
        {Hex("11 11 FF FF 00 00"), Hex("00 00 00 00 06 00 00 00 02 00 11 11 FF FF 01 00")},
        // An odd length keeps its last byte: an empty Basic Multilingual Plane, then plane 1 (its
        // number, then a bitmap with members in its first and last byte).
        {Concat({Bytes(8192, 0x00), {0x01, 0x01}, Bytes(8190, 0x00), {0x5A}}),
         Hex("00 00 00 00 01 40 00 00 00 00 00 10 01 00 01 01 FF 0F 5A")},
        // 65537 zero words: the fill run stops at 65535 words, a literal count 0 starts the next.
        {Bytes(2 * 65537, 0x00), Hex("00 00 00 00 02 00 02 00 00 00 FF FF 00 00 02 00")},
        // Without a fill word the input grows by the header and one count; one word more than a
        // run can hold gives a fill count 0 and a second literal run.
        {noFill, Concat({Hex("00 00 00 00 FE FF 01 00 FF FF"), noFill})},
        {Concat({noFill, Hex("12 34")}),
         Concat({Hex("00 00 00 00 00 00 02 00 FF FF"), noFill, Hex("00 00 01 00 12 34")})},
        // Decoding only: a format other than 1 fills with zeros, and empty records may follow once
        // the output is full.
        {Bytes(4, 0x00), Hex("02 00 00 00 04 00 00 00 00 00 02 00"), false},
        {Bytes(4, 0x00), Hex("01 01 00 00 04 00 00 00 00 00 02 00"), false},
        {Hex("AB CD"), Hex("00 00 00 00 02 00 00 00 01 00 AB CD 00 00 00 00"), false},
    };
    for (const auto& example : examples) {
        SCOPED_TRACE(testing::PrintToString(example.compressed));
        if (example.encodes) {
            EXPECT_EQ(Compress(example.input), example.compressed);
        }
        EXPECT_EQ(Decompress(example.compressed), example.input);
    }
}

TEST(BitmapCodec, FormatFollowsTheMajorityOfTheFirstThousandWords) {
    // A tie gives format 0; all-ones words past the first 4000 bytes do not count.
    const Bytes tie = Concat({Bytes(2000, 0x00), Bytes(2000, 0xFF), Bytes(4000, 0xFF)});
    EXPECT_EQ(Compress(tie)->at(0), 0x00);
    EXPECT_EQ(Compress(Concat({Bytes(1996, 0x00), Bytes(2004, 0xFF)}))->at(0), 0x01);
    // Words that are only partly zero or partly ones count for neither.
    EXPECT_EQ(Compress(Hex("00 00 00 01 FF FF FF FF FF FF 00 00"))->at(0), 0x01);
    // Inputs of fewer than four bytes have no words to look at.
    EXPECT_EQ(Compress({0xFF, 0xFF, 0xFF}), Hex("00 00 00 00 03 00 00 00 01 00 FF FF FF"));
}

TEST(BitmapCodec, NullEmptyOrMalformedInputGivesNull) {
    const UInt8 byte = 0;
    for (auto codec :
         {QZCreateCompressedBitmapRepresentation, QZCopyUncompressedBitmapRepresentation})
        EXPECT_TRUE(!codec(nullptr, 12) && !codec(&byte, 0) && !codec(&byte, -1));
    const char* malformed[] = {
        "00 00 00 00 04 00 00",                      // shorter than the header
        "00 00 00 00 00 00 00 00",                   // claims no bytes at all
        "00 00 00 00 00 00 00 00 00 00",             // the same, with records
        "00 00 00 00 02 00 00 00 02 00 01 02 03 04", // a literal run past the length
        "00 00 00 00 06 00 00 00 01 00 01 02 03 00", // a fill run past the length
        "00 00 00 00 08 00 00 00 01 00 01 02 02 00", // output bytes left unwritten
        "00 00 00 00 08 00 00 00",                   // no records at all
        "00 00 00 00 04 00 00 00 02 00 01 02 03",    // a literal run past the input
        "00 00 00 00 04 00 00 00 01 00 01 02 01",    // a count cut in half after a literal run
        "00 00 00 00 04 00 00 00 02",                // a count cut in half alone
        "00 00 00 00 01 00 00 00",                   // odd length, no trailing byte
        "00 00 00 00 03 00 00 00 01 00 01 02",       // odd length, records eat the trailing byte
    };
    for (const char* input : malformed) {
        SCOPED_TRACE(input);
        EXPECT_EQ(Decompress(Hex(input)), std::nullopt);
    }
}

#if defined(__SANITIZE_ADDRESS__)
// The sanitizer runtime reports every allocation to this hook; it records the largest size.
extern "C" int __sanitizer_install_malloc_and_free_hooks(void (*)(const volatile void*, size_t),
                                                         void (*)(const volatile void*));
std::atomic<size_t> largestAllocation{0};
void RecordAllocation(const volatile void*, size_t size) {
    size_t largest = largestAllocation.load();
    while (size > largest && !largestAllocation.compare_exchange_weak(largest, size)) {
    }
}
void IgnoreFree(const volatile void*) {}
#endif

TEST(BitmapCodec, RefusesAHugeClaimBeforeAllocatingIt) {
#if defined(__SANITIZE_ADDRESS__)
    static const int installed =
        __sanitizer_install_malloc_and_free_hooks(RecordAllocation, IgnoreFree);
    (void)installed;
    largestAllocation = 0;
#endif
    // 4 GiB - 1 from a trailing byte alone, then from the longest fill run.
    EXPECT_EQ(Decompress(Hex("00 00 00 00 FF FF FF FF 00")), std::nullopt);
    EXPECT_EQ(Decompress(Hex("01 00 00 00 FF FF FF FF 00 00 FF FF 00")), std::nullopt);
#if defined(__SANITIZE_ADDRESS__)
    EXPECT_LT(largestAllocation.load(), size_t(1) << 20);
#endif
    // The same fill run, claiming what it gives, decodes.
    EXPECT_EQ(Decompress(Hex("01 00 00 00 FF FF 01 00 00 00 FF FF 00")),
              Concat({Bytes(131070, 0xFF), {0x00}}));
}

// Inputs made of alternating runs of fill words and other words, in random lengths that favour
// the boundaries of the encoder's rules (1-4 fill words, runs near 65535 words).
Bytes RunsInput(std::mt19937& random, size_t words, UInt16 fill, bool oddByte) {
    static const size_t kRunLengths[] = {1,     2,     3,     4,     5,     7,     8,
                                         65533, 65534, 65535, 65536, 65537, 131070};
    Bytes input;
    bool fillRun = random() % 2;
    while (input.size() < 2 * words) {
        size_t run =
            random() % 3 == 0 ? kRunLengths[random() % std::size(kRunLengths)] : random() % 40 + 1;
        run = std::min(run, words - input.size() / 2);
        for (size_t i = 0; i < run; ++i) {
            UInt16 word = fill;
            while (!fillRun && word == fill)
                word = UInt16(random() % 3 == 0 ? ~fill : random());
            input.push_back(UInt8(word));
            input.push_back(UInt8(word >> 8));
        }
        fillRun = !fillRun;
    }
    if (oddByte)
        input.push_back(UInt8(random()));
    return input;
}

TEST(BitmapCodec, StructuredAndRandomInputsRoundTripWithTheReferenceEncoding) {
    std::mt19937 random(20240611);
    for (int i = 0; i < 300; ++i) {
        const size_t words = i < 250 ? random() % 600 : random() % 300000;
        ExpectRoundTrip(RunsInput(random, words, random() % 2 ? 0xFFFF : 0x0000, random() % 2));
    }
    for (int i = 0; i < 400; ++i) {
        // Sparse, dense and plain random bytes, of every small length and some long ones.
        const size_t length = i < 100 ? size_t(i) + 1 : random() % (i < 380 ? 20000 : 300000);
        Bytes input(std::max<size_t>(length, 1));
        for (UInt8& byte : input) // rare others among zeros or ones, or plain small bytes
            byte = i % 3 == 2      ? UInt8(random() % 4)
                   : random() % 64 ? UInt8(i % 3 ? 0xFF : 0)
                                   : UInt8(random());
        ExpectRoundTrip(input);
    }
}

} // namespace
