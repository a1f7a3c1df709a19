#include "desktop/QZCancelDownloadHandler.h"

#include "platform/CFRuntime.h"

namespace {

/// Kinds made outside the platform layer take ids from 256 up, clear of the platform's own.
constexpr CFTypeID kCancelDownloadHandlerKind = 256;

} // namespace

struct __QZCancelDownloadHandler : glyphwell::runtime::CFObject {
    explicit __QZCancelDownloadHandler(std::function<void()> function)
        : CFObject(kCancelDownloadHandlerKind), cancel(std::move(function)) {}

    bool Equals(const CFObject& other) const override { return this == &other; }
    CFHashCode Hash() const override { return CFHashCode(reinterpret_cast<uintptr_t>(this) >> 4); }
    std::string Description() const override {
        return glyphwell::runtime::DescriptionPrefix(this, "QZCancelDownloadHandler");
    }

    const std::function<void()> cancel; ///< never changed after creation, so calls need no lock
};

CFTypeID QZCancelDownloadHandlerGetTypeID() {
    return kCancelDownloadHandlerKind;
}

QZCancelDownloadHandlerRef QZCancelDownloadHandlerCreate(std::function<void()> cancel) {
    if (!cancel)
        return nullptr;
    return new __QZCancelDownloadHandler(std::move(cancel));
}

void QZCancelDownloadHandlerInvoke(CFTypeRef value) {
    const auto* handler =
        glyphwell::runtime::As<__QZCancelDownloadHandler>(value, kCancelDownloadHandlerKind);
    if (handler)
        handler->cancel();
}
