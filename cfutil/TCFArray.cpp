#include "cfutil/TCFArray.h"

CFMutableArrayRef TCFMutableArray::CreateEmptyArray(CFIndex capacity) {
    return CFArrayCreateMutable(kCFAllocatorDefault, capacity, &kCFTypeArrayCallBacks);
}

TCFMutableArray::TCFMutableArray(CFIndex count, const void** values,
                                 const CFArrayCallBacks* callBacks)
    : TCFArray(CFArrayCreateMutable(kCFAllocatorDefault, 0, callBacks), kAdopted) {
    if (array_ && count > 0)
        CFArrayReplaceValues(GetMutable(), CFRangeMake(0, 0), values, count);
}

TCFMutableArray::TCFMutableArray(CFArrayRef array, CFIndex capacity)
    : TCFArray(array ? CFArrayCreateMutableCopy(kCFAllocatorDefault, capacity, array)
                     : CreateEmptyArray(capacity),
               kAdopted) {}

TCFMutableArray::TCFMutableArray(CFMutableArrayRef array)
    : TCFArray(array ? TCFRetain(array) : CreateEmptyArray(0), kAdopted) {}
