// Reads arbitrary bytes as any value. A value read without corruption must survive a second
// trip through the writer and the reader unchanged.
#include <cstdint>
#include <cstdlib>

#include "serialization/TCFFlattenContext.h"
#include "serialization/TCFResurrectContext.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    static const bool quiet = [] {
        glyphwell::SetLogSink([](const glyphwell::LogRecord&) {});
        return true;
    }();
    (void)quiet;
    TCFResurrectContext context(data, size);
    CFTypeRef value = context.Resurrect(kTCFTypeAny);
    if (!value)
        return 0;
    if (!context.IsCorrupted()) {
        CFMutableDataRef bytes = CFDataCreateMutable(kCFAllocatorDefault, 0);
        {
            TCFFlattenContext writer(bytes, false);
            writer.Flatten(value);
        }
        TCFResurrectContext again(CFDataGetBytePtr(bytes), CFDataGetLength(bytes));
        CFTypeRef copy = again.Resurrect(kTCFTypeAny);
        if (again.IsCorrupted() || !copy || !CFEqual(copy, value))
            std::abort();
        CFRelease(copy);
        CFRelease(bytes);
    }
    CFRelease(value);
    return 0;
}
