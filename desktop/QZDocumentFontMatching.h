// Where the fonts a document names stand on this machine: carried by the document, installed
// (fontconfig lists that family and style, as applications see it), offered by the downloadable
// font catalog, or missing.
//
// A name matches a face by the first rule that finds one: the exact PostScript name, then the
// family with the exact style, then the full name, then the family (in any of its localized
// names, spaces ignored) with the nearest weight and slant; a family named without a style
// matches every face of it. Qt-free.
#pragma once

#include <string>
#include <vector>

#include "desktop/QZDownloadableFontCatalog.h"
#include "documents/QZDocumentFonts.h"

enum class QZDocumentFontState { Embedded, Installed, Offered, Missing };

/// "embedded", "installed", "offered" or "missing".
const char* QZDocumentFontStateName(QZDocumentFontState state);

/// One face a document's names can match: an installed font or a catalog font.
struct QZMatchableFace {
    std::string postScriptName;
    std::vector<std::string> families;  ///< every family name, localized ones included
    std::string style;                  ///< e.g. "Bold Italic"; may be empty
    std::vector<std::string> fullNames; ///< may be empty
    int weight = 400;                   ///< on the CSS scale (400 regular, 700 bold)
    bool italic = false;
};

/// The rule by which a name matched.
enum class QZFontMatchRule { None, PostScriptName, FamilyAndStyle, FullName, NearestInFamily };

/// The faces of `faces` that `font` names, by the first rule that finds any (by family: the
/// nearest face to the style given, or every face without one); `rule` receives that rule.
/// Pointers into `faces`.
std::vector<const QZMatchableFace*> QZMatchDocumentFont(const QZDocumentFont& font,
                                                        const std::vector<QZMatchableFace>& faces,
                                                        QZFontMatchRule* rule = nullptr);

/// The installed fonts, as fontconfig's current configuration lists them.
std::vector<QZMatchableFace> QZInstalledMatchableFaces();

/// The fonts of `catalog`; style, weight and slant come from the PostScript name's suffix
/// ("Lato-BoldItalic").
std::vector<QZMatchableFace> QZCatalogMatchableFaces(const QZDownloadableFontCatalog& catalog);

/// A document font's state and, when offered, the catalog fonts that match.
struct QZDocumentFontMatch {
    QZDocumentFontState state = QZDocumentFontState::Missing;
    QZFontMatchRule rule = QZFontMatchRule::None;
    std::vector<std::string> postScriptNames; ///< catalog fonts, for Offered
    std::vector<std::string> families;        ///< their families, parallel to postScriptNames
};

/// Matches document fonts against a fixed view of the installed and the offered fonts.
class QZDocumentFontMatcher {
public:
    QZDocumentFontMatcher(std::vector<QZMatchableFace> installed,
                          std::vector<QZMatchableFace> offered);
    /// The fonts installed now and the current catalog.
    static QZDocumentFontMatcher ForThisMachine();

    QZDocumentFontMatch Match(const QZDocumentFont& font) const;

private:
    std::vector<QZMatchableFace> installed_;
    std::vector<QZMatchableFace> offered_;
};
