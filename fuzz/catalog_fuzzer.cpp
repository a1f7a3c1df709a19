// Reads arbitrary bytes as a downloadable-font catalog. Every asset kept must be well formed.
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <string_view>

#include "desktop/QZDownloadableFontCatalog.h"
#include "platform/Log.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    static const bool quiet = [] {
        glyphwell::SetLogSink([](const glyphwell::LogRecord&) {});
        return true;
    }();
    (void)quiet;
    const QZDownloadableFontCatalog catalog = QZDownloadableFontCatalog::Parse(
        std::string_view(reinterpret_cast<const char*>(data), size), "fuzz input");
    for (const QZDownloadableFontAsset& asset : catalog.assets)
        if (asset.localID.empty() || asset.sha256.size() != 64)
            std::abort();
    return 0;
}
