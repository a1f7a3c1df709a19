// TUTF8Buffer: the null-terminated file-system representation (UTF-8 path bytes) of one string,
// ready for the C library's path functions. Paths up to 512 bytes stay inside the object.
#pragma once

#include "cfutil/TStackBuffer.h"
#include "platform/CFString.h"

class TUTF8Buffer : public TStackBuffer<char, 512> {
public:
    /// Converts `string` (not retained; may be null). GetCount() is then the size of the buffer,
    /// not the length of the text; 0 means there is no text (a null string, or one that cannot
    /// be converted).
    explicit TUTF8Buffer(CFStringRef string);
    ~TUTF8Buffer() = default;
};
