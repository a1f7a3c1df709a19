#include "cfutil/TCFSet.h"

#include "cfutil/TStackBuffer.h"

namespace {

void AddToSet(const void* value, void* set) {
    CFSetAddValue(static_cast<CFMutableSetRef>(set), value);
}

void RemoveFromSet(const void* value, void* set) {
    CFSetRemoveValue(static_cast<CFMutableSetRef>(set), value);
}

} // namespace

void TCFMutableSet::AddValues(CFArrayRef array) const {
    if (!array)
        return;
    CFIndex count = CFArrayGetCount(array);
    for (CFIndex i = 0; i < count; ++i)
        AddValue(CFArrayGetValueAtIndex(array, i));
}

void TCFMutableSet::Union(CFSetRef other) const {
    // Adding a set to itself changes nothing; skipping it also keeps the set from being changed
    // while it is enumerated.
    if (!other || other == ref_)
        return;
    CFSetApplyFunction(other, AddToSet, GetMutable());
}

void TCFMutableSet::MinusSet(CFSetRef other) const {
    if (!other)
        return;
    // Removing members of the set that is being enumerated would corrupt the enumeration.
    if (other == ref_) {
        CFSetRemoveAllValues(GetMutable());
        return;
    }
    CFSetApplyFunction(other, RemoveFromSet, GetMutable());
}

void TCFMutableSet::Intersect(CFSetRef other) const {
    // Members are copied out first so that nothing is removed while the set is enumerated.
    // They stay valid while they are removed one by one: each is released only by its own
    // removal, after the last look at it.
    TStackBuffer<const void*, 30> members{uint64_t(GetCount())};
    GetValues(members.GetBuffer());
    for (uint64_t i = 0; i < members.GetCount(); ++i) {
        if (!other || !CFSetContainsValue(other, members[i]))
            RemoveValue(members[i]);
    }
}
