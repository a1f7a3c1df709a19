// TCFStringUniquer: the process-wide table that hands out one shared, immutable string per
// distinct UTF-8 text, so that equal texts read from requests share one string object.
//
// The table is keyed on raw UTF-8 bytes (up to the first zero byte) with its own hash and byte
// comparison, so looking up a text already seen makes no string object. Entries are never
// removed: every string handed out lives, unchanged, for the rest of the process and may be used
// on any thread without further locking. Lookups of texts already present take no lock.
//
// The strings handed out are shared constants, like CFSTR strings: CFRetain and CFRelease do not
// count on them and CFGetRetainCount reports the largest index, so callers may retain and release
// them as usual at no cost.
//
// NOTE: the key is the text up to its first zero byte, while a new string is made from all the
// bytes given. Two texts that agree up to an embedded zero byte therefore yield the one string
// made for whichever of them came first.
#pragma once

#include "platform/CFString.h"

class TCFStringUniquerImp;

/// Hash of a zero-terminated UTF-8 key: a 32-bit mix taking two bytes per round, never 0 (a zero
/// result becomes 0x80000000), widened with zero high bits. "abc" hashes to 0xCC946882.
CFHashCode utf8Hash(const void* key);
/// True when `a` and `b` are the same pointer or hold equal zero-terminated byte strings.
Boolean utf8Equal(const void* a, const void* b);
/// A new string "[<key text>]"; the caller releases it.
CFStringRef utf8CopyDescription(const void* key);

/// A handle on the process-wide uniquer; cheap to construct and copy, destroying it does nothing.
class TCFStringUniquer {
public:
    /// Fetches the process-wide instance, creating it on first use.
    TCFStringUniquer() : imp_(GetStringUniquer()) {}

    /// The unique string with the text of `string` (as UTF-8, up to its first U+0000). Null for
    /// null. A string that cannot be converted to UTF-8, or whose text is empty, is returned
    /// itself. Does not retain: the result is owned by the table (or is the caller's input).
    CFStringRef GetUniqueString(CFStringRef string) const;
    /// The unique string for the `length` bytes of UTF-8 text at `bytes`, looked up by the text
    /// up to its first zero byte and made, when new, from all `length` bytes. Null for null
    /// bytes, a length of 0 or less, or bytes that are not UTF-8 (logged). Does not retain: the
    /// table owns the result, which the caller may keep for the life of the process.
    CFStringRef GetUniqueString(const char* bytes, CFIndex length) const;
    CFStringRef GetUniqueString(const UInt8* bytes, CFIndex length) const {
        return GetUniqueString(reinterpret_cast<const char*>(bytes), length);
    }

    /// The process-wide instance, created exactly once even under concurrent first calls and
    /// never destroyed.
    static TCFStringUniquerImp* GetStringUniquer();

private:
    static TCFStringUniquerImp* CreateStringUniquer();

    TCFStringUniquerImp* imp_;
};
