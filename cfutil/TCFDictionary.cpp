#include "cfutil/TCFDictionary.h"

TCFDictionary::TCFDictionary(const void** keys, const void** values, CFIndex count)
    : TCFDict(CFDictionaryCreate(kCFAllocatorDefault, keys, values, count,
                                 &kCFTypeDictionaryKeyCallBacks,
                                 &kCFTypeDictionaryValueCallBacks)) {}

TCFDictionary::~TCFDictionary() {
    TCFSafeRelease(dictionary_);
}

CFDictionaryRef TCFDictionary::Orphan() {
    CFDictionaryRef dictionary = dictionary_;
    dictionary_ = nullptr;
    return dictionary;
}

TCFMutableDictionary::TCFMutableDictionary(CFIndex capacity)
    : TCFDictionary(CFDictionaryCreateMutable(kCFAllocatorDefault, capacity,
                                              &kCFTypeDictionaryKeyCallBacks,
                                              &kCFTypeDictionaryValueCallBacks),
                    kAdopted) {}
