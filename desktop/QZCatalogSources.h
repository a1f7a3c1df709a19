// The catalogs the agent offers, merged into one view: the user's own catalog first (unsigned:
// the user wrote it), then each publisher's kept catalog in NAME order (verified with the
// publisher's key, and only while it has not expired), then the system catalogs of
// XDG_DATA_DIRS. A PostScript name offered by several catalogs goes to the first; the assets of
// later ones keep their other fonts. No Qt.
//
// Each source is read through its compiled index (QZCatalogIndex.h), compiled again only when its
// files change; a source that cannot be read, verified or parsed offers nothing, with one log
// line for that state of its files.
#pragma once

#include <cstdint>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "desktop/QZCatalogSignature.h"
#include "desktop/QZDownloadableFontCatalog.h"

/// One catalog that takes part in the merge.
struct QZCatalogSource {
    enum class Kind { User, Publisher, System };
    Kind kind = Kind::User;
    /// How `glyphwell catalog list` names it: "user", "publisher/NAME", or the system file.
    std::string label;
    std::string path; ///< the catalog file
    /// For a publisher: the kept signature and the key that must have made it.
    std::string signaturePath;
    QZMinisignPublicKey publicKey;
};

/// The catalog sources that exist at the time `now` (Unix seconds), in merge order. A publisher
/// whose kept catalog has expired is left out, with one log line for that state.
std::vector<QZCatalogSource> QZCurrentCatalogSources(int64_t now);

/// The merged view and where each asset came from.
struct QZMergedDownloadableFontCatalog {
    QZDownloadableFontCatalog catalog;
    std::vector<QZCatalogSource> sources;
    std::vector<size_t> assetSources; ///< per asset of `catalog`, its index in `sources`
};

/// Merges `catalogs` (one per source, in merge order): each font goes to the first catalog that
/// offers its PostScript name; an asset left without fonts is left out.
QZMergedDownloadableFontCatalog
QZMergeDownloadableFontCatalogs(std::vector<QZCatalogSource> sources,
                                std::vector<QZDownloadableFontCatalog> catalogs);

/// The catalog of one source as the agent reads it (a publisher's verified first); empty, with
/// one log line, when it cannot be read, verified or parsed.
QZDownloadableFontCatalog QZLoadCatalogSource(const QZCatalogSource& source);
/// The same from the source's `bytes`, already read.
QZDownloadableFontCatalog QZCatalogFromSourceBytes(const QZCatalogSource& source,
                                                   const std::string& bytes);

class QZCatalogIndexView;

/// The sources of one moment with their compiled indexes, from which merged views are made.
/// Immutable once made; thread-safe.
class QZDownloadableFontCatalogSources {
public:
    QZDownloadableFontCatalogSources(std::vector<QZCatalogSource> sources,
                                     std::vector<std::shared_ptr<const QZCatalogIndexView>> views);
    const std::vector<QZCatalogSource>& Sources() const { return sources_; }
    /// Every asset of every source, merged; made on first use (its cost grows with the catalogs).
    const QZMergedDownloadableFontCatalog& All() const;
    /// The assets of All() that hold any of `postScriptNames`, in the same order and with the
    /// same fonts, found through the indexes: a larger catalog costs no more.
    QZMergedDownloadableFontCatalog Offering(const std::vector<std::string>& postScriptNames) const;
    /// Whether an index turned out damaged since: the sources must be read again.
    bool IsDamaged() const;

private:
    std::vector<QZCatalogSource> sources_;
    std::vector<std::shared_ptr<const QZCatalogIndexView>> views_;
    mutable std::once_flag allOnce_;
    mutable QZMergedDownloadableFontCatalog all_;
};

/// The current sources: shared, never changed once handed out; made again when a source changes.
/// Thread-safe.
std::shared_ptr<const QZDownloadableFontCatalogSources> QZCurrentDownloadableFontCatalogSources();

/// The current merged view of every asset (QZDownloadableFontCatalogSources::All()).
std::shared_ptr<const QZMergedDownloadableFontCatalog> QZCurrentMergedDownloadableFontCatalog();

/// The current merged view's assets that hold any of `postScriptNames`: what a question about
/// those fonts needs, at a cost that does not grow with the catalogs.
std::shared_ptr<const QZDownloadableFontCatalog>
QZCurrentDownloadableFontCatalogFor(const std::vector<std::string>& postScriptNames);
