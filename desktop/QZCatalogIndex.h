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
// Layout (little-endian): a header (magic "GWCATIX1", counts, the key, the section offsets),
// then arrays of fixed-size asset, font, localized-name and language records whose strings are
// (offset, length) pairs into one string section.
#pragma once

#include <array>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

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
/// QZLoadCatalogSource does (with its log lines) and compiled into a new index.
QZDownloadableFontCatalog QZLoadIndexedCatalogSource(const QZCatalogSource& source);
