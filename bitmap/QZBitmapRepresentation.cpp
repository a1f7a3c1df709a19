#include "bitmap/QZBitmapRepresentation.h"

#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <new>

namespace {

constexpr size_t kHeaderSize = 8;
/// A run count is 16 bits, so no run is longer than this many words.
constexpr size_t kMaxRunWords = 65535;
/// The format decision looks at no more than this many 32-bit words (4000 bytes).
constexpr size_t kFormatSampleWords = 1000;

constexpr UInt16 kFillWordFormat0 = 0x0000;
constexpr UInt16 kFillWordFormat1 = 0xFFFF;

// Input words. The two fill words read the same in either byte order, and the encoder only ever
// compares words with the fill word, so words are loaded as they lie and copied unchanged.

inline UInt16 LoadWord(const UInt8* words, size_t index) {
    UInt16 word;
    std::memcpy(&word, words + 2 * index, sizeof word);
    return word;
}

/// Four words starting at word `index`, as one 64-bit block.
inline UInt64 LoadBlock(const UInt8* words, size_t index) {
    UInt64 block;
    std::memcpy(&block, words + 2 * index, sizeof block);
    return block;
}

/// True when one of the four 16-bit lanes of `block` equals the fill word repeated in `fill64`
/// (a lane is zero after the XOR exactly when it is the fill word; the test for a zero lane is
/// exact as a yes/no answer).
inline bool BlockHasFillWord(UInt64 block, UInt64 fill64) {
    const UInt64 x = block ^ fill64;
    return ((x - 0x0001000100010001u) & ~x & 0x8000800080008000u) != 0;
}

inline UInt64 RepeatFillWord(UInt16 fill) {
    return fill == 0 ? 0 : ~UInt64(0);
}

// Header fields and run counts are little-endian.

inline size_t LoadLE16(const UInt8* p) {
    return size_t(p[0]) | size_t(p[1]) << 8;
}

inline UInt32 LoadLE32(const UInt8* p) {
    return UInt32(p[0]) | UInt32(p[1]) << 8 | UInt32(p[2]) << 16 | UInt32(p[3]) << 24;
}

inline void StoreLE16(UInt8* p, size_t value) {
    p[0] = UInt8(value);
    p[1] = UInt8(value >> 8);
}

inline void StoreLE32(UInt8* p, UInt32 value) {
    for (int i = 0; i < 4; ++i)
        p[i] = UInt8(value >> (8 * i));
}

/// Format 1 (fill word 0xFFFF) when, among the first min(length / 4, 1000) 32-bit words, those
/// with all bits set outnumber the zero words; a tie or no words at all gives format 0.
bool ShouldUseFormat1(const UInt8* bytes, CFIndex length) {
    const size_t sampleWords = std::min(size_t(length) / 4, kFormatSampleWords);
    size_t zeroWords = 0;
    size_t onesWords = 0;
    for (size_t i = 0; i < sampleWords; ++i) {
        UInt32 word;
        std::memcpy(&word, bytes + 4 * i, sizeof word);
        zeroWords += word == 0;
        onesWords += word == 0xFFFFFFFFu;
    }
    return onesWords > zeroWords;
}

/// The end (a word index) of the literal run that starts at word `p` and may cover at most
/// `window` words. The run ends at the first fill word that begins four fill words in a row, or
/// at a row of fill words that reaches the end of the window; one to three fill words followed
/// by another word stay inside the run.
size_t EndOfLiteralRun(const UInt8* words, size_t p, size_t window, UInt16 fill) {
    const UInt64 fill64 = RepeatFillWord(fill);
    size_t left = window;
    for (;;) {
        // Pass the words that are not the fill word, four at a time while none of four is.
        while (left >= 4 && !BlockHasFillWord(LoadBlock(words, p), fill64)) {
            p += 4;
            left -= 4;
        }
        while (left > 0 && LoadWord(words, p) != fill) {
            ++p;
            --left;
        }
        // Here word p is a fill word, or the window is used up. Fill words stay in the run when
        // one of the next three words is not the fill word; four in a row, or a row that
        // reaches the end of the window, end it.
        if (left > 3 && LoadWord(words, p + 3) != fill) {
            p += 4;
            left -= 4;
        } else if (left > 2 && LoadWord(words, p + 2) != fill) {
            p += 3;
            left -= 3;
        } else if (left < 2 || LoadWord(words, p + 1) == fill) {
            return p;
        } else {
            p += 2;
            left -= 2;
        }
    }
}

/// The number of fill words from word `p` onwards, at most `window`.
size_t CountFillWords(const UInt8* words, size_t p, size_t window, UInt16 fill) {
    const UInt64 fill64 = RepeatFillWord(fill);
    size_t count = 0;
    while (window - count >= 4 && LoadBlock(words, p + count) == fill64)
        count += 4;
    while (count < window && LoadWord(words, p + count) == fill)
        ++count;
    return count;
}

/// Codes `length` bytes (length > 0) against `fillWord` and returns the body size in bytes (no
/// header). Writes the body to `destination` only when it is not null; it must then have room
/// for the size that a call without destination returned.
CFIndex GetCompressedBitmapRepresentation(const UInt8* bytes, CFIndex length, UInt16 fillWord,
                                          UInt8* destination) {
    size_t remaining = size_t(length) / 2; // words not yet coded
    size_t p = 0;                          // next word to code
    size_t size = 0;                       // body bytes so far
    // An empty word range (one input byte) still gets one literal count 0.
    do {
        const size_t literalEnd =
            EndOfLiteralRun(bytes, p, std::min(remaining, kMaxRunWords), fillWord);
        const size_t literalWords = literalEnd - p;
        if (destination) {
            StoreLE16(destination + size, literalWords);
            std::memcpy(destination + size + 2, bytes + 2 * p, 2 * literalWords);
        }
        size += 2 + 2 * literalWords;
        p = literalEnd;
        remaining -= literalWords;

        if (remaining > 0) {
            const size_t fillWords =
                CountFillWords(bytes, p, std::min(remaining, kMaxRunWords), fillWord);
            if (destination)
                StoreLE16(destination + size, fillWords);
            size += 2;
            p += fillWords;
            remaining -= fillWords;
        }
    } while (remaining > 0);

    if (length % 2 != 0) {
        if (destination)
            destination[size] = bytes[length - 1];
        ++size;
    }
    return CFIndex(size);
}

CFIndex GetCompressedBitmapRepresentationFormat0(const UInt8* bytes, CFIndex length,
                                                 UInt8* destination) {
    return GetCompressedBitmapRepresentation(bytes, length, kFillWordFormat0, destination);
}

CFIndex GetCompressedBitmapRepresentationFormat1(const UInt8* bytes, CFIndex length,
                                                 UInt8* destination) {
    return GetCompressedBitmapRepresentation(bytes, length, kFillWordFormat1, destination);
}

/// Replays the records of the representation `compressed` (`length` >= 8 bytes, header
/// included) into `capacity` output bytes, fill runs made of `fillByte`. Succeeds only when the
/// records stay inside the input, stay inside the output, and fill it exactly (the trailing byte
/// of an odd `capacity` must be there too). Writes to `destination` only when it is not null, so
/// a call without destination checks the records before the output is allocated.
bool GetUncompressedBitmapRepresentation(const UInt8* compressed, CFIndex length, CFIndex capacity,
                                         UInt8 fillByte, UInt8* destination) {
    const size_t trailing = size_t(capacity) % 2;
    if (size_t(length) < kHeaderSize + trailing)
        return false;
    const size_t recordsEnd = size_t(length) - trailing;
    const size_t room = size_t(capacity) - trailing; // bytes the records must fill
    size_t in = kHeaderSize;
    size_t out = 0;
    while (in < recordsEnd) {
        if (recordsEnd - in < 2)
            return false;
        const size_t literalBytes = 2 * LoadLE16(compressed + in);
        in += 2;
        if (literalBytes > recordsEnd - in || literalBytes > room - out)
            return false;
        if (destination)
            std::memcpy(destination + out, compressed + in, literalBytes);
        in += literalBytes;
        out += literalBytes;
        if (in == recordsEnd)
            break;

        if (recordsEnd - in < 2)
            return false;
        const size_t fillBytes = 2 * LoadLE16(compressed + in);
        in += 2;
        if (fillBytes > room - out)
            return false;
        if (destination)
            std::memset(destination + out, fillByte, fillBytes);
        out += fillBytes;
    }
    if (out != room)
        return false;
    if (trailing && destination)
        destination[room] = compressed[length - 1];
    return true;
}

bool GetUncompressedBitmapRepresentationDataFormat0(const UInt8* compressed, CFIndex length,
                                                    CFIndex capacity, UInt8* destination) {
    return GetUncompressedBitmapRepresentation(compressed, length, capacity, 0x00, destination);
}

bool GetUncompressedBitmapRepresentationDataFormat1(const UInt8* compressed, CFIndex length,
                                                    CFIndex capacity, UInt8* destination) {
    return GetUncompressedBitmapRepresentation(compressed, length, capacity, 0xFF, destination);
}

/// Decodes by the header's format: 1 fills with 0xFF, any other value with 0x00. `length` >= 8.
bool GetUncompressedBitmapRepresentationData(const UInt8* compressed, CFIndex length,
                                             CFIndex capacity, UInt8* destination) {
    if (LoadLE32(compressed) == 1)
        return GetUncompressedBitmapRepresentationDataFormat1(compressed, length, capacity,
                                                              destination);
    return GetUncompressedBitmapRepresentationDataFormat0(compressed, length, capacity,
                                                          destination);
}

/// A data object that owns `buffer` (from malloc) of `length` bytes; frees it when that fails.
CFDataRef AdoptBuffer(UInt8* buffer, CFIndex length) {
    CFDataRef data = nullptr;
    try {
        data = CFDataCreateWithBytesNoCopy(kCFAllocatorDefault, buffer, length, kCFAllocatorMalloc);
    } catch (const std::bad_alloc&) {
    }
    if (!data)
        std::free(buffer);
    return data;
}

} // namespace

CFDataRef QZCreateCompressedBitmapRepresentation(const UInt8* bytes, CFIndex length) {
    if (!bytes || length <= 0)
        return nullptr;
    const bool format1 = ShouldUseFormat1(bytes, length);
    // First pass for the size, so that the output is allocated once at its exact size.
    const CFIndex bodySize = format1
                                 ? GetCompressedBitmapRepresentationFormat1(bytes, length, nullptr)
                                 : GetCompressedBitmapRepresentationFormat0(bytes, length, nullptr);
    const CFIndex size = CFIndex(kHeaderSize) + bodySize;
    UInt8* buffer = static_cast<UInt8*>(std::malloc(size_t(size)));
    if (!buffer)
        return nullptr;
    StoreLE32(buffer, format1 ? 1 : 0);
    StoreLE32(buffer + 4, UInt32(length));
    if (format1)
        GetCompressedBitmapRepresentationFormat1(bytes, length, buffer + kHeaderSize);
    else
        GetCompressedBitmapRepresentationFormat0(bytes, length, buffer + kHeaderSize);
    return AdoptBuffer(buffer, size);
}

CFDataRef QZCopyUncompressedBitmapRepresentation(const UInt8* bytes, CFIndex length) {
    if (!bytes || length < CFIndex(kHeaderSize))
        return nullptr;
    // The claimed length is trusted only once the records are known to fill it exactly, so a
    // short input claiming gigabytes is refused before anything is allocated.
    const CFIndex capacity = CFIndex(LoadLE32(bytes + 4));
    if (capacity == 0 || !GetUncompressedBitmapRepresentationData(bytes, length, capacity, nullptr))
        return nullptr;
    UInt8* buffer = static_cast<UInt8*>(std::malloc(size_t(capacity)));
    if (!buffer)
        return nullptr;
    if (!GetUncompressedBitmapRepresentationData(bytes, length, capacity, buffer)) {
        std::free(buffer);
        return nullptr;
    }
    return AdoptBuffer(buffer, capacity);
}
