// Ordered collections. Elements are visited in index order. Index arguments are the caller's to
// keep in range; an out-of-range index is bad input.
//
// Bad input: reported once through the assertion handler (naming the function called); then
// creators give null, readers 0, false or null, and modifiers change nothing (see CFBase.h).
#pragma once

#include "platform/CFBase.h"

CFTypeID CFArrayGetTypeID();

/// A new array of `count` values; `callBacks` null means no retain, pointer equality.
CFArrayRef CFArrayCreate(CFAllocatorRef allocator, const void** values, CFIndex count,
                         const CFArrayCallBacks* callBacks);
CFArrayRef CFArrayCreateCopy(CFAllocatorRef allocator, CFArrayRef array);
/// `capacity` 0 means unlimited (a limit is not enforced).
CFMutableArrayRef CFArrayCreateMutable(CFAllocatorRef allocator, CFIndex capacity,
                                       const CFArrayCallBacks* callBacks);
CFMutableArrayRef CFArrayCreateMutableCopy(CFAllocatorRef allocator, CFIndex capacity,
                                           CFArrayRef array);

CFIndex CFArrayGetCount(CFArrayRef array);
const void* CFArrayGetValueAtIndex(CFArrayRef array, CFIndex index);
void CFArrayGetValues(CFArrayRef array, CFRange range, const void** values);
CFIndex CFArrayGetCountOfValue(CFArrayRef array, CFRange range, const void* value);
Boolean CFArrayContainsValue(CFArrayRef array, CFRange range, const void* value);
CFIndex CFArrayGetFirstIndexOfValue(CFArrayRef array, CFRange range, const void* value);
CFIndex CFArrayGetLastIndexOfValue(CFArrayRef array, CFRange range, const void* value);
void CFArrayApplyFunction(CFArrayRef array, CFRange range, CFArrayApplierFunction applier,
                          void* context);
/// Binary search in a range sorted by `comparator`: the index of an element equal to `value`
/// when there is one; otherwise the index of the first element greater than `value`, or
/// range.location + range.length when none is greater.
CFIndex CFArrayBSearchValues(CFArrayRef array, CFRange range, const void* value,
                             CFComparatorFunction comparator, void* context);

void CFArrayAppendValue(CFMutableArrayRef array, const void* value);
/// `index` may equal the count (the value is appended).
void CFArrayInsertValueAtIndex(CFMutableArrayRef array, CFIndex index, const void* value);
/// `index` may equal the count (the value is appended).
void CFArraySetValueAtIndex(CFMutableArrayRef array, CFIndex index, const void* value);
void CFArrayRemoveValueAtIndex(CFMutableArrayRef array, CFIndex index);
void CFArrayRemoveAllValues(CFMutableArrayRef array);
/// Replaces the values of `range` with `newCount` values.
void CFArrayReplaceValues(CFMutableArrayRef array, CFRange range, const void** newValues,
                          CFIndex newCount);
void CFArrayExchangeValuesAtIndices(CFMutableArrayRef array, CFIndex index1, CFIndex index2);
/// Stable sort of `range` by `comparator`.
void CFArraySortValues(CFMutableArrayRef array, CFRange range, CFComparatorFunction comparator,
                       void* context);
/// Appends the values of `range` of `other`.
void CFArrayAppendArray(CFMutableArrayRef array, CFArrayRef other, CFRange range);
