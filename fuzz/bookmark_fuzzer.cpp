// Reads arbitrary bytes as bookmark data: the properties recorded in it, and resolution (which
// looks the recorded path up, read-only).
#include <cstddef>
#include <cstdint>

#include "cfutil/TCFBookmark.h"
#include "platform/Log.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    static const bool quiet = [] {
        glyphwell::SetLogSink([](const glyphwell::LogRecord&) {});
        return true;
    }();
    (void)quiet;
    CFDataRef bookmark = CFDataCreate(kCFAllocatorDefault, data, CFIndex(size));
    if (CFDictionaryRef properties = TCFBookmark::CopyPropertiesFromBookmarkData(bookmark, nullptr))
        CFRelease(properties);
    Boolean stale = false;
    CFErrorRef error = nullptr;
    if (CFURLRef url = TCFBookmark::CreateURLByResolvingBookmarkData(bookmark, &stale, nullptr,
                                                                     nullptr, 0, &error))
        CFRelease(url);
    if (error)
        CFRelease(error);
    CFRelease(bookmark);
    return 0;
}
