// The compiled form of a catalog: a binary index in $XDG_CACHE_HOME/glyphwell/catalog-index/,
// made once when its source changes and then mapped read-only, so that a question costs no JSON
// parsing whatever the catalog's size. No Qt.
//
// An index is keyed by its source: the path, size and modification time (nanoseconds) of the
// catalog file, its SHA-256, and for a publisher's catalog the key that verified it and the
// SHA-256 of its signature file. It is current when all of these match; a source that was only
// touched (same SHA-256) keeps its index. The index is never trusted: every offset, length and
// count is checked against the file before any view is made, and a damaged, truncated or hostile
// index is compiled again. Written beside and renamed, so readers see a whole file or none.
//
// Layout (little-endian): a header (magic "GWCATIX2", counts, the key, the section offsets),
// then arrays of fixed-size asset, font, localized-name and language records whose strings are
// (offset, length) pairs into one string section, and a table of (hash of a PostScript name,
// asset, font) sorted by hash, so that the assets offering a font are found without reading the
// others.
#pragma once

#include <array>
#include <atomic>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "desktop/QZCatalogSources.h"
#include "desktop/QZDownloadableFontCatalog.h"

/// What an index was compiled from.
struct QZCatalogIndexKey {
    std::string path;
    uint64_t size = 0;
    int64_t modified = 0; ///< nanoseconds since the epoch
    std::array<unsigned char, 32> sha256{};
    std::array<unsigned char, 32> publicKey{};       ///< zero for an unsigned source
    std::array<unsigned char, 32> signatureSHA256{}; ///< zero for an unsigned source
    bool operator==(const QZCatalogIndexKey&) const = default;
};

/// A checked index: every offset, length and count was checked when it was opened; an asset's
/// contents (non-empty names, a SHA-256 of 64 lower-case hexadecimal digits, a size up to
/// INT64_MAX, localized names in order) are checked before a view of it is made, and views are
/// made only of the assets asked for. Immutable; shared between threads.
class QZCatalogIndexView {
public:
    /// Checks the index `bytes`, which `owner` keeps alive (the views made later point into
    /// `bytes`). Null when any check fails. `*key` receives the key it was compiled from. When an
    /// asset turns out damaged later, the file `path` (if given) is removed.
    static std::shared_ptr<const QZCatalogIndexView> Open(std::string_view bytes,
                                                          std::shared_ptr<const void> owner,
                                                          QZCatalogIndexKey* key,
                                                          std::string path = {});

    size_t AssetCount() const { return counts_[0]; }
    /// The assets (indexes, in catalog order) holding a font named `postScriptName`.
    std::vector<uint32_t> AssetsOffering(std::string_view postScriptName) const;
    /// The catalog of the assets `indexes` (in that order); every asset when `all`. A damaged
    /// asset is left out, and the index file removed so that it is compiled again.
    QZDownloadableFontCatalog Catalog(const std::vector<uint32_t>& indexes, bool all = false) const;
    /// Whether an asset was found damaged.
    bool IsDamaged() const { return damaged_.load(); }

private:
    QZCatalogIndexView() = default;
    std::string_view String(const char* reference) const;
    bool AssetIsSound(const char* record) const;

    std::shared_ptr<const void> owner_;
    std::string path_;
    mutable std::atomic<bool> damaged_{false};
    const char* data_ = nullptr;
    uint32_t counts_[5] = {};  ///< assets, fonts, names, languages, lookup entries
    uint64_t offsets_[6] = {}; ///< of the same sections, then of the strings
};

/// The index bytes of `catalog` compiled from the source `key`.
std::string QZCompileCatalogIndex(const QZDownloadableFontCatalog& catalog,
                                  const QZCatalogIndexKey& key);

/// Reads the index `bytes`, which `owner` keeps alive: the catalog's views point into `bytes`.
/// Nothing when any check fails. `*key` receives the key it was compiled from.
std::optional<QZDownloadableFontCatalog> QZReadCatalogIndex(std::string_view bytes,
                                                            std::shared_ptr<const void> owner,
                                                            QZCatalogIndexKey* key);

/// The index file of the catalog at `path`.
std::string QZCatalogIndexPath(const std::string& path);

/// The catalog of `source` through its index: mapped when current, otherwise read as
/// QZLoadCatalogSource does (with its log lines) and compiled into a new index (kept in memory
/// when it cannot be written). Never null.
std::shared_ptr<const QZCatalogIndexView> QZLoadIndexedCatalogSource(const QZCatalogSource& source);
