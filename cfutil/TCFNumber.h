// TCFNumber: owns one count of a number value made from a C++ value, and the conversions between
// property values and plain numbers. Create<T> maps each C++ type to the platform number type
// that keeps it:
//
//   SInt8  (signed char)  kCFNumberCharType (7)
//   SInt64 (long)         kCFNumberLongType (10)
//   double                kCFNumberDoubleType (13)
//   bool                  kCFNumberIntType (9), 0 or 1 as a 32-bit integer
//
// A type without a mapping does not link. Truth values made here are integer numbers, not the
// platform's boolean values: CreateFromBoolean hands out one of two shared numbers.
#pragma once

#include "cfutil/TCFRetained.h"
#include "platform/CFNumber.h"
#include "platform/CFString.h"

class TCFNumber : public TCFReferenceHolder<CFNumberRef> {
public:
    /// Adopts Create<T>(value).
    template <class T>
    explicit TCFNumber(T value) : TCFReferenceHolder(Create<T>(value), kAdopted) {}

    /// A new number of the platform number type for T holding `value` (see the table above).
    /// Returns a new reference; the caller releases it. Null only when the platform refuses.
    template <class T> static CFNumberRef Create(T value);

    /// The shared number for `flag`, an integer of the Create<bool> kind, with one more count
    /// that the caller owns and releases. The pair is made once in the process and never
    /// destroyed; unlike the platform's shared small integers, its counts are kept.
    static CFNumberRef CreateFromBoolean(bool flag);

    /// Parses `string` as a base-10 signed 64-bit integer (kCFNumberLongType), or failing that
    /// as a floating-point number (kCFNumberDoubleType), with the C library's conversions in the
    /// C locale: "." is the decimal point whatever the process locale. Leading white space and
    /// a sign are accepted; anything after the number, white space included, rejects the text.
    /// Integers beyond the 64-bit range saturate at its limits. Returns a new reference that the
    /// caller releases, or null for null, empty or unparsable text.
    static CFNumberRef CreateForString(CFStringRef string);

    /// Writes the value of `number` to `out`: 1 or 0 for kCFBooleanTrue or kCFBooleanFalse
    /// (by identity), else the number read as kCFNumberLongType, exact or not (a negative
    /// number arrives as a large unsigned value, a fraction is truncated toward zero). The
    /// argument should be a number or one of the two booleans; anything else writes 0. Does not
    /// retain.
    template <class T> static void GetCFNumberValue(CFTypeRef number, T& out);

    /// Like GetCFNumberValue, for any property value or null: returns true when `out` was taken
    /// from a number or boolean, false with `out` set to 0 otherwise. Does not retain.
    template <class T> static bool GetCFNumberValueSafely(CFTypeRef value, T& out);
};

template <> CFNumberRef TCFNumber::Create<SInt8>(SInt8 value);
template <> CFNumberRef TCFNumber::Create<SInt64>(SInt64 value);
template <> CFNumberRef TCFNumber::Create<double>(double value);
template <> CFNumberRef TCFNumber::Create<bool>(bool value);

template <> void TCFNumber::GetCFNumberValue<unsigned long>(CFTypeRef number, unsigned long& out);
template <>
bool TCFNumber::GetCFNumberValueSafely<unsigned long>(CFTypeRef value, unsigned long& out);
