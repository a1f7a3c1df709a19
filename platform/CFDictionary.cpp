#include "platform/CFDictionary.h"

#include <memory>
#include <string>

#include "platform/CFCollectionStorage.h"
#include "platform/Log.h"

using glyphwell::runtime::CallEqual;
using glyphwell::runtime::HashedCollection;
using glyphwell::runtime::HashedEntry;
using glyphwell::runtime::kDictionaryKind;
using glyphwell::runtime::PutMode;
using glyphwell::runtime::ReportInvalidArgument;
using Where = glyphwell::runtime::SourceLocation;

/// A dictionary: a hashed collection of pairs.
struct __CFDictionary final : HashedCollection {
    __CFDictionary(const CFDictionaryKeyCallBacks* keyCallBacks,
                   const CFDictionaryValueCallBacks* valueCallBacks, bool isMutable)
        : HashedCollection(kDictionaryKind, "CFDictionary", keyCallBacks, valueCallBacks,
                           isMutable) {}

    /// A new dictionary with the same callbacks and pairs, each retained again.
    __CFDictionary* Copy(bool copyIsMutable) const {
        auto* copy = new __CFDictionary(&keyCallBacks, &valueCallBacks, copyIsMutable);
        CopyEntriesTo(*copy);
        return copy;
    }
};

namespace {

/// The dictionary behind a reference, or null (reported) when it is not one.
__CFDictionary* DictionaryOf(const void* dictionary, const Where& where = Where::current()) {
    return glyphwell::runtime::CheckedObject<__CFDictionary>(dictionary, kDictionaryKind,
                                                             "dictionary is a CFDictionary", where);
}

/// The dictionary behind a reference when it may be changed, else null (reported).
__CFDictionary* MutableDictionaryOf(const void* dictionary, const Where& where = Where::current()) {
    __CFDictionary* object = DictionaryOf(dictionary, where);
    if (object && !object->isMutable) {
        ReportInvalidArgument("dictionary is mutable", where);
        return nullptr;
    }
    return object;
}

} // namespace

CFTypeID CFDictionaryGetTypeID() {
    return kDictionaryKind;
}

CFDictionaryRef CFDictionaryCreate(CFAllocatorRef, const void** keys, const void** values,
                                   CFIndex count, const CFDictionaryKeyCallBacks* keyCallBacks,
                                   const CFDictionaryValueCallBacks* valueCallBacks) {
    if (count < 0 || (count > 0 && (!keys || !values))) {
        ReportInvalidArgument("count >= 0 and keys, values != NULL", Where::current());
        return nullptr;
    }
    // Held until complete, so that an allocation failing on the way loses nothing.
    auto dictionary = std::make_unique<__CFDictionary>(keyCallBacks, valueCallBacks, false);
    dictionary->table.Reserve(count);
    for (CFIndex i = 0; i < count; ++i)
        dictionary->Put(keys[i], values[i], PutMode::AddOrReplace);
    return dictionary.release();
}

// A copy of an immutable dictionary is the dictionary itself: nothing can tell them apart.
CFDictionaryRef CFDictionaryCreateCopy(CFAllocatorRef, CFDictionaryRef dictionary) {
    const __CFDictionary* source = DictionaryOf(dictionary);
    if (!source)
        return nullptr;
    if (!source->isMutable)
        return static_cast<CFDictionaryRef>(CFRetain(dictionary));
    return source->Copy(false);
}

CFMutableDictionaryRef CFDictionaryCreateMutable(CFAllocatorRef, CFIndex capacity,
                                                 const CFDictionaryKeyCallBacks* keyCallBacks,
                                                 const CFDictionaryValueCallBacks* valueCallBacks) {
    if (!GW_CHECK_ARGUMENT(capacity >= 0))
        return nullptr;
    return new __CFDictionary(keyCallBacks, valueCallBacks, true);
}

CFMutableDictionaryRef CFDictionaryCreateMutableCopy(CFAllocatorRef, CFIndex capacity,
                                                     CFDictionaryRef dictionary) {
    const __CFDictionary* source = DictionaryOf(dictionary);
    return source && GW_CHECK_ARGUMENT(capacity >= 0) ? source->Copy(true) : nullptr;
}

CFIndex CFDictionaryGetCount(CFDictionaryRef dictionary) {
    const __CFDictionary* object = DictionaryOf(dictionary);
    return object ? object->table.Count() : 0;
}

CFIndex CFDictionaryGetCountOfKey(CFDictionaryRef dictionary, const void* key) {
    return CFDictionaryContainsKey(dictionary, key) ? 1 : 0;
}

CFIndex CFDictionaryGetCountOfValue(CFDictionaryRef dictionary, const void* value) {
    const __CFDictionary* object = DictionaryOf(dictionary);
    if (!object)
        return 0;
    CFIndex count = 0;
    object->table.ForEach([&](const HashedEntry& entry) {
        count += CallEqual(object->valueCallBacks.equal, entry.value, value);
    });
    return count;
}

Boolean CFDictionaryContainsKey(CFDictionaryRef dictionary, const void* key) {
    const __CFDictionary* object = DictionaryOf(dictionary);
    return object && object->Find(key) >= 0;
}

Boolean CFDictionaryContainsValue(CFDictionaryRef dictionary, const void* value) {
    const __CFDictionary* object = DictionaryOf(dictionary);
    return object && object->table.Any([&](const HashedEntry& entry) {
        return CallEqual(object->valueCallBacks.equal, entry.value, value);
    });
}

const void* CFDictionaryGetValue(CFDictionaryRef dictionary, const void* key) {
    const void* value = nullptr;
    return CFDictionaryGetValueIfPresent(dictionary, key, &value) ? value : nullptr;
}

Boolean CFDictionaryGetValueIfPresent(CFDictionaryRef dictionary, const void* key,
                                      const void** value) {
    const __CFDictionary* object = DictionaryOf(dictionary);
    CFIndex position = object ? object->Find(key) : -1;
    if (position < 0)
        return false;
    if (value)
        *value = object->table.EntryAt(position).value;
    return true;
}

void CFDictionaryGetKeysAndValues(CFDictionaryRef dictionary, const void** keys,
                                  const void** values) {
    const __CFDictionary* object = DictionaryOf(dictionary);
    if (!object)
        return;
    object->table.ForEach([&](const HashedEntry& entry) {
        if (keys)
            *keys++ = entry.key;
        if (values)
            *values++ = entry.value;
    });
}

void CFDictionaryApplyFunction(CFDictionaryRef dictionary, CFDictionaryApplierFunction applier,
                               void* context) {
    const __CFDictionary* object = DictionaryOf(dictionary);
    if (!object)
        return;
    if (!applier) {
        ReportInvalidArgument("applier != NULL", Where::current());
        return;
    }
    object->table.ForEach(
        [&](const HashedEntry& entry) { applier(entry.key, entry.value, context); });
}

void CFDictionaryAddValue(CFMutableDictionaryRef dictionary, const void* key, const void* value) {
    if (__CFDictionary* object = MutableDictionaryOf(dictionary))
        object->Put(key, value, PutMode::AddOnly);
}

void CFDictionarySetValue(CFMutableDictionaryRef dictionary, const void* key, const void* value) {
    if (__CFDictionary* object = MutableDictionaryOf(dictionary))
        object->Put(key, value, PutMode::AddOrReplace);
}

void CFDictionaryReplaceValue(CFMutableDictionaryRef dictionary, const void* key,
                              const void* value) {
    if (__CFDictionary* object = MutableDictionaryOf(dictionary))
        object->Put(key, value, PutMode::ReplaceOnly);
}

void CFDictionaryRemoveValue(CFMutableDictionaryRef dictionary, const void* key) {
    __CFDictionary* object = MutableDictionaryOf(dictionary);
    CFIndex position = object ? object->Find(key) : -1;
    if (position < 0)
        return;
    object->ReleaseEntry(object->table.Remove(position));
}

void CFDictionaryRemoveAllValues(CFMutableDictionaryRef dictionary) {
    __CFDictionary* object = MutableDictionaryOf(dictionary);
    if (!object)
        return;
    // Empty the dictionary before releasing, so release callbacks see a consistent dictionary.
    for (const HashedEntry& entry : object->table.TakeAll())
        object->ReleaseEntry(entry);
}
