// Reads arbitrary text as a style sheet, a declaration list and HTML: every name kept is
// non-empty and no generic family.
#include <cstddef>
#include <cstdint>
#include <string_view>

#include "FuzzSupport.h"
#include "documents/QZDocumentReaders.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    const std::string_view text(reinterpret_cast<const char*>(data), size);
    QZFontCollector fonts;
    QZCollectCSSStyleSheet(text, fonts);
    QZCollectCSSDeclarations(text, fonts);
    QZCollectHTMLFonts(text, fonts);
    for (const QZDocumentFont& font : fonts.Take())
        fuzz::Check(!font.name.empty() && !QZIsGenericFamily(font.name));
    return 0;
}
