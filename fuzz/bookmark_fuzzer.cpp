// Reads arbitrary bytes as bookmark data: the properties recorded in it, and resolution (which
// looks the recorded path up, read-only).
#include <cstddef>
#include <cstdint>

#include "FuzzSupport.h"
#include "cfutil/TCFBookmark.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    fuzz::Quiet();
    fuzz::Owned<CFDataRef> bookmark{CFDataCreate(kCFAllocatorDefault, data, CFIndex(size))};
    fuzz::Owned<CFDictionaryRef> properties{
        TCFBookmark::CopyPropertiesFromBookmarkData(bookmark, nullptr)};
    Boolean stale = false;
    fuzz::Owned<CFErrorRef> error{nullptr};
    fuzz::Owned<CFURLRef> url{TCFBookmark::CreateURLByResolvingBookmarkData(
        bookmark, &stale, nullptr, nullptr, 0, &error.ref)};
    return 0;
}
