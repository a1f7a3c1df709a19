// Conversions between UTF-16 code units and the byte encodings that strings support (internal to
// platform/). UTF-8 is strict in both directions: overlong forms, encoded surrogates, code points
// above U+10FFFF and truncated sequences are rejected on input, and unpaired surrogates cannot be
// written. ASCII runs take a fast path both ways, since string conversion sits on the hot path of
// the flattened value stream.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

#include "platform/CFString.h"

namespace glyphwell::text {

/// Appends the UTF-16 form of `length` bytes in `encoding` to `out`. With `external`, a leading
/// byte-order mark is removed and UTF-16 without one is read big-endian. Returns false (with `out`
/// in an unspecified state) for bytes invalid in the encoding or an unknown encoding.
bool Decode(const uint8_t* bytes, size_t length, CFStringEncoding encoding, bool external,
            std::u16string& out);

/// Decodes UTF-8 leniently: every invalid byte becomes U+FFFD. For trusted literals.
std::u16string DecodeUTF8Lenient(std::string_view utf8);

/// True when the bytes are well-formed UTF-8.
bool IsValidUTF8(const uint8_t* bytes, size_t length);

/// Outcome of Encode.
struct EncodeResult {
    size_t unitsConverted = 0; ///< UTF-16 units consumed
    size_t bytes = 0;          ///< bytes written (or needed, without a buffer)
};

/// Converts `units` into `encoding` following the CFStringGetBytes rules: conversion stops before
/// the first unconvertible unit (or stands `lossByte` in for it when it is not 0) and, when
/// `buffer` is not null, before the first unit whose bytes would pass `capacity`. A surrogate
/// pair converts whole or not at all. With `external`, UTF-16 in host order starts with a
/// byte-order mark; UTF-8 never gets one. Returns false for an unknown encoding.
bool Encode(std::u16string_view units, CFStringEncoding encoding, uint8_t lossByte, bool external,
            uint8_t* buffer, size_t capacity, EncodeResult& result);

/// Appends the UTF-8 form of `units` to `out`; false (out partly appended) on an unpaired
/// surrogate.
bool EncodeUTF8(std::u16string_view units, std::string& out);

/// The UTF-8 form of `units` with U+FFFD for each unpaired surrogate. For descriptions.
std::string EncodeUTF8Lossy(std::u16string_view units);

/// The largest byte count one UTF-16 unit can need in `encoding`; 0 for an unknown encoding.
size_t MaxBytesPerUnit(CFStringEncoding encoding);

} // namespace glyphwell::text
