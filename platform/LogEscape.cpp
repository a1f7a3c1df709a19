#include "platform/LogEscape.h"

namespace glyphwell {

namespace {

/// The length of the well-formed UTF-8 sequence at the start of `bytes`, or 0 when it is not
/// one (overlong forms, surrogates and values beyond U+10FFFF are not well-formed).
size_t WellFormedSequenceLength(std::string_view bytes) {
    const auto byte = [&bytes](size_t i) { return static_cast<unsigned char>(bytes[i]); };
    const unsigned char lead = byte(0);
    size_t length = 0;
    unsigned char low = 0x80, high = 0xBF; // the allowed range of the second byte
    if (lead < 0x80)
        return 1;
    if (lead >= 0xC2 && lead <= 0xDF) {
        length = 2;
    } else if (lead >= 0xE0 && lead <= 0xEF) {
        length = 3;
        if (lead == 0xE0)
            low = 0xA0;
        else if (lead == 0xED)
            high = 0x9F;
    } else if (lead >= 0xF0 && lead <= 0xF4) {
        length = 4;
        if (lead == 0xF0)
            low = 0x90;
        else if (lead == 0xF4)
            high = 0x8F;
    } else {
        return 0;
    }
    if (bytes.size() < length || byte(1) < low || byte(1) > high)
        return 0;
    for (size_t i = 2; i < length; ++i)
        if (byte(i) < 0x80 || byte(i) > 0xBF)
            return 0;
    return length;
}

void AppendHexEscape(std::string& text, unsigned char byte) {
    static const char digits[] = "0123456789abcdef";
    text += "\\x";
    text += digits[byte >> 4];
    text += digits[byte & 15];
}

} // namespace

std::string LogEscape(std::string_view value) {
    std::string text;
    text.reserve(value.size());
    while (!value.empty()) {
        const unsigned char byte = static_cast<unsigned char>(value[0]);
        const size_t length = WellFormedSequenceLength(value);
        if (length == 0) {
            AppendHexEscape(text, byte);
            value.remove_prefix(1);
            continue;
        }
        // U+0080 to U+009F (C1 controls) are encoded as C2 80 to C2 9F.
        const bool c1Control =
            length == 2 && byte == 0xC2 && static_cast<unsigned char>(value[1]) < 0xA0;
        if (byte == '\n') {
            text += "\\n";
        } else if (byte == '\r') {
            text += "\\r";
        } else if (byte == '\t') {
            text += "\\t";
        } else if (byte == '\\') {
            text += "\\\\";
        } else if (byte < 0x20 || byte == 0x7F) {
            AppendHexEscape(text, byte);
        } else if (c1Control) {
            AppendHexEscape(text, byte);
            AppendHexEscape(text, static_cast<unsigned char>(value[1]));
        } else {
            text.append(value.data(), length);
        }
        value.remove_prefix(length);
    }
    return text;
}

} // namespace glyphwell
