#include "desktop/QZDownloadableFontCatalog.h"

#include <mutex>
#include <sys/stat.h>

#include "cfutil/CFStringUtilities.h"
#include "cfutil/CFUserDirectories.h"
#include "cfutil/TCFRetained.h"
#include "platform/CFDictionary.h"
#include "platform/CFNumber.h"
#include "platform/Log.h"
#include "platform/LogEscape.h"
#include "protocol/QZUIProtocol.h"

namespace {

constexpr char kCatalogRelativePath[] = "glyphwell/downloadable-fonts.json";
/// The state of the catalog file that the cached catalog was read from.
struct FileState {
    std::string path; ///< empty: no catalog file
    int64_t size = -1;
    int64_t modified = 0; ///< nanoseconds since the epoch
    bool operator==(const FileState&) const = default;
};

struct CatalogCache {
    std::mutex mutex;
    bool loaded = false;
    FileState state;
    std::shared_ptr<const QZDownloadableFontCatalog> catalog =
        std::make_shared<QZDownloadableFontCatalog>();
    QZInstalledFontCheck installedCheck;
};

CatalogCache& Cache() {
    static CatalogCache cache;
    return cache;
}

FileState CurrentFileState() {
    for (const std::string& path : QZDownloadableFontCatalogPaths()) {
        struct stat status {};
        if (stat(path.c_str(), &status) == 0)
            return {path, int64_t(status.st_size),
                    int64_t(status.st_mtim.tv_sec) * 1000000000 + status.st_mtim.tv_nsec};
    }
    return {};
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

QZDownloadableFontCatalog LoadCatalog(const FileState& state) {
    if (state.path.empty()) {
        std::string paths;
        for (const std::string& path : QZDownloadableFontCatalogPaths())
            paths += (paths.empty() ? "" : ", ") + path;
        glyphwell::AppLog("No downloadable font catalog: none of %s exists",
                          glyphwell::LogEscape(paths).c_str());
        return {};
    }
    std::vector<QZCatalogProblem> problems;
    QZDownloadableFontCatalog catalog = QZReadDownloadableFontCatalogFile(state.path, problems);
    LogProblems(problems, state.path);
    return catalog;
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
    std::vector<std::string> paths;
    for (const std::string& directory : GetDataDirectories())
        paths.push_back(directory + '/' + kCatalogRelativePath);
    return paths;
}

std::shared_ptr<const QZDownloadableFontCatalog> QZCurrentDownloadableFontCatalog() {
    CatalogCache& cache = Cache();
    const FileState state = CurrentFileState();
    std::lock_guard<std::mutex> lock(cache.mutex);
    if (!cache.loaded || !(cache.state == state)) {
        cache.catalog = std::make_shared<const QZDownloadableFontCatalog>(LoadCatalog(state));
        cache.state = state;
        cache.loaded = true;
    }
    return cache.catalog;
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
    const auto catalog = QZCurrentDownloadableFontCatalog();
    QZInstalledFontCheck installed;
    {
        CatalogCache& cache = Cache();
        std::lock_guard<std::mutex> lock(cache.mutex);
        installed = cache.installedCheck;
    }
    CFMutableArrayRef result = CFArrayCreateMutable(kCFAllocatorDefault, 0, &kCFTypeArrayCallBacks);
    const CFIndex count = CFArrayGetCount(requestedFontAttributeDictionaries);
    for (CFIndex i = 0; i < count; ++i) {
        const void* element = CFArrayGetValueAtIndex(requestedFontAttributeDictionaries, i);
        if (!element || CFGetTypeID(element) != CFDictionaryGetTypeID())
            continue;
        const void* name =
            CFDictionaryGetValue(static_cast<CFDictionaryRef>(element), NSFontNameAttribute);
        std::string postScriptName;
        if (!name || CFGetTypeID(name) != CFStringGetTypeID() ||
            !CFString::GetUTF8(static_cast<CFStringRef>(name), postScriptName) ||
            postScriptName.empty())
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
