// Key-value collections; keys are distinct by the key equality callback. Enumeration follows
// insertion order (a replaced value keeps its key's place), which callers must not rely on.
//
// Bad input: reported once through the assertion handler (naming the function called); then
// creators give null, readers 0, false or null, and modifiers change nothing (see CFBase.h).
#pragma once

#include "platform/CFBase.h"

CFTypeID CFDictionaryGetTypeID();

/// A new dictionary of `count` pairs (a repeated key keeps the last value). Null callbacks mean
/// no retain, pointer equality and hash.
CFDictionaryRef CFDictionaryCreate(CFAllocatorRef allocator, const void** keys, const void** values,
                                   CFIndex count, const CFDictionaryKeyCallBacks* keyCallBacks,
                                   const CFDictionaryValueCallBacks* valueCallBacks);
CFDictionaryRef CFDictionaryCreateCopy(CFAllocatorRef allocator, CFDictionaryRef dictionary);
CFMutableDictionaryRef CFDictionaryCreateMutable(CFAllocatorRef allocator, CFIndex capacity,
                                                 const CFDictionaryKeyCallBacks* keyCallBacks,
                                                 const CFDictionaryValueCallBacks* valueCallBacks);
CFMutableDictionaryRef CFDictionaryCreateMutableCopy(CFAllocatorRef allocator, CFIndex capacity,
                                                     CFDictionaryRef dictionary);

CFIndex CFDictionaryGetCount(CFDictionaryRef dictionary);
CFIndex CFDictionaryGetCountOfKey(CFDictionaryRef dictionary, const void* key);
CFIndex CFDictionaryGetCountOfValue(CFDictionaryRef dictionary, const void* value);
Boolean CFDictionaryContainsKey(CFDictionaryRef dictionary, const void* key);
Boolean CFDictionaryContainsValue(CFDictionaryRef dictionary, const void* value);
/// The value for `key`, or null.
const void* CFDictionaryGetValue(CFDictionaryRef dictionary, const void* key);
Boolean CFDictionaryGetValueIfPresent(CFDictionaryRef dictionary, const void* key,
                                      const void** value);
/// Fills `keys` and `values` (either may be null) with CFDictionaryGetCount entries, pairwise.
void CFDictionaryGetKeysAndValues(CFDictionaryRef dictionary, const void** keys,
                                  const void** values);
void CFDictionaryApplyFunction(CFDictionaryRef dictionary, CFDictionaryApplierFunction applier,
                               void* context);

/// Adds the pair when the key is absent.
void CFDictionaryAddValue(CFMutableDictionaryRef dictionary, const void* key, const void* value);
/// Adds the pair, or replaces the value of an equal key.
void CFDictionarySetValue(CFMutableDictionaryRef dictionary, const void* key, const void* value);
/// Replaces the value of an equal key; nothing when the key is absent.
void CFDictionaryReplaceValue(CFMutableDictionaryRef dictionary, const void* key,
                              const void* value);
void CFDictionaryRemoveValue(CFMutableDictionaryRef dictionary, const void* key);
void CFDictionaryRemoveAllValues(CFMutableDictionaryRef dictionary);
