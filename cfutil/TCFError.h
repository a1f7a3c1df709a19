// TCFError: owns one count of a new error value (a domain, a code and optional user info).
#pragma once

#include "platform/CFError.h"

class TCFError {
public:
    /// Creates an error in `domain` with `code`; the error retains the domain and keeps a copy
    /// of `userInfo` (may be null). Holds null when `domain` is null.
    TCFError(CFStringRef domain, CFIndex code, CFDictionaryRef userInfo);
    TCFError(const TCFError&) = delete;
    TCFError& operator=(const TCFError&) = delete;
    /// Releases the held error (null-safe).
    ~TCFError();

    /// The held error; does not retain.
    operator CFErrorRef() const { return error_; }
    /// Returns the held error with its count and leaves this wrapper null; the caller releases
    /// the result.
    CFErrorRef Orphan();

private:
    CFErrorRef error_;
};
