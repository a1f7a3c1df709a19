// Escaping of values that came from outside (a catalog, a request, a server) before they go into
// a log line, so that such a value cannot start a forged line, move the terminal's cursor or
// break a log reader's decoding.
#pragma once

#include <string>
#include <string_view>

namespace glyphwell {

/// `value` with every byte that could forge or garble a log line escaped: "\n", "\r" and "\t"
/// as such, other control characters (U+0000 to U+001F, U+007F to U+009F) and every byte that
/// is not part of well-formed UTF-8 as "\xNN" (lower-case hexadecimal, one per byte), and the
/// backslash itself as "\\" so that an escape cannot be faked. Well-formed UTF-8 text without
/// these characters comes back unchanged.
std::string LogEscape(std::string_view value);

} // namespace glyphwell
