#include "UIAgent/QZUIAgentHandleMessage.h"

#include <memory>

#include "UIAgent/QZAutoActivationConfirmation.h"
#include "UIAgent/QZFontDownloadConfirmation.h"
#include "UIAgent/QZRunFontDownload.h"
#include "UIAgent/QZUIController.h"
#include "cfutil/TCFArray.h"
#include "cfutil/TCFData.h"
#include "cfutil/TCFDictionary.h"
#include "cfutil/TCFNumber.h"
#include "cfutil/TCFRetained.h"
#include "cfutil/TCFTypeRef.h"
#include "platform/Log.h"
#include "protocol/QZUIProtocol.h"
#include "serialization/TCFFlattenContext.h"
#include "serialization/TCFResurrectContext.h"

namespace {

bool IsKind(CFTypeRef value, CFTypeID kind) {
    return value && CFGetTypeID(value) == kind;
}

/// Runs `show` (a question put to the user) with the withdrawal of the request being handled
/// wired to `withdraw`: when the client goes away while the question is up, the question ends as
/// answered no. Returns false, without asking, when the client has gone away already.
template <class Show, class Withdraw> bool AskUnlessWithdrawn(Show show, Withdraw withdraw) {
    std::shared_ptr<glyphwell::port::PendingRequest> request = glyphwell::port::CurrentRequest();
    if (!request) {
        show();
        return true;
    }
    if (request->IsWithdrawn())
        return false;
    // The handler may outlive the question (it stays with the request): it acts only while the
    // question is up.
    auto asking = std::make_shared<bool>(true);
    request->SetWithdrawalHandler([asking, withdraw] {
        if (*asking)
            withdraw();
    });
    show();
    *asking = false;
    return true;
}

/// Appends the flattened `dictionary` to `reply`.
void FlattenReply(CFMutableDataRef reply, CFDictionaryRef dictionary) {
    TCFFlattenContext context(reply, false);
    context.Flatten(dictionary);
}

/// Message id 1. Without a non-empty candidate array there is nothing to show (the alert names
/// the first candidate): no alert, and the answer no, with the request's array (or an empty one)
/// passed back.
void HandleAutoActivation(CFDictionaryRef request, CFMutableDataRef reply) {
    CFTypeRef candidates = TCFDict(request).GetValue(kQZUIPropertyCandidateFontURLs);
    CFArrayRef requestCandidates =
        IsKind(candidates, CFArrayGetTypeID()) ? static_cast<CFArrayRef>(candidates) : nullptr;

    SInt8 activate = 0;
    SInt8 suppress = 0;
    TCFRetained<CFArrayRef> passedBack(requestCandidates);
    // Lives until the reply is built: the reply holds its candidate array.
    std::unique_ptr<QZAutoActivationConfirmation> confirmation;
    if (requestCandidates && CFArrayGetCount(requestCandidates) > 0) {
        confirmation = std::make_unique<QZAutoActivationConfirmation>(request);
        QZAutoActivationConfirmation& alert = *confirmation;
        if (AskUnlessWithdrawn([&] { alert.showAlert(); }, [&] { alert.withdraw(); })) {
            activate = alert.shouldActivate() ? 1 : 0;
            suppress = alert.suppressFurtherAlerts() ? 1 : 0;
        }
        if (CFArrayRef fromAlert = alert.candidateFonts())
            passedBack = TCFRetained<CFArrayRef>(fromAlert);
    }
    if (!passedBack)
        passedBack.Adopt(CFArrayCreate(kCFAllocatorDefault, nullptr, 0, &kCFTypeArrayCallBacks));

    TCFNumber result(activate);
    TCFNumber suppressNumber(suppress);
    const void* keys[] = {kQZUIPropertyResult, kQZUIPropertySuppress,
                          kQZUIPropertyCandidateFontURLs};
    const void* values[] = {static_cast<CFNumberRef>(result),
                            static_cast<CFNumberRef>(suppressNumber),
                            static_cast<CFArrayRef>(passedBack)};
    TCFDictionary answer(keys, values, 3);
    FlattenReply(reply, answer);
}

/// Message id 2.
void HandleFontDownload(CFDictionaryRef request, CFMutableDataRef reply) {
    const bool flag = TCFTypeRef::GetBooleanValue(TCFDict(request).GetValue(kQZUIPropertySuppress));
    bool shouldDownload = flag;
    bool suppress = flag;
    CFDictionaryRef localizedNames = nullptr;

    // Lives until the reply is built: it owns the display names and watches the requesting
    // application for as long as the request is handled.
    std::unique_ptr<QZFontDownloadConfirmation> confirmation;
    if (!flag) {
        confirmation = std::make_unique<QZFontDownloadConfirmation>(request);
        QZFontDownloadConfirmation& alert = *confirmation;
        if (alert.valid()) {
            if (AskUnlessWithdrawn([&] { alert.showAlert(); }, [&] { alert.withdraw(); })) {
                shouldDownload = alert.shouldDownload();
                suppress = alert.suppressFurtherAlerts();
            } else {
                shouldDownload = false;
                suppress = false;
            }
            localizedNames = alert.localizedFontNamesDict();
        } else {
            shouldDownload = false;
            suppress = false;
        }
    }

    bool result = false;
    if (shouldDownload) {
        TCFAdopted<CFArrayRef> descriptors(QZCreateFontDescriptors(request));
        result = QZRunFontDownload(descriptors, localizedNames, confirmation.get()) != 0;
    }

    TCFNumber resultNumber(static_cast<SInt8>(result ? 1 : 0));
    TCFNumber suppressNumber(static_cast<SInt8>(suppress ? 1 : 0));
    const void* keys[] = {kQZUIPropertyResult, kQZUIPropertySuppress};
    const void* values[] = {static_cast<CFNumberRef>(resultNumber),
                            static_cast<CFNumberRef>(suppressNumber)};
    TCFDictionary answer(keys, values, 2);
    FlattenReply(reply, answer);
}

} // namespace

CFDataRef QZUIAgentHandleMessage(CFMessagePortRef, SInt32 msgid, CFDataRef data, void* info) {
    CFMutableDataRef reply = CFDataCreateMutable(kCFAllocatorDefault, 0);
    auto* controller = static_cast<QZUIController*>(info);

    TCFData requestData(data);
    TCFAdopted<CFDictionaryRef> request(nullptr);
    {
        TCFResurrectContext reader(requestData.GetPtr(),
                                   static_cast<unsigned long>(requestData.GetLength()));
        request.Adopt(reader.RetrieveCFDictionary());
    }

    if (controller)
        controller->setAlertCount(controller->alertCount() + 1);

    switch (msgid) {
    case kQZUIMessageAutoActivation:
        HandleAutoActivation(request, reply);
        break;
    case kQZUIMessageFontDownload:
        HandleFontDownload(request, reply);
        break;
    default:
        // The id widened with its sign, printed unsigned: -1 shows as 18446744073709551615.
        glyphwell::AppLog("unknown msgid: %lu",
                          static_cast<unsigned long>(static_cast<int64_t>(msgid)));
        break;
    }

    if (controller)
        controller->setAlertCount(controller->alertCount() - 1);
    return reply;
}

CFArrayRef QZCreateFontDescriptors(CFDictionaryRef request) {
    TCFMutableArray descriptors(0);
    CFTypeRef fonts = TCFDict(request).GetValue(kQZUIPropertyFontProperties);
    if (!IsKind(fonts, CFArrayGetTypeID()))
        return descriptors.Orphan();
    TCFDeque<CFTypeRef> elements(static_cast<CFArrayRef>(fonts));
    for (CFIndex i = 0; i < elements.GetCount(); ++i) {
        CFTypeRef element = elements.At(i);
        if (!IsKind(element, CFDictionaryGetTypeID()))
            continue;
        CFTypeRef name =
            TCFDict(static_cast<CFDictionaryRef>(element)).GetValue(NSFontNameAttribute);
        if (!IsKind(name, CFStringGetTypeID()))
            continue;
        const void* keys[] = {NSFontNameAttribute};
        const void* values[] = {name};
        TCFDictionary descriptor(keys, values, 1);
        descriptors.Append(static_cast<CFDictionaryRef>(descriptor));
    }
    return descriptors.Orphan();
}
