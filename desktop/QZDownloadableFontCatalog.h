// The downloadable fonts: which font assets can be fetched for a requested font, and how large
// they are. The list comes from a JSON catalog, glyphwell/downloadable-fonts.json, found under the
// XDG data directories (the user's own first, then each of XDG_DATA_DIRS); the first one that
// exists is the catalog. Its format is documented in resources/catalog/README.md.
//
// The catalog is read again whenever its file changes (path, size or modification time); a
// catalog that cannot be read or parsed counts as empty and is logged once for that state of the
// file, and an asset that does not have the expected shape is left out with one log line.
// Thread-safe.
#pragma once

#include <QString>
#include <QStringList>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "platform/CFArray.h"

/// One font held by an asset.
struct QZDownloadableFont {
    std::string postScriptName;
    std::string family; ///< may be empty
    /// Language identifier to family name in that language.
    std::map<std::string, std::string> localizedFamilyNames;
};

/// One downloadable asset: a file holding one or more fonts.
struct QZDownloadableFontAsset {
    std::string localID; ///< the asset's identifier, unique in the catalog
    std::string url;
    uint64_t size = 0;  ///< bytes to download, at most INT64_MAX
    std::string sha256; ///< 64 lower-case hexadecimal digits
    std::vector<QZDownloadableFont> fonts;
};

struct QZDownloadableFontCatalog {
    std::vector<QZDownloadableFontAsset> assets;

    /// Reads a catalog from `bytes`; `origin` names it in log lines. Text that is not a JSON
    /// object with an "assets" array gives an empty catalog and one log line; each malformed
    /// asset is left out with one log line.
    static QZDownloadableFontCatalog Parse(std::string_view bytes, const std::string& origin);
};

/// The places searched for the catalog, in order.
QStringList QZDownloadableFontCatalogPaths();
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
