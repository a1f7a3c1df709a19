// Wrappers over dictionary values: TCFDict, a view that never owns its reference; TCFDictionary,
// which owns one count of an immutable dictionary; TCFMutableDictionary, which creates and owns a
// mutable one. Reading a null dictionary yields no pairs.
//
// Beyond single platform calls they compare and filter dictionaries (ContainsSubset,
// CreateDictionaryFilteredByKey), copy the pairs of one into another (SetPairs), and keep
// multi-value dictionaries, whose keys each map to a mutable array of values (AddMultiValue,
// AddMultiValues). Keys and values are compared only with the property-value equality (CFEqual).
#pragma once

#include "cfutil/TCFRetained.h"
#include "cfutil/TCFSet.h"
#include "platform/CFArray.h"
#include "platform/CFDictionary.h"
#include "platform/CFString.h"

/// A view of a dictionary value: does not retain, does not release.
class TCFDict : public TCFReferenceSlot<CFDictionaryRef> {
public:
    /// Stores `dictionary` (may be null); does not retain.
    explicit TCFDict(CFDictionaryRef dictionary) : TCFReferenceSlot(dictionary) {}

    /// The number of pairs; 0 for null.
    CFIndex GetCount() const { return ref_ ? CFDictionaryGetCount(ref_) : 0; }
    /// The value for `key`, or null when absent or for null; does not retain.
    const void* GetValue(const void* key) const {
        return ref_ ? CFDictionaryGetValue(ref_, key) : nullptr;
    }
    /// Fills `keys` and `values` (caller arrays of GetCount() entries) pairwise; leaves them
    /// untouched for null. Does not retain.
    void GetKeysAndValues(const void** keys, const void** values) const {
        if (ref_)
            CFDictionaryGetKeysAndValues(ref_, keys, values);
    }
    /// Calls function(key, value, context) once for each pair; nothing for null. The function
    /// must not change this dictionary.
    void ApplyFunction(CFDictionaryApplierFunction function, void* context) const {
        if (ref_)
            CFDictionaryApplyFunction(ref_, function, context);
    }

    /// True when every key of `other` is present here with an equal value (CFEqual). False when
    /// this dictionary is null; true for an empty or null `other`. Does not retain.
    bool ContainsSubset(CFDictionaryRef other) const;
    /// The pairs whose key is a member of `keys`. Returns a new reference that the caller
    /// releases: a new dictionary (empty when no key matches, also for a null dictionary), or,
    /// when `keys` is null or empty, this dictionary itself with one more count (null for null),
    /// without copying or filtering anything.
    CFDictionaryRef CreateDictionaryFilteredByKey(CFSetRef keys) const;
};

/// Owns one count of a dictionary value and releases it when destroyed. Cannot be copied.
class TCFDictionary : public TCFReferenceHolder<CFDictionaryRef, TCFDict> {
public:
    /// Creates an immutable dictionary of `count` pairs, keys and values retained and compared
    /// as property values.
    TCFDictionary(const void** keys, const void** values, CFIndex count);
    /// Adopts `dictionary` (no retain; may be null).
    TCFDictionary(CFDictionaryRef dictionary, adopted_t)
        : TCFReferenceHolder(dictionary, kAdopted) {}
};

/// Owns a new, initially empty mutable dictionary with property-value keys and values.
class TCFMutableDictionary : public TCFDictionary {
public:
    /// Creates an empty mutable dictionary; `capacity` 0 means unlimited.
    explicit TCFMutableDictionary(CFIndex capacity = 0);

    /// The held dictionary typed as mutable; does not retain.
    CFMutableDictionaryRef GetMutable() const { return const_cast<CFMutableDictionaryRef>(ref_); }
    /// Adds the pair, or replaces the value of an equal key; the dictionary retains both.
    void SetPair(const void* key, const void* value) const {
        CFDictionarySetValue(GetMutable(), key, value);
    }
    /// Adds the pair only when the key is absent; the dictionary retains both.
    void AddPair(CFStringRef key, const void* value) const {
        CFDictionaryAddValue(GetMutable(), key, value);
    }
    /// SetPair for every pair of `other`, in the order its pairs are stored; nothing for a null
    /// `other`. Does not retain `other`; this dictionary retains what it stores.
    void SetPairs(CFDictionaryRef other) const;

    /// Adds `value` to the array of values of `key`: the first value makes a new mutable array
    /// of property values (held only by this dictionary), later ones are appended to it in
    /// place, duplicates included. A present value that is not an array becomes the first
    /// element of a new array, so that nothing is lost. The array retains `value`.
    void AddMultiValue(const void* key, const void* value) const;
    /// Appends every element of the array `values` to the array of values of `key`, in order.
    /// When the key is absent a mutable copy of `values` is stored (a new empty array for a
    /// null `values`); when its value is not an array, that value is kept in front of the copy.
    /// A `values` that is not an array is added as one value (AddMultiValue). Does not retain
    /// `values`; the arrays retain their elements.
    void AddMultiValues(const void* key, CFArrayRef values) const;
    /// AddMultiValues(key, array) for every pair of `other` (non-null; `other` may be this
    /// dictionary); a value of `other` that is not an array is added as one value. Does not
    /// retain `other`.
    void AddMultiValues(CFDictionaryRef other) const;
};

/// The working state of CreateDictionaryFilteredByKey: the wanted keys and the dictionary of
/// the pairs found so far.
class KeyFilterContext {
public:
    /// Retains `keys` (null-safe) and creates an empty result with unlimited capacity.
    explicit KeyFilterContext(CFSetRef keys) : keys_(keys) {}

    /// True when `key` is a member of the wanted keys; false for a null key set.
    bool ContainsValue(const void* key) const { return keys_.ContainsValue(key); }
    /// Adds the pair to the result when the key is absent there; the result retains both.
    void AddPair(const void* key, const void* value) const {
        CFDictionaryAddValue(result_.GetMutable(), key, value);
    }
    /// Returns the result with its count, as an immutable reference; the caller releases it.
    /// The context holds no result afterwards.
    CFDictionaryRef OrphanResult() { return result_.Orphan(); }

private:
    TCFSet<const void*> keys_;
    TCFMutableDictionary result_;
};
