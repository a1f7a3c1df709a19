// Character sets: one optional 8192-byte bitmap per Unicode plane. A plane without members is
// never stored, so equality and the bitmap representation can look at the stored planes alone.
#include "platform/CFCharacterSet.h"

#include <algorithm>
#include <array>
#include <bit>
#include <cstring>
#include <memory>
#include <string>
#include <vector>

#include "platform/ArgumentChecks.h"
#include "platform/CFData.h"
#include "platform/CFRuntime.h"
#include "platform/CFString.h"
#include "platform/Log.h"

using namespace glyphwell::runtime;

namespace {

constexpr size_t kPlaneBytes = 8192;
constexpr size_t kPlaneCount = 17;
constexpr size_t kPlaneRecordBytes = 1 + kPlaneBytes;
constexpr uint32_t kLastCodePoint = 0x10FFFF;

using Plane = std::array<uint8_t, kPlaneBytes>;

bool IsEmpty(const uint8_t* bytes) {
    for (size_t i = 0; i < kPlaneBytes; i += 8) {
        uint64_t word;
        std::memcpy(&word, bytes + i, 8);
        if (word)
            return false;
    }
    return true;
}

/// Sets or clears bits `first` to `last` (inclusive, both within one plane) of `plane`.
void SetBits(Plane& plane, uint32_t first, uint32_t last, bool member) {
    auto apply = [&](size_t index, uint8_t mask) {
        plane[index] = member ? uint8_t(plane[index] | mask) : uint8_t(plane[index] & ~mask);
    };
    size_t firstByte = first >> 3, lastByte = last >> 3;
    uint8_t firstMask = uint8_t(0xFF << (first & 7));
    uint8_t lastMask = uint8_t(0xFF >> (7 - (last & 7)));
    if (firstByte == lastByte) {
        apply(firstByte, firstMask & lastMask);
        return;
    }
    apply(firstByte, firstMask);
    std::memset(plane.data() + firstByte + 1, member ? 0xFF : 0x00, lastByte - firstByte - 1);
    apply(lastByte, lastMask);
}

} // namespace

struct __CFCharacterSet final : public CFObject {
    explicit __CFCharacterSet(bool isMutable) : CFObject(kCharacterSetKind), isMutable(isMutable) {}

    bool Equals(const CFObject& other) const override {
        const auto& that = static_cast<const __CFCharacterSet&>(other);
        for (size_t p = 0; p < kPlaneCount; ++p) {
            const Plane* a = planes[p].get();
            const Plane* b = that.planes[p].get();
            if (bool(a) != bool(b) || (a && *a != *b))
                return false;
        }
        return true;
    }

    /// FNV-1a over the 64-bit words of the stored planes, mixed with their numbers.
    CFHashCode Hash() const override {
        CFHashCode h = 0;
        for (size_t p = 0; p < kPlaneCount; ++p) {
            if (!planes[p])
                continue;
            CFHashCode planeHash = 0xcbf29ce484222325ULL;
            for (size_t i = 0; i < kPlaneBytes; i += 8) {
                uint64_t word;
                std::memcpy(&word, planes[p]->data() + i, 8);
                planeHash = (planeHash ^ word) * 0x100000001b3ULL;
            }
            h = MixHash(MixHash(h, p), planeHash);
        }
        return h;
    }

    /// "<CFCharacterSet 0x...>{planes = 0 1, members = 12}"
    std::string Description() const override {
        std::string text = DescriptionPrefix(this, "CFCharacterSet") + "{planes =";
        size_t members = 0;
        for (size_t p = 0; p < kPlaneCount; ++p) {
            if (!planes[p])
                continue;
            text += " " + std::to_string(p);
            for (uint8_t byte : *planes[p])
                members += size_t(std::popcount(byte));
        }
        return text + ", members = " + std::to_string(members) + "}";
    }

    bool Contains(uint32_t c) const {
        if (c > kLastCodePoint)
            return false;
        const Plane* plane = planes[c >> 16].get();
        return plane && ((*plane)[(c & 0xFFFF) >> 3] >> (c & 7) & 1);
    }

    /// Adds or removes the code points `first` to `last` (inclusive, at most U+10FFFF).
    void SetRange(uint32_t first, uint32_t last, bool member) {
        for (uint32_t p = first >> 16; p <= last >> 16; ++p) {
            std::unique_ptr<Plane>& plane = planes[p];
            if (!plane && !member)
                continue;
            if (!plane)
                plane = std::make_unique<Plane>(Plane{});
            uint32_t low = p == first >> 16 ? first & 0xFFFF : 0;
            uint32_t high = p == last >> 16 ? last & 0xFFFF : 0xFFFF;
            SetBits(*plane, low, high, member);
            if (!member && IsEmpty(plane->data()))
                plane.reset();
        }
    }

    void AddCodePoint(uint32_t c) { SetRange(c, c, true); }

    void Union(const __CFCharacterSet& other) {
        for (size_t p = 0; p < kPlaneCount; ++p) {
            if (!other.planes[p])
                continue;
            if (!planes[p]) {
                planes[p] = std::make_unique<Plane>(*other.planes[p]);
                continue;
            }
            for (size_t i = 0; i < kPlaneBytes; ++i)
                (*planes[p])[i] |= (*other.planes[p])[i];
        }
    }

    /// Stores `bytes` (kPlaneBytes of them) as plane `p`, unless they hold no member.
    void LoadPlane(size_t p, const uint8_t* bytes) {
        if (IsEmpty(bytes))
            return;
        planes[p] = std::make_unique<Plane>();
        std::memcpy(planes[p]->data(), bytes, kPlaneBytes);
    }

    std::array<std::unique_ptr<Plane>, kPlaneCount> planes;
    const bool isMutable;
};

namespace {

const __CFCharacterSet* Get(CFCharacterSetRef set,
                            const glyphwell::runtime::SourceLocation& where =
                                glyphwell::runtime::SourceLocation::current()) {
    const __CFCharacterSet* object = As<__CFCharacterSet>(set, kCharacterSetKind);
    CheckArgument(object != nullptr, "object != nullptr", where);
    return object;
}

/// The mutable set behind `set`, or null (reported) when it is null or immutable.
__CFCharacterSet* GetMutable(CFMutableCharacterSetRef set,
                             const glyphwell::runtime::SourceLocation& where =
                                 glyphwell::runtime::SourceLocation::current()) {
    __CFCharacterSet* object = AsMutable<__CFCharacterSet>(set, kCharacterSetKind);
    CheckArgument(object != nullptr && object->isMutable, "object != nullptr && object->isMutable",
                  where);
    return object && object->isMutable ? object : nullptr;
}

/// Clips `range` to the code space; false when nothing of it is left.
bool ClipRange(CFRange range, uint32_t& first, uint32_t& last,
               const glyphwell::runtime::SourceLocation& where =
                   glyphwell::runtime::SourceLocation::current()) {
    CheckArgument(range.length >= 0, "range.length >= 0", where);
    if (range.length <= 0)
        return false;
    // Wide arithmetic: location + length may overflow a CFIndex.
    __int128 begin = range.location < 0 ? 0 : range.location;
    __int128 end =
        std::min<__int128>(__int128(range.location) + range.length, __int128(kLastCodePoint) + 1);
    if (begin >= end)
        return false;
    first = uint32_t(begin);
    last = uint32_t(end - 1);
    return true;
}

void AddString(__CFCharacterSet& set, CFStringRef string) {
    CFIndex length = CFStringGetLength(string);
    const UniChar* units = CFStringGetCharactersPtr(string);
    for (CFIndex i = 0; i < length; ++i) {
        uint32_t c = units[i];
        if (c >= 0xD800 && c <= 0xDBFF && i + 1 < length && units[i + 1] >= 0xDC00 &&
            units[i + 1] <= 0xDFFF) {
            c = 0x10000 + ((c - 0xD800) << 10) + (units[i + 1] - 0xDC00u);
            ++i;
        }
        set.AddCodePoint(c);
    }
}

__CFCharacterSet* CopyOf(const __CFCharacterSet* source, bool isMutable) {
    auto* copy = new __CFCharacterSet(isMutable);
    if (source)
        copy->Union(*source);
    return copy;
}

} // namespace

CFTypeID CFCharacterSetGetTypeID() {
    return kCharacterSetKind;
}

CFCharacterSetRef CFCharacterSetCreateWithBitmapRepresentation(CFAllocatorRef,
                                                               CFDataRef representation) {
    if (!GW_CHECK_ARGUMENT(representation != nullptr))
        return nullptr;
    size_t length = size_t(CFDataGetLength(representation));
    if (length == 0)
        return new __CFCharacterSet(false);
    if (length < kPlaneBytes || (length - kPlaneBytes) % kPlaneRecordBytes != 0 ||
        (length - kPlaneBytes) / kPlaneRecordBytes > kPlaneCount - 1)
        return nullptr;
    const uint8_t* bytes = CFDataGetBytePtr(representation);
    auto set = std::make_unique<__CFCharacterSet>(false);
    set->LoadPlane(0, bytes);
    bool seen[kPlaneCount] = {};
    for (size_t offset = kPlaneBytes; offset < length; offset += kPlaneRecordBytes) {
        size_t plane = bytes[offset];
        if (plane < 1 || plane >= kPlaneCount || seen[plane])
            return nullptr;
        seen[plane] = true;
        set->LoadPlane(plane, bytes + offset + 1);
    }
    return set.release();
}

CFDataRef CFCharacterSetCreateBitmapRepresentation(CFAllocatorRef allocator,
                                                   CFCharacterSetRef set) {
    const __CFCharacterSet* object = Get(set);
    if (!object)
        return nullptr;
    std::vector<uint8_t> bytes(kPlaneBytes, 0);
    if (object->planes[0])
        std::memcpy(bytes.data(), object->planes[0]->data(), kPlaneBytes);
    for (size_t p = 1; p < kPlaneCount; ++p) {
        if (!object->planes[p])
            continue;
        bytes.push_back(uint8_t(p));
        bytes.insert(bytes.end(), object->planes[p]->begin(), object->planes[p]->end());
    }
    return CFDataCreate(allocator, bytes.data(), CFIndex(bytes.size()));
}

CFCharacterSetRef CFCharacterSetCreateWithCharactersInRange(CFAllocatorRef, CFRange range) {
    if (!GW_CHECK_ARGUMENT(range.length >= 0))
        return nullptr;
    auto* set = new __CFCharacterSet(false);
    uint32_t first, last;
    if (ClipRange(range, first, last))
        set->SetRange(first, last, true);
    return set;
}

CFCharacterSetRef CFCharacterSetCreateWithCharactersInString(CFAllocatorRef, CFStringRef string) {
    if (!GW_CHECK_ARGUMENT(string != nullptr))
        return nullptr;
    auto* set = new __CFCharacterSet(false);
    AddString(*set, string);
    return set;
}

CFCharacterSetRef CFCharacterSetCreateCopy(CFAllocatorRef, CFCharacterSetRef set) {
    const __CFCharacterSet* object = Get(set);
    if (object && !object->isMutable) // immutable sets are shared, not copied
        return static_cast<CFCharacterSetRef>(CFRetain(set));
    return object ? CopyOf(object, false) : nullptr;
}

CFMutableCharacterSetRef CFCharacterSetCreateMutable(CFAllocatorRef) {
    return new __CFCharacterSet(true);
}

CFMutableCharacterSetRef CFCharacterSetCreateMutableCopy(CFAllocatorRef, CFCharacterSetRef set) {
    const __CFCharacterSet* object = Get(set);
    return object ? CopyOf(object, true) : nullptr;
}

Boolean CFCharacterSetIsCharacterMember(CFCharacterSetRef set, UniChar character) {
    const __CFCharacterSet* object = Get(set);
    return object && object->Contains(character);
}

Boolean CFCharacterSetIsLongCharacterMember(CFCharacterSetRef set, UTF32Char character) {
    const __CFCharacterSet* object = Get(set);
    return object && object->Contains(character);
}

Boolean CFCharacterSetHasMemberInPlane(CFCharacterSetRef set, CFIndex plane) {
    const __CFCharacterSet* object = Get(set);
    return object && plane >= 0 && plane < CFIndex(kPlaneCount) && object->planes[plane];
}

void CFCharacterSetAddCharactersInRange(CFMutableCharacterSetRef set, CFRange range) {
    __CFCharacterSet* object = GetMutable(set);
    uint32_t first, last;
    if (object && ClipRange(range, first, last))
        object->SetRange(first, last, true);
}

void CFCharacterSetRemoveCharactersInRange(CFMutableCharacterSetRef set, CFRange range) {
    __CFCharacterSet* object = GetMutable(set);
    uint32_t first, last;
    if (object && ClipRange(range, first, last))
        object->SetRange(first, last, false);
}

void CFCharacterSetAddCharactersInString(CFMutableCharacterSetRef set, CFStringRef string) {
    __CFCharacterSet* object = GetMutable(set);
    GW_CHECK_ARGUMENT(string != nullptr);
    if (object && string)
        AddString(*object, string);
}

void CFCharacterSetUnion(CFMutableCharacterSetRef set, CFCharacterSetRef other) {
    __CFCharacterSet* object = GetMutable(set);
    const __CFCharacterSet* source = Get(other);
    if (object && source && object != source)
        object->Union(*source);
}
