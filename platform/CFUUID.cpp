#include "platform/CFUUID.h"

#include <sys/random.h>

#include <cerrno>
#include <cstring>
#include <random>

#include "platform/ArgumentChecks.h"
#include "platform/CFRuntime.h"
#include "platform/CFString.h"
#include "platform/Log.h"

using glyphwell::runtime::CFObject;
using glyphwell::runtime::kUUIDKind;
using glyphwell::runtime::MixHash;

namespace {

constexpr size_t kTextLength = 36; // 8-4-4-4-12 hexadecimal digits with their dashes

bool IsDashPosition(size_t position) {
    return position == 8 || position == 13 || position == 18 || position == 23;
}

// The 8-4-4-4-12 text of `bytes`, in upper case.
std::string UUIDText(const UInt8 (&bytes)[16]) {
    static const char hex[] = "0123456789ABCDEF";
    std::string text;
    text.reserve(kTextLength);
    for (size_t i = 0; i < 16; ++i) {
        if (IsDashPosition(text.size()))
            text += '-';
        text += hex[bytes[i] >> 4];
        text += hex[bytes[i] & 15];
    }
    return text;
}

int HexValue(UniChar c) {
    if (c >= '0' && c <= '9')
        return c - '0';
    if (c >= 'a' && c <= 'f')
        return c - 'a' + 10;
    if (c >= 'A' && c <= 'F')
        return c - 'A' + 10;
    return -1;
}

/// Fills `bytes` with random bytes from the kernel; std::random_device only if the kernel call
/// is unavailable.
void RandomBytes(UInt8* bytes, size_t count) {
    size_t filled = 0;
    while (filled < count) {
        ssize_t got = getrandom(bytes + filled, count - filled, 0);
        if (got > 0) {
            filled += size_t(got);
        } else if (got < 0 && errno != EINTR) {
            std::random_device device;
            for (; filled < count; ++filled)
                bytes[filled] = UInt8(device());
        }
    }
}

} // namespace

/// Sixteen bytes in their natural order.
struct __CFUUID final : CFObject {
    explicit __CFUUID(const UInt8* source) : CFObject(kUUIDKind) {
        std::memcpy(bytes, source, sizeof bytes);
    }

    bool Equals(const CFObject& other) const override {
        return std::memcmp(bytes, static_cast<const __CFUUID&>(other).bytes, sizeof bytes) == 0;
    }
    CFHashCode Hash() const override {
        CFHashCode hash = 0;
        for (UInt8 byte : bytes)
            hash = MixHash(hash, byte);
        return hash;
    }
    std::string Description() const override {
        return glyphwell::runtime::DescriptionPrefix(this, "CFUUID") + " " + UUIDText(bytes);
    }

    UInt8 bytes[16];
};

static_assert(sizeof(CFUUIDBytes) == 16, "CFUUIDBytes is the 16 bytes and nothing else");

CFTypeID CFUUIDGetTypeID() {
    return kUUIDKind;
}

CFUUIDRef CFUUIDCreate(CFAllocatorRef) {
    UInt8 bytes[16];
    RandomBytes(bytes, sizeof bytes);
    bytes[6] = UInt8((bytes[6] & 0x0f) | 0x40); // version 4: random
    bytes[8] = UInt8((bytes[8] & 0x3f) | 0x80); // the standard variant
    return new __CFUUID(bytes);
}

CFUUIDRef CFUUIDCreateFromUUIDBytes(CFAllocatorRef, CFUUIDBytes bytes) {
    UInt8 raw[16];
    std::memcpy(raw, &bytes, sizeof raw);
    return new __CFUUID(raw);
}

CFUUIDRef CFUUIDCreateFromString(CFAllocatorRef, CFStringRef string) {
    if (!string || CFStringGetLength(string) != CFIndex(kTextLength))
        return nullptr;
    UniChar text[kTextLength];
    CFStringGetCharacters(string, CFRangeMake(0, CFIndex(kTextLength)), text);
    UInt8 bytes[16];
    size_t byteIndex = 0;
    for (size_t i = 0; i < kTextLength;) {
        if (IsDashPosition(i)) {
            if (text[i++] != '-')
                return nullptr;
            continue;
        }
        int high = HexValue(text[i]), low = HexValue(text[i + 1]);
        if (high < 0 || low < 0)
            return nullptr;
        bytes[byteIndex++] = UInt8(high << 4 | low);
        i += 2;
    }
    return new __CFUUID(bytes);
}

CFStringRef CFUUIDCreateString(CFAllocatorRef, CFUUIDRef uuid) {
    const __CFUUID* object = glyphwell::runtime::As<__CFUUID>(uuid, kUUIDKind);
    GW_CHECK_ARGUMENT(object != nullptr);
    if (!object)
        return nullptr;
    return CFStringCreateWithCString(kCFAllocatorDefault, UUIDText(object->bytes).c_str(),
                                     kCFStringEncodingASCII);
}

CFUUIDBytes CFUUIDGetUUIDBytes(CFUUIDRef uuid) {
    CFUUIDBytes result{};
    const __CFUUID* object = glyphwell::runtime::As<__CFUUID>(uuid, kUUIDKind);
    GW_CHECK_ARGUMENT(object != nullptr);
    if (object)
        std::memcpy(&result, object->bytes, sizeof result);
    return result;
}
