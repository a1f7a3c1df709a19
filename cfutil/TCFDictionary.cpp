#include "cfutil/TCFDictionary.h"

#include "cfutil/TCFArray.h"
#include "cfutil/TStackBuffer.h"

TCFDictionary::TCFDictionary(const void** keys, const void** values, CFIndex count)
    : TCFDictionary(CFDictionaryCreate(kCFAllocatorDefault, keys, values, count,
                                       &kCFTypeDictionaryKeyCallBacks,
                                       &kCFTypeDictionaryValueCallBacks),
                    kAdopted) {}

TCFMutableDictionary::TCFMutableDictionary(CFIndex capacity)
    : TCFDictionary(CFDictionaryCreateMutable(kCFAllocatorDefault, capacity,
                                              &kCFTypeDictionaryKeyCallBacks,
                                              &kCFTypeDictionaryValueCallBacks),
                    kAdopted) {}

bool TCFDict::ContainsSubset(CFDictionaryRef other) const {
    if (!ref_)
        return false;
    TCFDict subset(other);
    TStackBuffer<const void*, 30> keys{uint64_t(subset.GetCount())};
    TStackBuffer<const void*, 30> values(keys.GetCount());
    subset.GetKeysAndValues(keys.GetBuffer(), values.GetBuffer());
    for (uint64_t i = 0; i < keys.GetCount(); ++i) {
        const void* value = GetValue(keys[i]);
        if (!value || !CFEqual(value, values[i]))
            return false;
    }
    return true;
}

namespace {

void AddPairWithWantedKey(const void* key, const void* value, void* context) {
    auto* filter = static_cast<KeyFilterContext*>(context);
    if (filter->ContainsValue(key))
        filter->AddPair(key, value);
}

bool IsArray(CFTypeRef value) {
    return value && CFGetTypeID(value) == CFArrayGetTypeID();
}

} // namespace

CFDictionaryRef TCFDict::CreateDictionaryFilteredByKey(CFSetRef keys) const {
    if (!keys || CFSetGetCount(keys) == 0)
        return TCFSafeRetain(ref_);
    KeyFilterContext filter(keys);
    ApplyFunction(AddPairWithWantedKey, &filter);
    return filter.OrphanResult();
}

void TCFMutableDictionary::SetPairs(CFDictionaryRef other) const {
    TCFDict pairs(other);
    TStackBuffer<const void*, 30> keys{uint64_t(pairs.GetCount())};
    TStackBuffer<const void*, 30> values(keys.GetCount());
    pairs.GetKeysAndValues(keys.GetBuffer(), values.GetBuffer());
    for (uint64_t i = 0; i < keys.GetCount(); ++i)
        SetPair(keys[i], values[i]);
}

void TCFMutableDictionary::AddMultiValue(const void* key, const void* value) const {
    const void* present = GetValue(key);
    if (IsArray(present)) {
        CFArrayAppendValue(static_cast<CFMutableArrayRef>(const_cast<void*>(present)), value);
        return;
    }
    TCFMutableArray array(0);
    if (present)
        array.Append(present);
    array.Append(value);
    SetPair(key, array);
}

void TCFMutableDictionary::AddMultiValues(const void* key, CFArrayRef values) const {
    if (values && !IsArray(values)) {
        AddMultiValue(key, values);
        return;
    }
    const void* present = GetValue(key);
    if (IsArray(present)) {
        // Shares (and retains) the present array while appending; `values` may be that array.
        TCFMutableArray array(static_cast<CFMutableArrayRef>(const_cast<void*>(present)));
        CFIndex count = TCFDeque<const void*>(values).GetCount();
        if (count > 0)
            array.Append(values, CFRangeMake(0, count));
        return;
    }
    TCFMutableArray array(values, 0);
    if (present)
        array.InsertValueAtIndex(0, present);
    SetPair(key, array);
}

void TCFMutableDictionary::AddMultiValues(CFDictionaryRef other) const {
    TCFDict pairs(other);
    TStackBuffer<const void*, 30> keys{uint64_t(pairs.GetCount())};
    TStackBuffer<const void*, 30> values(keys.GetCount());
    pairs.GetKeysAndValues(keys.GetBuffer(), values.GetBuffer());
    for (uint64_t i = 0; i < keys.GetCount(); ++i)
        AddMultiValues(keys[i], static_cast<CFArrayRef>(values[i]));
}
