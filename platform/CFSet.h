// Unordered collections of distinct values (by the equality callback). Enumeration follows
// insertion order, which callers must not rely on.
//
// Bad input: reported once through the assertion handler (naming the function called); then
// creators give null, readers 0, false or null, and modifiers change nothing (see CFBase.h).
#pragma once

#include "platform/CFBase.h"

CFTypeID CFSetGetTypeID();

/// A new set of `count` values (duplicates collapse to the first); `callBacks` null means no
/// retain, pointer equality and hash.
CFSetRef CFSetCreate(CFAllocatorRef allocator, const void** values, CFIndex count,
                     const CFSetCallBacks* callBacks);
CFSetRef CFSetCreateCopy(CFAllocatorRef allocator, CFSetRef set);
CFMutableSetRef CFSetCreateMutable(CFAllocatorRef allocator, CFIndex capacity,
                                   const CFSetCallBacks* callBacks);
CFMutableSetRef CFSetCreateMutableCopy(CFAllocatorRef allocator, CFIndex capacity, CFSetRef set);

CFIndex CFSetGetCount(CFSetRef set);
CFIndex CFSetGetCountOfValue(CFSetRef set, const void* value);
Boolean CFSetContainsValue(CFSetRef set, const void* value);
/// The member equal to `value`, or null.
const void* CFSetGetValue(CFSetRef set, const void* value);
Boolean CFSetGetValueIfPresent(CFSetRef set, const void* candidate, const void** value);
/// Fills `values` with the CFSetGetCount members.
void CFSetGetValues(CFSetRef set, const void** values);
void CFSetApplyFunction(CFSetRef set, CFSetApplierFunction applier, void* context);

/// Adds `value` when no equal member exists.
void CFSetAddValue(CFMutableSetRef set, const void* value);
/// Replaces an equal member when there is one, else adds.
void CFSetSetValue(CFMutableSetRef set, const void* value);
/// Replaces an equal member; nothing when there is none.
void CFSetReplaceValue(CFMutableSetRef set, const void* value);
void CFSetRemoveValue(CFMutableSetRef set, const void* value);
void CFSetRemoveAllValues(CFMutableSetRef set);
