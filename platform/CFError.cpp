#include "platform/CFError.h"

#include "platform/ArgumentChecks.h"
#include "platform/CFDictionary.h"
#include "platform/CFRuntime.h"
#include "platform/CFString.h"
#include "platform/Log.h"

using glyphwell::runtime::CFObject;
using glyphwell::runtime::kErrorKind;
using glyphwell::runtime::MixHash;

// Constant strings live in a function-local table, so these may be made during static
// initialization; code running in another file's static initializers must still not rely on
// them being set yet.
const CFStringRef kCFErrorDomainPOSIX = CFSTR("NSPOSIXErrorDomain");
const CFStringRef kCFErrorLocalizedDescriptionKey = CFSTR("NSLocalizedDescription");
const CFStringRef kCFErrorLocalizedFailureReasonKey = CFSTR("NSLocalizedFailureReason");
const CFStringRef kCFErrorUnderlyingErrorKey = CFSTR("NSUnderlyingError");

/// A domain, a code and the user info, or null for none (an empty user info is kept as none, so
/// that both compare equal).
struct __CFError final : CFObject {
    __CFError(CFStringRef domain, CFIndex code, CFDictionaryRef userInfo)
        : CFObject(kErrorKind), domain(domain), code(code), userInfo(userInfo) {}
    ~__CFError() override {
        CFRelease(domain);
        if (userInfo)
            CFRelease(userInfo);
    }

    bool Equals(const CFObject& other) const override {
        const __CFError& that = static_cast<const __CFError&>(other);
        return code == that.code && CFEqual(domain, that.domain) &&
               (userInfo == that.userInfo ||
                (userInfo && that.userInfo && CFEqual(userInfo, that.userInfo)));
    }
    CFHashCode Hash() const override { return MixHash(CFHash(domain), CFHashCode(code)); }
    std::string Description() const override {
        std::string text = glyphwell::runtime::DescriptionPrefix(this, "CFError") +
                           " Error Domain=" + glyphwell::Describe(domain) +
                           " Code=" + std::to_string(code);
        if (userInfo)
            text += " UserInfo=" + glyphwell::Describe(userInfo);
        return text;
    }

    const CFStringRef domain; ///< retained
    const CFIndex code;
    const CFDictionaryRef userInfo; ///< an owned copy, or null
};

namespace {

const __CFError* AsError(CFErrorRef error) {
    return glyphwell::runtime::As<__CFError>(error, kErrorKind);
}

} // namespace

CFTypeID CFErrorGetTypeID() {
    return kErrorKind;
}

CFErrorRef CFErrorCreate(CFAllocatorRef, CFStringRef domain, CFIndex code,
                         CFDictionaryRef userInfo) {
    if (!domain)
        return nullptr;
    CFDictionaryRef copy = nullptr;
    if (userInfo && CFDictionaryGetCount(userInfo) > 0)
        copy = CFDictionaryCreateCopy(kCFAllocatorDefault, userInfo);
    CFRetain(domain);
    return new __CFError(domain, code, copy);
}

CFStringRef CFErrorGetDomain(CFErrorRef error) {
    const __CFError* object = AsError(error);
    GW_CHECK_ARGUMENT(object != nullptr);
    return object ? object->domain : nullptr;
}

CFIndex CFErrorGetCode(CFErrorRef error) {
    const __CFError* object = AsError(error);
    GW_CHECK_ARGUMENT(object != nullptr);
    return object ? object->code : 0;
}

CFDictionaryRef CFErrorCopyUserInfo(CFErrorRef error) {
    const __CFError* object = AsError(error);
    GW_CHECK_ARGUMENT(object != nullptr);
    if (!object)
        return nullptr;
    if (object->userInfo)
        return static_cast<CFDictionaryRef>(CFRetain(object->userInfo));
    return CFDictionaryCreate(kCFAllocatorDefault, nullptr, nullptr, 0,
                              &kCFTypeDictionaryKeyCallBacks, &kCFTypeDictionaryValueCallBacks);
}
