// Wrappers over set values: TCFSet<T> owns one count of a set whose members are references of
// type T; TCFMutableSet owns a mutable set of untyped references. Reading a null set yields no
// members.
#pragma once

#include "cfutil/TCFRetained.h"
#include "platform/CFArray.h"
#include "platform/CFSet.h"

/// Owns one count of a set value and releases it when destroyed. Cannot be copied.
template <class T> class TCFSet : public TCFReferenceHolder<CFSetRef> {
public:
    /// Retains `set` (null-safe), or adopts it with kAdopted (no retain; may be null).
    using TCFReferenceHolder::TCFReferenceHolder;

    /// The member count; 0 for null.
    CFIndex GetCount() const { return ref_ ? CFSetGetCount(ref_) : 0; }
    /// Fills `values` (a caller array of GetCount() entries) with the members; leaves it
    /// untouched for null. Does not retain.
    void GetValues(const void** values) const {
        if (ref_)
            CFSetGetValues(ref_, values);
    }
    /// True when the set holds a member equal to `value`; false for null.
    bool ContainsValue(T value) const { return ref_ && CFSetContainsValue(ref_, value); }
};

/// Owns a mutable set of untyped references, with set algebra in place.
///
/// It receives its reference in one of two ways: the default constructor creates a new, empty
/// set of property values, and the (set, kAdopted) constructor takes over the count of a mutable
/// set the caller created (there is no retaining constructor, so two wrappers never share one
/// set by accident). Either way it holds a non-null set, which the mutating operations require.
class TCFMutableSet : public TCFSet<const void*> {
public:
    /// Creates an empty set of property values (retained, compared with CFEqual and CFHash);
    /// `capacity` 0 means unlimited.
    explicit TCFMutableSet(CFIndex capacity = 0)
        : TCFSet(CFSetCreateMutable(kCFAllocatorDefault, capacity, &kCFTypeSetCallBacks),
                 kAdopted) {}
    /// Adopts `set` (no retain), for example the result of CFSetCreateMutableCopy; the caller
    /// guarantees it is non-null.
    TCFMutableSet(CFMutableSetRef set, adopted_t) : TCFSet(set, kAdopted) {}

    /// The held set typed as mutable; does not retain.
    CFMutableSetRef GetMutable() const { return const_cast<CFMutableSetRef>(ref_); }
    /// Adds `value` when no equal member is present; the set retains it.
    void AddValue(const void* value) const { CFSetAddValue(GetMutable(), value); }
    /// Removes the member equal to `value`, if any.
    void RemoveValue(const void* value) const { CFSetRemoveValue(GetMutable(), value); }

    /// Adds every element of `array` in index order (AddValue each); a null array adds nothing.
    /// Does not retain `array`.
    void AddValues(CFArrayRef array) const;
    /// Adds every member of `other`; a null `other`, or this set itself, changes nothing. Does
    /// not retain `other`.
    void Union(CFSetRef other) const;
    /// Removes every member of `other`; a null `other` changes nothing, and this set itself
    /// empties the set. Does not retain `other`.
    void MinusSet(CFSetRef other) const;
    /// Removes every member that `other` does not contain; a null `other` reads as the empty
    /// set and so empties this one. Does not retain `other`.
    void Intersect(CFSetRef other) const;
};
