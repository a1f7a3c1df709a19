// Wrappers over dictionary values: TCFDict, a view that never owns its reference; TCFDictionary,
// which owns one count of an immutable dictionary; TCFMutableDictionary, which creates and owns a
// mutable one. Reading a null dictionary yields no pairs.
#pragma once

#include "cfutil/TCFRetained.h"
#include "platform/CFDictionary.h"
#include "platform/CFString.h"

/// A view of a dictionary value: does not retain, does not release.
class TCFDict {
public:
    /// Stores `dictionary` (may be null); does not retain.
    explicit TCFDict(CFDictionaryRef dictionary) : dictionary_(dictionary) {}

    /// The held dictionary; does not retain.
    operator CFDictionaryRef() const { return dictionary_; }
    /// The number of pairs; 0 for null.
    CFIndex GetCount() const { return dictionary_ ? CFDictionaryGetCount(dictionary_) : 0; }
    /// The value for `key`, or null when absent or for null; does not retain.
    const void* GetValue(const void* key) const {
        return dictionary_ ? CFDictionaryGetValue(dictionary_, key) : nullptr;
    }
    /// Fills `keys` and `values` (caller arrays of GetCount() entries) pairwise; leaves them
    /// untouched for null. Does not retain.
    void GetKeysAndValues(const void** keys, const void** values) const {
        if (dictionary_)
            CFDictionaryGetKeysAndValues(dictionary_, keys, values);
    }

protected:
    CFDictionaryRef dictionary_;
};

/// Owns one count of a dictionary value and releases it when destroyed. Cannot be copied.
class TCFDictionary : public TCFDict {
public:
    /// Creates an immutable dictionary of `count` pairs, keys and values retained and compared
    /// as property values.
    TCFDictionary(const void** keys, const void** values, CFIndex count);
    /// Adopts `dictionary` (no retain; may be null).
    TCFDictionary(CFDictionaryRef dictionary, adopted_t) : TCFDict(dictionary) {}
    TCFDictionary(const TCFDictionary&) = delete;
    TCFDictionary& operator=(const TCFDictionary&) = delete;
    /// Releases the held dictionary (null-safe).
    ~TCFDictionary();

    /// Returns the held dictionary with its count and leaves this wrapper null; the caller
    /// releases the result.
    CFDictionaryRef Orphan();
};

/// Owns a new, initially empty mutable dictionary with property-value keys and values.
class TCFMutableDictionary : TNoncopyable, public TCFDictionary {
public:
    /// Creates an empty mutable dictionary; `capacity` 0 means unlimited.
    explicit TCFMutableDictionary(CFIndex capacity = 0);

    /// The held dictionary typed as mutable; does not retain.
    CFMutableDictionaryRef GetMutable() const {
        return const_cast<CFMutableDictionaryRef>(dictionary_);
    }
    /// Adds the pair, or replaces the value of an equal key; the dictionary retains both.
    void SetPair(const void* key, const void* value) const {
        CFDictionarySetValue(GetMutable(), key, value);
    }
    /// Adds the pair only when the key is absent; the dictionary retains both.
    void AddPair(CFStringRef key, const void* value) const {
        CFDictionaryAddValue(GetMutable(), key, value);
    }
};
