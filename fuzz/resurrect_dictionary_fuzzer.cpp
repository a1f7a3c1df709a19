// Reads arbitrary bytes as a request: RetrieveCFDictionary, as the agent does with each request.
#include <cstdint>

#include "FuzzSupport.h"
#include "serialization/TCFResurrectContext.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    fuzz::Quiet();
    TCFResurrectContext context(data, size);
    fuzz::Owned<CFDictionaryRef> dictionary{context.RetrieveCFDictionary()};
    return 0;
}
