// ASCII case folding for keywords and names compared without regard to the locale.
#pragma once

#include <algorithm>
#include <string>
#include <string_view>

namespace glyphwell {

inline char LowerASCII(char c) {
    return c >= 'A' && c <= 'Z' ? char(c - 'A' + 'a') : c;
}

inline std::string LowerASCIICopy(std::string_view text) {
    std::string lower(text);
    for (char& c : lower)
        c = LowerASCII(c);
    return lower;
}

inline bool EqualIgnoringASCIICase(std::string_view a, std::string_view b) {
    return a.size() == b.size() && std::equal(a.begin(), a.end(), b.begin(), [](char x, char y) {
               return LowerASCII(x) == LowerASCII(y);
           });
}

} // namespace glyphwell
