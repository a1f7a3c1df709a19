#include <algorithm>
#include <atomic>
#include <cstring>
#include <optional>
#include <random>
#include <vector>

#include <gtest/gtest.h>

#include "bitmap/QZBitmapRepresentation.h"

namespace {

using Bytes = std::vector<UInt8>;

// The codec's results as byte vectors; nullopt stands for a null data object.

std::optional<Bytes> TakeBytes(CFDataRef data) {
    if (!data)
        return std::nullopt;
    const UInt8* begin = CFDataGetBytePtr(data);
    Bytes bytes(begin, begin + CFDataGetLength(data));
    CFRelease(data);
    return bytes;
}

std::optional<Bytes> Compress(const Bytes& input) {
    return TakeBytes(QZCreateCompressedBitmapRepresentation(input.data(), CFIndex(input.size())));
}

std::optional<Bytes> Decompress(const Bytes& input) {
    return TakeBytes(QZCopyUncompressedBitmapRepresentation(input.data(), CFIndex(input.size())));
}

Bytes Concat(std::initializer_list<Bytes> parts) {
    Bytes all;
    for (const Bytes& part : parts)
        all.insert(all.end(), part.begin(), part.end());
    return all;
}

Bytes Repeat(size_t count, UInt8 byte) {
    return Bytes(count, byte);
}

size_t LoadLE(const Bytes& bytes, size_t offset, size_t width) {
    size_t value = 0;
    for (size_t i = 0; i < width; ++i)
        value |= size_t(bytes.at(offset + i)) << (8 * i);
    return value;
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

Bytes ReferenceDecompress(const Bytes& c) {
    const size_t n = LoadLE(c, 4, 4);
    const UInt8 fill = LoadLE(c, 0, 4) == 1 ? 0xFF : 0x00;
    const size_t end = c.size() - n % 2;
    Bytes out;
    for (size_t i = 8; i < end;) {
        const size_t literal = 2 * LoadLE(c, i, 2);
        i += 2;
        if (i + literal > end)
            return {};
        out.insert(out.end(), c.begin() + i, c.begin() + i + literal);
        i += literal;
        if (i < end) {
            out.insert(out.end(), 2 * LoadLE(c, i, 2), fill);
            i += 2;
        }
    }
    if (n % 2)
        out.push_back(c.back());
    return out;
}

/// Compresses `input`, expects exactly the reference encoding, and expects both decoders to
/// give the input back.
void ExpectRoundTrip(const Bytes& input) {
    SCOPED_TRACE(testing::Message() << "input of " << input.size() << " bytes");
    const std::optional<Bytes> compressed = Compress(input);
    ASSERT_TRUE(compressed);
    ASSERT_EQ(*compressed, ReferenceCompress(input));
    ASSERT_EQ(ReferenceDecompress(*compressed), input);
    ASSERT_EQ(Decompress(*compressed), input);
}

TEST(BitmapCodec, DocumentedExamplesEncodeAndDecodeExactly) {
    const struct {
        Bytes input;
        Bytes compressed;
    } examples[] = {
        {Repeat(8, 0x00), {0x00, 0x00, 0x00, 0x00, 0x08, 0x00, 0x00, 0x00, 0x00, 0x00, 0x04, 0x00}},
        {Repeat(8, 0xFF), {0x01, 0x00, 0x00, 0x00, 0x08, 0x00, 0x00, 0x00, 0x00, 0x00, 0x04, 0x00}},
        {{0x01, 0x00, 0x00, 0x00, 0x00},
         {0x00, 0x00, 0x00, 0x00, 0x05, 0x00, 0x00, 0x00, 0x01, 0x00, 0x01, 0x00, 0x01, 0x00,
          0x00}},
        {{0x00, 0x00, 0x01, 0x00, 0x00, 0x00, 0x00, 0x00},
         {0x00, 0x00, 0x00, 0x00, 0x08, 0x00, 0x00, 0x00, 0x02, 0x00, 0x00, 0x00, 0x01, 0x00, 0x02,
          0x00}},
        {Concat({{0x01, 0x02, 0x03, 0x04}, Repeat(8, 0x00), {0x05, 0x06}}),
         {0x00, 0x00, 0x00, 0x00, 0x0E, 0x00, 0x00, 0x00, 0x02, 0x00,
          0x01, 0x02, 0x03, 0x04, 0x04, 0x00, 0x01, 0x00, 0x05, 0x06}},
        // An empty and a full Basic Multilingual Plane: a literal count 0 and one fill run.
        {Repeat(8192, 0x00),
         {0x00, 0x00, 0x00, 0x00, 0x00, 0x20, 0x00, 0x00, 0x00, 0x00, 0x00, 0x10}},
        {Repeat(8192, 0xFF),
         {0x01, 0x00, 0x00, 0x00, 0x00, 0x20, 0x00, 0x00, 0x00, 0x00, 0x00, 0x10}},
        // One byte: an empty word range still gets its literal count, then the byte.
        {{0x7A}, {0x00, 0x00, 0x00, 0x00, 0x01, 0x00, 0x00, 0x00, 0x00, 0x00, 0x7A}},
        // One to three fill words between other words stay in the literal run.
        {{0x11, 0x11, 0x00, 0x00, 0x22, 0x22, 0x00, 0x00, 0x00, 0x00,
          0x33, 0x33, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x44, 0x44},
         {0x00, 0x00, 0x00, 0x00, 0x14, 0x00, 0x00, 0x00, 0x0A, 0x00,
          0x11, 0x11, 0x00, 0x00, 0x22, 0x22, 0x00, 0x00, 0x00, 0x00,
          0x33, 0x33, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x44, 0x44}},
        // Four fill words in a row end the literal run.
        {{0x11, 0x11, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x44, 0x44},
         {0x00, 0x00, 0x00, 0x00, 0x0C, 0x00, 0x00, 0x00, 0x01, 0x00, 0x11, 0x11, 0x04, 0x00, 0x01,
          0x00, 0x44, 0x44}},
        // Fill words reaching the end of the input end the literal run, however few.
        {{0x11, 0x11, 0xFF, 0xFF, 0x00, 0x00},
         {0x00, 0x00, 0x00, 0x00, 0x06, 0x00, 0x00, 0x00, 0x02, 0x00, 0x11, 0x11, 0xFF, 0xFF, 0x01,
          0x00}},
        // An odd length keeps its last byte: an empty Basic Multilingual Plane, then plane 1 (its
        // number, then a bitmap with members in its first and last byte).
        {Concat({Repeat(8192, 0x00), {0x01, 0x01}, Repeat(8190, 0x00), {0x5A}}),
         {0x00, 0x00, 0x00, 0x00, 0x01, 0x40, 0x00, 0x00, 0x00, 0x00, 0x00, 0x10, 0x01, 0x00, 0x01,
          0x01, 0xFF, 0x0F, 0x5A}},
        // 65537 zero words: the fill run stops at 65535 words, a literal count 0 starts the next.
        {Repeat(2 * 65537, 0x00),
         {0x00, 0x00, 0x00, 0x00, 0x02, 0x00, 0x02, 0x00, 0x00, 0x00, 0xFF, 0xFF, 0x00, 0x00, 0x02,
          0x00}},
    };
    for (const auto& example : examples) {
        SCOPED_TRACE(testing::PrintToString(example.compressed));
        EXPECT_EQ(Compress(example.input), example.compressed);
        EXPECT_EQ(Decompress(example.compressed), example.input);
    }
    // Decoding only: a format other than 1 fills with zeros, and empty records may follow once
    // the output is full.
    const struct {
        Bytes compressed;
        Bytes output;
    } decodings[] = {
        {{0x02, 0x00, 0x00, 0x00, 0x04, 0x00, 0x00, 0x00, 0x00, 0x00, 0x02, 0x00}, Repeat(4, 0x00)},
        {{0x01, 0x01, 0x00, 0x00, 0x04, 0x00, 0x00, 0x00, 0x00, 0x00, 0x02, 0x00}, Repeat(4, 0x00)},
        {{0x00, 0x00, 0x00, 0x00, 0x02, 0x00, 0x00, 0x00, 0x01, 0x00, 0xAB, 0xCD, 0x00, 0x00, 0x00,
          0x00},
         {0xAB, 0xCD}},
    };
    for (const auto& decoding : decodings) {
        SCOPED_TRACE(testing::PrintToString(decoding.compressed));
        EXPECT_EQ(Decompress(decoding.compressed), decoding.output);
    }
}

TEST(BitmapCodec, InputWithoutFillWordGrowsByHeaderAndOneCount) {
    Bytes input(131070);
    for (size_t i = 0; i < input.size(); ++i)
        input[i] = UInt8(i % 251 + 1);
    const Bytes expected =
        Concat({{0x00, 0x00, 0x00, 0x00, 0xFE, 0xFF, 0x01, 0x00, 0xFF, 0xFF}, input});
    EXPECT_EQ(Compress(input), expected);

    // One word more than a run can hold: a fill count 0 and a second literal run follow.
    input.push_back(0x12);
    input.push_back(0x34);
    const Bytes longer = Concat({{0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x02, 0x00, 0xFF, 0xFF},
                                 Bytes(input.begin(), input.end() - 2),
                                 {0x00, 0x00, 0x01, 0x00, 0x12, 0x34}});
    EXPECT_EQ(Compress(input), longer);
}

TEST(BitmapCodec, FormatFollowsTheMajorityOfTheFirstThousandWords) {
    // A tie gives format 0; all-ones words past the first 4000 bytes do not count.
    const Bytes tie = Concat({Repeat(2000, 0x00), Repeat(2000, 0xFF), Repeat(4000, 0xFF)});
    EXPECT_EQ(Compress(tie)->at(0), 0x00);
    EXPECT_EQ(Compress(Concat({Repeat(1996, 0x00), Repeat(2004, 0xFF)}))->at(0), 0x01);
    // Words that are only partly zero or partly ones count for neither.
    const Bytes mixed = {0x00, 0x00, 0x00, 0x01, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0x00, 0x00};
    EXPECT_EQ(Compress(mixed)->at(0), 0x01);
    // Inputs of fewer than four bytes have no words to look at.
    EXPECT_EQ(Compress({0xFF, 0xFF, 0xFF}), (Bytes{0x00, 0x00, 0x00, 0x00, 0x03, 0x00, 0x00, 0x00,
                                                   0x01, 0x00, 0xFF, 0xFF, 0xFF}));
}

TEST(BitmapCodec, NullOrEmptyInputGivesNull) {
    const UInt8 byte = 0;
    EXPECT_EQ(QZCreateCompressedBitmapRepresentation(nullptr, 4), nullptr);
    EXPECT_EQ(QZCreateCompressedBitmapRepresentation(&byte, 0), nullptr);
    EXPECT_EQ(QZCreateCompressedBitmapRepresentation(&byte, -1), nullptr);
    EXPECT_EQ(QZCopyUncompressedBitmapRepresentation(nullptr, 12), nullptr);
    EXPECT_EQ(QZCopyUncompressedBitmapRepresentation(&byte, 0), nullptr);
    EXPECT_EQ(QZCopyUncompressedBitmapRepresentation(&byte, -1), nullptr);
}

TEST(BitmapCodec, MalformedInputGivesNull) {
    const Bytes malformed[] = {
        // Shorter than the header.
        {0x00, 0x00, 0x00, 0x00, 0x04, 0x00, 0x00},
        // Claims no bytes at all.
        {0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00},
        {0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00},
        // A length smaller than the records need: literal, then fill.
        {0x00, 0x00, 0x00, 0x00, 0x02, 0x00, 0x00, 0x00, 0x02, 0x00, 0x01, 0x02, 0x03, 0x04},
        {0x00, 0x00, 0x00, 0x00, 0x06, 0x00, 0x00, 0x00, 0x01, 0x00, 0x01, 0x02, 0x03, 0x00},
        // Records that leave output bytes unwritten.
        {0x00, 0x00, 0x00, 0x00, 0x08, 0x00, 0x00, 0x00, 0x01, 0x00, 0x01, 0x02, 0x02, 0x00},
        {0x00, 0x00, 0x00, 0x00, 0x08, 0x00, 0x00, 0x00},
        // A literal run longer than the rest of the input.
        {0x00, 0x00, 0x00, 0x00, 0x04, 0x00, 0x00, 0x00, 0x02, 0x00, 0x01, 0x02, 0x03},
        // A count cut in half, after a literal run and alone.
        {0x00, 0x00, 0x00, 0x00, 0x04, 0x00, 0x00, 0x00, 0x01, 0x00, 0x01, 0x02, 0x01},
        {0x00, 0x00, 0x00, 0x00, 0x04, 0x00, 0x00, 0x00, 0x02},
        // An odd length without room for its trailing byte.
        {0x00, 0x00, 0x00, 0x00, 0x01, 0x00, 0x00, 0x00},
        // An odd length whose records would need the byte kept for the trailing byte.
        {0x00, 0x00, 0x00, 0x00, 0x03, 0x00, 0x00, 0x00, 0x01, 0x00, 0x01, 0x02},
    };
    for (const Bytes& input : malformed) {
        SCOPED_TRACE(testing::PrintToString(input));
        EXPECT_EQ(Decompress(input), std::nullopt);
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
    EXPECT_EQ(Decompress({0x00, 0x00, 0x00, 0x00, 0xFF, 0xFF, 0xFF, 0xFF, 0x00}), std::nullopt);
    EXPECT_EQ(
        Decompress({0x01, 0x00, 0x00, 0x00, 0xFF, 0xFF, 0xFF, 0xFF, 0x00, 0x00, 0xFF, 0xFF, 0x00}),
        std::nullopt);
#if defined(__SANITIZE_ADDRESS__)
    EXPECT_LT(largestAllocation.load(), size_t(1) << 20);
#endif
    // The same fill run, claiming what it gives, decodes.
    EXPECT_EQ(
        Decompress({0x01, 0x00, 0x00, 0x00, 0xFF, 0xFF, 0x01, 0x00, 0x00, 0x00, 0xFF, 0xFF, 0x00}),
        Concat({Repeat(131070, 0xFF), {0x00}}));
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

TEST(BitmapCodec, StructuredInputsRoundTripWithTheReferenceEncoding) {
    std::mt19937 random(20240611);
    for (int i = 0; i < 300; ++i) {
        const size_t words = i < 250 ? random() % 600 : random() % 300000;
        ExpectRoundTrip(RunsInput(random, words, random() % 2 ? 0xFFFF : 0x0000, random() % 2));
    }
}

TEST(BitmapCodec, RandomInputsRoundTripWithTheReferenceEncoding) {
    std::mt19937 random(7);
    for (int i = 0; i < 400; ++i) {
        // Sparse, dense and plain random bytes, of every small length and some long ones.
        const size_t length = i < 100 ? size_t(i) + 1 : random() % (i < 380 ? 20000 : 300000);
        const int kind = i % 3;
        Bytes input(std::max<size_t>(length, 1));
        for (UInt8& byte : input) {
            const bool rare = random() % 64 == 0;
            byte = kind == 0   ? (rare ? UInt8(random()) : 0x00)
                   : kind == 1 ? (rare ? UInt8(random()) : 0xFF)
                               : UInt8(random() % 4);
        }
        ExpectRoundTrip(input);
    }
}

TEST(BitmapCodec, RunsAroundTheRunLimitRoundTripWithTheReferenceEncoding) {
    for (const UInt8 fillByte : {UInt8(0x00), UInt8(0xFF)}) {
        const UInt8 other = UInt8(~fillByte);
        for (size_t words : {65533u, 65534u, 65535u, 65536u, 65537u, 131070u, 131071u}) {
            SCOPED_TRACE(words);
            ExpectRoundTrip(Repeat(2 * words, fillByte));
            ExpectRoundTrip(Repeat(2 * words + 1, fillByte));
            // A literal run of `words` words between fill runs, and the window ending inside a
            // short row of fill words.
            for (size_t fills : {0u, 1u, 2u, 3u, 4u, 5u}) {
                ExpectRoundTrip(Concat({Repeat(8, fillByte), Repeat(2 * words, other),
                                        Repeat(2 * fills, fillByte), Repeat(2, other)}));
                ExpectRoundTrip(Concat({Repeat(2 * (words - 3), other), Repeat(2 * fills, fillByte),
                                        Repeat(6, other)}));
            }
        }
    }
}

} // namespace
