// The downloadable fonts: which font assets can be fetched for a requested font, and how large
// they are. The list comes from JSON catalogs: the user's own
// ($XDG_DATA_HOME/glyphwell/downloadable-fonts.json), the publishers' verified ones, and those of
// XDG_DATA_DIRS, merged as QZCatalogSources.h describes. The format is documented in
// resources/catalog/README.md.
//
// Each catalog is read again whenever its files change; a catalog that cannot be read or parsed
// counts as empty and is logged once for that state of the file, and an asset that does not have
// the expected shape is left out with one log line.
// Thread-safe; no Qt.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "platform/CFArray.h"

/// A family name in one language.
struct QZLocalizedName {
    std::string_view language;
    std::string_view name;
};

/// One font held by an asset. The views point into the catalog's storage.
struct QZDownloadableFont {
    std::string_view postScriptName;
    std::string_view family; ///< may be empty
    /// Language identifier to family name in that language: sorted by language, each once.
    std::span<const QZLocalizedName> localizedFamilyNames;
    /// The fontconfig language tags the font covers (`ja`, `zh-cn`, `und-zsye`), from the
    /// catalog's optional "languages" array; empty when the catalog gives none.
    std::span<const std::string_view> languages;

    /// The family name in `language`; empty when the catalog gives none.
    std::string_view LocalizedFamilyName(std::string_view language) const;
};

/// One downloadable asset: a file holding one or more fonts. The views point into the catalog's
/// storage.
struct QZDownloadableFontAsset {
    std::string_view localID; ///< the asset's identifier, unique in the catalog
    std::string_view url;
    uint64_t size = 0;       ///< bytes to download, at most INT64_MAX
    std::string_view sha256; ///< 64 lower-case hexadecimal digits
    std::span<const QZDownloadableFont> fonts;
};

/// The catalog in compact form: every string stored once in a few large blocks, assets and fonts
/// as views into them, no JSON document kept.
///
/// NOTE: the views of `assets` stay valid as long as a catalog sharing `storage` exists (copies
/// and moves share it); they do not outlive the last one.
struct QZDownloadableFontCatalog {
    std::vector<QZDownloadableFontAsset> assets;
    std::shared_ptr<const void> storage; ///< what the views point into

    /// Reads a catalog from `bytes`; `origin` names it in log lines. Text that is not a JSON
    /// object with an "assets" array gives an empty catalog and one log line; each malformed
    /// asset is left out with one log line.
    static QZDownloadableFontCatalog Parse(std::string_view bytes, const std::string& origin);
};

/// One problem found while reading a catalog.
struct QZCatalogProblem {
    enum class Kind {
        Unreadable, ///< the file cannot be read or is too large: the catalog is empty
        Malformed,  ///< not JSON, or no "assets" array: the catalog is empty
        Asset       ///< one asset is left out
    };
    Kind kind = Kind::Malformed;
    /// For Kind::Asset, the 1-based line and byte column of the asset's opening brace (of the
    /// end of an element that is not an object); 0 for the other kinds.
    size_t line = 0;
    size_t column = 0;
    size_t asset = 0;    ///< the asset's index in "assets", for Kind::Asset
    std::string message; ///< e.g. "no \"url\"" or the JSON parser's message
};

/// Reads the catalog file `path` as the agent does (streaming, at most 64 MiB) and appends every
/// problem found to `problems`, in file order, without logging. Asset problems are found even
/// when the text turns out not to be JSON further on; the catalog returned is then empty.
QZDownloadableFontCatalog
QZReadDownloadableFontCatalogFile(const std::string& path, std::vector<QZCatalogProblem>& problems);

/// Reads a catalog from `bytes` like QZReadDownloadableFontCatalogFile, without logging.
QZDownloadableFontCatalog QZReadDownloadableFontCatalog(std::string_view bytes,
                                                        std::vector<QZCatalogProblem>& problems);

/// The places searched for the catalog, in order: under $XDG_DATA_HOME (default ~/.local/share),
/// then under each absolute directory of $XDG_DATA_DIRS (default /usr/local/share:/usr/share).
std::vector<std::string> QZDownloadableFontCatalogPaths();
/// The current catalog (empty when there is none); shared, never changed once handed out.
std::shared_ptr<const QZDownloadableFontCatalog> QZCurrentDownloadableFontCatalog();

/// Whether a font, by PostScript name, is installed already: such fonts get no assets. Until one
/// is set, no font counts as installed.
using QZInstalledFontCheck = std::function<bool(const std::string& postScriptName)>;
/// Sets the check used from now on (an empty function: none).
void QZSetInstalledFontCheck(QZInstalledFontCheck check);

/// The downloadable assets of each requested font, in request order: a new array of one
/// dictionary per (font, asset holding it), so that an asset holding several requested fonts
/// appears once for each. Each dictionary holds "LocalID" (string), "_DownloadSize" (number of
/// type kCFNumberSInt64Type), "_DownloadURL" and "_DownloadSHA256" (strings),
/// "NSFontNameAttribute", and, when the catalog gives them, "NSFontFamilyAttribute" and
/// "NSCTFontLocalizedFamilyNameAttribute" (a dictionary from language to name). Elements of
/// `requestedFontAttributeDictionaries` that are not dictionaries with a string
/// "NSFontNameAttribute" are skipped. Null when the argument is null. Returns a new reference;
/// the caller releases it.
CFArrayRef
QZCopyDownloadableFontAttributesForRequests(CFArrayRef requestedFontAttributeDictionaries);
