// The readers behind QZScanDocumentFile, one per syntax, and the collector they share. Internal
// to documents/ (and its tests and fuzz targets).
#pragma once

#include <cstdio>
#include <memory>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "documents/QZDocumentFonts.h"
#include "platform/ASCIIText.h"

/// Whitespace as the document syntaxes count it (space, tab, line ends, form feed).
inline bool QZIsWhitespace(char c) {
    return c == ' ' || c == '\t' || c == '\n' || c == '\r' || c == '\f';
}
/// `text` without the whitespace (QZIsWhitespace) at either end.
inline std::string_view QZTrimWhitespace(std::string_view text) {
    while (!text.empty() && QZIsWhitespace(text.front()))
        text.remove_prefix(1);
    while (!text.empty() && QZIsWhitespace(text.back()))
        text.remove_suffix(1);
    return text;
}

/// Gathers the fonts of one document: trims names, drops CSS generic families and empty names,
/// keeps each (name, kind, style) once in order of first mention, and marks a font embedded when
/// any mention says so (a family carried without a style covers every style of it). Keeps at
/// most kQZDocumentFontLimit fonts; a document that names more is refused.
class QZFontCollector {
public:
    static constexpr size_t kQZDocumentFontLimit = 4096;

    void Add(std::string_view name, QZDocumentFontKind kind, std::string_view style = {},
             bool embedded = false);
    /// Adds a family named in a document's own syntax: `Name,Bold` gives family and style.
    void AddCommaStyled(std::string_view name, bool embedded);
    /// The fonts gathered, in order, with embedded families applied.
    std::vector<QZDocumentFont> Take();
    /// Moves the fonts into `scan`, or sets its error when the document named too many.
    void TakeInto(QZDocumentScan& scan);

private:
    std::vector<QZDocumentFont> fonts_;
    std::unordered_map<std::string, size_t> index_; ///< folded (name, kind, style) to position
    bool overflowed_ = false;
};

/// Whether `name` is a CSS generic family or keyword (serif, monospace, inherit, ...).
bool QZIsGenericFamily(std::string_view name);

/// CSS: a style sheet (rules, @font-face, @media nesting), a declaration list (a `style`
/// attribute) and a font-family value list.
void QZCollectCSSStyleSheet(std::string_view css, QZFontCollector& fonts);
void QZCollectCSSDeclarations(std::string_view declarations, QZFontCollector& fonts);
void QZCollectCSSFamilies(std::string_view value, QZFontCollector& fonts, bool embedded = false);

/// HTML and XHTML, read leniently: `<style>` sheets, `style` attributes, `<font face>`.
void QZCollectHTMLFonts(std::string_view html, QZFontCollector& fonts);

/// ASS/SSA subtitles; false when `text` is not one. `format` becomes "ass" or "ssa".
bool QZCollectSubtitleFonts(std::string_view text, QZFontCollector& fonts, std::string* format);

/// A streaming XML reader for the font names of OOXML parts, ODF content and styles (zipped or
/// flat), SVG and XHTML. Feed it the document's bytes in pieces.
class QZXMLFontReader {
public:
    explicit QZXMLFontReader(QZFontCollector& fonts);
    ~QZXMLFontReader();
    QZXMLFontReader(const QZXMLFontReader&) = delete;
    QZXMLFontReader& operator=(const QZXMLFontReader&) = delete;

    /// Parses the next piece; `last` for the final one. False once the document is not
    /// well-formed or breaks a limit, with the reason in `error`.
    bool Feed(const char* bytes, size_t length, bool last, std::string* error);
    /// The root element: its local name and, for a flat ODF document, the format it declares
    /// ("fodt", "fods", "fodp"); empty before the root was read.
    const std::string& RootName() const;
    const std::string& DeclaredFormat() const;

private:
    struct State;
    std::unique_ptr<State> state_;
};

/// PDF from an open file (not closed) or from memory.
QZDocumentScan QZScanPDFFile(FILE* file, const std::string& description);
QZDocumentScan QZScanPDFBytes(std::string_view bytes);

/// ZIP-based formats (OOXML, ODF, EPUB) from a file descriptor (always closed) or from memory.
QZDocumentScan QZScanZipDescriptor(int descriptor);
QZDocumentScan QZScanZipBytes(std::string_view bytes);
