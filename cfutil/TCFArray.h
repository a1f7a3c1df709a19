// Wrappers over array values. TCFDeque<T> is a view that never owns its reference; TCFArray<T>
// owns one count; TCFMutableArray, TCFLazyMutableArray and TCFSortedArray own a mutable array of
// untyped references. T is the element's reference type (TCFArray<CFStringRef>); elements are
// handed out as T without any check of their kind. Reading a null array yields no elements.
#pragma once

#include <concepts>

#include "cfutil/TCFRetained.h"
#include "platform/CFArray.h"

/// A view of an array value: does not retain, does not release.
template <class T> class TCFDeque : public TCFReferenceSlot<CFArrayRef> {
public:
    /// Stores `array` (may be null); does not retain.
    explicit TCFDeque(CFArrayRef array) : TCFReferenceSlot(array) {}

    /// The element count; 0 for null.
    CFIndex GetCount() const { return ref_ ? CFArrayGetCount(ref_) : 0; }
    /// The element at `index` (kept below GetCount() by the caller) as T; null for a null array.
    /// Does not retain.
    T At(CFIndex index) const {
        if (!ref_)
            return nullptr;
        return static_cast<T>(const_cast<void*>(CFArrayGetValueAtIndex(ref_, index)));
    }
};

/// Owns one count of an array value and releases it when destroyed. Cannot be copied.
template <class T> class TCFArray : public TCFReferenceHolder<CFArrayRef, TCFDeque<T>> {
public:
    /// Retains `array` (null-safe), or adopts it with kAdopted (no retain; may be null).
    using TCFReferenceHolder<CFArrayRef, TCFDeque<T>>::TCFReferenceHolder;
    /// Creates an immutable array of the `count` `values`, handled by `callBacks`.
    TCFArray(const void** values, CFIndex count, const CFArrayCallBacks* callBacks)
        : TCFArray(CFArrayCreate(kCFAllocatorDefault, values, count, callBacks), kAdopted) {}
};

/// Owns a mutable array of untyped references. Every constructor leaves it holding an array.
class TCFMutableArray : public TCFArray<const void*> {
public:
    /// Creates an empty array of property values (retained, compared with CFEqual); `capacity`
    /// 0 means unlimited. Any integer type is taken, so that TCFMutableArray(0) is not mistaken
    /// for the null-pointer overload below.
    template <std::integral I>
    explicit TCFMutableArray(I capacity)
        : TCFMutableArray(CreateEmptyArray(CFIndex(capacity)), kAdopted) {}
    /// Creates an empty array handled by `callBacks`, then inserts the `count` `values` at its
    /// start, in order.
    TCFMutableArray(CFIndex count, const void** values, const CFArrayCallBacks* callBacks);
    /// Creates a mutable copy of `array` (a new empty array of property values when `array` is
    /// null); `capacity` 0 means unlimited.
    TCFMutableArray(CFArrayRef array, CFIndex capacity);
    /// Retains and shares `array`; creates a new empty array of property values when it is null.
    explicit TCFMutableArray(CFMutableArrayRef array);

    /// The held array typed as mutable; does not retain.
    CFMutableArrayRef GetMutable() const { return const_cast<CFMutableArrayRef>(ref_); }
    /// Appends `value`, which the array's callbacks retain.
    void Append(const void* value) const { CFArrayAppendValue(GetMutable(), value); }
    /// Appends the elements of `range` of `other`.
    void Append(CFArrayRef other, CFRange range) const {
        CFArrayAppendArray(GetMutable(), other, range);
    }
    /// Inserts `value` before the element at `index` (at most GetCount()).
    void InsertValueAtIndex(CFIndex index, const void* value) const {
        CFArrayInsertValueAtIndex(GetMutable(), index, value);
    }
    /// Removes the element at `index` (below GetCount()).
    void RemoveValueAtIndex(CFIndex index) const { CFArrayRemoveValueAtIndex(GetMutable(), index); }

protected:
    /// Adopts `array` (no retain), which the caller guarantees to be non-null.
    TCFMutableArray(CFMutableArrayRef array, adopted_t) : TCFArray(array, kAdopted) {}
    /// A new empty array of property values. Returns a new reference; the caller releases it.
    static CFMutableArrayRef CreateEmptyArray(CFIndex capacity);
};

/// A mutable array of property values that is created by the first Append: until then it holds
/// null, GetCount() is 0 and Orphan() yields null, so an empty result costs no allocation.
class TCFLazyMutableArray : public TCFArray<const void*> {
public:
    /// Holds no array.
    TCFLazyMutableArray() : TCFArray(nullptr, kAdopted) {}

    /// Creates an empty array of property values with unlimited capacity when none is held.
    void LazyCreate() {
        if (!ref_)
            Adopt(CFArrayCreateMutable(kCFAllocatorDefault, 0, &kCFTypeArrayCallBacks));
    }
    /// LazyCreate(), then appends `value`, which the array retains.
    void Append(const void* value) {
        LazyCreate();
        CFArrayAppendValue(GetMutable(), value);
    }
    /// The held array typed as mutable, or null while nothing was appended; does not retain.
    CFMutableArrayRef GetMutable() const { return const_cast<CFMutableArrayRef>(ref_); }
};

/// A mutable array of untyped references kept in ascending order by a three-way comparison
/// (kCFCompareLessThan, kCFCompareEqualTo, kCFCompareGreaterThan) and its context.
///
/// It receives its reference by creating it: the only constructor makes a new, empty array of
/// property values that the wrapper owns, so the array starts sorted and stays sorted as long as
/// values enter through InsertUnique or Merge (InsertValueAtIndex trusts the caller's index).
class TCFSortedArray : public TCFMutableArray {
public:
    /// Creates an empty array of property values ordered by `comparator` (non-null), which is
    /// called with `context` (not retained; it must outlive the array); `capacity` 0 means
    /// unlimited.
    TCFSortedArray(CFComparatorFunction comparator, void* context, CFIndex capacity = 0)
        : TCFMutableArray(capacity), comparator_(comparator), context_(context) {}

    /// Inserts `value` at its sorted position (before the first greater element) unless an
    /// element equal to it under the comparison is present; the array retains it. Returns true
    /// when it inserted. The comparison is called with `value` as either argument.
    bool InsertUnique(const void* value);

    /// The comparison that orders the array.
    CFComparatorFunction GetComparator() const { return comparator_; }
    /// The context handed to every call of the comparison.
    void* GetContext() const { return context_; }

private:
    CFComparatorFunction comparator_;
    void* context_;
};

/// Appends to the array of `sorted` the stable merge of `first` and `second` (each sorted by the
/// comparison of `sorted`; the result is sorted only if they are): on ties the element of
/// `first` comes first, duplicates are kept, and the elements `sorted` held before stay in
/// front, not merged with the new ones. A null input reads as empty. Does not retain `first` or
/// `second`; the array retains what it receives. Either input may be the array of `sorted`
/// itself: its elements are read up to its count on entry.
void Merge(CFArrayRef first, CFArrayRef second, const TCFSortedArray& sorted);
