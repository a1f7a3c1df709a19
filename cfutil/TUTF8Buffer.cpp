#include "cfutil/TUTF8Buffer.h"

namespace {

/// The buffer size that any representation of `string` fits in, terminator included; 0 for null.
uint64_t RepresentationBufferSize(CFStringRef string) {
    if (!string)
        return 0;
    CFIndex maxSize = CFStringGetMaximumSizeOfFileSystemRepresentation(string);
    return maxSize < 0 ? 0 : static_cast<uint64_t>(maxSize) + 1;
}

} // namespace

TUTF8Buffer::TUTF8Buffer(CFStringRef string) : TStackBuffer(RepresentationBufferSize(string)) {
    if (GetCount() == 0)
        return;
    if (!CFStringGetFileSystemRepresentation(string, GetBuffer(), static_cast<CFIndex>(GetCount())))
        SetCount(0);
}
