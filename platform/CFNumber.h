// Numbers and booleans. A number keeps the type code it was created with (1-16) and that
// code's byte size, and converts to any other code on request, saying whether the conversion
// was exact. The two booleans are shared constants.
//
// Bad input: reported once through the assertion handler (naming the function called); then
// creators give null, readers 0, false or null, and modifiers change nothing (see CFBase.h).
#pragma once

#include "platform/CFBase.h"

typedef CFIndex CFNumberType;
enum : CFNumberType {
    kCFNumberSInt8Type = 1,
    kCFNumberSInt16Type = 2,
    kCFNumberSInt32Type = 3,
    kCFNumberSInt64Type = 4,
    kCFNumberFloat32Type = 5,
    kCFNumberFloat64Type = 6,
    kCFNumberCharType = 7,       ///< signed char, 1 byte
    kCFNumberShortType = 8,      ///< 2 bytes
    kCFNumberIntType = 9,        ///< 4 bytes
    kCFNumberLongType = 10,      ///< 8 bytes
    kCFNumberLongLongType = 11,  ///< 8 bytes
    kCFNumberFloatType = 12,     ///< 4 bytes
    kCFNumberDoubleType = 13,    ///< 8 bytes
    kCFNumberCFIndexType = 14,   ///< 8 bytes
    kCFNumberNSIntegerType = 15, ///< 8 bytes
    kCFNumberCGFloatType = 16,   ///< 8 bytes, a double
    kCFNumberMaxType = 16
};

CFTypeID CFNumberGetTypeID();

/// A new number of type `type` from the value at `valuePtr`, read in that type's C
/// representation (host order). Null for a type outside 1-16 or a null pointer. An integer from
/// -1 to 15 of an integer type comes back as a shared constant (one per type and value, like the
/// booleans): CFRetain and CFRelease do not count it and CFGetRetainCount reports the largest
/// index.
CFNumberRef CFNumberCreate(CFAllocatorRef allocator, CFNumberType type, const void* valuePtr);
/// Like CFNumberCreate, but always a new number whose retains are counted, small integers
/// included: for a number that its maker hands out with one more count each time.
CFNumberRef CFNumberCreateCounted(CFAllocatorRef allocator, CFNumberType type,
                                  const void* valuePtr);
/// The type code the number was created with.
CFNumberType CFNumberGetType(CFNumberRef number);
/// The byte size of that type: 1, 2, 4 or 8.
CFIndex CFNumberGetByteSize(CFNumberRef number);
Boolean CFNumberIsFloatType(CFNumberRef number);
/// Stores the value converted to `type` at `valuePtr` (that type's byte size). Integers
/// narrowed to a smaller type keep their low bits; floating point converted to an integer is
/// truncated toward zero and saturates at the type's limits (NaN gives 0). Returns true when
/// the stored value equals the number exactly, false when the conversion lost anything. False,
/// with nothing stored, for a type outside 1-16.
Boolean CFNumberGetValue(CFNumberRef number, CFNumberType type, void* valuePtr);
/// Numeric order; integers and floating point compare by value.
CFComparisonResult CFNumberCompare(CFNumberRef a, CFNumberRef b, void* context);

/// The size in bytes of a type code's C type; 0 for a code outside 1-16.
CFIndex CFNumberTypeByteSize(CFNumberType type);

CFTypeID CFBooleanGetTypeID();
extern const CFBooleanRef kCFBooleanTrue;
extern const CFBooleanRef kCFBooleanFalse;
Boolean CFBooleanGetValue(CFBooleanRef boolean);
