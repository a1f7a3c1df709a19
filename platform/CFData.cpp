#include "platform/CFData.h"

#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <functional>
#include <memory>
#include <new>
#include <vector>

#include "platform/ArgumentChecks.h"
#include "platform/CFRuntime.h"
#include "platform/Log.h"

using glyphwell::runtime::CFObject;
using glyphwell::runtime::kDataKind;
using glyphwell::runtime::MixHash;

/// A byte buffer. The bytes live in a malloc() block owned by the object, except for data made
/// over caller bytes without copying, whose bytes are freed or left alone as the caller chose.
/// Mutable data always owns its block and grows it geometrically, so appends cost O(1)
/// amortised.
struct __CFData final : CFObject {
    __CFData(bool isMutable, UInt8* bytes, CFIndex length, CFIndex capacity, bool freeBytes)
        : CFObject(kDataKind), isMutable(isMutable), freeBytes(freeBytes), bytes(bytes),
          length(length), capacity(capacity) {}
    ~__CFData() override {
        if (freeBytes)
            std::free(bytes);
    }

    bool Equals(const CFObject& other) const override;
    CFHashCode Hash() const override;
    std::string Description() const override;

    /// Makes room for at least `needed` bytes; the contents are kept.
    void Reserve(CFIndex needed);
    /// Replaces the bytes of `range` (inside the data) with `newLength` bytes from `newBytes`,
    /// or zero bytes when `newBytes` is null. `newBytes` may point into this object's bytes.
    void Replace(CFRange range, const UInt8* newBytes, CFIndex newLength);
    /// Appends `newLength` bytes from `newBytes`, or zero bytes when it is null: Replace at the
    /// end, without its general bookkeeping unless the bytes come from this object's own block.
    void Append(const UInt8* newBytes, CFIndex newLength);

    const bool isMutable;
    const bool freeBytes;
    UInt8* bytes;
    CFIndex length;
    CFIndex capacity;
};

bool __CFData::Equals(const CFObject& other) const {
    const __CFData& that = static_cast<const __CFData&>(other);
    return length == that.length && (length == 0 || std::memcmp(bytes, that.bytes, length) == 0);
}

CFHashCode __CFData::Hash() const {
    CFHashCode hash = MixHash(0, CFHashCode(length));
    for (CFIndex i = 0, end = std::min<CFIndex>(length, 80); i < end; ++i)
        hash = MixHash(hash, bytes[i]);
    return hash;
}

std::string __CFData::Description() const {
    static const char hex[] = "0123456789abcdef";
    std::string text = glyphwell::runtime::DescriptionPrefix(this, "CFData");
    text += "{length = " + std::to_string(length) + ", bytes = 0x";
    for (CFIndex i = 0, end = std::min<CFIndex>(length, 64); i < end; ++i) {
        text += hex[bytes[i] >> 4];
        text += hex[bytes[i] & 15];
    }
    if (length > 64)
        text += "...";
    text += '}';
    return text;
}

void __CFData::Reserve(CFIndex needed) {
    if (needed <= capacity)
        return;
    CFIndex grown = capacity > 0 ? capacity : 16;
    while (grown < needed)
        grown = grown > PTRDIFF_MAX / 2 ? needed : grown * 2;
    void* moved = std::realloc(bytes, size_t(grown));
    if (!moved)
        throw std::bad_alloc();
    bytes = static_cast<UInt8*>(moved);
    capacity = grown;
}

void __CFData::Replace(CFRange range, const UInt8* newBytes, CFIndex newLength) {
    // Bytes taken from this object's own block are copied first: growing may move the block
    // and shifting the tail may overwrite them.
    std::vector<UInt8> ownCopy;
    std::less<const UInt8*> before;
    if (newBytes && bytes && !before(newBytes, bytes) && before(newBytes, bytes + capacity)) {
        ownCopy.assign(newBytes, newBytes + newLength);
        newBytes = ownCopy.data();
    }
    CFIndex tail = length - range.location - range.length;
    CFIndex newTotal = length - range.length + newLength;
    Reserve(newTotal);
    if (tail > 0)
        std::memmove(bytes + range.location + newLength, bytes + range.location + range.length,
                     size_t(tail));
    if (newLength > 0) {
        if (newBytes)
            std::memcpy(bytes + range.location, newBytes, size_t(newLength));
        else
            std::memset(bytes + range.location, 0, size_t(newLength));
    }
    length = newTotal;
}

void __CFData::Append(const UInt8* newBytes, CFIndex newLength) {
    std::less<const UInt8*> before;
    if (newBytes && bytes && !before(newBytes, bytes) && before(newBytes, bytes + capacity)) {
        Replace(CFRangeMake(length, 0), newBytes, newLength); // growing may move them
        return;
    }
    Reserve(length + newLength);
    if (newBytes)
        std::memcpy(bytes + length, newBytes, size_t(newLength));
    else
        std::memset(bytes + length, 0, size_t(newLength));
    length += newLength;
}

namespace {

const __CFData* AsData(CFDataRef data) {
    return glyphwell::runtime::As<__CFData>(data, kDataKind);
}

/// The mutable data behind `data`, or null (reported) when it is missing or immutable.
__CFData* AsMutableData(CFMutableDataRef data, const glyphwell::runtime::SourceLocation& where =
                                                   glyphwell::runtime::SourceLocation::current()) {
    __CFData* object = glyphwell::runtime::AsMutable<__CFData>(data, kDataKind);
    glyphwell::runtime::CheckArgument(object != nullptr && object->isMutable,
                                      "object != nullptr && object->isMutable", where);
    return object && object->isMutable ? object : nullptr;
}

/// Whether `range` lies inside data of `length` bytes; reported for the caller when it does not.
bool RangeInside(CFRange range, CFIndex length,
                 const glyphwell::runtime::SourceLocation& where =
                     glyphwell::runtime::SourceLocation::current()) {
    return glyphwell::runtime::CheckRange(range, length, where,
                                          "RangeInside(range, object->length)");
}

/// A new data object with a copy of `length` bytes, `capacity` reserved (a hint only).
__CFData* NewData(bool isMutable, const UInt8* bytes, CFIndex length, CFIndex capacity) {
    auto data = std::make_unique<__CFData>(isMutable, nullptr, 0, 0, true); // held until complete
    // The capacity is only a hint: a huge one is not taken as a reason to allocate.
    constexpr CFIndex kLargestHint = CFIndex(1) << 24;
    data->Reserve(std::max(length, std::min(capacity, kLargestHint)));
    if (length > 0)
        std::memcpy(data->bytes, bytes, size_t(length));
    data->length = length;
    return data.release();
}

} // namespace

CFTypeID CFDataGetTypeID() {
    return kDataKind;
}

CFDataRef CFDataCreate(CFAllocatorRef, const UInt8* bytes, CFIndex length) {
    GW_CHECK_ARGUMENT(length >= 0 && (bytes != nullptr || length == 0));
    if (length < 0 || (!bytes && length > 0))
        return nullptr;
    return NewData(false, bytes, length, 0);
}

CFDataRef CFDataCreateWithBytesNoCopy(CFAllocatorRef, const UInt8* bytes, CFIndex length,
                                      CFAllocatorRef bytesDeallocator) {
    GW_CHECK_ARGUMENT(length >= 0 && (bytes != nullptr || length == 0));
    if (length < 0 || (!bytes && length > 0))
        return nullptr;
    bool freeBytes = bytesDeallocator != kCFAllocatorNull;
    return new __CFData(false, const_cast<UInt8*>(bytes), length, length, freeBytes);
}

CFDataRef CFDataCreateCopy(CFAllocatorRef, CFDataRef data) {
    const __CFData* source = AsData(data);
    GW_CHECK_ARGUMENT(source != nullptr);
    if (!source)
        return nullptr;
    return NewData(false, source->bytes, source->length, 0);
}

CFMutableDataRef CFDataCreateMutable(CFAllocatorRef, CFIndex capacity) {
    if (!GW_CHECK_ARGUMENT(capacity >= 0))
        return nullptr;
    return NewData(true, nullptr, 0, capacity);
}

CFMutableDataRef CFDataCreateMutableCopy(CFAllocatorRef, CFIndex capacity, CFDataRef data) {
    const __CFData* source = AsData(data);
    if (!GW_CHECK_ARGUMENT(source != nullptr) || !GW_CHECK_ARGUMENT(capacity >= 0))
        return nullptr;
    return NewData(true, source->bytes, source->length, capacity);
}

CFIndex CFDataGetLength(CFDataRef data) {
    const __CFData* object = AsData(data);
    GW_CHECK_ARGUMENT(object != nullptr);
    return object ? object->length : 0;
}

const UInt8* CFDataGetBytePtr(CFDataRef data) {
    const __CFData* object = AsData(data);
    GW_CHECK_ARGUMENT(object != nullptr);
    return object ? object->bytes : nullptr;
}

UInt8* CFDataGetMutableBytePtr(CFMutableDataRef data) {
    __CFData* object = AsMutableData(data);
    return object ? object->bytes : nullptr;
}

void CFDataGetBytes(CFDataRef data, CFRange range, UInt8* buffer) {
    const __CFData* object = AsData(data);
    GW_CHECK_ARGUMENT(object != nullptr);
    if (!object)
        return;
    GW_CHECK_ARGUMENT(buffer != nullptr || range.length == 0);
    if (!RangeInside(range, object->length) || range.length == 0 || !buffer)
        return;
    std::memcpy(buffer, object->bytes + range.location, size_t(range.length));
}

void CFDataSetLength(CFMutableDataRef data, CFIndex length) {
    __CFData* object = AsMutableData(data);
    GW_CHECK_ARGUMENT(length >= 0);
    if (!object || length < 0)
        return;
    if (length <= object->length) {
        object->length = length;
        return;
    }
    object->Append(nullptr, length - object->length);
}

void CFDataIncreaseLength(CFMutableDataRef data, CFIndex extraLength) {
    __CFData* object = AsMutableData(data);
    GW_CHECK_ARGUMENT(extraLength >= 0);
    if (!object || extraLength < 0)
        return;
    GW_CHECK_ARGUMENT(extraLength <= PTRDIFF_MAX - object->length);
    if (extraLength > PTRDIFF_MAX - object->length)
        return;
    object->Append(nullptr, extraLength);
}

void CFDataAppendBytes(CFMutableDataRef data, const UInt8* bytes, CFIndex length) {
    __CFData* object = AsMutableData(data);
    GW_CHECK_ARGUMENT(length >= 0 && (bytes != nullptr || length == 0));
    if (!object || length <= 0 || !bytes)
        return;
    GW_CHECK_ARGUMENT(length <= PTRDIFF_MAX - object->length);
    if (length > PTRDIFF_MAX - object->length)
        return;
    object->Append(bytes, length);
}

glyphwell::DataTail glyphwell::DataReserveTail(CFMutableDataRef data, CFIndex minimum) {
    __CFData* object = AsMutableData(data);
    GW_CHECK_ARGUMENT(minimum >= 0);
    if (!object || minimum < 0)
        return {};
    GW_CHECK_ARGUMENT(minimum <= PTRDIFF_MAX - object->length);
    if (minimum > PTRDIFF_MAX - object->length)
        return {};
    const CFIndex before = object->capacity;
    object->Reserve(object->length + std::max<CFIndex>(minimum, 1));
    return {object->bytes + object->length, object->capacity - object->length,
            object->capacity != before};
}

void glyphwell::DataCommitTail(CFMutableDataRef data, CFIndex count) {
    __CFData* object = AsMutableData(data);
    GW_CHECK_ARGUMENT(count >= 0 && count <= (object ? object->capacity - object->length : 0));
    if (!object || count < 0 || count > object->capacity - object->length)
        return;
    object->length += count;
}

void glyphwell::DataTrimRoom(CFMutableDataRef data) {
    __CFData* object = AsMutableData(data);
    if (!object || object->capacity == object->length || object->length == 0)
        return;
    // Shrinking splits the block in place with glibc; should it fail, the block stays as it was.
    if (void* trimmed = std::realloc(object->bytes, size_t(object->length))) {
        object->bytes = static_cast<UInt8*>(trimmed);
        object->capacity = object->length;
    }
}

void CFDataReplaceBytes(CFMutableDataRef data, CFRange range, const UInt8* newBytes,
                        CFIndex newLength) {
    __CFData* object = AsMutableData(data);
    if (!object)
        return;
    GW_CHECK_ARGUMENT(newLength >= 0 && (newBytes != nullptr || newLength == 0));
    if (!RangeInside(range, object->length) || newLength < 0 || (!newBytes && newLength > 0))
        return;
    GW_CHECK_ARGUMENT(newLength - range.length <= PTRDIFF_MAX - object->length);
    if (newLength - range.length > PTRDIFF_MAX - object->length)
        return;
    object->Replace(range, newBytes, newLength);
}

void CFDataDeleteBytes(CFMutableDataRef data, CFRange range) {
    __CFData* object = AsMutableData(data);
    if (!object)
        return;
    if (RangeInside(range, object->length))
        object->Replace(range, nullptr, 0);
}
