#include "UIAgent/QZRunFontDownload.h"

#include <QObject>
#include <functional>
#include <memory>

#include "UIAgent/FontDownloadWindowController.h"
#include "UIAgent/QZFontDownloadConfirmation.h"
#include "UIAgent/QZNetworkCheck.h"
#include "platform/CFMessagePort.h"

namespace {

/// What ends this request's questions early: the requesting application's exit or the client
/// leaving. `stop` ends whatever question is up; the flag stays set.
struct RequestEnding {
    bool ended = false;
    std::function<void()> stop;

    void End() {
        ended = true;
        if (stop)
            stop();
    }
};

} // namespace

CFIndex QZRunFontDownload(CFArrayRef descriptors, CFDictionaryRef localizedNames,
                          QZFontDownloadConfirmation* confirmation) {
    // Nothing to download: no network question, no window that would wait for nothing.
    if (!descriptors || CFArrayGetCount(descriptors) == 0)
        return 0;

    std::shared_ptr<glyphwell::port::PendingRequest> request = glyphwell::port::CurrentRequest();
    if (request && request->IsWithdrawn())
        return 0;
    // Both notifiers may outlive this call (the request object stays with the port): they hold
    // the shared record only, and `stop` is cleared before the question it names goes.
    auto ending = std::make_shared<RequestEnding>();
    QObject connections;
    if (confirmation)
        QObject::connect(confirmation, &QZFontDownloadConfirmation::requestingApplicationTerminated,
                         &connections, [ending] { ending->End(); });
    if (request)
        request->SetWithdrawalHandler([ending] { ending->End(); });

    {
        QZNetworkCheck check;
        ending->stop = [&check] { check.withdraw(); };
        const bool goOn = check.continueDownload();
        ending->stop = nullptr;
        if (!goOn || ending->ended)
            return 0;
    }

    FontDownloadWindowController controller(descriptors);
    controller.setLocalizedFontNamesDict(localizedNames);
    ending->stop = [&controller] { controller.requestingApplicationTerminated(); };
    controller.window();
    controller.runModal();
    ending->stop = nullptr;
    CFArrayRef matches = controller.matches();
    return matches ? CFArrayGetCount(matches) : 0;
}
