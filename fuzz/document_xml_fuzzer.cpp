// Feeds arbitrary bytes to the XML font reader, split in two pieces at a point the input picks.
#include <cstddef>
#include <cstdint>
#include <string>

#include "FuzzSupport.h"
#include "documents/QZDocumentReaders.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    if (size == 0)
        return 0;
    const size_t split = data[0] % size;
    const char* text = reinterpret_cast<const char*>(data + 1);
    QZFontCollector fonts;
    QZXMLFontReader reader(fonts);
    std::string error;
    if (reader.Feed(text, split, false, &error))
        reader.Feed(text + split, size - 1 - split, true, &error);
    for (const QZDocumentFont& font : fonts.Take())
        fuzz::Check(!font.name.empty());
    return 0;
}
