#include "tools/Base64.h"

namespace glyphwell::tools {

namespace {
constexpr char kAlphabet[] = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";

int ValueOf(char c) {
    if (c >= 'A' && c <= 'Z')
        return c - 'A';
    if (c >= 'a' && c <= 'z')
        return c - 'a' + 26;
    if (c >= '0' && c <= '9')
        return c - '0' + 52;
    if (c == '+')
        return 62;
    if (c == '/')
        return 63;
    return -1;
}
} // namespace

std::string EncodeBase64(const uint8_t* bytes, size_t length) {
    std::string text;
    text.reserve((length + 2) / 3 * 4);
    size_t i = 0;
    for (; i + 3 <= length; i += 3) {
        const uint32_t v = uint32_t(bytes[i]) << 16 | uint32_t(bytes[i + 1]) << 8 | bytes[i + 2];
        text += kAlphabet[v >> 18];
        text += kAlphabet[(v >> 12) & 63];
        text += kAlphabet[(v >> 6) & 63];
        text += kAlphabet[v & 63];
    }
    if (length - i == 1) {
        const uint32_t v = uint32_t(bytes[i]) << 16;
        text += kAlphabet[v >> 18];
        text += kAlphabet[(v >> 12) & 63];
        text += "==";
    } else if (length - i == 2) {
        const uint32_t v = uint32_t(bytes[i]) << 16 | uint32_t(bytes[i + 1]) << 8;
        text += kAlphabet[v >> 18];
        text += kAlphabet[(v >> 12) & 63];
        text += kAlphabet[(v >> 6) & 63];
        text += '=';
    }
    return text;
}

std::optional<std::vector<uint8_t>> DecodeBase64(std::string_view text) {
    if (text.size() % 4 != 0)
        return std::nullopt;
    std::vector<uint8_t> bytes;
    bytes.reserve(text.size() / 4 * 3);
    for (size_t i = 0; i < text.size(); i += 4) {
        const bool last = i + 4 == text.size();
        const int padding = last ? (text[i + 3] == '=') + (text[i + 2] == '=') : 0;
        if (padding == 1 && text[i + 2] == '=')
            return std::nullopt; // "x=y=" style
        int v[4];
        for (int k = 0; k < 4 - padding; ++k)
            if ((v[k] = ValueOf(text[i + k])) < 0)
                return std::nullopt;
        const uint32_t word = uint32_t(v[0]) << 18 | uint32_t(v[1]) << 12 |
                              (padding < 2 ? uint32_t(v[2]) << 6 : 0) |
                              (padding < 1 ? uint32_t(v[3]) : 0);
        bytes.push_back(uint8_t(word >> 16));
        if (padding < 2)
            bytes.push_back(uint8_t(word >> 8));
        if (padding < 1)
            bytes.push_back(uint8_t(word));
        // Canonical form only: the bits the padding drops must be zero.
        if ((padding == 2 && (v[1] & 15)) || (padding == 1 && (v[2] & 3)))
            return std::nullopt;
    }
    return bytes;
}

} // namespace glyphwell::tools
