#include "platform/CFDictionary.h"

#include <string>

#include "platform/CFCollectionStorage.h"
#include "platform/Log.h"

using glyphwell::runtime::CallEqual;
using glyphwell::runtime::CallRelease;
using glyphwell::runtime::CallRetain;
using glyphwell::runtime::CFObject;
using glyphwell::runtime::ElementReleaser;
using glyphwell::runtime::HashedEntry;
using glyphwell::runtime::HashedTable;
using glyphwell::runtime::kDictionaryKind;
using glyphwell::runtime::PutMode;
using glyphwell::runtime::ReportInvalidArgument;
using Where = glyphwell::runtime::SourceLocation;

/// A dictionary: a hashed table of pairs, each key and value holding the count its retain
/// callback took.
struct __CFDictionary final : CFObject {
    __CFDictionary(const CFDictionaryKeyCallBacks* keyCallBacks,
                   const CFDictionaryValueCallBacks* valueCallBacks, bool isMutable)
        : CFObject(kDictionaryKind),
          keyCallBacks(keyCallBacks ? *keyCallBacks : CFDictionaryKeyCallBacks{}),
          valueCallBacks(valueCallBacks ? *valueCallBacks : CFDictionaryValueCallBacks{}),
          isMutable(isMutable), table(this->keyCallBacks.hash, this->keyCallBacks.equal) {}

    ~__CFDictionary() override {
        ElementReleaser releaser;
        table.ForEach([&](const HashedEntry& entry) {
            releaser.Release(keyCallBacks.release, entry.key);
            releaser.Release(valueCallBacks.release, entry.value);
        });
    }

    // Same count, and every key of this one is in `other` with an equal value.
    bool Equals(const CFObject& other) const override {
        const auto& that = static_cast<const __CFDictionary&>(other);
        if (table.Count() != that.table.Count())
            return false;
        return !table.Any([&](const HashedEntry& entry) {
            CFIndex position = that.Find(entry.key);
            return position < 0 || !CallEqual(valueCallBacks.equal, entry.value,
                                              that.table.EntryAt(position).value);
        });
    }

    CFHashCode Hash() const override { return CFHashCode(table.Count()); }

    std::string Description() const override {
        std::string text = glyphwell::runtime::DescriptionPrefix(this, "CFDictionary");
        text += "{count = " + std::to_string(table.Count()) + ", entries = (\n";
        table.ForEach([&](const HashedEntry& entry) {
            text += '\t';
            text += glyphwell::runtime::CallDescribe(keyCallBacks.copyDescription, entry.key);
            text += " = ";
            text += glyphwell::runtime::CallDescribe(valueCallBacks.copyDescription, entry.value);
            text += '\n';
        });
        text += ")}";
        return text;
    }

    CFIndex Find(const void* key) const { return table.Find(key, table.HashOf(key)); }

    void Put(const void* key, const void* value, PutMode mode) {
        CFHashCode hash = table.HashOf(key);
        CFIndex position = table.Find(key, hash);
        if (position < 0) {
            if (mode != PutMode::ReplaceOnly)
                table.Append(CallRetain(keyCallBacks.retain, key),
                             CallRetain(valueCallBacks.retain, value), hash);
            return;
        }
        if (mode == PutMode::AddOnly)
            return;
        // The key keeps its object and place. Retain the new value first: it may be the old one.
        const void* retained = CallRetain(valueCallBacks.retain, value);
        HashedEntry& entry = table.EntryAt(position);
        const void* replaced = entry.value;
        entry.value = retained;
        CallRelease(valueCallBacks.release, replaced);
    }

    // A new dictionary with the same callbacks and pairs, each retained again.
    __CFDictionary* Copy(bool copyIsMutable) const {
        auto* copy = new __CFDictionary(&keyCallBacks, &valueCallBacks, copyIsMutable);
        copy->table.Reserve(table.Count());
        table.ForEach([&](const HashedEntry& entry) {
            copy->table.Append(CallRetain(keyCallBacks.retain, entry.key),
                               CallRetain(valueCallBacks.retain, entry.value), entry.hash);
        });
        return copy;
    }

    CFDictionaryKeyCallBacks keyCallBacks;
    CFDictionaryValueCallBacks valueCallBacks;
    bool isMutable;
    HashedTable table;
};

namespace {

// The dictionary behind a reference, or null (reported) when it is not one.
__CFDictionary* dictionaryOf(const void* dictionary, const Where& where = Where::current()) {
    return glyphwell::runtime::CheckedObject<__CFDictionary>(dictionary, kDictionaryKind,
                                                             "dictionary is a CFDictionary", where);
}

// The dictionary behind a reference when it may be changed, else null (reported).
__CFDictionary* mutableDictionaryOf(const void* dictionary, const Where& where = Where::current()) {
    __CFDictionary* object = dictionaryOf(dictionary, where);
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
    auto* dictionary = new __CFDictionary(keyCallBacks, valueCallBacks, false);
    dictionary->table.Reserve(count);
    for (CFIndex i = 0; i < count; ++i)
        dictionary->Put(keys[i], values[i], PutMode::AddOrReplace);
    return dictionary;
}

// A copy of an immutable dictionary is the dictionary itself: nothing can tell them apart.
CFDictionaryRef CFDictionaryCreateCopy(CFAllocatorRef, CFDictionaryRef dictionary) {
    const __CFDictionary* source = dictionaryOf(dictionary);
    if (!source)
        return nullptr;
    if (!source->isMutable)
        return static_cast<CFDictionaryRef>(CFRetain(dictionary));
    return source->Copy(false);
}

CFMutableDictionaryRef CFDictionaryCreateMutable(CFAllocatorRef, CFIndex,
                                                 const CFDictionaryKeyCallBacks* keyCallBacks,
                                                 const CFDictionaryValueCallBacks* valueCallBacks) {
    return new __CFDictionary(keyCallBacks, valueCallBacks, true);
}

CFMutableDictionaryRef CFDictionaryCreateMutableCopy(CFAllocatorRef, CFIndex,
                                                     CFDictionaryRef dictionary) {
    const __CFDictionary* source = dictionaryOf(dictionary);
    return source ? source->Copy(true) : nullptr;
}

CFIndex CFDictionaryGetCount(CFDictionaryRef dictionary) {
    const __CFDictionary* object = dictionaryOf(dictionary);
    return object ? object->table.Count() : 0;
}

CFIndex CFDictionaryGetCountOfKey(CFDictionaryRef dictionary, const void* key) {
    return CFDictionaryContainsKey(dictionary, key) ? 1 : 0;
}

CFIndex CFDictionaryGetCountOfValue(CFDictionaryRef dictionary, const void* value) {
    const __CFDictionary* object = dictionaryOf(dictionary);
    if (!object)
        return 0;
    CFIndex count = 0;
    object->table.ForEach([&](const HashedEntry& entry) {
        count += CallEqual(object->valueCallBacks.equal, entry.value, value);
    });
    return count;
}

Boolean CFDictionaryContainsKey(CFDictionaryRef dictionary, const void* key) {
    const __CFDictionary* object = dictionaryOf(dictionary);
    return object && object->Find(key) >= 0;
}

Boolean CFDictionaryContainsValue(CFDictionaryRef dictionary, const void* value) {
    const __CFDictionary* object = dictionaryOf(dictionary);
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
    const __CFDictionary* object = dictionaryOf(dictionary);
    CFIndex position = object ? object->Find(key) : -1;
    if (position < 0)
        return false;
    if (value)
        *value = object->table.EntryAt(position).value;
    return true;
}

void CFDictionaryGetKeysAndValues(CFDictionaryRef dictionary, const void** keys,
                                  const void** values) {
    const __CFDictionary* object = dictionaryOf(dictionary);
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
    const __CFDictionary* object = dictionaryOf(dictionary);
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
    if (__CFDictionary* object = mutableDictionaryOf(dictionary))
        object->Put(key, value, PutMode::AddOnly);
}

void CFDictionarySetValue(CFMutableDictionaryRef dictionary, const void* key, const void* value) {
    if (__CFDictionary* object = mutableDictionaryOf(dictionary))
        object->Put(key, value, PutMode::AddOrReplace);
}

void CFDictionaryReplaceValue(CFMutableDictionaryRef dictionary, const void* key,
                              const void* value) {
    if (__CFDictionary* object = mutableDictionaryOf(dictionary))
        object->Put(key, value, PutMode::ReplaceOnly);
}

void CFDictionaryRemoveValue(CFMutableDictionaryRef dictionary, const void* key) {
    __CFDictionary* object = mutableDictionaryOf(dictionary);
    CFIndex position = object ? object->Find(key) : -1;
    if (position < 0)
        return;
    HashedEntry removed = object->table.Remove(position);
    CallRelease(object->keyCallBacks.release, removed.key);
    CallRelease(object->valueCallBacks.release, removed.value);
}

void CFDictionaryRemoveAllValues(CFMutableDictionaryRef dictionary) {
    __CFDictionary* object = mutableDictionaryOf(dictionary);
    if (!object)
        return;
    // Empty the dictionary before releasing, so release callbacks see a consistent dictionary.
    for (const HashedEntry& entry : object->table.TakeAll()) {
        CallRelease(object->keyCallBacks.release, entry.key);
        CallRelease(object->valueCallBacks.release, entry.value);
    }
}
