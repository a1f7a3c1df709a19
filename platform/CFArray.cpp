#include "platform/CFArray.h"

#include <algorithm>
#include <memory>
#include <string>
#include <vector>

#include "platform/CFCollectionStorage.h"
#include "platform/Log.h"

using glyphwell::runtime::CallEqual;
using glyphwell::runtime::CallRelease;
using glyphwell::runtime::CallRetain;
using glyphwell::runtime::CFObject;
using glyphwell::runtime::CheckRange;
using glyphwell::runtime::ElementReleaser;
using glyphwell::runtime::kArrayKind;
using glyphwell::runtime::ReportInvalidArgument;
using Where = glyphwell::runtime::SourceLocation;

/// An array: the element pointers in order, each holding the count its retain callback took.
struct __CFArray final : CFObject {
    __CFArray(const CFArrayCallBacks* callBacks, bool isMutable)
        : CFObject(kArrayKind), callBacks(callBacks ? *callBacks : CFArrayCallBacks{}),
          isMutable(isMutable) {}

    ~__CFArray() override {
        ElementReleaser releaser;
        for (const void* value : values)
            releaser.Release(callBacks.release, value);
    }

    bool Equals(const CFObject& other) const override {
        const auto& that = static_cast<const __CFArray&>(other);
        if (values.size() != that.values.size())
            return false;
        for (size_t i = 0; i < values.size(); ++i)
            if (!CallEqual(callBacks.equal, values[i], that.values[i]))
                return false;
        return true;
    }

    CFHashCode Hash() const override { return values.size(); }

    std::string Description() const override {
        std::string text = glyphwell::runtime::DescriptionPrefix(this, "CFArray");
        text += "{count = " + std::to_string(values.size()) + ", values = (\n";
        for (size_t i = 0; i < values.size(); ++i) {
            text += '\t' + std::to_string(i) + " : ";
            text += glyphwell::runtime::CallDescribe(callBacks.copyDescription, values[i]);
            text += '\n';
        }
        text += ")}";
        return text;
    }

    const void* Retain(const void* value) const { return CallRetain(callBacks.retain, value); }
    void Release(const void* value) const { CallRelease(callBacks.release, value); }

    CFArrayCallBacks callBacks;
    bool isMutable;
    std::vector<const void*> values;
};

namespace {

/// The array behind a reference, or null (reported) when it is not one.
__CFArray* ArrayOf(const void* array, const Where& where = Where::current()) {
    return glyphwell::runtime::CheckedObject<__CFArray>(array, kArrayKind, "array is a CFArray",
                                                        where);
}

/// The array behind a reference when it may be changed, else null (reported).
__CFArray* MutableArrayOf(const void* array, const Where& where = Where::current()) {
    __CFArray* object = ArrayOf(array, where);
    if (object && !object->isMutable) {
        ReportInvalidArgument("array is mutable", where);
        return nullptr;
    }
    return object;
}

bool IndexInside(CFIndex index, CFIndex end, const Where& where = Where::current()) {
    bool inside = index >= 0 && index < end;
    if (!inside)
        ReportInvalidArgument("index lies inside the array", where);
    return inside;
}

CFIndex CountOf(const __CFArray* array) {
    return CFIndex(array->values.size());
}

/// A new array holding `count` values from `values`, retained.
__CFArray* CreateArray(const void* const* values, CFIndex count, const CFArrayCallBacks* callBacks,
                       bool isMutable) {
    // Held until complete, so that an allocation failing on the way loses nothing.
    auto array = std::make_unique<__CFArray>(callBacks, isMutable);
    array->values.reserve(size_t(count));
    for (CFIndex i = 0; i < count; ++i)
        array->values.push_back(array->Retain(values[i]));
    return array.release();
}

} // namespace

CFTypeID CFArrayGetTypeID() {
    return kArrayKind;
}

CFArrayRef CFArrayCreate(CFAllocatorRef, const void** values, CFIndex count,
                         const CFArrayCallBacks* callBacks) {
    if (count < 0 || (count > 0 && !values)) {
        ReportInvalidArgument("count >= 0 and values != NULL", Where::current());
        return nullptr;
    }
    return CreateArray(values, count, callBacks, false);
}

// A copy of an immutable array is the array itself: nothing can tell them apart.
CFArrayRef CFArrayCreateCopy(CFAllocatorRef, CFArrayRef array) {
    const __CFArray* source = ArrayOf(array);
    if (!source)
        return nullptr;
    if (!source->isMutable)
        return static_cast<CFArrayRef>(CFRetain(array));
    return CreateArray(source->values.data(), CountOf(source), &source->callBacks, false);
}

CFMutableArrayRef CFArrayCreateMutable(CFAllocatorRef, CFIndex capacity,
                                       const CFArrayCallBacks* callBacks) {
    if (!GW_CHECK_ARGUMENT(capacity >= 0))
        return nullptr;
    return new __CFArray(callBacks, true);
}

CFMutableArrayRef CFArrayCreateMutableCopy(CFAllocatorRef, CFIndex capacity, CFArrayRef array) {
    const __CFArray* source = ArrayOf(array);
    if (!source || !GW_CHECK_ARGUMENT(capacity >= 0))
        return nullptr;
    return CreateArray(source->values.data(), CountOf(source), &source->callBacks, true);
}

CFIndex CFArrayGetCount(CFArrayRef array) {
    const __CFArray* object = ArrayOf(array);
    return object ? CountOf(object) : 0;
}

const void* CFArrayGetValueAtIndex(CFArrayRef array, CFIndex index) {
    const __CFArray* object = ArrayOf(array);
    if (!object || !IndexInside(index, CountOf(object)))
        return nullptr;
    return object->values[size_t(index)];
}

void CFArrayGetValues(CFArrayRef array, CFRange range, const void** values) {
    const __CFArray* object = ArrayOf(array);
    if (!object || !CheckRange(range, CountOf(object), Where::current()) ||
        (range.length > 0 && !values))
        return;
    std::copy_n(object->values.begin() + range.location, range.length, values);
}

CFIndex CFArrayGetCountOfValue(CFArrayRef array, CFRange range, const void* value) {
    const __CFArray* object = ArrayOf(array);
    if (!object || !CheckRange(range, CountOf(object), Where::current()))
        return 0;
    CFIndex count = 0;
    for (CFIndex i = range.location; i < range.location + range.length; ++i)
        count += CallEqual(object->callBacks.equal, object->values[size_t(i)], value);
    return count;
}

Boolean CFArrayContainsValue(CFArrayRef array, CFRange range, const void* value) {
    return CFArrayGetFirstIndexOfValue(array, range, value) != kCFNotFound;
}

CFIndex CFArrayGetFirstIndexOfValue(CFArrayRef array, CFRange range, const void* value) {
    const __CFArray* object = ArrayOf(array);
    if (!object || !CheckRange(range, CountOf(object), Where::current()))
        return kCFNotFound;
    for (CFIndex i = range.location; i < range.location + range.length; ++i)
        if (CallEqual(object->callBacks.equal, object->values[size_t(i)], value))
            return i;
    return kCFNotFound;
}

CFIndex CFArrayGetLastIndexOfValue(CFArrayRef array, CFRange range, const void* value) {
    const __CFArray* object = ArrayOf(array);
    if (!object || !CheckRange(range, CountOf(object), Where::current()))
        return kCFNotFound;
    for (CFIndex i = range.location + range.length; i-- > range.location;)
        if (CallEqual(object->callBacks.equal, object->values[size_t(i)], value))
            return i;
    return kCFNotFound;
}

// Visits by index and re-reads the count on each step, so an applier that changes the array
// (a caller error) cannot make the walk leave the storage.
void CFArrayApplyFunction(CFArrayRef array, CFRange range, CFArrayApplierFunction applier,
                          void* context) {
    const __CFArray* object = ArrayOf(array);
    if (!object || !CheckRange(range, CountOf(object), Where::current()))
        return;
    if (!applier) {
        ReportInvalidArgument("applier != NULL", Where::current());
        return;
    }
    for (CFIndex i = range.location; i < range.location + range.length && i < CountOf(object); ++i)
        applier(object->values[size_t(i)], context);
}

// A lower bound: the first element of the range not less than `value`. That is the first
// element equal to it when there is one, else the first greater one, else the range's end.
CFIndex CFArrayBSearchValues(CFArrayRef array, CFRange range, const void* value,
                             CFComparatorFunction comparator, void* context) {
    const __CFArray* object = ArrayOf(array);
    if (!object || !CheckRange(range, CountOf(object), Where::current()))
        return kCFNotFound;
    if (!comparator) {
        ReportInvalidArgument("comparator != NULL", Where::current());
        return kCFNotFound;
    }
    CFIndex low = range.location;
    CFIndex high = range.location + range.length;
    while (low < high) {
        CFIndex middle = low + (high - low) / 2;
        if (comparator(object->values[size_t(middle)], value, context) < kCFCompareEqualTo)
            low = middle + 1;
        else
            high = middle;
    }
    return low;
}

void CFArrayAppendValue(CFMutableArrayRef array, const void* value) {
    if (__CFArray* object = MutableArrayOf(array))
        object->values.push_back(object->Retain(value));
}

void CFArrayInsertValueAtIndex(CFMutableArrayRef array, CFIndex index, const void* value) {
    __CFArray* object = MutableArrayOf(array);
    if (!object || !IndexInside(index, CountOf(object) + 1))
        return;
    object->values.insert(object->values.begin() + index, object->Retain(value));
}

void CFArraySetValueAtIndex(CFMutableArrayRef array, CFIndex index, const void* value) {
    __CFArray* object = MutableArrayOf(array);
    if (!object || !IndexInside(index, CountOf(object) + 1))
        return;
    const void* retained = object->Retain(value);
    if (index == CountOf(object)) {
        object->values.push_back(retained);
        return;
    }
    const void* replaced = object->values[size_t(index)];
    object->values[size_t(index)] = retained;
    object->Release(replaced);
}

void CFArrayRemoveValueAtIndex(CFMutableArrayRef array, CFIndex index) {
    __CFArray* object = MutableArrayOf(array);
    if (!object || !IndexInside(index, CountOf(object)))
        return;
    const void* removed = object->values[size_t(index)];
    object->values.erase(object->values.begin() + index);
    object->Release(removed);
}

void CFArrayRemoveAllValues(CFMutableArrayRef array) {
    __CFArray* object = MutableArrayOf(array);
    if (!object)
        return;
    // Empty the array before releasing, so release callbacks see a consistent array.
    std::vector<const void*> removed;
    removed.swap(object->values);
    for (const void* value : removed)
        object->Release(value);
}

void CFArrayReplaceValues(CFMutableArrayRef array, CFRange range, const void** newValues,
                          CFIndex newCount) {
    __CFArray* object = MutableArrayOf(array);
    if (!object || !CheckRange(range, CountOf(object), Where::current()))
        return;
    if (newCount < 0 || (newCount > 0 && !newValues)) {
        ReportInvalidArgument("newCount >= 0 and newValues != NULL", Where::current());
        return;
    }
    // Retain the new values before releasing the old: they may be the same objects.
    std::vector<const void*> inserted(size_t(newCount), nullptr);
    for (CFIndex i = 0; i < newCount; ++i)
        inserted[size_t(i)] = object->Retain(newValues[i]);
    auto first = object->values.begin() + range.location;
    std::vector<const void*> removed(first, first + range.length);
    first = object->values.erase(first, first + range.length);
    object->values.insert(first, inserted.begin(), inserted.end());
    for (const void* value : removed)
        object->Release(value);
}

void CFArrayExchangeValuesAtIndices(CFMutableArrayRef array, CFIndex index1, CFIndex index2) {
    __CFArray* object = MutableArrayOf(array);
    if (!object || !IndexInside(index1, CountOf(object)) || !IndexInside(index2, CountOf(object)))
        return;
    std::swap(object->values[size_t(index1)], object->values[size_t(index2)]);
}

void CFArraySortValues(CFMutableArrayRef array, CFRange range, CFComparatorFunction comparator,
                       void* context) {
    __CFArray* object = MutableArrayOf(array);
    if (!object || !CheckRange(range, CountOf(object), Where::current()))
        return;
    if (!comparator) {
        ReportInvalidArgument("comparator != NULL", Where::current());
        return;
    }
    auto first = object->values.begin() + range.location;
    std::stable_sort(first, first + range.length, [&](const void* a, const void* b) {
        return comparator(a, b, context) < kCFCompareEqualTo;
    });
}

void CFArrayAppendArray(CFMutableArrayRef array, CFArrayRef other, CFRange range) {
    __CFArray* object = MutableArrayOf(array);
    const __CFArray* source = ArrayOf(other);
    if (!object || !source || !CheckRange(range, CountOf(source), Where::current()))
        return;
    // Copy first: `other` may be `array` itself, whose storage moves as it grows.
    auto first = source->values.begin() + range.location;
    std::vector<const void*> appended(first, first + range.length);
    object->values.reserve(object->values.size() + appended.size());
    for (const void* value : appended)
        object->values.push_back(object->Retain(value));
}
