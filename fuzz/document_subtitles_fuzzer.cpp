// Reads arbitrary text as ASS/SSA subtitles.
#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

#include "FuzzSupport.h"
#include "documents/QZDocumentReaders.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    QZFontCollector fonts;
    std::string format;
    const bool read = QZCollectSubtitleFonts(
        std::string_view(reinterpret_cast<const char*>(data), size), fonts, &format);
    fuzz::Check(read == !format.empty());
    for (const QZDocumentFont& font : fonts.Take())
        fuzz::Check(!font.name.empty());
    return 0;
}
