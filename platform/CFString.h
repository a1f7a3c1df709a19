// Strings: immutable (or mutable) sequences of UTF-16 code units, with conversion to and from
// byte encodings. Text is never normalised; equality compares code units.
//
// An immutable string made from ASCII or UTF-8 bytes keeps those bytes and makes its UTF-16 units
// only when a caller asks for them (CFStringGetCharactersPtr, or indexing into non-ASCII text);
// this does not change what any operation returns. Such a string is equal to, and hashes the
// same as, the string of the same text made from UTF-16 units.
//
// Bad input: reported once through the assertion handler (naming the function called); then
// creators give null, readers 0, false or null, and modifiers change nothing (see CFBase.h).
#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "platform/CFBase.h"

typedef UInt32 CFStringEncoding;

enum : CFStringEncoding {
    kCFStringEncodingMacRoman = 0,
    kCFStringEncodingISOLatin1 = 0x0201,
    kCFStringEncodingASCII = 0x0600,
    kCFStringEncodingUTF8 = 0x08000100,
    kCFStringEncodingUTF16 = 0x0100, ///< host order; a byte-order mark is honoured on input
    kCFStringEncodingUTF16BE = 0x10000100,
    kCFStringEncodingUTF16LE = 0x14000100,
    kCFStringEncodingUTF32BE = 0x18000100,
    kCFStringEncodingUTF32LE = 0x1c000100,
    kCFStringEncodingInvalidId = 0xffffffffU,
};

typedef CFOptionFlags CFStringCompareFlags;
enum : CFStringCompareFlags {
    kCFCompareCaseInsensitive = 1, ///< ASCII letters only
    kCFCompareBackwards = 4,       ///< search from the end
    kCFCompareAnchored = 8,        ///< match only at the start (or end, with kCFCompareBackwards)
    kCFCompareNonliteral = 16,     ///< accepted, no effect: text is compared literally
};

CFTypeID CFStringGetTypeID();

/// A shared constant string for a literal of UTF-8 text; never destroyed, no release needed.
/// The same text yields the same reference.
#define CFSTR(text) __CFStringMakeConstantString("" text "")
CFStringRef __CFStringMakeConstantString(const char* utf8);

// Creation. Every Create returns a new reference, or null when the input cannot be read in the
// given encoding (invalid UTF-8, an unknown encoding, ...).

/// Text from bytes. With `isExternalRepresentation`, a leading byte-order mark is taken away
/// (UTF-8 and UTF-16) and UTF-16 without one is read big-endian.
CFStringRef CFStringCreateWithBytes(CFAllocatorRef allocator, const UInt8* bytes, CFIndex numBytes,
                                    CFStringEncoding encoding, Boolean isExternalRepresentation);
/// Text from a zero-terminated C string.
CFStringRef CFStringCreateWithCString(CFAllocatorRef allocator, const char* cString,
                                      CFStringEncoding encoding);
/// Text from `numChars` UTF-16 units; null for a negative count (or a null `chars` with units).
CFStringRef CFStringCreateWithCharacters(CFAllocatorRef allocator, const UniChar* chars,
                                         CFIndex numChars);
/// Text from a path in the file-system representation (UTF-8 on Linux).
CFStringRef CFStringCreateWithFileSystemRepresentation(CFAllocatorRef allocator,
                                                       const char* buffer);
CFStringRef CFStringCreateCopy(CFAllocatorRef allocator, CFStringRef string);
/// The units of `range`; null when the range is not inside the string.
CFStringRef CFStringCreateWithSubstring(CFAllocatorRef allocator, CFStringRef string,
                                        CFRange range);
/// printf-style formatting; "%@" inserts a value's description.
CFStringRef CFStringCreateWithFormat(CFAllocatorRef allocator, CFDictionaryRef formatOptions,
                                     CFStringRef format, ...);

/// A new empty mutable string; `maxLength` 0 means unlimited (a limit is not enforced).
CFMutableStringRef CFStringCreateMutable(CFAllocatorRef allocator, CFIndex maxLength);
CFMutableStringRef CFStringCreateMutableCopy(CFAllocatorRef allocator, CFIndex maxLength,
                                             CFStringRef string);
void CFStringAppend(CFMutableStringRef string, CFStringRef appended);
void CFStringAppendCString(CFMutableStringRef string, const char* cString,
                           CFStringEncoding encoding);
void CFStringAppendCharacters(CFMutableStringRef string, const UniChar* chars, CFIndex numChars);
/// Replaces the units of `range` with `replacement`.
void CFStringReplace(CFMutableStringRef string, CFRange range, CFStringRef replacement);
void CFStringDelete(CFMutableStringRef string, CFRange range);
void CFStringInsert(CFMutableStringRef string, CFIndex index, CFStringRef inserted);

// Access.

/// Length in UTF-16 units.
CFIndex CFStringGetLength(CFStringRef string);
UniChar CFStringGetCharacterAtIndex(CFStringRef string, CFIndex index);
void CFStringGetCharacters(CFStringRef string, CFRange range, UniChar* buffer);
/// Pointer to the string's UTF-16 units; valid while the string lives unchanged. Never null for
/// a string: one that keeps 8-bit bytes makes its units on the first call and keeps them.
const UniChar* CFStringGetCharactersPtr(CFStringRef string);

/// Converts the units of `range` into `encoding`, writing at most `maxBufLen` bytes to `buffer`
/// (with a null buffer only the size is computed). Conversion stops before the first unit that
/// cannot be represented (when `lossByte` is 0; otherwise that byte stands in for it) or that
/// would not fit. Returns the number of UTF-16 units converted and stores the bytes used (or
/// needed) in `*usedBufLen`. A surrogate pair converts whole or not at all. No byte-order mark
/// is written for UTF-8, even with `isExternalRepresentation`.
CFIndex CFStringGetBytes(CFStringRef string, CFRange range, CFStringEncoding encoding,
                         UInt8 lossByte, Boolean isExternalRepresentation, UInt8* buffer,
                         CFIndex maxBufLen, CFIndex* usedBufLen);
/// Zero-terminated conversion of the whole string; false when it does not fit or cannot convert.
Boolean CFStringGetCString(CFStringRef string, char* buffer, CFIndex bufferSize,
                           CFStringEncoding encoding);
/// The zero-terminated bytes of a string in `encoding` when it keeps them directly (a string
/// made from ASCII, for an encoding that agrees with ASCII; one made from UTF-8, for UTF-8) and
/// they hold no zero byte; null otherwise. Valid while the string lives.
const char* CFStringGetCStringPtr(CFStringRef string, CFStringEncoding encoding);
/// The largest byte count `length` UTF-16 units can need in `encoding` (3 per unit in UTF-8).
CFIndex CFStringGetMaximumSizeForEncoding(CFIndex length, CFStringEncoding encoding);
/// Largest buffer size CFStringGetFileSystemRepresentation can need, terminator included.
CFIndex CFStringGetMaximumSizeOfFileSystemRepresentation(CFStringRef string);
/// The zero-terminated UTF-8 path form; false when it does not fit or cannot convert.
Boolean CFStringGetFileSystemRepresentation(CFStringRef string, char* buffer, CFIndex maxBufLen);

// Comparison and search.

CFComparisonResult CFStringCompare(CFStringRef a, CFStringRef b, CFStringCompareFlags options);
CFComparisonResult CFStringCompareWithOptions(CFStringRef a, CFStringRef b, CFRange rangeToCompare,
                                              CFStringCompareFlags options);
/// The first occurrence of `toFind` (the last with kCFCompareBackwards); {kCFNotFound, 0} when
/// there is none.
CFRange CFStringFind(CFStringRef string, CFStringRef toFind, CFStringCompareFlags options);
Boolean CFStringFindWithOptions(CFStringRef string, CFStringRef toFind, CFRange rangeToSearch,
                                CFStringCompareFlags options, CFRange* result);
Boolean CFStringHasPrefix(CFStringRef string, CFStringRef prefix);
Boolean CFStringHasSuffix(CFStringRef string, CFStringRef suffix);

namespace glyphwell {

/// A new string of the UTF-8 bytes `utf8` (a zero byte stays U+0000); null when they are not
/// UTF-8. Returns a new reference; the caller releases it.
CFStringRef CreateString(std::string_view utf8);

/// The UTF-8 bytes of `string` (a U+0000 in it stays a zero byte). Empty for a null string, and,
/// when `lossByte` is 0, for a string holding a lone surrogate, which has no UTF-8 form; otherwise
/// `lossByte` stands in for each lone surrogate.
std::optional<std::string> UTF8String(CFStringRef string, UInt8 lossByte = 0);

/// The UTF-8 bytes `string` keeps (all of them, zero bytes included) when it was made from ASCII
/// or UTF-8; a view with null data() for a string held as UTF-16 or for anything but a string (an
/// empty kept text has non-null data()). Does not copy; the view is valid while the string lives.
/// For writers that copy text out without converting; returned in registers, not as an optional,
/// since the writer asks once per text.
std::string_view UTF8Bytes(CFStringRef string);

} // namespace glyphwell
