// Wrappers over string values: TCFStr, a view that never owns its reference; TCFString, which
// adopts one count; and TCFMutableString, which creates and owns an empty mutable string. Every
// reading operation treats a null string as empty (length 0, no match, false).
#pragma once

#include "cfutil/CFStringUtilities.h"
#include "cfutil/TCFRetained.h"
#include "platform/CFString.h"

/// A view of a string value: does not retain, does not release.
class TCFStr : public TCFReferenceSlot<CFStringRef> {
public:
    /// Stores `string` (may be null); does not retain.
    explicit TCFStr(CFStringRef string) : TCFReferenceSlot(string) {}

    /// Length in UTF-16 units; 0 for null.
    CFIndex GetLength() const { return ref_ ? CFStringGetLength(ref_) : 0; }
    /// The UTF-16 unit at `index` (kept below GetLength() by the caller); 0 for null.
    UniChar GetCharacterAtIndex(CFIndex index) const;
    /// The largest byte count GetLength() units can need in `encoding`.
    CFIndex GetMaxSize(CFStringEncoding encoding) const;
    /// Zero-terminated conversion into `buffer` of `size` bytes; false for null, or when the
    /// text does not fit or cannot be converted.
    bool GetCString(char* buffer, CFIndex size, CFStringEncoding encoding) const;
    /// The buffer size that GetFileSystemRepresentation can need, terminator included; 0 for null.
    CFIndex GetMaxSizeOfFileSystemRepresentation() const;
    /// The zero-terminated path bytes into `buffer` of `size` bytes; false for null, or when they
    /// do not fit.
    bool GetFileSystemRepresentation(char* buffer, CFIndex size) const;
    /// The first occurrence of `string` under the compare `options`; {kCFNotFound, 0} when there
    /// is none or either string is null.
    CFRange Find(CFStringRef string, CFStringCompareFlags options) const;
    /// True when the held string starts with `prefix`; false when either is null.
    bool HasPrefix(CFStringRef prefix) const;
    /// A new string of the units of `range` (kept inside the string by the caller), or null for
    /// null. Returns a new reference; the caller releases it.
    CFStringRef CreateSubstring(CFRange range) const;

    /// `path` with a leading tilde expanded: "~" and "~/x" name the current user's home
    /// directory ($HOME when set and absolute, else the password database), "~name" and
    /// "~name/x" the home directory of user `name` from the password database, without a
    /// trailing slash ("/" excepted). Everything after
    /// the user part is kept as it is. A path that does not start with "~", or that names a user
    /// without a home directory, is returned itself, retained (a null path yields null).
    /// Returns a new reference (possibly to `path`); the caller releases it.
    static CFStringRef CreateStringByExpandingTildeInPath(CFStringRef path);
    /// The language identifier without its regional suffix, which starts at the first "_" or,
    /// when there is none, at the first "-": en_US gives en, pt-BR gives pt, en-US_POSIX gives
    /// en-US. Identifiers starting with "zh" keep their suffix. The held string itself,
    /// retained, when nothing is cut; null for null. Returns a new reference; the caller
    /// releases it.
    CFStringRef CreateSubstringWithoutRegionalSuffix() const;
    /// The process-wide shared string with the held string's text (TCFStringUniquer), or null
    /// for null. Does not retain: the uniquer owns the result for the life of the process.
    CFStringRef GetUniqueString() const;
};

/// Owns one count of a string value and releases it when destroyed. Cannot be copied.
class TCFString : public TCFReferenceHolder<CFStringRef, TCFStr> {
public:
    /// Adopts `string` (no retain; may be null): meant for the result of a Create or Copy call.
    explicit TCFString(CFStringRef string) : TCFReferenceHolder(string, kAdopted) {}
    /// Adopts CFString::CopyAsString(code): 0x61626364 gives "abcd".
    explicit TCFString(UInt32 code);
    /// Adopts a new string of `length` bytes in `encoding` (not as an external representation:
    /// a byte-order mark is kept as text); null when the bytes do not decode.
    TCFString(const UInt8* bytes, CFIndex length, CFStringEncoding encoding);
};

/// Owns a new, initially empty mutable string.
class TCFMutableString : public TCFString {
public:
    /// Creates an empty mutable string; `maxLength` 0 means unlimited.
    explicit TCFMutableString(CFIndex maxLength = 0);

    /// The held string typed as mutable; does not retain.
    CFMutableStringRef GetMutable() const { return const_cast<CFMutableStringRef>(ref_); }
    /// Appends the text of `string`.
    void Append(CFStringRef string) const { CFStringAppend(GetMutable(), string); }
    /// Replaces the units of `range` with `string`.
    void Replace(CFRange range, CFStringRef string) const {
        CFStringReplace(GetMutable(), range, string);
    }
};
