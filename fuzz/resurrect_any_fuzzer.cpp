// Reads arbitrary bytes as any value. A value read without corruption must survive a second
// trip through the writer and the reader unchanged.
#include <cstdint>

#include "FuzzSupport.h"
#include "serialization/TCFFlattenContext.h"
#include "serialization/TCFResurrectContext.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    fuzz::Quiet();
    TCFResurrectContext context(data, size);
    fuzz::Owned<CFTypeRef> value{context.Resurrect(kTCFTypeAny)};
    if (!value || context.IsCorrupted())
        return 0;
    fuzz::Owned<CFMutableDataRef> bytes{CFDataCreateMutable(kCFAllocatorDefault, 0)};
    {
        TCFFlattenContext writer(bytes, false);
        writer.Flatten(value);
    }
    TCFResurrectContext again(CFDataGetBytePtr(bytes), CFDataGetLength(bytes));
    fuzz::Owned<CFTypeRef> copy{again.Resurrect(kTCFTypeAny)};
    fuzz::Check(!again.IsCorrupted() && copy && CFEqual(copy, value));
    return 0;
}
