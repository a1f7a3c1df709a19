// One streaming expat reader for every XML syntax that names fonts. Elements and attributes are
// recognised by their local names (namespaces resolved by expat, prefixes ignored), which the
// formats keep apart:
//
//   - OOXML: w:rFonts (ascii, hAnsi, eastAsia, cs), w:font name in the font table with its
//     w:embed* children, a:latin/a:ea/a:cs/a:sym typeface (themes and runs), the spreadsheet's
//     font name and rFont, p:embeddedFont;
//   - ODF: style:font-face svg:font-family (embedded when it holds a font-face-uri),
//     fo:font-family and style:font-family-asian/-complex;
//   - SVG and XHTML: font-family attributes, style attributes and <style> sheets, font-face.
// Debian builds expat with DTD support, which declares the amplification limits.
#define XML_DTD 1
#include <expat.h>

#include <algorithm>
#include <string>
#include <vector>

#include "documents/QZDocumentReaders.h"

namespace {

/// The local name of expat's "uri local" pair.
std::string_view LocalName(const XML_Char* name) {
    std::string_view text(name);
    const size_t space = text.rfind(' ');
    return space == std::string_view::npos ? text : text.substr(space + 1);
}

bool HasNamespace(const XML_Char* name) {
    return std::string_view(name).find(' ') != std::string_view::npos;
}

bool IsThemeReference(std::string_view typeface) {
    return typeface.empty() || typeface.front() == '+';
}

struct Element {
    std::string local;
    bool styleSheet = false; ///< an SVG or XHTML <style>: its text is CSS
    std::string fontFace;    ///< a font-face element's family, embedded when it holds a source
    bool fontFaceSource = false;
};

} // namespace

struct QZXMLFontReader::State {
    explicit State(QZFontCollector& collector) : fonts(collector) {}

    QZFontCollector& fonts;
    XML_Parser parser = nullptr;
    std::vector<Element> stack;
    std::string rootName;
    std::string declaredFormat;
    std::string styleText;
    std::string failure;

    void Start(const XML_Char* name, const XML_Char** attributes) {
        if (stack.size() >= kQZDocumentDepthLimit) {
            failure = "elements nested deeper than " + std::to_string(kQZDocumentDepthLimit);
            XML_StopParser(parser, XML_FALSE);
            return;
        }
        Element element;
        element.local = LocalName(name);
        const std::string_view parent = stack.empty() ? std::string_view() : stack.back().local;
        if (stack.empty()) {
            rootName = element.local;
            for (const XML_Char** a = attributes; *a; a += 2)
                if (LocalName(a[0]) == "mimetype") {
                    const std::string_view type(a[1]);
                    if (type.ends_with("opendocument.text"))
                        declaredFormat = "fodt";
                    else if (type.ends_with("opendocument.spreadsheet"))
                        declaredFormat = "fods";
                    else if (type.ends_with("opendocument.presentation"))
                        declaredFormat = "fodp";
                }
        }
        const std::string& local = element.local;
        for (const XML_Char** a = attributes; *a; a += 2) {
            const std::string_view attribute = LocalName(a[0]);
            const std::string_view value(a[1]);
            if (attribute == "font-family") {
                if (local == "font-face")
                    element.fontFace = value;
                else
                    QZCollectCSSFamilies(value, fonts);
            } else if (attribute == "font-family-asian" || attribute == "font-family-complex") {
                QZCollectCSSFamilies(value, fonts); // ODF text properties for other scripts
            } else if (attribute == "style" && !HasNamespace(a[0])) {
                QZCollectCSSDeclarations(value, fonts);
            } else if (local == "rFonts" && (attribute == "ascii" || attribute == "hAnsi" ||
                                             attribute == "eastAsia" || attribute == "cs")) {
                fonts.Add(value, QZDocumentFontKind::Family);
            } else if (local == "font" && attribute == "name" && parent == "fonts") {
                fonts.Add(value, QZDocumentFontKind::Family);
            } else if ((local == "latin" || local == "ea" || local == "cs" || local == "sym") &&
                       attribute == "typeface" && !IsThemeReference(value)) {
                fonts.Add(value, QZDocumentFontKind::Family);
            } else if (local == "font" && attribute == "typeface" && parent == "embeddedFont") {
                fonts.Add(value, QZDocumentFontKind::Family, {}, true);
            } else if ((local == "name" && parent == "font") || local == "rFont") {
                if (attribute == "val")
                    fonts.Add(value, QZDocumentFontKind::Family);
            }
        }
        // A font table entry with an embedded file: the family is carried.
        if (local.starts_with("embed") && parent == "font" && !stack.back().fontFace.empty())
            fonts.Add(stack.back().fontFace, QZDocumentFontKind::Family, {}, true);
        if (local == "font" && parent == "fonts")
            for (const XML_Char** a = attributes; *a; a += 2)
                if (LocalName(a[0]) == "name")
                    element.fontFace = a[1];
        if (local == "font-face-uri" || local == "font-face-src" || local == "binary-data")
            for (Element& outer : stack)
                if (outer.local == "font-face")
                    outer.fontFaceSource = true;
        const std::string_view qualified(name);
        element.styleSheet =
            local == "style" &&
            (!HasNamespace(name) || qualified.starts_with("http://www.w3.org/2000/svg ") ||
             qualified.starts_with("http://www.w3.org/1999/xhtml "));
        if (element.styleSheet)
            styleText.clear();
        stack.push_back(std::move(element));
    }

    void End() {
        if (stack.empty())
            return;
        Element& element = stack.back();
        if (element.styleSheet)
            QZCollectCSSStyleSheet(styleText, fonts);
        if (element.local == "font-face" && !element.fontFace.empty()) {
            // svg:font-family may hold a quoted name or a list; the first one is the face's.
            QZFontCollector one;
            QZCollectCSSFamilies(element.fontFace, one);
            for (const QZDocumentFont& font : one.Take())
                fonts.Add(font.name, QZDocumentFontKind::Family, {}, element.fontFaceSource);
        }
        stack.pop_back();
    }

    void Text(const XML_Char* text, int length) {
        if (!stack.empty() && stack.back().styleSheet && styleText.size() < kQZDocumentTextLimit)
            styleText.append(text, size_t(length));
    }
};

QZXMLFontReader::QZXMLFontReader(QZFontCollector& fonts) : state_(std::make_unique<State>(fonts)) {
    State* state = state_.get();
    state->parser = XML_ParserCreateNS(nullptr, ' ');
    if (!state->parser)
        return;
    XML_SetUserData(state->parser, state);
    // Entity expansion beyond 20 times the input (past the first 4 MiB) ends the parse.
    XML_SetBillionLaughsAttackProtectionMaximumAmplification(state->parser, 20.0f);
    XML_SetBillionLaughsAttackProtectionActivationThreshold(state->parser, 4u << 20);
    XML_SetElementHandler(
        state->parser,
        [](void* data, const XML_Char* name, const XML_Char** attributes) {
            static_cast<State*>(data)->Start(name, attributes);
        },
        [](void* data, const XML_Char*) { static_cast<State*>(data)->End(); });
    XML_SetCharacterDataHandler(state->parser, [](void* data, const XML_Char* text, int length) {
        static_cast<State*>(data)->Text(text, length);
    });
}

QZXMLFontReader::~QZXMLFontReader() {
    if (state_->parser)
        XML_ParserFree(state_->parser);
}

bool QZXMLFontReader::Feed(const char* bytes, size_t length, bool last, std::string* error) {
    if (!state_->parser) {
        *error = "out of memory";
        return false;
    }
    while (length > 0 || last) {
        const int piece = int(std::min<size_t>(length, 1 << 20));
        const bool final = last && size_t(piece) == length;
        if (XML_Parse(state_->parser, bytes, piece, final) != XML_STATUS_OK) {
            *error = !state_->failure.empty()
                         ? state_->failure
                         : "XML error at line " +
                               std::to_string(XML_GetCurrentLineNumber(state_->parser)) + ": " +
                               XML_ErrorString(XML_GetErrorCode(state_->parser));
            return false;
        }
        bytes += piece;
        length -= size_t(piece);
        if (final)
            break;
    }
    return true;
}

const std::string& QZXMLFontReader::RootName() const {
    return state_->rootName;
}
const std::string& QZXMLFontReader::DeclaredFormat() const {
    return state_->declaredFormat;
}
