// Reads arbitrary bytes as a PDF. A scan ends with fonts or an error, never both.
#include <cstddef>
#include <cstdint>
#include <string_view>

#include "FuzzSupport.h"
#include "documents/QZDocumentReaders.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    const QZDocumentScan scan =
        QZScanPDFBytes(std::string_view(reinterpret_cast<const char*>(data), size));
    fuzz::Check(scan.error.empty() || scan.fonts.empty());
    return 0;
}
