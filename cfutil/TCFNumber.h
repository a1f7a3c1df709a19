// TCFNumber: owns one count of a number value made from a C++ value. Create<T> maps each C++
// type to the platform number type that keeps it: SInt8 to kCFNumberCharType, SInt64 to
// kCFNumberLongType. A type without a mapping does not link.
#pragma once

#include "platform/CFNumber.h"

class TCFNumber {
public:
    /// Adopts Create<T>(value).
    template <class T> explicit TCFNumber(T value) : number_(Create<T>(value)) {}
    TCFNumber(const TCFNumber&) = delete;
    TCFNumber& operator=(const TCFNumber&) = delete;
    /// Releases the held number (null-safe).
    ~TCFNumber();

    /// A new number of the platform number type for T holding `value`. Returns a new
    /// reference; the caller releases it.
    template <class T> static CFNumberRef Create(T value);

    /// The held number; does not retain.
    operator CFNumberRef() const { return number_; }
    /// Returns the held number with its count and leaves this wrapper null; the caller
    /// releases the result.
    CFNumberRef Orphan();

private:
    CFNumberRef number_;
};

template <> CFNumberRef TCFNumber::Create<SInt8>(SInt8 value);
template <> CFNumberRef TCFNumber::Create<SInt64>(SInt64 value);
