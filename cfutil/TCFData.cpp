#include "cfutil/TCFData.h"

#include "cfutil/TCFRetained.h"

TCFData::TCFData(CFDataRef data) : TCFBlob(TCFSafeRetain(data)) {}

TCFData::~TCFData() {
    TCFSafeRelease(data_);
}

CFDataRef TCFData::Orphan() {
    CFDataRef data = data_;
    data_ = nullptr;
    return data;
}
