#include "platform/CFDate.h"

#include <cmath>
#include <cstring>
#include <ctime>

#include "platform/ArgumentChecks.h"
#include "platform/CFRuntime.h"
#include "platform/Log.h"

using glyphwell::runtime::CFObject;
using glyphwell::runtime::kDateKind;
using glyphwell::runtime::kNullKind;
using glyphwell::runtime::MixHash;

namespace {

/// Seconds from the Unix epoch to 2001-01-01 00:00:00 UTC.
constexpr double kUnixToAbsolute = 978307200.0;

} // namespace

/// A point in time, in seconds since 2001-01-01 00:00:00 UTC.
struct __CFDate final : CFObject {
    explicit __CFDate(CFAbsoluteTime at) : CFObject(kDateKind), at(at) {}

    bool Equals(const CFObject& other) const override {
        double that = static_cast<const __CFDate&>(other).at;
        return at == that || (std::isnan(at) && std::isnan(that));
    }
    CFHashCode Hash() const override {
        if (std::isnan(at))
            return 0;
        double normalized = at == 0 ? 0.0 : at; // -0 and +0 are the same time
        uint64_t bits;
        std::memcpy(&bits, &normalized, sizeof bits);
        return MixHash(0, CFHashCode(bits));
    }
    std::string Description() const override {
        std::string text = glyphwell::runtime::DescriptionPrefix(this, "CFDate") + " ";
        double unixTime = std::floor(at + kUnixToAbsolute);
        std::tm parts{};
        char when[64];
        // Beyond what time_t and the calendar can show, the seconds themselves are shown.
        if (std::isfinite(unixTime) && std::fabs(unixTime) < 1e15) {
            std::time_t seconds = std::time_t(unixTime);
            if (gmtime_r(&seconds, &parts) &&
                std::strftime(when, sizeof when, "%Y-%m-%d %H:%M:%S +0000", &parts) > 0)
                return text + when;
        }
        return text + glyphwell::Format("%g", at);
    }

    const CFAbsoluteTime at;
};

/// The null value: one shared instance.
struct __CFNull final : CFObject {
    constexpr __CFNull() : CFObject(kNullKind, true) {}

    bool Equals(const CFObject&) const override { return true; }
    CFHashCode Hash() const override { return 0x6e756c6c; }
    std::string Description() const override { return "<null>"; }
};

namespace {

// Constant-initialized and never destroyed, like the booleans.
union NullStorage {
    constexpr NullStorage() : object() {}
    ~NullStorage() {}
    __CFNull object;
};
constinit NullStorage nullStorage;

} // namespace

const CFNullRef kCFNull = &nullStorage.object;

CFTypeID CFNullGetTypeID() {
    return kNullKind;
}
CFTypeID CFDateGetTypeID() {
    return kDateKind;
}

CFDateRef CFDateCreate(CFAllocatorRef, CFAbsoluteTime at) {
    return new __CFDate(at);
}

CFAbsoluteTime CFDateGetAbsoluteTime(CFDateRef date) {
    const __CFDate* object = glyphwell::runtime::As<__CFDate>(date, kDateKind);
    GW_CHECK_ARGUMENT(object != nullptr);
    return object ? object->at : 0;
}

CFAbsoluteTime CFAbsoluteTimeGetCurrent() {
    timespec now{};
    clock_gettime(CLOCK_REALTIME, &now);
    return double(now.tv_sec) - kUnixToAbsolute + double(now.tv_nsec) * 1e-9;
}
