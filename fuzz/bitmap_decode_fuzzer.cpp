// Fuzz target for the bitmap representation decoder: any input must decode without reading or
// writing out of bounds, and whatever decodes must survive compression and decoding unchanged.
#include <cstdint>
#include <cstring>

#include "FuzzSupport.h"
#include "bitmap/QZBitmapRepresentation.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    fuzz::Owned<CFDataRef> decoded{QZCopyUncompressedBitmapRepresentation(data, CFIndex(size))};
    if (!decoded)
        return 0;
    const UInt8* bytes = CFDataGetBytePtr(decoded);
    const CFIndex length = CFDataGetLength(decoded);
    fuzz::Owned<CFDataRef> compressed{QZCreateCompressedBitmapRepresentation(bytes, length)};
    fuzz::Check(compressed);
    fuzz::Owned<CFDataRef> again{QZCopyUncompressedBitmapRepresentation(
        CFDataGetBytePtr(compressed), CFDataGetLength(compressed))};
    fuzz::Check(again && CFDataGetLength(again) == length &&
                std::memcmp(CFDataGetBytePtr(again), bytes, size_t(length)) == 0);
    return 0;
}
