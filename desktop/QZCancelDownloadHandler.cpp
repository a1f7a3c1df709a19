#include "desktop/QZCancelDownloadHandler.h"

#include "platform/CFKind.h"

namespace {

struct CancelDownloadPayload : CFKindPayload {
    explicit CancelDownloadPayload(std::function<void()> function) : cancel(std::move(function)) {}

    const std::function<void()> cancel; ///< never changed after creation, so calls need no lock
};

} // namespace

CFTypeID QZCancelDownloadHandlerGetTypeID() {
    static const CFTypeID kind = CFKindRegister("QZCancelDownloadHandler", nullptr);
    return kind;
}

QZCancelDownloadHandlerRef QZCancelDownloadHandlerCreate(std::function<void()> cancel) {
    if (!cancel)
        return nullptr;
    return static_cast<QZCancelDownloadHandlerRef>(
        CFKindCreateValue(QZCancelDownloadHandlerGetTypeID(),
                          std::make_unique<CancelDownloadPayload>(std::move(cancel))));
}

void QZCancelDownloadHandlerInvoke(CFTypeRef value) {
    const auto* handler = static_cast<const CancelDownloadPayload*>(
        CFKindGetPayload(value, QZCancelDownloadHandlerGetTypeID()));
    if (handler)
        handler->cancel();
}
