// Errors: a domain string, a code and an optional user-info dictionary.
//
// Bad input: reported once through the assertion handler (naming the function called); then
// creators give null, readers 0, false or null, and modifiers change nothing (see CFBase.h).
#pragma once

#include "platform/CFBase.h"

CFTypeID CFErrorGetTypeID();

extern const CFStringRef kCFErrorDomainPOSIX;
extern const CFStringRef kCFErrorLocalizedDescriptionKey;
extern const CFStringRef kCFErrorLocalizedFailureReasonKey;
extern const CFStringRef kCFErrorUnderlyingErrorKey;

/// A new error; the domain and user info are retained (a copy of the user info is kept). Null
/// when `domain` is null.
CFErrorRef CFErrorCreate(CFAllocatorRef allocator, CFStringRef domain, CFIndex code,
                         CFDictionaryRef userInfo);
/// The domain, not retained.
CFStringRef CFErrorGetDomain(CFErrorRef error);
CFIndex CFErrorGetCode(CFErrorRef error);
/// A new reference to the user info; an empty dictionary when there is none.
CFDictionaryRef CFErrorCopyUserInfo(CFErrorRef error);
