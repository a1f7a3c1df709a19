#include "UIAgent/QZUIAgentHandleMessage.h"

#include <memory>

#include "UIAgent/QZAutoActivationConfirmation.h"
#include "UIAgent/QZDictionaryValue.h"
#include "UIAgent/QZFontDownloadConfirmation.h"
#include "UIAgent/QZRunFontDownload.h"
#include "UIAgent/QZUIController.h"
#include "cfutil/TCFArray.h"
#include "cfutil/TCFData.h"
#include "cfutil/TCFDictionary.h"
#include "cfutil/TCFNumber.h"
#include "cfutil/TCFRetained.h"
#include "cfutil/TCFTypeRef.h"
#include "desktop/QZCatalogSources.h"
#include "desktop/QZDownloadableFontCatalog.h"
#include "desktop/QZFontMatching.h"
#include "desktop/QZQtStrings.h"
#include "platform/Log.h"
#include "protocol/QZUIProtocol.h"
#include "serialization/TCFFlattenContext.h"
#include "serialization/TCFResurrectContext.h"

namespace {

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
    const auto requestCandidates =
        QZGetTypedValue<CFArrayRef>(request, kQZUIPropertyCandidateFontURLs);

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

/// Whether the font `postScriptName` can be had: installed already, or offered by the catalog.
bool FontIsAvailable(const QZDownloadableFontCatalog& catalog, const std::string& postScriptName) {
    for (const QZDownloadableFontAsset& asset : catalog.assets)
        for (const QZDownloadableFont& font : asset.fonts)
            if (font.postScriptName == postScriptName)
                return true;
    return QZIsFontInstalled(postScriptName);
}

/// The descriptors of `request` (QZCreateFontDescriptors) without the fonts that no catalog
/// offers and that are not installed: asking for them could only end in a failure alert. Returns
/// a new array; the caller releases it.
CFArrayRef CreateAvailableFontDescriptors(CFDictionaryRef request) {
    TCFAdopted<CFArrayRef> all(QZCreateFontDescriptors(request));
    std::vector<std::string> names;
    for (CFIndex i = 0; i < CFArrayGetCount(all); ++i)
        names.push_back(
            QZQString(QZGetTypedValue<CFStringRef>(QZGetTypedElement<CFDictionaryRef>(all, i),
                                                   NSFontNameAttribute))
                .toStdString());
    // Only the assets of these fonts, found through the catalogs' indexes.
    const std::shared_ptr<const QZDownloadableFontCatalog> catalog =
        QZCurrentDownloadableFontCatalogFor(names);
    TCFMutableArray available(0);
    for (CFIndex i = 0; i < CFArrayGetCount(all); ++i)
        if (FontIsAvailable(*catalog, names[size_t(i)]))
            available.Append(QZGetTypedElement<CFDictionaryRef>(all, i));
    return available.Orphan();
}

/// What the download confirmation decided (or the request's own flag, when it says not to ask).
struct DownloadDecision {
    bool shouldDownload = false;
    bool suppress = false;
};

/// Puts the download question of `confirmation` unless the request is withdrawn.
DownloadDecision AskToDownload(QZFontDownloadConfirmation& confirmation) {
    if (!confirmation.valid())
        return {};
    if (!AskUnlessWithdrawn([&] { confirmation.showAlert(); }, [&] { confirmation.withdraw(); }))
        return {};
    return {confirmation.shouldDownload(), confirmation.suppressFurtherAlerts()};
}

/// Message id 2.
void HandleFontDownload(CFDictionaryRef request, CFMutableDataRef reply) {
    const bool flag = TCFTypeRef::GetBooleanValue(TCFDict(request).GetValue(kQZUIPropertySuppress));
    DownloadDecision decision{flag, flag};

    // Lives until the reply is built: it owns the display names and watches the requesting
    // application for as long as the request is handled.
    std::unique_ptr<QZFontDownloadConfirmation> confirmation;
    if (!flag) {
        confirmation = std::make_unique<QZFontDownloadConfirmation>(request);
        decision = AskToDownload(*confirmation);
    }

    bool result = false;
    if (decision.shouldDownload) {
        TCFAdopted<CFArrayRef> descriptors(CreateAvailableFontDescriptors(request));
        // Unasked, the progress window still names the fonts as the confirmation would have.
        TCFRetained<CFDictionaryRef> names;
        if (confirmation)
            names = TCFRetained<CFDictionaryRef>(confirmation->localizedFontNamesDict());
        else if (CFArrayGetCount(descriptors) > 0) {
            const auto fonts = QZGetTypedValue<CFArrayRef>(request, kQZUIPropertyFontProperties);
            TCFRetained<CFArrayRef> assets(QZCopyDownloadableFontAttributesForRequests(fonts),
                                           kAdopted);
            names.Adopt(QZFontDownloadConfirmation::CreateDisplayNames(fonts, assets));
        }
        result = QZRunFontDownload(descriptors, names, confirmation.get()) != 0;
    }

    TCFNumber resultNumber(static_cast<SInt8>(result ? 1 : 0));
    TCFNumber suppressNumber(static_cast<SInt8>(decision.suppress ? 1 : 0));
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
    const auto fonts = QZGetTypedValue<CFArrayRef>(request, kQZUIPropertyFontProperties);
    const CFIndex count = fonts ? CFArrayGetCount(fonts) : 0;
    for (CFIndex i = 0; i < count; ++i) {
        const auto name = QZGetTypedValue<CFStringRef>(QZGetTypedElement<CFDictionaryRef>(fonts, i),
                                                       NSFontNameAttribute);
        if (!name)
            continue;
        const void* keys[] = {NSFontNameAttribute};
        const void* values[] = {name};
        TCFDictionary descriptor(keys, values, 1);
        descriptors.Append(static_cast<CFDictionaryRef>(descriptor));
    }
    return descriptors.Orphan();
}
