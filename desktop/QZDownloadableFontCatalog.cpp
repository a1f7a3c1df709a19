#include "desktop/QZDownloadableFontCatalog.h"

#include <mutex>

#include "cfutil/CFStringUtilities.h"
#include "cfutil/TCFRetained.h"
#include "desktop/QZCatalogPaths.h"
#include "desktop/QZCatalogSources.h"
#include "platform/CFDictionary.h"
#include "platform/CFNumber.h"
#include "platform/Log.h"
#include "platform/LogEscape.h"
#include "protocol/QZUIProtocol.h"

namespace {

struct CatalogCache {
    std::mutex mutex;
    QZInstalledFontCheck installedCheck;
};

CatalogCache& Cache() {
    static CatalogCache cache;
    return cache;
}

/// Logs the problems of the catalog `origin` as the agent reports them: an unreadable or
/// malformed catalog in one line, otherwise one line per asset left out.
void LogProblems(const std::vector<QZCatalogProblem>& problems, const std::string& origin) {
    const std::string place = glyphwell::LogEscape(origin);
    for (const QZCatalogProblem& problem : problems) {
        if (problem.kind == QZCatalogProblem::Kind::Asset)
            continue;
        glyphwell::AppLog(problem.kind == QZCatalogProblem::Kind::Unreadable
                              ? "Cannot read the downloadable font catalog %s: %s"
                              : "Cannot parse the downloadable font catalog %s: %s",
                          place.c_str(), glyphwell::LogEscape(problem.message).c_str());
        return;
    }
    for (const QZCatalogProblem& problem : problems)
        glyphwell::AppLog("Skipping asset %zu of the downloadable font catalog %s: %s",
                          problem.asset, place.c_str(),
                          glyphwell::LogEscape(problem.message).c_str());
}

/// The dictionary that describes `asset` for the font `font` it holds. The caller releases it.
CFDictionaryRef CreateAssetDictionary(const QZDownloadableFontAsset& asset,
                                      const QZDownloadableFont& font) {
    CFMutableDictionaryRef dictionary = CFDictionaryCreateMutable(
        kCFAllocatorDefault, 0, &kCFTypeDictionaryKeyCallBacks, &kCFTypeDictionaryValueCallBacks);
    auto setString = [dictionary](CFStringRef key, std::string_view utf8) {
        TCFRetained<CFStringRef> value(glyphwell::CreateString(utf8), kAdopted);
        if (value)
            CFDictionarySetValue(dictionary, key, value);
    };
    setString(CFSTR("LocalID"), asset.localID);
    const SInt64 size = SInt64(asset.size);
    TCFRetained<CFNumberRef> number(CFNumberCreate(kCFAllocatorDefault, kCFNumberSInt64Type, &size),
                                    kAdopted);
    CFDictionarySetValue(dictionary, CFSTR("_DownloadSize"), number);
    setString(CFSTR("_DownloadURL"), asset.url);
    setString(CFSTR("_DownloadSHA256"), asset.sha256);
    setString(NSFontNameAttribute, font.postScriptName);
    if (!font.family.empty())
        setString(NSFontFamilyAttribute, font.family);
    if (!font.localizedFamilyNames.empty()) {
        TCFRetained<CFMutableDictionaryRef> names(
            CFDictionaryCreateMutable(kCFAllocatorDefault, 0, &kCFTypeDictionaryKeyCallBacks,
                                      &kCFTypeDictionaryValueCallBacks),
            kAdopted);
        for (const auto& [language, name] : font.localizedFamilyNames) {
            TCFRetained<CFStringRef> key(glyphwell::CreateString(language), kAdopted);
            TCFRetained<CFStringRef> value(glyphwell::CreateString(name), kAdopted);
            if (key && value)
                CFDictionarySetValue(names, key, value);
        }
        CFDictionarySetValue(dictionary, NSCTFontLocalizedFamilyNameAttribute, names);
    }
    return dictionary;
}

} // namespace

QZDownloadableFontCatalog QZDownloadableFontCatalog::Parse(std::string_view bytes,
                                                           const std::string& origin) {
    std::vector<QZCatalogProblem> problems;
    QZDownloadableFontCatalog catalog = QZReadDownloadableFontCatalog(bytes, problems);
    LogProblems(problems, origin);
    return catalog;
}

std::vector<std::string> QZDownloadableFontCatalogPaths() {
    // The user's data directory first, then each of XDG_DATA_DIRS (with their defaults).
    std::vector<std::string> paths = QZSystemCatalogPaths();
    paths.insert(paths.begin(), QZUserCatalogPath());
    return paths;
}

std::shared_ptr<const QZDownloadableFontCatalog> QZCurrentDownloadableFontCatalog() {
    // The merged view of every source; the catalog shares its owner.
    const auto merged = QZCurrentMergedDownloadableFontCatalog();
    return std::shared_ptr<const QZDownloadableFontCatalog>(merged, &merged->catalog);
}

void QZSetInstalledFontCheck(QZInstalledFontCheck check) {
    CatalogCache& cache = Cache();
    std::lock_guard<std::mutex> lock(cache.mutex);
    cache.installedCheck = std::move(check);
}

CFArrayRef
QZCopyDownloadableFontAttributesForRequests(CFArrayRef requestedFontAttributeDictionaries) {
    if (!requestedFontAttributeDictionaries)
        return nullptr;
    // The names asked for first: only their assets are looked up, through the indexes.
    std::vector<std::string> names;
    const CFIndex count = CFArrayGetCount(requestedFontAttributeDictionaries);
    for (CFIndex i = 0; i < count; ++i) {
        const void* element = CFArrayGetValueAtIndex(requestedFontAttributeDictionaries, i);
        const void* name =
            element && CFGetTypeID(element) == CFDictionaryGetTypeID()
                ? CFDictionaryGetValue(static_cast<CFDictionaryRef>(element), NSFontNameAttribute)
                : nullptr;
        std::string postScriptName;
        if (name && CFGetTypeID(name) == CFStringGetTypeID())
            CFString::GetUTF8(static_cast<CFStringRef>(name), postScriptName);
        names.push_back(std::move(postScriptName));
    }
    const auto catalog = QZCurrentDownloadableFontCatalogFor(names);
    QZInstalledFontCheck installed;
    {
        CatalogCache& cache = Cache();
        std::lock_guard<std::mutex> lock(cache.mutex);
        installed = cache.installedCheck;
    }
    CFMutableArrayRef result = CFArrayCreateMutable(kCFAllocatorDefault, 0, &kCFTypeArrayCallBacks);
    for (const std::string& postScriptName : names) {
        if (postScriptName.empty())
            continue;
        if (installed && installed(postScriptName))
            continue;
        for (const QZDownloadableFontAsset& asset : catalog->assets) {
            for (const QZDownloadableFont& font : asset.fonts) {
                if (font.postScriptName != postScriptName)
                    continue;
                TCFRetained<CFDictionaryRef> dictionary(CreateAssetDictionary(asset, font),
                                                        kAdopted);
                CFArrayAppendValue(result, dictionary);
                break;
            }
        }
    }
    return result;
}
