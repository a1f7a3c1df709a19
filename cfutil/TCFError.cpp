#include "cfutil/TCFError.h"

#include "cfutil/TCFRetained.h"

TCFError::TCFError(CFStringRef domain, CFIndex code, CFDictionaryRef userInfo)
    : error_(CFErrorCreate(kCFAllocatorDefault, domain, code, userInfo)) {}

TCFError::~TCFError() {
    TCFSafeRelease(error_);
}

CFErrorRef TCFError::Orphan() {
    CFErrorRef error = error_;
    error_ = nullptr;
    return error;
}
