// Test and benchmark helper: the flattened value stream of a value, as bytes.
#pragma once

#include <cstdint>
#include <vector>

#include "platform/CFData.h"
#include "serialization/TCFFlattenContext.h"

namespace glyphwell::testing {

/// The bytes that the writer gives for `value`.
inline std::vector<uint8_t> FlattenedBytes(CFTypeRef value) {
    CFMutableDataRef data = CFDataCreateMutable(nullptr, 0);
    {
        TCFFlattenContext context(data, false);
        context.Flatten(value);
    }
    const UInt8* bytes = CFDataGetBytePtr(data);
    std::vector<uint8_t> copy(bytes, bytes + CFDataGetLength(data));
    CFRelease(data);
    return copy;
}

} // namespace glyphwell::testing
