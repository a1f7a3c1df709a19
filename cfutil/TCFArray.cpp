#include "cfutil/TCFArray.h"

#include <algorithm>

#include "cfutil/CFArraySequence.h"

CFMutableArrayRef TCFMutableArray::CreateEmptyArray(CFIndex capacity) {
    return CFArrayCreateMutable(kCFAllocatorDefault, capacity, &kCFTypeArrayCallBacks);
}

TCFMutableArray::TCFMutableArray(CFIndex count, const void** values,
                                 const CFArrayCallBacks* callBacks)
    : TCFArray(CFArrayCreateMutable(kCFAllocatorDefault, 0, callBacks), kAdopted) {
    if (ref_ && count > 0)
        CFArrayReplaceValues(GetMutable(), CFRangeMake(0, 0), values, count);
}

TCFMutableArray::TCFMutableArray(CFArrayRef array, CFIndex capacity)
    : TCFArray(array ? CFArrayCreateMutableCopy(kCFAllocatorDefault, capacity, array)
                     : CreateEmptyArray(capacity),
               kAdopted) {}

TCFMutableArray::TCFMutableArray(CFMutableArrayRef array)
    : TCFArray(array ? TCFRetain(array) : CreateEmptyArray(0), kAdopted) {}

bool TCFSortedArray::InsertUnique(const void* value) {
    CFArray_sequence<const void*> elements(ref_);
    auto [first, last] = std::equal_range(elements.begin(), elements.end(), value,
                                          TCFComparatorFunctor<-1>(comparator_, context_));
    if (first != last)
        return false;
    InsertValueAtIndex(first.GetIndex(), value);
    return true;
}

void Merge(CFArrayRef first, CFArrayRef second, const TCFSortedArray& sorted) {
    CFArray_sequence<const void*> firstElements(first);
    CFArray_sequence<const void*> secondElements(second);
    std::merge(firstElements.begin(), firstElements.end(), secondElements.begin(),
               secondElements.end(), CFMutableArray_back_inserter(sorted.GetMutable()),
               TCFComparatorFunctor<-1>(sorted.GetComparator(), sorted.GetContext()));
}
