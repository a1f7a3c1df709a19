// The merged catalog view: which sources exist, loading one (verified for a publisher), merging
// them whole or for a few fonts, and the cache that keeps the current sources and their indexes
// until a file changes.
#include "desktop/QZCatalogSources.h"

#include <algorithm>
#include <ctime>
#include <map>
#include <mutex>
#include <set>
#include <sys/stat.h>
#include <unordered_set>

#include "desktop/QZCatalogIndex.h"
#include "desktop/QZCatalogPaths.h"
#include "desktop/QZCatalogPublishers.h"
#include "platform/Log.h"
#include "platform/LogEscape.h"

namespace {

/// What identifies one state of a file: a change of any member means new contents.
struct FileStamp {
    bool exists = false;
    dev_t device = 0;
    ino_t inode = 0;
    off_t size = 0;
    int64_t modified = 0; ///< nanoseconds
    bool operator==(const FileStamp&) const = default;
};

FileStamp StampOf(const std::string& path) {
    struct stat status {};
    if (path.empty() || stat(path.c_str(), &status) != 0)
        return {};
    return {true, status.st_dev, status.st_ino, status.st_size,
            int64_t(status.st_mtim.tv_sec) * 1000000000 + status.st_mtim.tv_nsec};
}

/// The state of a source's files and key.
struct SourceStamp {
    FileStamp catalog;
    FileStamp signature;
    std::array<unsigned char, 32> key{};
    bool operator==(const SourceStamp&) const = default;
};

SourceStamp StampOf(const QZCatalogSource& source) {
    return {StampOf(source.path), StampOf(source.signaturePath), source.publicKey.key};
}

struct SourcesCache {
    std::mutex mutex;
    std::vector<SourceStamp> stamps; ///< of the merged view's sources
    std::vector<std::string> paths;
    std::shared_ptr<const QZDownloadableFontCatalogSources> merged;
    std::map<std::string, int64_t> expiredLogged; ///< publisher to the expiry logged
    bool noneLogged = false;
};

SourcesCache& Cache() {
    static SourcesCache cache;
    return cache;
}

/// What a merged catalog's views point into.
struct MergedStorage {
    std::vector<std::shared_ptr<const void>> sources;
    std::vector<std::vector<QZDownloadableFont>> fonts; ///< of assets that lost some fonts
};

} // namespace

std::vector<QZCatalogSource> QZCurrentCatalogSources(int64_t now) {
    std::vector<QZCatalogSource> sources;
    const std::string user = QZUserCatalogPath();
    if (StampOf(user).exists)
        sources.push_back({QZCatalogSource::Kind::User, "user", user, {}, {}});
    for (const QZCatalogPublisher& publisher :
         QZReadCatalogPublishers(QZCatalogPublisherDirectories())) {
        const std::string directory = QZPublisherCacheDirectory(publisher.name);
        const QZPublisherState state = QZReadPublisherState(directory);
        if (!state.present)
            continue;
        if (state.expires && *state.expires <= now) {
            std::lock_guard<std::mutex> lock(Cache().mutex);
            int64_t& logged = Cache().expiredLogged[publisher.name];
            if (logged != *state.expires)
                glyphwell::AppLog(
                    "Not offering the catalog of the publisher %s: it expired at %lld",
                    glyphwell::LogEscape(publisher.name).c_str(),
                    static_cast<long long>(*state.expires));
            logged = *state.expires;
            continue;
        }
        sources.push_back({QZCatalogSource::Kind::Publisher, "publisher/" + publisher.name,
                           directory + "/" + kPublisherCatalogFile,
                           directory + "/" + kPublisherSignatureFile, publisher.publicKey});
    }
    for (const std::string& path : QZSystemCatalogPaths())
        if (StampOf(path).exists)
            sources.push_back({QZCatalogSource::Kind::System, path, path, {}, {}});
    return sources;
}

QZDownloadableFontCatalog QZLoadCatalogSource(const QZCatalogSource& source) {
    std::string problem;
    const std::optional<std::string> bytes =
        QZReadCatalogFile(source.path, kMaximumPublishedCatalogSize, &problem);
    if (!bytes) {
        glyphwell::AppLog("Cannot read the downloadable font catalog %s: %s",
                          glyphwell::LogEscape(source.path).c_str(),
                          glyphwell::LogEscape(problem).c_str());
        return {};
    }
    return QZCatalogFromSourceBytes(source, *bytes);
}

QZDownloadableFontCatalog QZCatalogFromSourceBytes(const QZCatalogSource& source,
                                                   const std::string& bytes) {
    if (source.kind == QZCatalogSource::Kind::Publisher) {
        std::string problem;
        QZCatalogSignatureCheck check;
        if (const auto signature =
                QZReadCatalogFile(source.signaturePath, kMaximumCatalogSignatureSize, &problem)) {
            check = QZVerifyCatalogSignature(bytes, *signature, source.publicKey);
            problem = check.problem;
        }
        if (!check.valid) {
            glyphwell::AppLog("Not offering the catalog of %s: %s",
                              glyphwell::LogEscape(source.label).c_str(),
                              glyphwell::LogEscape(problem).c_str());
            return {};
        }
    }
    return QZDownloadableFontCatalog::Parse(bytes, source.path);
}

QZMergedDownloadableFontCatalog
QZMergeDownloadableFontCatalogs(std::vector<QZCatalogSource> sources,
                                std::vector<QZDownloadableFontCatalog> catalogs) {
    QZMergedDownloadableFontCatalog merged;
    merged.sources = std::move(sources);
    auto storage = std::make_shared<MergedStorage>();
    size_t nonEmpty = 0;
    for (const QZDownloadableFontCatalog& catalog : catalogs)
        nonEmpty += catalog.assets.empty() ? 0 : 1;
    if (nonEmpty <= 1) {
        // One source offers everything: its catalog is the view, nothing compared or copied.
        for (size_t index = 0; index < catalogs.size(); ++index) {
            if (catalogs[index].assets.empty())
                continue;
            merged.assetSources.assign(catalogs[index].assets.size(), index);
            merged.catalog = std::move(catalogs[index]);
        }
        return merged;
    }
    // Names offered by the earlier sources.
    std::unordered_set<std::string_view> offered, offeredHere;
    for (size_t index = 0; index < catalogs.size(); ++index) {
        const QZDownloadableFontCatalog& catalog = catalogs[index];
        if (catalog.assets.empty())
            continue;
        storage->sources.push_back(catalog.storage);
        for (const QZDownloadableFontAsset& asset : catalog.assets) {
            QZDownloadableFontAsset kept = asset;
            std::vector<QZDownloadableFont> fonts;
            for (const QZDownloadableFont& font : asset.fonts) {
                offeredHere.insert(font.postScriptName);
                if (!offered.count(font.postScriptName))
                    fonts.push_back(font);
            }
            if (fonts.empty())
                continue;
            if (fonts.size() != asset.fonts.size())
                kept.fonts = storage->fonts.emplace_back(std::move(fonts));
            merged.catalog.assets.push_back(kept);
            merged.assetSources.push_back(index);
        }
        offered.merge(offeredHere);
        offeredHere.clear();
    }
    merged.catalog.storage = std::move(storage);
    return merged;
}

QZDownloadableFontCatalogSources::QZDownloadableFontCatalogSources(
    std::vector<QZCatalogSource> sources,
    std::vector<std::shared_ptr<const QZCatalogIndexView>> views)
    : sources_(std::move(sources)), views_(std::move(views)) {}

const QZMergedDownloadableFontCatalog& QZDownloadableFontCatalogSources::All() const {
    std::call_once(allOnce_, [this] {
        std::vector<QZDownloadableFontCatalog> catalogs;
        for (const auto& view : views_)
            catalogs.push_back(view->Catalog({}, true));
        all_ = QZMergeDownloadableFontCatalogs(sources_, std::move(catalogs));
    });
    return all_;
}

bool QZDownloadableFontCatalogSources::IsDamaged() const {
    return std::any_of(views_.begin(), views_.end(),
                       [](const auto& view) { return view->IsDamaged(); });
}

QZMergedDownloadableFontCatalog
QZDownloadableFontCatalogSources::Offering(const std::vector<std::string>& postScriptNames) const {
    // Per source, the assets holding a name that no earlier source offers.
    std::vector<std::set<uint32_t>> selected(views_.size());
    for (const std::string& name : postScriptNames) {
        for (size_t index = 0; index < views_.size(); ++index) {
            const std::vector<uint32_t> assets = views_[index]->AssetsOffering(name);
            if (assets.empty())
                continue;
            selected[index].insert(assets.begin(), assets.end());
            break;
        }
    }
    QZMergedDownloadableFontCatalog merged;
    merged.sources = sources_;
    auto storage = std::make_shared<MergedStorage>();
    for (size_t index = 0; index < views_.size(); ++index) {
        if (selected[index].empty())
            continue;
        QZDownloadableFontCatalog catalog = views_[index]->Catalog(
            std::vector<uint32_t>(selected[index].begin(), selected[index].end()));
        storage->sources.push_back(catalog.storage);
        for (const QZDownloadableFontAsset& asset : catalog.assets) {
            // As in All(): the fonts that an earlier source offers are not this asset's.
            std::vector<QZDownloadableFont> fonts;
            for (const QZDownloadableFont& font : asset.fonts) {
                bool earlier = false;
                for (size_t before = 0; before < index && !earlier; ++before)
                    earlier = !views_[before]->AssetsOffering(font.postScriptName).empty();
                if (!earlier)
                    fonts.push_back(font);
            }
            if (fonts.empty())
                continue;
            QZDownloadableFontAsset kept = asset;
            if (fonts.size() != asset.fonts.size())
                kept.fonts = storage->fonts.emplace_back(std::move(fonts));
            merged.catalog.assets.push_back(kept);
            merged.assetSources.push_back(index);
        }
    }
    merged.catalog.storage = std::move(storage);
    return merged;
}

std::shared_ptr<const QZDownloadableFontCatalogSources> QZCurrentDownloadableFontCatalogSources() {
    std::vector<QZCatalogSource> sources = QZCurrentCatalogSources(int64_t(std::time(nullptr)));
    std::vector<SourceStamp> stamps;
    std::vector<std::string> paths;
    for (const QZCatalogSource& source : sources) {
        stamps.push_back(StampOf(source));
        paths.push_back(source.path);
    }
    SourcesCache& cache = Cache();
    std::lock_guard<std::mutex> lock(cache.mutex);
    if (cache.merged && cache.stamps == stamps && cache.paths == paths &&
        !cache.merged->IsDamaged())
        return cache.merged;
    if (sources.empty() && !cache.noneLogged) {
        std::string searched = QZUserCatalogPath();
        for (const std::string& path : QZSystemCatalogPaths())
            searched += ", " + path;
        glyphwell::AppLog("No downloadable font catalog: none of %s exists",
                          glyphwell::LogEscape(searched).c_str());
    }
    cache.noneLogged = sources.empty();
    // Each source through its compiled index: no JSON is read while the indexes are current.
    std::vector<std::shared_ptr<const QZCatalogIndexView>> views;
    for (const QZCatalogSource& source : sources)
        views.push_back(QZLoadIndexedCatalogSource(source));
    cache.merged = std::make_shared<const QZDownloadableFontCatalogSources>(std::move(sources),
                                                                            std::move(views));
    cache.stamps = std::move(stamps);
    cache.paths = std::move(paths);
    return cache.merged;
}

std::shared_ptr<const QZMergedDownloadableFontCatalog> QZCurrentMergedDownloadableFontCatalog() {
    const auto sources = QZCurrentDownloadableFontCatalogSources();
    return std::shared_ptr<const QZMergedDownloadableFontCatalog>(sources, &sources->All());
}

std::shared_ptr<const QZDownloadableFontCatalog>
QZCurrentDownloadableFontCatalogFor(const std::vector<std::string>& postScriptNames) {
    auto merged = std::make_shared<const QZMergedDownloadableFontCatalog>(
        QZCurrentDownloadableFontCatalogSources()->Offering(postScriptNames));
    return std::shared_ptr<const QZDownloadableFontCatalog>(merged, &merged->catalog);
}
