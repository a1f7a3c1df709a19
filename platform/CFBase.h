// Property values: the reference-counted, immutable value model that every other subsystem
// builds on, with the operation names the calling code uses. This header holds the base types,
// the operations every value supports (counting, kind, equality, hashing, description) and the
// callback records of the containers.
//
// Ownership: an operation whose name holds Create or Copy returns a new reference that the caller
// releases with CFRelease; a Get operation returns a reference the caller does not own.
// Reference counts are atomic, so values may be retained and released on any thread; a value
// itself is not changed after creation unless it is one of the mutable kinds.
//
// Bad input, the same rule for every operation: an invalid argument (a null or foreign
// reference, a negative count, length or capacity, a range or index outside the value, a change
// to an immutable value, an unknown type code) is reported once through the assertion handler,
// which names the public function called. Then an operation that creates or copies returns
// null, one that reads returns 0, false or null, and one that modifies changes nothing.
// Zero-length input with a null pointer is valid.
#pragma once

#include <cstdint>

typedef unsigned char Boolean;
typedef uint8_t UInt8;
typedef int8_t SInt8;
typedef uint16_t UInt16;
typedef int16_t SInt16;
typedef uint32_t UInt32;
typedef int32_t SInt32;
typedef uint64_t UInt64;
typedef int64_t SInt64;
typedef float Float32;
typedef double Float64;
typedef uint16_t UniChar;
typedef uint32_t UTF32Char;

typedef long CFIndex;
typedef unsigned long CFTypeID;
typedef unsigned long CFHashCode;
typedef unsigned long CFOptionFlags;

/// A span of elements: `location` is the first index, `length` the number of elements.
struct CFRange {
    CFIndex location;
    CFIndex length;
};
inline CFRange CFRangeMake(CFIndex location, CFIndex length) {
    return CFRange{location, length};
}

enum : CFIndex { kCFNotFound = -1 };

typedef enum : CFIndex {
    kCFCompareLessThan = -1,
    kCFCompareEqualTo = 0,
    kCFCompareGreaterThan = 1
} CFComparisonResult;

typedef CFComparisonResult (*CFComparatorFunction)(const void* a, const void* b, void* context);

typedef const void* CFTypeRef;

typedef const struct __CFAllocator* CFAllocatorRef;
typedef const struct __CFString* CFStringRef;
typedef struct __CFString* CFMutableStringRef;
typedef const struct __CFNumber* CFNumberRef;
typedef const struct __CFBoolean* CFBooleanRef;
typedef const struct __CFData* CFDataRef;
typedef struct __CFData* CFMutableDataRef;
typedef const struct __CFCharacterSet* CFCharacterSetRef;
typedef struct __CFCharacterSet* CFMutableCharacterSetRef;
typedef const struct __CFArray* CFArrayRef;
typedef struct __CFArray* CFMutableArrayRef;
typedef const struct __CFSet* CFSetRef;
typedef struct __CFSet* CFMutableSetRef;
typedef const struct __CFDictionary* CFDictionaryRef;
typedef struct __CFDictionary* CFMutableDictionaryRef;
typedef const struct __CFURL* CFURLRef;
typedef const struct __CFUUID* CFUUIDRef;
typedef struct __CFError* CFErrorRef;
typedef const struct __CFDate* CFDateRef;
typedef const struct __CFNull* CFNullRef;

// ---------------------------------------------------------------------------------------------
// Allocators. Values are always allocated with the C++ heap; the allocator arguments exist so
// that calling code reads as usual. kCFAllocatorMalloc and kCFAllocatorNull matter only as the
// deallocator of CFDataCreateWithBytesNoCopy: free() the bytes, or leave them alone.

extern const CFAllocatorRef kCFAllocatorDefault; ///< null: the default allocator
extern const CFAllocatorRef kCFAllocatorSystemDefault;
extern const CFAllocatorRef kCFAllocatorMalloc; ///< bytes came from malloc(); free() them
extern const CFAllocatorRef kCFAllocatorNull;   ///< bytes are not ours; never free them

// ---------------------------------------------------------------------------------------------
// Operations on every value. Passing null to CFRetain, CFRelease, CFGetTypeID, CFHash or
// CFCopyDescription is a caller error: it is reported through the assertion handler and the
// call does nothing (returns null or 0).

/// Adds one count to `value` and returns it.
CFTypeRef CFRetain(CFTypeRef value);
/// Gives back one count; the value is destroyed when its last count goes. Shared constants
/// (booleans, CFSTR strings, kCFNull) are never destroyed.
void CFRelease(CFTypeRef value);
/// The current count; a large constant for shared values that are never destroyed.
CFIndex CFGetRetainCount(CFTypeRef value);
/// The value's kind, to compare with the per-kind ids (CFStringGetTypeID() ...).
CFTypeID CFGetTypeID(CFTypeRef value);
/// Value equality: same kind and same content (numbers compare by numeric value across type
/// codes; containers compare element by element with their equality callbacks).
Boolean CFEqual(CFTypeRef a, CFTypeRef b);
/// A hash consistent with CFEqual.
CFHashCode CFHash(CFTypeRef value);
/// A new string describing the value for logs and debugging. The caller releases it.
CFStringRef CFCopyDescription(CFTypeRef value);
/// A new string naming the kind ("CFString", ...). The caller releases it.
CFStringRef CFCopyTypeIDDescription(CFTypeID typeID);
/// Writes the value's description to the standard error stream, with a newline.
void CFShow(CFTypeRef value);

// ---------------------------------------------------------------------------------------------
// Container callbacks. A null callback means: no retain / no release / pointer equality /
// pointer hash / a generic description.

typedef const void* (*CFRetainCallBack)(CFAllocatorRef allocator, const void* value);
typedef void (*CFReleaseCallBack)(CFAllocatorRef allocator, const void* value);
typedef CFStringRef (*CFCopyDescriptionCallBack)(const void* value);
typedef Boolean (*CFEqualCallBack)(const void* a, const void* b);
typedef CFHashCode (*CFHashCallBack)(const void* value);

struct CFArrayCallBacks {
    CFIndex version;
    CFRetainCallBack retain;
    CFReleaseCallBack release;
    CFCopyDescriptionCallBack copyDescription;
    CFEqualCallBack equal;
};

struct CFSetCallBacks {
    CFIndex version;
    CFRetainCallBack retain;
    CFReleaseCallBack release;
    CFCopyDescriptionCallBack copyDescription;
    CFEqualCallBack equal;
    CFHashCallBack hash;
};

typedef CFSetCallBacks CFDictionaryKeyCallBacks;
typedef CFArrayCallBacks CFDictionaryValueCallBacks;

/// Property-value semantics: retain on insert, release on removal, CFEqual, CFHash.
extern const CFArrayCallBacks kCFTypeArrayCallBacks;
extern const CFSetCallBacks kCFTypeSetCallBacks;
extern const CFDictionaryKeyCallBacks kCFTypeDictionaryKeyCallBacks;
extern const CFDictionaryValueCallBacks kCFTypeDictionaryValueCallBacks;
/// Like kCFTypeDictionaryKeyCallBacks, but keys are retained as given (no copy is made either way).
extern const CFDictionaryKeyCallBacks kCFCopyStringDictionaryKeyCallBacks;
extern const CFSetCallBacks kCFCopyStringSetCallBacks;

typedef void (*CFArrayApplierFunction)(const void* value, void* context);
typedef void (*CFSetApplierFunction)(const void* value, void* context);
typedef void (*CFDictionaryApplierFunction)(const void* key, const void* value, void* context);
