#include "desktop/QZFontService.h"

#include <QCoreApplication>
#include <QString>
#include <chrono>
#include <map>
#include <memory>
#include <set>
#include <system_error>
#include <thread>
#include <utility>
#include <vector>

#include "cfutil/TCFRetained.h"
#include "desktop/QZCatalogSources.h"
#include "desktop/QZDownloadableFontCatalog.h"
#include "desktop/QZFontDownloader.h"
#include "desktop/QZFontMatching.h"
#include "desktop/QZQtStrings.h"
#include "platform/CFError.h"
#include "platform/CFNumber.h"
#include "platform/Log.h"
#include "platform/LogEscape.h"
#include "protocol/QZUIProtocol.h"

const CFStringRef kCTFontDescriptorMatchingCancelDownloadHandler =
    CFSTR("CTFontDescriptorMatchingCancelDownloadHandler");
const CFStringRef kCTFontDescriptorMatchingDescriptors =
    CFSTR("CTFontDescriptorMatchingDescriptors");
const CFStringRef kCTFontDescriptorMatchingTotalDownloadedSize =
    CFSTR("CTFontDescriptorMatchingTotalDownloadedSize");
const CFStringRef kCTFontDescriptorMatchingTotalAssetSize =
    CFSTR("CTFontDescriptorMatchingTotalAssetSize");
const CFStringRef kCTFontDescriptorMatchingResult = CFSTR("CTFontDescriptorMatchingResult");
const CFStringRef kCTFontDescriptorMatchingError = CFSTR("CTFontDescriptorMatchingError");
const CFStringRef kQZFontDownloadErrorDomain = CFSTR("QZFontDownloadErrorDomain");

namespace {

/// State 5 is reported when the first bytes of an asset arrive, when its last ones did, and in
/// between at most this often: each report may cost the receiver a trip to its main thread.
constexpr std::chrono::milliseconds kDownloadingReportInterval{100};

QString Text(const char* sourceText) {
    return QCoreApplication::translate("QZFontService", sourceText);
}

/// The PostScript name of a descriptor; empty when it has none.
std::string PostScriptName(const void* descriptor) {
    if (!descriptor || CFGetTypeID(descriptor) != CFDictionaryGetTypeID())
        return {};
    return QZQStringIfString(
               CFDictionaryGetValue(static_cast<CFDictionaryRef>(descriptor), NSFontNameAttribute))
        .toStdString();
}

/// The new dictionary describing an installed font. The caller releases it.
CFDictionaryRef CreateMatchedDescriptor(const QZInstalledFont& font) {
    CFMutableDictionaryRef descriptor = CFDictionaryCreateMutable(
        kCFAllocatorDefault, 0, &kCFTypeDictionaryKeyCallBacks, &kCFTypeDictionaryValueCallBacks);
    TCFRetained<CFStringRef> name(glyphwell::CreateString(font.postScriptName), kAdopted);
    CFDictionarySetValue(descriptor, NSFontNameAttribute, name);
    if (!font.family.empty()) {
        TCFRetained<CFStringRef> family(glyphwell::CreateString(font.family), kAdopted);
        CFDictionarySetValue(descriptor, NSFontFamilyAttribute, family);
    }
    return descriptor;
}

/// The first catalog asset that holds `postScriptName`, or null.
const QZDownloadableFontAsset* FindAsset(const QZDownloadableFontCatalog& catalog,
                                         const std::string& postScriptName) {
    for (const QZDownloadableFontAsset& asset : catalog.assets)
        for (const QZDownloadableFont& font : asset.fonts)
            if (font.postScriptName == postScriptName)
                return &asset;
    return nullptr;
}

/// One matching run, owned by its worker thread.
class MatchingRun {
public:
    MatchingRun(CFArrayRef descriptors, QZFontDescriptorProgressHandler handler)
        : descriptors_(CFArrayCreateCopy(kCFAllocatorDefault, descriptors), kAdopted),
          handler_(std::move(handler)), cancellation_(std::make_shared<QZDownloadCancellation>()),
          matches_(CFArrayCreateMutable(kCFAllocatorDefault, 0, &kCFTypeArrayCallBacks), kAdopted) {
        // The handler value may outlive the run (a receiver keeps it); it holds the cancellation
        // only, never the run.
        std::shared_ptr<QZDownloadCancellation> cancellation = cancellation_;
        cancelHandler_.Adopt(
            QZCancelDownloadHandlerCreate([cancellation] { cancellation->Cancel(); }));
    }

    void Run();

private:
    /// An asset's outcome within this run, so that fonts of one asset fetch it only once.
    struct AssetOutcome {
        bool installed = false;
        std::string failureReason;
    };

    /// Reports `state` with the cancel handler and `entries`; the handler's answer.
    bool Report(QZFontDescriptorMatchingState state,
                std::initializer_list<std::pair<CFStringRef, CFTypeRef>> entries);
    /// Reports state 4, 5 or 6 with the run's byte counts.
    bool ReportDownloading(QZFontDescriptorMatchingState state, CFTypeRef concerned,
                           uint64_t downloaded);
    /// Reports state 8 for `postScriptName`; the handler's answer.
    bool ReportFailure(CFTypeRef concerned, const std::string& postScriptName, CFIndex code,
                       const std::string& reason);
    /// Matches one descriptor; false when the run must end without state 1.
    bool MatchOne(CFTypeRef descriptor, const std::string& postScriptName);
    /// Downloads `asset` for `descriptor`; false when the run must end without state 1.
    bool Download(CFTypeRef descriptor, const std::string& postScriptName,
                  const QZDownloadableFontAsset& asset);

    TCFRetained<CFArrayRef> descriptors_;
    QZFontDescriptorProgressHandler handler_;
    std::shared_ptr<QZDownloadCancellation> cancellation_;
    TCFRetained<QZCancelDownloadHandlerRef> cancelHandler_;
    TCFRetained<CFMutableArrayRef> matches_;
    std::shared_ptr<const QZDownloadableFontCatalog> catalog_;
    std::map<std::string, AssetOutcome, std::less<>> assetOutcomes_; ///< by LocalID
    std::set<std::string, std::less<>> plannedAssets_; ///< LocalIDs counted in totalBytes_
    uint64_t totalBytes_ = 0;
    uint64_t finishedBytes_ = 0; ///< bytes of the assets that ended, whatever their outcome
};

bool MatchingRun::Report(QZFontDescriptorMatchingState state,
                         std::initializer_list<std::pair<CFStringRef, CFTypeRef>> entries) {
    TCFRetained<CFMutableDictionaryRef> progress(
        CFDictionaryCreateMutable(kCFAllocatorDefault, 0, &kCFTypeDictionaryKeyCallBacks,
                                  &kCFTypeDictionaryValueCallBacks),
        kAdopted);
    CFDictionarySetValue(progress, kCTFontDescriptorMatchingCancelDownloadHandler, cancelHandler_);
    for (const auto& [key, value] : entries)
        if (value)
            CFDictionarySetValue(progress, key, value);
    return handler_(state, progress);
}

bool MatchingRun::ReportDownloading(QZFontDescriptorMatchingState state, CFTypeRef concerned,
                                    uint64_t downloaded) {
    const SInt64 done = SInt64(std::min(downloaded, totalBytes_));
    const SInt64 total = SInt64(totalBytes_);
    TCFRetained<CFNumberRef> doneNumber(
        CFNumberCreate(kCFAllocatorDefault, kCFNumberSInt64Type, &done), kAdopted);
    TCFRetained<CFNumberRef> totalNumber(
        CFNumberCreate(kCFAllocatorDefault, kCFNumberSInt64Type, &total), kAdopted);
    const void* one[] = {concerned};
    TCFRetained<CFArrayRef> concernedArray(
        CFArrayCreate(kCFAllocatorDefault, one, 1, &kCFTypeArrayCallBacks), kAdopted);
    return Report(state, {{kCTFontDescriptorMatchingDescriptors, concernedArray},
                          {kCTFontDescriptorMatchingTotalDownloadedSize, doneNumber},
                          {kCTFontDescriptorMatchingTotalAssetSize, totalNumber}});
}

bool MatchingRun::ReportFailure(CFTypeRef concerned, const std::string& postScriptName,
                                CFIndex code, const std::string& reason) {
    TCFRetained<CFStringRef> description(
        QZCreateCFString(Text("The font “%1” cannot be downloaded.")
                             .arg(QString::fromStdString(postScriptName))),
        kAdopted);
    TCFRetained<CFStringRef> failureReason(glyphwell::CreateString(reason), kAdopted);
    const void* keys[] = {kCFErrorLocalizedDescriptionKey, kCFErrorLocalizedFailureReasonKey};
    const void* values[] = {description, failureReason};
    TCFRetained<CFDictionaryRef> userInfo(CFDictionaryCreate(kCFAllocatorDefault, keys, values, 2,
                                                             &kCFTypeDictionaryKeyCallBacks,
                                                             &kCFTypeDictionaryValueCallBacks),
                                          kAdopted);
    TCFRetained<CFErrorRef> error(
        CFErrorCreate(kCFAllocatorDefault, kQZFontDownloadErrorDomain, code, userInfo), kAdopted);
    const void* one[] = {concerned};
    TCFRetained<CFArrayRef> concernedArray(
        CFArrayCreate(kCFAllocatorDefault, one, 1, &kCFTypeArrayCallBacks), kAdopted);
    glyphwell::AppLog("Cannot download the font %s: %s",
                      glyphwell::LogEscape(postScriptName).c_str(),
                      glyphwell::LogEscape(reason).c_str());
    return Report(kCTFontDescriptorMatchingDidFailWithError,
                  {{kCTFontDescriptorMatchingDescriptors, concernedArray},
                   {kCTFontDescriptorMatchingError, error}});
}

bool MatchingRun::Download(CFTypeRef descriptor, const std::string& postScriptName,
                           const QZDownloadableFontAsset& asset) {
    // An asset that was not foreseen when the run began (its font was installed then).
    if (plannedAssets_.emplace(asset.localID).second)
        totalBytes_ += asset.size;
    const uint64_t startBytes = finishedBytes_;
    if (!ReportDownloading(kCTFontDescriptorMatchingWillBeginDownloading, descriptor, startBytes))
        return false;

    using Clock = std::chrono::steady_clock;
    bool reportedAny = false;
    Clock::time_point lastReport;
    const auto progress = [&](uint64_t received) {
        const Clock::time_point now = Clock::now();
        if (reportedAny && received != asset.size && now - lastReport < kDownloadingReportInterval)
            return true;
        reportedAny = true;
        lastReport = now;
        return ReportDownloading(kCTFontDescriptorMatchingDownloading, descriptor,
                                 startBytes + received);
    };
    const QZFontAssetDownload download{std::string(asset.localID),
                                       std::string(asset.url),
                                       asset.size,
                                       std::string(asset.sha256),
                                       {postScriptName}};
    const QZFontDownloadResult result =
        QZDownloadFontAsset(download, QZFontInstallDirectory(), progress, cancellation_.get());

    switch (result.outcome) {
    case QZFontDownloadOutcome::Stopped:
        return false;
    case QZFontDownloadOutcome::Cancelled:
        return true; // Run() sees the cancellation and finishes
    case QZFontDownloadOutcome::Failed:
        finishedBytes_ = startBytes + asset.size;
        assetOutcomes_[std::string(asset.localID)] = {false, result.failureReason};
        return ReportFailure(descriptor, postScriptName, kQZFontDownloadErrorDownloadFailed,
                             result.failureReason);
    case QZFontDownloadOutcome::Installed:
        break;
    }
    finishedBytes_ = startBytes + asset.size;
    assetOutcomes_[std::string(asset.localID)] = {true, {}};
    if (!ReportDownloading(kCTFontDescriptorMatchingDidFinishDownloading, descriptor,
                           finishedBytes_))
        return false;
    return MatchOne(descriptor, postScriptName);
}

bool MatchingRun::MatchOne(CFTypeRef descriptor, const std::string& postScriptName) {
    if (const std::optional<QZInstalledFont> font = QZFindInstalledFont(postScriptName)) {
        TCFRetained<CFDictionaryRef> matched(CreateMatchedDescriptor(*font), kAdopted);
        CFArrayAppendValue(matches_, matched);
        const void* one[] = {matched};
        TCFRetained<CFArrayRef> matchedArray(
            CFArrayCreate(kCFAllocatorDefault, one, 1, &kCFTypeArrayCallBacks), kAdopted);
        return Report(kCTFontDescriptorMatchingDidMatch,
                      {{kCTFontDescriptorMatchingDescriptors, matchedArray}});
    }
    const QZDownloadableFontAsset* asset = FindAsset(*catalog_, postScriptName);
    if (!asset)
        return ReportFailure(descriptor, postScriptName, kQZFontDownloadErrorNotDownloadable,
                             Text("No downloadable font has this name.").toStdString());
    const auto outcome = assetOutcomes_.find(asset->localID);
    if (outcome == assetOutcomes_.end())
        return Download(descriptor, postScriptName, *asset);
    // The asset was fetched earlier in this run, for another font.
    if (!outcome->second.installed)
        return ReportFailure(descriptor, postScriptName, kQZFontDownloadErrorDownloadFailed,
                             outcome->second.failureReason);
    return ReportFailure(descriptor, postScriptName, kQZFontDownloadErrorNotInAsset,
                         Text("The downloaded font file does not hold this font.").toStdString());
}

void MatchingRun::Run() {
    // Only the assets of the fonts asked for, found through the catalogs' indexes.
    std::vector<std::string> requested;
    for (CFIndex i = 0; i < CFArrayGetCount(descriptors_); ++i)
        requested.push_back(PostScriptName(CFArrayGetValueAtIndex(descriptors_, i)));
    catalog_ = QZCurrentDownloadableFontCatalogFor(requested);
    // The byte total: every distinct asset needed by a font that is not installed yet.
    std::vector<std::pair<CFTypeRef, std::string>> fonts;
    const CFIndex count = CFArrayGetCount(descriptors_);
    for (CFIndex i = 0; i < count; ++i) {
        const void* descriptor = CFArrayGetValueAtIndex(descriptors_, i);
        std::string name = PostScriptName(descriptor);
        if (name.empty())
            continue;
        if (!QZIsFontInstalled(name))
            if (const QZDownloadableFontAsset* asset = FindAsset(*catalog_, name))
                if (plannedAssets_.emplace(asset->localID).second)
                    totalBytes_ += asset->size;
        fonts.emplace_back(descriptor, std::move(name));
    }

    if (!Report(kCTFontDescriptorMatchingDidBegin,
                {{kCTFontDescriptorMatchingDescriptors, descriptors_}}))
        return;
    for (const auto& [descriptor, name] : fonts) {
        if (cancellation_->IsCancelled())
            break;
        const void* one[] = {descriptor};
        TCFRetained<CFArrayRef> concerned(
            CFArrayCreate(kCFAllocatorDefault, one, 1, &kCFTypeArrayCallBacks), kAdopted);
        if (!Report(kCTFontDescriptorMatchingWillBeginQuerying,
                    {{kCTFontDescriptorMatchingDescriptors, concerned}}))
            return;
        if (cancellation_->IsCancelled())
            break;
        if (!MatchOne(descriptor, name))
            return;
    }
    Report(kCTFontDescriptorMatchingDidFinish,
           {{kCTFontDescriptorMatchingDescriptors, descriptors_},
            {kCTFontDescriptorMatchingResult, matches_}});
}

} // namespace

bool QZMatchFontDescriptorsWithProgressHandler(CFArrayRef descriptors, CFSetRef,
                                               QZFontDescriptorProgressHandler handler) {
    if (!descriptors || CFGetTypeID(descriptors) != CFArrayGetTypeID() || !handler)
        return false;
    auto run = std::make_unique<MatchingRun>(descriptors, std::move(handler));
    try {
        std::thread([run = std::move(run)] { run->Run(); }).detach();
    } catch (const std::system_error& error) {
        glyphwell::AppLog("Cannot start the font matching: %s", error.what());
        return false;
    }
    return true;
}
