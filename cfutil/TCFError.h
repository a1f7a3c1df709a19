// TCFError: owns one count of a new error value (a domain, a code and optional user info).
#pragma once

#include "cfutil/TCFRetained.h"
#include "platform/CFError.h"

class TCFError : public TCFReferenceHolder<CFErrorRef> {
public:
    /// Creates an error in `domain` with `code`; the error retains the domain and keeps a copy
    /// of `userInfo` (may be null). Holds null when `domain` is null.
    TCFError(CFStringRef domain, CFIndex code, CFDictionaryRef userInfo);
};
