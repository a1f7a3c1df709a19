// TCFTypeRef: readings of a property value of any kind, for values whose kind the caller does not
// know (a preference, a field of a request). Each reading is total: null and unexpected kinds
// give a defined answer instead of a failure.
#pragma once

#include "platform/CFBase.h"

class TCFTypeRef {
public:
    TCFTypeRef() = delete;

    /// The truth value of `value`: a boolean's own value; for a string, whether it equals
    /// "true" or "YES" ignoring ASCII case ("1" is false); for a number, whether it is a
    /// non-zero integer that fits 32 bits exactly (2.5 and 2^32 are false, 3.0 is true);
    /// false for null and every other kind. Does not retain.
    static bool GetBooleanValue(CFTypeRef value);
};
