#include "desktop/QZDownloadableFontCatalog.h"

#include <QDateTime>
#include <QFile>
#include <QFileInfo>
#include <QStandardPaths>
#include <limits>
#include <mutex>
#include <nlohmann/json.hpp>
#include <set>

#include "cfutil/TCFRetained.h"
#include "desktop/QZQtStrings.h"
#include "platform/CFDictionary.h"
#include "platform/CFNumber.h"
#include "platform/Log.h"
#include "protocol/QZUIProtocol.h"

namespace {

constexpr char kCatalogRelativePath[] = "glyphwell/downloadable-fonts.json";
/// A catalog beyond this size is not read: it cannot be a list of font files.
constexpr qint64 kMaximumCatalogSize = 64 << 20;

using nlohmann::json;

bool IsSHA256(const std::string& text) {
    if (text.size() != 64)
        return false;
    for (char c : text)
        if (!((c >= '0' && c <= '9') || (c >= 'a' && c <= 'f')))
            return false;
    return true;
}

bool NonEmptyString(const json& object, const char* key) {
    const auto found = object.find(key);
    return found != object.end() && found->is_string() &&
           !found->get_ref<const std::string&>().empty();
}

/// Reads one font of an asset; false with `reason` set when it is malformed.
bool ReadFont(const json& value, QZDownloadableFont& font, std::string& reason) {
    if (!value.is_object() || !NonEmptyString(value, "postScriptName")) {
        reason = "a font without a \"postScriptName\"";
        return false;
    }
    font.postScriptName = value["postScriptName"].get<std::string>();
    if (const auto family = value.find("family"); family != value.end()) {
        if (!family->is_string()) {
            reason = "a \"family\" that is not a string";
            return false;
        }
        font.family = family->get<std::string>();
    }
    if (const auto names = value.find("localizedFamilyNames"); names != value.end()) {
        if (!names->is_object()) {
            reason = "\"localizedFamilyNames\" that is not an object";
            return false;
        }
        for (const auto& [language, name] : names->items()) {
            if (!name.is_string()) {
                reason = "a localized family name that is not a string";
                return false;
            }
            font.localizedFamilyNames[language] = name.get<std::string>();
        }
    }
    return true;
}

/// Reads one asset; false with `reason` set when it is malformed.
bool ReadAsset(const json& value, QZDownloadableFontAsset& asset, std::string& reason) {
    if (!value.is_object()) {
        reason = "not an object";
        return false;
    }
    if (!NonEmptyString(value, "LocalID")) {
        reason = "no \"LocalID\"";
        return false;
    }
    asset.localID = value["LocalID"].get<std::string>();
    if (!NonEmptyString(value, "url")) {
        reason = "no \"url\"";
        return false;
    }
    asset.url = value["url"].get<std::string>();
    const auto size = value.find("size");
    if (size == value.end() || !size->is_number_integer() ||
        (size->is_number_unsigned()
             ? size->get<uint64_t>() > uint64_t(std::numeric_limits<int64_t>::max())
             : size->get<int64_t>() < 0)) {
        reason = "no \"size\" in bytes";
        return false;
    }
    asset.size =
        size->is_number_unsigned() ? size->get<uint64_t>() : uint64_t(size->get<int64_t>());
    const auto sha256 = value.find("sha256");
    if (sha256 == value.end() || !sha256->is_string() || !IsSHA256(sha256->get<std::string>())) {
        reason = "no \"sha256\" of 64 lower-case hexadecimal digits";
        return false;
    }
    asset.sha256 = sha256->get<std::string>();
    const auto fonts = value.find("fonts");
    if (fonts == value.end() || !fonts->is_array() || fonts->empty()) {
        reason = "no \"fonts\"";
        return false;
    }
    for (const json& font : *fonts) {
        QZDownloadableFont read;
        if (!ReadFont(font, read, reason))
            return false;
        asset.fonts.push_back(std::move(read));
    }
    return true;
}

/// The state of the catalog file that the cached catalog was read from.
struct FileState {
    QString path; ///< empty: no catalog file
    qint64 size = -1;
    qint64 modified = 0; ///< milliseconds since the epoch
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
    for (const QString& path : QZDownloadableFontCatalogPaths()) {
        const QFileInfo info(path);
        if (info.exists())
            return {path, info.size(), info.lastModified().toMSecsSinceEpoch()};
    }
    return {};
}

QZDownloadableFontCatalog LoadCatalog(const FileState& state) {
    if (state.path.isEmpty()) {
        glyphwell::AppLog(
            "No downloadable font catalog: none of %s exists",
            qUtf8Printable(QZDownloadableFontCatalogPaths().join(QStringLiteral(", "))));
        return {};
    }
    QFile file(state.path);
    if (!file.open(QIODevice::ReadOnly)) {
        glyphwell::AppLog("Cannot read the downloadable font catalog %s: %s",
                          qUtf8Printable(state.path), qUtf8Printable(file.errorString()));
        return {};
    }
    const QByteArray bytes = file.read(kMaximumCatalogSize + 1);
    if (bytes.size() > kMaximumCatalogSize) {
        glyphwell::AppLog("Cannot read the downloadable font catalog %s: larger than %lld bytes",
                          qUtf8Printable(state.path), (long long)kMaximumCatalogSize);
        return {};
    }
    return QZDownloadableFontCatalog::Parse(
        std::string_view(bytes.constData(), size_t(bytes.size())), state.path.toStdString());
}

CFStringRef CreateString(const std::string& utf8) {
    return CFStringCreateWithBytes(kCFAllocatorDefault, reinterpret_cast<const UInt8*>(utf8.data()),
                                   CFIndex(utf8.size()), kCFStringEncodingUTF8, false);
}

/// The dictionary that describes `asset` for the font `font` it holds. The caller releases it.
CFDictionaryRef CreateAssetDictionary(const QZDownloadableFontAsset& asset,
                                      const QZDownloadableFont& font) {
    CFMutableDictionaryRef dictionary = CFDictionaryCreateMutable(
        kCFAllocatorDefault, 0, &kCFTypeDictionaryKeyCallBacks, &kCFTypeDictionaryValueCallBacks);
    auto setString = [dictionary](CFStringRef key, const std::string& utf8) {
        TCFRetained<CFStringRef> value(CreateString(utf8), kAdopted);
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
            TCFRetained<CFStringRef> key(CreateString(language), kAdopted);
            TCFRetained<CFStringRef> value(CreateString(name), kAdopted);
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
    QZDownloadableFontCatalog catalog;
    json document;
    try {
        document = json::parse(bytes.begin(), bytes.end());
    } catch (const json::exception& error) {
        glyphwell::AppLog("Cannot parse the downloadable font catalog %s: %s", origin.c_str(),
                          error.what());
        return catalog;
    }
    const auto assets = document.is_object() ? document.find("assets") : document.end();
    if (!document.is_object() || assets == document.end() || !assets->is_array()) {
        glyphwell::AppLog("Cannot parse the downloadable font catalog %s: no \"assets\" array",
                          origin.c_str());
        return catalog;
    }
    std::set<std::string> identifiers;
    size_t index = 0;
    for (const json& value : *assets) {
        QZDownloadableFontAsset asset;
        std::string reason;
        if (!ReadAsset(value, asset, reason)) {
            glyphwell::AppLog("Skipping asset %zu of the downloadable font catalog %s: %s", index,
                              origin.c_str(), reason.c_str());
        } else if (!identifiers.insert(asset.localID).second) {
            glyphwell::AppLog("Skipping asset %zu of the downloadable font catalog %s: "
                              "duplicate \"LocalID\" %s",
                              index, origin.c_str(), asset.localID.c_str());
        } else {
            catalog.assets.push_back(std::move(asset));
        }
        ++index;
    }
    return catalog;
}

QStringList QZDownloadableFontCatalogPaths() {
    // The user's data directory first, then each of XDG_DATA_DIRS (with their defaults).
    QStringList paths;
    for (const QString& directory :
         QStandardPaths::standardLocations(QStandardPaths::GenericDataLocation))
        paths << directory + u'/' + QString::fromLatin1(kCatalogRelativePath);
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
        const QString name = QZQStringIfString(
            CFDictionaryGetValue(static_cast<CFDictionaryRef>(element), NSFontNameAttribute));
        if (name.isEmpty())
            continue;
        const std::string postScriptName = name.toStdString();
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
