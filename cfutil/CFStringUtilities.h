// String utilities that carry decisions of their own: four-character codes as strings, null-safe
// string equality, UTF-8 bytes of a string, and dictionary lookups by language identifier with
// fallback from a regional variant (en_GB) to its base language (en).
//
// The string operations attached to TCFStr (tilde expansion, cutting a regional suffix, the
// shared string from the uniquer) are declared with TCFStr in cfutil/TCFString.h and defined in
// CFStringUtilities.cpp.
#pragma once

#include <string>

#include "platform/CFDictionary.h"
#include "platform/CFString.h"

namespace CFString {

/// A new string of the four bytes of `code`, most significant first, read as a C string in Mac
/// Roman (so it stops at the first zero byte): 0x74657874 gives "text", 0x61006364 gives "a".
/// Returns a new reference; the caller releases it.
CFStringRef CopyAsString(UInt32 code);

/// Replaces `out` with the UTF-8 bytes of `string`. False (and `out` empty) for null, or for a
/// string holding a lone surrogate, which has no UTF-8 form.
bool GetUTF8(CFStringRef string, std::string& out);

} // namespace CFString

/// True when `a` and `b` are the same reference (two nulls included), false when exactly one is
/// null, otherwise the value equality of the two strings.
bool StringEqual(CFStringRef a, CFStringRef b);

namespace CFDictionary {

/// The value for `key` in `dictionary`; null for a null dictionary, a null key or an absent key.
/// Does not retain.
const void* GetValue(CFDictionaryRef dictionary, CFTypeRef key);

/// The value for the language identifier `language` (en_GB, pt-BR, zh_Hant ...) or, when there
/// is none, for its base language (TCFStr::CreateSubstringWithoutRegionalSuffix: en_GB falls back
/// to en, zh_TW never falls back to zh). No further fallback. Null when neither is present, or
/// for a null dictionary or language. Does not retain.
const void* GetValueForLanguage(CFDictionaryRef dictionary, CFStringRef language);

} // namespace CFDictionary
