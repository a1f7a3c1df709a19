#include "platform/TextCodec.h"

#include <iconv.h>

#include <bit>
#include <cstring>

static_assert(std::endian::native == std::endian::little,
              "UTF-16 in host order is little-endian, and the encoder narrows words as such");

namespace glyphwell::text {
namespace {

constexpr char16_t kByteOrderMark = 0xFEFF;
constexpr char16_t kReplacement = 0xFFFD;

bool IsHighSurrogate(uint32_t unit) {
    return unit >= 0xD800 && unit <= 0xDBFF;
}
bool IsLowSurrogate(uint32_t unit) {
    return unit >= 0xDC00 && unit <= 0xDFFF;
}
bool IsSurrogate(uint32_t unit) {
    return unit >= 0xD800 && unit <= 0xDFFF;
}

/// The encodings this codec knows, by how they are written.
enum class Form { UTF8, UTF16BE, UTF16LE, UTF32BE, UTF32LE, ASCII, Latin1, MacRoman, Unknown };

Form FormOf(CFStringEncoding encoding) {
    switch (encoding) {
    case kCFStringEncodingUTF8:
        return Form::UTF8;
    case kCFStringEncodingUTF16:
    case kCFStringEncodingUTF16LE:
        return Form::UTF16LE; // the host is little-endian
    case kCFStringEncodingUTF16BE:
        return Form::UTF16BE;
    case kCFStringEncodingUTF32BE:
        return Form::UTF32BE;
    case kCFStringEncodingUTF32LE:
        return Form::UTF32LE;
    case kCFStringEncodingASCII:
        return Form::ASCII;
    case kCFStringEncodingISOLatin1:
        return Form::Latin1;
    case kCFStringEncodingMacRoman:
        return Form::MacRoman;
    default:
        return Form::Unknown;
    }
}

// ---------------------------------------------------------------------------------------------
// Mac Roman: the upper half of the code page, taken once from iconv. A byte iconv cannot map
// holds 0xFFFF (no such character) and is rejected both ways.

struct MacRomanTable {
    char16_t upper[128];
};

MacRomanTable BuildMacRomanTable() {
    MacRomanTable table;
    for (char16_t& unit : table.upper)
        unit = 0xFFFF;
    iconv_t converter = iconv_open("UTF-16LE", "MACINTOSH");
    if (converter == iconv_t(-1))
        return table;
    for (int byte = 0x80; byte <= 0xFF; ++byte) {
        char in = char(byte);
        unsigned char out[8];
        char* inPtr = &in;
        char* outPtr = reinterpret_cast<char*>(out);
        size_t inLeft = 1, outLeft = sizeof out;
        iconv(converter, nullptr, nullptr, nullptr, nullptr); // reset the shift state
        if (iconv(converter, &inPtr, &inLeft, &outPtr, &outLeft) != size_t(-1) &&
            sizeof out - outLeft == 2)
            table.upper[byte - 0x80] = char16_t(out[0] | out[1] << 8);
    }
    iconv_close(converter);
    return table;
}

const MacRomanTable& MacRoman() {
    static const MacRomanTable table = BuildMacRomanTable();
    return table;
}

/// The Mac Roman byte for a BMP character, or -1.
int MacRomanByte(uint32_t c) {
    if (c < 0x80)
        return int(c);
    const MacRomanTable& table = MacRoman();
    for (int i = 0; i < 128; ++i)
        if (table.upper[i] == c && c != 0xFFFF)
            return 0x80 + i;
    return -1;
}

// ---------------------------------------------------------------------------------------------
// Decoding.

/// Reads one multi-byte UTF-8 sequence at `p` (lead byte >= 0x80) with `available` bytes left.
/// Returns its length and stores the code point in `c`, or returns 0 when it is malformed.
size_t DecodeSequence(const uint8_t* p, size_t available, uint32_t& c) {
    auto continuation = [](uint8_t b) { return (b & 0xC0) == 0x80; };
    uint8_t lead = p[0];
    if (lead < 0xC2) // a stray continuation byte, or the lead of an overlong 2-byte form
        return 0;
    if (lead < 0xE0) {
        if (available < 2 || !continuation(p[1]))
            return 0;
        c = uint32_t(lead & 0x1F) << 6 | (p[1] & 0x3F);
        return 2;
    }
    if (lead < 0xF0) {
        // E0 needs A0-BF (no overlongs); ED needs 80-9F (no surrogates).
        uint8_t low = lead == 0xE0 ? 0xA0 : 0x80;
        uint8_t high = lead == 0xED ? 0x9F : 0xBF;
        if (available < 3 || p[1] < low || p[1] > high || !continuation(p[2]))
            return 0;
        c = uint32_t(lead & 0x0F) << 12 | uint32_t(p[1] & 0x3F) << 6 | (p[2] & 0x3F);
        return 3;
    }
    if (lead < 0xF5) {
        // F0 needs 90-BF (no overlongs); F4 needs 80-8F (nothing above U+10FFFF).
        uint8_t low = lead == 0xF0 ? 0x90 : 0x80;
        uint8_t high = lead == 0xF4 ? 0x8F : 0xBF;
        if (available < 4 || p[1] < low || p[1] > high || !continuation(p[2]) ||
            !continuation(p[3]))
            return 0;
        c = uint32_t(lead & 0x07) << 18 | uint32_t(p[1] & 0x3F) << 12 | uint32_t(p[2] & 0x3F) << 6 |
            (p[3] & 0x3F);
        return 4;
    }
    return 0;
}

/// Copies 16 code units from `from` to `to`, widened or narrowed to the type of `to`, when all 16
/// are ASCII; false, with nothing written, otherwise. The fixed-size loops compile to vector
/// instructions.
template <class From, class To> bool CopyASCIIBlock(const From* from, To* to) {
    From block[16];
    std::memcpy(block, from, sizeof block);
    From any = 0;
    for (From unit : block)
        any |= unit;
    if (any >= 0x80)
        return false;
    To converted[16];
    for (int k = 0; k < 16; ++k)
        converted[k] = To(block[k]);
    std::memcpy(to, converted, sizeof converted);
    return true;
}

bool DecodeUTF8(const uint8_t* p, size_t n, std::u16string& out, bool lenient) {
    // Never more units than bytes: write into the grown string, then trim.
    size_t start = out.size();
    out.resize(start + n);
    char16_t* dst = out.data() + start;
    size_t i = 0;
    while (i < n) {
        while (i + 16 <= n && CopyASCIIBlock(p + i, dst)) { // ASCII 16 bytes at a time
            dst += 16;
            i += 16;
        }
        if (i == n)
            break;
        if (p[i] < 0x80) {
            *dst++ = p[i++];
            continue;
        }
        uint32_t c = 0;
        size_t length = DecodeSequence(p + i, n - i, c);
        if (length == 0) {
            if (!lenient)
                return false;
            *dst++ = kReplacement;
            ++i;
            continue;
        }
        i += length;
        if (c >= 0x10000) {
            c -= 0x10000;
            *dst++ = char16_t(0xD800 + (c >> 10));
            *dst++ = char16_t(0xDC00 + (c & 0x3FF));
        } else {
            *dst++ = char16_t(c);
        }
    }
    out.resize(size_t(dst - out.data()));
    return true;
}

bool DecodeUTF16(const uint8_t* p, size_t n, bool bigEndian, std::u16string& out) {
    if (n % 2 != 0)
        return false;
    out.reserve(out.size() + n / 2);
    for (size_t i = 0; i < n; i += 2)
        out.push_back(bigEndian ? char16_t(p[i] << 8 | p[i + 1]) : char16_t(p[i] | p[i + 1] << 8));
    return true;
}

bool DecodeUTF32(const uint8_t* p, size_t n, bool bigEndian, bool external, std::u16string& out) {
    if (n % 4 != 0)
        return false;
    for (size_t i = 0; i < n; i += 4) {
        uint32_t c = bigEndian ? uint32_t(p[i]) << 24 | uint32_t(p[i + 1]) << 16 |
                                     uint32_t(p[i + 2]) << 8 | p[i + 3]
                               : uint32_t(p[i + 3]) << 24 | uint32_t(p[i + 2]) << 16 |
                                     uint32_t(p[i + 1]) << 8 | p[i];
        if (c > 0x10FFFF || IsSurrogate(c))
            return false;
        if (i == 0 && external && c == kByteOrderMark)
            continue;
        if (c >= 0x10000) {
            c -= 0x10000;
            out.push_back(char16_t(0xD800 + (c >> 10)));
            out.push_back(char16_t(0xDC00 + (c & 0x3FF)));
        } else {
            out.push_back(char16_t(c));
        }
    }
    return true;
}

// ---------------------------------------------------------------------------------------------
// Encoding.

/// The character at `units[i]`, a surrogate pair read whole (`take` is then 2). False for an
/// unpaired surrogate, with `c` that unit.
[[gnu::always_inline]] inline bool ReadCharacter(const char16_t* units, size_t n, size_t i,
                                                 uint32_t& c, size_t& take) {
    c = units[i];
    take = 1;
    if (!IsSurrogate(c))
        return true;
    if (IsHighSurrogate(c) && i + 1 < n && IsLowSurrogate(units[i + 1])) {
        c = 0x10000 + ((c - 0xD800) << 10) + (units[i + 1] - 0xDC00);
        take = 2;
        return true;
    }
    return false;
}

/// Writes the UTF-8 form of the scalar value `c` (not a surrogate) at `out`; returns its length.
[[gnu::always_inline]] inline size_t EncodeUTF8Scalar(uint32_t c, uint8_t* out) {
    if (c < 0x80) {
        out[0] = uint8_t(c);
        return 1;
    }
    if (c < 0x800) {
        out[0] = uint8_t(0xC0 | c >> 6);
        out[1] = uint8_t(0x80 | (c & 0x3F));
        return 2;
    }
    if (c < 0x10000) {
        out[0] = uint8_t(0xE0 | c >> 12);
        out[1] = uint8_t(0x80 | (c >> 6 & 0x3F));
        out[2] = uint8_t(0x80 | (c & 0x3F));
        return 3;
    }
    out[0] = uint8_t(0xF0 | c >> 18);
    out[1] = uint8_t(0x80 | (c >> 12 & 0x3F));
    out[2] = uint8_t(0x80 | (c >> 6 & 0x3F));
    out[3] = uint8_t(0x80 | (c & 0x3F));
    return 4;
}

/// EncodeUTF8Counted into a buffer with room for the longest form (3 bytes per unit), so no
/// unit can run out of space: one tight loop, no capacity checks. This is the stream writer's
/// case, and the same rules give the same bytes.
void EncodeUTF8WithRoom(std::u16string_view units, uint8_t lossByte, uint8_t* buffer,
                        EncodeResult& result) {
    const char16_t* src = units.data();
    const size_t n = units.size();
    size_t i = 0, pos = 0;
    while (i < n) {
        // ASCII in blocks of 16 units (the fixed-size loops compile to vector instructions),
        // then of 4 units within a 64-bit word.
        while (i + 16 <= n && CopyASCIIBlock(src + i, buffer + pos)) {
            i += 16;
            pos += 16;
        }
        while (i + 4 <= n) {
            uint64_t word;
            std::memcpy(&word, src + i, sizeof word);
            if (word & 0xFF80FF80FF80FF80ull)
                break;
            // Units u0..u3 at bits 0, 16, 32 and 48 (little-endian host) become bytes 0..3.
            const uint64_t pairs = (word | word >> 8) & 0x0000FFFF0000FFFFull;
            const uint32_t four = uint32_t(pairs | pairs >> 16);
            std::memcpy(buffer + pos, &four, sizeof four);
            i += 4;
            pos += 4;
        }
        if (i == n)
            break;
        uint32_t c;
        size_t take;
        if (ReadCharacter(src, n, i, c, take))
            pos += EncodeUTF8Scalar(c, buffer + pos);
        else if (lossByte != 0) // an unpaired surrogate
            buffer[pos++] = lossByte;
        else
            break;
        i += take;
    }
    result.unitsConverted = i;
    result.bytes = pos;
}

/// Writes the `length` bytes of one character at `pos` of `buffer` (when there is a buffer) and
/// advances `pos`; false, with nothing written, when the buffer has no room for all of them, so
/// that a character is never cut.
bool PutCharacter(const uint8_t* bytes, size_t length, uint8_t* buffer, size_t capacity,
                  size_t& pos) {
    if (buffer) {
        if (capacity - pos < length)
            return false;
        std::memcpy(buffer + pos, bytes, length);
    }
    pos += length;
    return true;
}

/// UTF-16 to UTF-8 with the CFStringGetBytes rules; ASCII runs are copied in blocks.
void EncodeUTF8Counted(std::u16string_view units, uint8_t lossByte, uint8_t* buffer,
                       size_t capacity, EncodeResult& result) {
    if (buffer && capacity / 3 >= units.size()) {
        EncodeUTF8WithRoom(units, lossByte, buffer, result);
        return;
    }
    const char16_t* src = units.data();
    const size_t n = units.size();
    size_t i = 0, pos = 0;
    while (i < n) {
        size_t run = n - i;
        if (buffer && capacity - pos < run)
            run = capacity - pos;
        size_t k = 0;
        // Blocks of 16 units: the fixed-size loops below compile to vector instructions.
        for (; k + 16 <= run; k += 16) {
            char16_t block[16];
            std::memcpy(block, src + i + k, sizeof block);
            char16_t any = 0;
            for (char16_t unit : block)
                any |= unit;
            if (any >= 0x80)
                break;
            if (buffer) {
                uint8_t narrow[16];
                for (int j = 0; j < 16; ++j)
                    narrow[j] = uint8_t(block[j]);
                std::memcpy(buffer + pos + k, narrow, sizeof narrow);
            }
        }
        for (; k < run && src[i + k] < 0x80; ++k)
            if (buffer)
                buffer[pos + k] = uint8_t(src[i + k]);
        i += k;
        pos += k;
        if (i == n)
            break;

        // A non-ASCII unit, or no room left for the next ASCII one.
        uint32_t c;
        size_t take, length;
        uint8_t bytes[4];
        if (ReadCharacter(src, n, i, c, take)) {
            length = EncodeUTF8Scalar(c, bytes);
        } else if (lossByte != 0) { // an unpaired surrogate
            length = 1;
            bytes[0] = lossByte;
        } else {
            break;
        }
        if (!PutCharacter(bytes, length, buffer, capacity, pos))
            break;
        i += take;
    }
    result.unitsConverted = i;
    result.bytes = pos;
}

/// Writes `c` in one of the non-UTF-8 forms into `out`; returns the byte count, or 0 when the
/// form cannot represent it. `lone` marks an unpaired surrogate unit.
size_t EncodeOne(Form form, uint32_t c, bool lone, uint8_t out[4]) {
    switch (form) {
    case Form::UTF16BE:
    case Form::UTF16LE: {
        uint16_t words[2] = {uint16_t(c), 0};
        size_t count = 1;
        if (c >= 0x10000) {
            words[0] = uint16_t(0xD800 + ((c - 0x10000) >> 10));
            words[1] = uint16_t(0xDC00 + ((c - 0x10000) & 0x3FF));
            count = 2;
        }
        for (size_t w = 0; w < count; ++w) {
            bool big = form == Form::UTF16BE;
            out[2 * w] = uint8_t(big ? words[w] >> 8 : words[w]);
            out[2 * w + 1] = uint8_t(big ? words[w] : words[w] >> 8);
        }
        return 2 * count;
    }
    case Form::UTF32BE:
    case Form::UTF32LE:
        if (lone)
            return 0;
        for (int b = 0; b < 4; ++b)
            out[form == Form::UTF32BE ? b : 3 - b] = uint8_t(c >> (24 - 8 * b));
        return 4;
    case Form::ASCII:
        out[0] = uint8_t(c);
        return c < 0x80 ? 1 : 0;
    case Form::Latin1:
        out[0] = uint8_t(c);
        return c < 0x100 ? 1 : 0;
    case Form::MacRoman: {
        int byte = c < 0x10000 && !lone ? MacRomanByte(c) : -1;
        out[0] = uint8_t(byte);
        return byte < 0 ? 0 : 1;
    }
    default:
        return 0;
    }
}

/// The same rules as EncodeUTF8Counted for every other form, one character at a time.
void EncodeGeneric(std::u16string_view units, Form form, uint8_t lossByte, bool byteOrderMark,
                   uint8_t* buffer, size_t capacity, EncodeResult& result) {
    size_t i = 0, pos = 0;
    if (byteOrderMark) {
        if (buffer && capacity < 2)
            return;
        if (buffer) {
            buffer[0] = 0xFF; // U+FEFF, little-endian like the host
            buffer[1] = 0xFE;
        }
        pos = 2;
    }
    const size_t n = units.size();
    while (i < n) {
        uint32_t c;
        size_t take;
        const bool lone = !ReadCharacter(units.data(), n, i, c, take);
        uint8_t bytes[4];
        size_t length = EncodeOne(form, c, lone, bytes);
        if (length == 0) {
            if (lossByte == 0)
                break;
            // The loss byte stands for the whole character, as a character of the form.
            bool wide = form != Form::ASCII && form != Form::Latin1 && form != Form::MacRoman;
            length = wide ? EncodeOne(form, lossByte, false, bytes) : 1;
            if (!wide)
                bytes[0] = lossByte;
        }
        if (!PutCharacter(bytes, length, buffer, capacity, pos))
            break;
        i += take;
    }
    result.unitsConverted = i;
    result.bytes = pos;
}

} // namespace

bool Decode(const uint8_t* bytes, size_t length, CFStringEncoding encoding, bool external,
            std::u16string& out) {
    if (length == 0)
        return FormOf(encoding) != Form::Unknown;
    switch (FormOf(encoding)) {
    case Form::UTF8:
        if (external && length >= 3 && bytes[0] == 0xEF && bytes[1] == 0xBB && bytes[2] == 0xBF) {
            bytes += 3;
            length -= 3;
        }
        return DecodeUTF8(bytes, length, out, false);
    case Form::UTF16BE:
    case Form::UTF16LE: {
        // The generic encoding honours a byte-order mark and takes it away; without one it is
        // big-endian for an external representation and host order otherwise. The encodings
        // with an explicit order only lose a mark that is in that order, and only when external.
        bool big = encoding == kCFStringEncodingUTF16BE ||
                   (encoding == kCFStringEncodingUTF16 && external);
        bool hasMark = length >= 2 && ((bytes[0] == 0xFE && bytes[1] == 0xFF) ||
                                       (bytes[0] == 0xFF && bytes[1] == 0xFE));
        if (hasMark && encoding == kCFStringEncodingUTF16) {
            big = bytes[0] == 0xFE;
            bytes += 2;
            length -= 2;
        } else if (hasMark && external && (bytes[0] == 0xFE) == big) {
            bytes += 2;
            length -= 2;
        }
        return DecodeUTF16(bytes, length, big, out);
    }
    case Form::UTF32BE:
    case Form::UTF32LE:
        return DecodeUTF32(bytes, length, FormOf(encoding) == Form::UTF32BE, external, out);
    case Form::ASCII:
        for (size_t i = 0; i < length; ++i)
            if (bytes[i] > 0x7F)
                return false;
        out.append(bytes, bytes + length);
        return true;
    case Form::Latin1:
        out.append(bytes, bytes + length);
        return true;
    case Form::MacRoman: {
        const MacRomanTable& table = MacRoman();
        for (size_t i = 0; i < length; ++i) {
            char16_t unit = bytes[i] < 0x80 ? char16_t(bytes[i]) : table.upper[bytes[i] - 0x80];
            if (unit == 0xFFFF)
                return false;
            out.push_back(unit);
        }
        return true;
    }
    default:
        return false;
    }
}

std::u16string DecodeUTF8Lenient(std::string_view utf8) {
    std::u16string out;
    DecodeUTF8(reinterpret_cast<const uint8_t*>(utf8.data()), utf8.size(), out, true);
    return out;
}

bool IsValidUTF8(const uint8_t* bytes, size_t length) {
    size_t i = 0;
    while (i < length) {
        if (bytes[i] < 0x80) {
            ++i;
            continue;
        }
        uint32_t c;
        size_t sequence = DecodeSequence(bytes + i, length - i, c);
        if (sequence == 0)
            return false;
        i += sequence;
    }
    return true;
}

bool Encode(std::u16string_view units, CFStringEncoding encoding, uint8_t lossByte, bool external,
            uint8_t* buffer, size_t capacity, EncodeResult& result) {
    result = EncodeResult{};
    Form form = FormOf(encoding);
    if (form == Form::Unknown)
        return false;
    if (form == Form::UTF8)
        EncodeUTF8Counted(units, lossByte, buffer, capacity, result);
    else
        EncodeGeneric(units, form, lossByte, external && encoding == kCFStringEncodingUTF16, buffer,
                      capacity, result);
    return true;
}

bool EncodeUTF8(std::u16string_view units, std::string& out) {
    EncodeResult result;
    EncodeUTF8Counted(units, 0, nullptr, 0, result);
    if (result.unitsConverted != units.size())
        return false;
    size_t start = out.size();
    out.resize(start + result.bytes);
    EncodeUTF8Counted(units, 0, reinterpret_cast<uint8_t*>(out.data() + start), result.bytes,
                      result);
    return true;
}

std::string EncodeUTF8Lossy(std::u16string_view units) {
    std::string out;
    while (!units.empty()) {
        EncodeResult result;
        size_t start = out.size();
        EncodeUTF8Counted(units, 0, nullptr, 0, result);
        out.resize(start + result.bytes);
        EncodeUTF8Counted(units.substr(0, result.unitsConverted), 0,
                          reinterpret_cast<uint8_t*>(out.data() + start), result.bytes, result);
        units.remove_prefix(result.unitsConverted);
        if (!units.empty()) { // an unpaired surrogate
            out += "\xEF\xBF\xBD";
            units.remove_prefix(1);
        }
    }
    return out;
}

size_t MaxBytesPerUnit(CFStringEncoding encoding) {
    switch (FormOf(encoding)) {
    case Form::UTF8:
        return 3;
    case Form::UTF16BE:
    case Form::UTF16LE:
        return 2;
    case Form::UTF32BE:
    case Form::UTF32LE:
        return 4;
    case Form::Unknown:
        return 0;
    default:
        return 1;
    }
}

} // namespace glyphwell::text
