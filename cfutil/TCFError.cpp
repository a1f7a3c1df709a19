#include "cfutil/TCFError.h"

TCFError::TCFError(CFStringRef domain, CFIndex code, CFDictionaryRef userInfo)
    : TCFReferenceHolder(CFErrorCreate(kCFAllocatorDefault, domain, code, userInfo), kAdopted) {}
