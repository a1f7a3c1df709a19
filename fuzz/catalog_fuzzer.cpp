// Reads arbitrary bytes as a downloadable-font catalog. Every asset kept must be well formed.
#include <cstddef>
#include <cstdint>
#include <string_view>

#include "FuzzSupport.h"
#include "desktop/QZDownloadableFontCatalog.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    fuzz::Quiet();
    const QZDownloadableFontCatalog catalog = QZDownloadableFontCatalog::Parse(
        std::string_view(reinterpret_cast<const char*>(data), size), "fuzz input");
    for (const QZDownloadableFontAsset& asset : catalog.assets) {
        fuzz::Check(!asset.localID.empty() && asset.sha256.size() == 64);
        for (const QZDownloadableFont& font : asset.fonts)
            for (std::string_view language : font.languages)
                fuzz::Check(!language.empty());
    }
    return 0;
}
