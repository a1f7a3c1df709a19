#include "cfutil/TCFNumber.h"

#include "cfutil/TCFRetained.h"

template <> CFNumberRef TCFNumber::Create<SInt8>(SInt8 value) {
    return CFNumberCreate(kCFAllocatorDefault, kCFNumberCharType, &value);
}

template <> CFNumberRef TCFNumber::Create<SInt64>(SInt64 value) {
    static_assert(sizeof(SInt64) == sizeof(long), "kCFNumberLongType is 8 bytes");
    return CFNumberCreate(kCFAllocatorDefault, kCFNumberLongType, &value);
}

TCFNumber::~TCFNumber() {
    TCFSafeRelease(number_);
}

CFNumberRef TCFNumber::Orphan() {
    CFNumberRef number = number_;
    number_ = nullptr;
    return number;
}
