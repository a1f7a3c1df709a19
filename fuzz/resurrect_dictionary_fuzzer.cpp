// Reads arbitrary bytes as a request: RetrieveCFDictionary, as the agent does with each request.
#include <cstdint>

#include "serialization/TCFResurrectContext.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    static const bool quiet = [] {
        glyphwell::SetLogSink([](const glyphwell::LogRecord&) {});
        return true;
    }();
    (void)quiet;
    TCFResurrectContext context(data, size);
    CFDictionaryRef dictionary = context.RetrieveCFDictionary();
    if (dictionary)
        CFRelease(dictionary);
    return 0;
}
