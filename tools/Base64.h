// Standard base64 (RFC 4648, with padding) for the "$data" values of tagged JSON.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace glyphwell::tools {

std::string EncodeBase64(const uint8_t* bytes, size_t length);
/// The decoded bytes, or nothing when `text` is not canonical padded base64 (whitespace is not
/// allowed).
std::optional<std::vector<uint8_t>> DecodeBase64(std::string_view text);

} // namespace glyphwell::tools
