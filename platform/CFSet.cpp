#include "platform/CFSet.h"

#include <memory>
#include <string>

#include "platform/CFCollectionStorage.h"
#include "platform/Log.h"

using glyphwell::runtime::HashedCollection;
using glyphwell::runtime::HashedEntry;
using glyphwell::runtime::kSetKind;
using glyphwell::runtime::PutMode;
using glyphwell::runtime::ReportInvalidArgument;
using Where = glyphwell::runtime::SourceLocation;

/// The key callbacks that a set's callbacks amount to (the two records have the same fields).
static CFDictionaryKeyCallBacks KeyCallBacksOf(const CFSetCallBacks* callBacks) {
    if (!callBacks)
        return {};
    return {callBacks->version,         callBacks->retain, callBacks->release,
            callBacks->copyDescription, callBacks->equal,  callBacks->hash};
}

/// A set: its members are the keys of a hashed collection.
struct __CFSet final : HashedCollection {
    __CFSet(const CFSetCallBacks* callBacks, bool isMutable)
        : __CFSet(KeyCallBacksOf(callBacks), isMutable) {}
    __CFSet(const CFDictionaryKeyCallBacks& keys, bool isMutable)
        : HashedCollection(kSetKind, "CFSet", &keys, nullptr, isMutable) {}

    void Put(const void* value, PutMode mode) { HashedCollection::Put(value, nullptr, mode); }

    /// A new set with the same callbacks and members, each retained again.
    __CFSet* Copy(bool copyIsMutable) const {
        auto* copy = new __CFSet(keyCallBacks, copyIsMutable);
        CopyEntriesTo(*copy);
        return copy;
    }
};

namespace {

/// The set behind a reference, or null (reported) when it is not one.
__CFSet* SetOf(const void* set, const Where& where = Where::current()) {
    return glyphwell::runtime::CheckedObject<__CFSet>(set, kSetKind, "set is a CFSet", where);
}

/// The set behind a reference when it may be changed, else null (reported).
__CFSet* MutableSetOf(const void* set, const Where& where = Where::current()) {
    __CFSet* object = SetOf(set, where);
    if (object && !object->isMutable) {
        ReportInvalidArgument("set is mutable", where);
        return nullptr;
    }
    return object;
}

} // namespace

CFTypeID CFSetGetTypeID() {
    return kSetKind;
}

CFSetRef CFSetCreate(CFAllocatorRef, const void** values, CFIndex count,
                     const CFSetCallBacks* callBacks) {
    if (count < 0 || (count > 0 && !values)) {
        ReportInvalidArgument("count >= 0 and values != NULL", Where::current());
        return nullptr;
    }
    auto set = std::make_unique<__CFSet>(callBacks, false); // held until complete
    set->table.Reserve(count);
    for (CFIndex i = 0; i < count; ++i)
        set->Put(values[i], PutMode::AddOnly);
    return set.release();
}

// A copy of an immutable set is the set itself: nothing can tell them apart.
CFSetRef CFSetCreateCopy(CFAllocatorRef, CFSetRef set) {
    const __CFSet* source = SetOf(set);
    if (!source)
        return nullptr;
    if (!source->isMutable)
        return static_cast<CFSetRef>(CFRetain(set));
    return source->Copy(false);
}

CFMutableSetRef CFSetCreateMutable(CFAllocatorRef, CFIndex capacity,
                                   const CFSetCallBacks* callBacks) {
    if (!GW_CHECK_ARGUMENT(capacity >= 0))
        return nullptr;
    return new __CFSet(callBacks, true);
}

CFMutableSetRef CFSetCreateMutableCopy(CFAllocatorRef, CFIndex capacity, CFSetRef set) {
    const __CFSet* source = SetOf(set);
    return source && GW_CHECK_ARGUMENT(capacity >= 0) ? source->Copy(true) : nullptr;
}

CFIndex CFSetGetCount(CFSetRef set) {
    const __CFSet* object = SetOf(set);
    return object ? object->table.Count() : 0;
}

CFIndex CFSetGetCountOfValue(CFSetRef set, const void* value) {
    const __CFSet* object = SetOf(set);
    return object && object->Find(value) >= 0 ? 1 : 0;
}

Boolean CFSetContainsValue(CFSetRef set, const void* value) {
    const __CFSet* object = SetOf(set);
    return object && object->Find(value) >= 0;
}

const void* CFSetGetValue(CFSetRef set, const void* value) {
    const void* member = nullptr;
    return CFSetGetValueIfPresent(set, value, &member) ? member : nullptr;
}

Boolean CFSetGetValueIfPresent(CFSetRef set, const void* candidate, const void** value) {
    const __CFSet* object = SetOf(set);
    CFIndex position = object ? object->Find(candidate) : -1;
    if (position < 0)
        return false;
    if (value)
        *value = object->table.EntryAt(position).key;
    return true;
}

void CFSetGetValues(CFSetRef set, const void** values) {
    const __CFSet* object = SetOf(set);
    if (!object || !values)
        return;
    object->table.ForEach([&](const HashedEntry& entry) { *values++ = entry.key; });
}

void CFSetApplyFunction(CFSetRef set, CFSetApplierFunction applier, void* context) {
    const __CFSet* object = SetOf(set);
    if (!object)
        return;
    if (!applier) {
        ReportInvalidArgument("applier != NULL", Where::current());
        return;
    }
    object->table.ForEach([&](const HashedEntry& entry) { applier(entry.key, context); });
}

void CFSetAddValue(CFMutableSetRef set, const void* value) {
    if (__CFSet* object = MutableSetOf(set))
        object->Put(value, PutMode::AddOnly);
}

void CFSetSetValue(CFMutableSetRef set, const void* value) {
    if (__CFSet* object = MutableSetOf(set))
        object->Put(value, PutMode::AddOrReplace);
}

void CFSetReplaceValue(CFMutableSetRef set, const void* value) {
    if (__CFSet* object = MutableSetOf(set))
        object->Put(value, PutMode::ReplaceOnly);
}

void CFSetRemoveValue(CFMutableSetRef set, const void* value) {
    __CFSet* object = MutableSetOf(set);
    CFIndex position = object ? object->Find(value) : -1;
    if (position < 0)
        return;
    object->ReleaseEntry(object->table.Remove(position));
}

void CFSetRemoveAllValues(CFMutableSetRef set) {
    __CFSet* object = MutableSetOf(set);
    if (!object)
        return;
    // Empty the set before releasing, so release callbacks see a consistent set.
    for (const HashedEntry& entry : object->table.TakeAll())
        object->ReleaseEntry(entry);
}
