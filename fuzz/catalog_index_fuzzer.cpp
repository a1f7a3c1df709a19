// Reads arbitrary bytes as a compiled catalog index. Whatever it accepts must hold only views
// inside the input, find only assets that hold the name looked up, and compile back into an
// index that reads the same.
#include <cstddef>
#include <cstdint>
#include <string_view>

#include "FuzzSupport.h"
#include "desktop/QZCatalogIndex.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    fuzz::Quiet();
    const std::string_view bytes(reinterpret_cast<const char*>(data), size);
    const auto inside = [&](std::string_view text) {
        return text.empty() || (text.data() >= bytes.data() &&
                                text.data() + text.size() <= bytes.data() + bytes.size());
    };
    QZCatalogIndexKey key;
    const auto view = QZCatalogIndexView::Open(bytes, nullptr, &key);
    if (!view)
        return 0;
    const QZDownloadableFontCatalog catalog = view->Catalog({}, true);
    for (const QZDownloadableFontAsset& asset : catalog.assets) {
        fuzz::Check(inside(asset.localID) && inside(asset.url) && inside(asset.sha256) &&
                    !asset.fonts.empty());
        for (const QZDownloadableFont& font : asset.fonts) {
            fuzz::Check(inside(font.postScriptName) && inside(font.family));
            for (const QZLocalizedName& name : font.localizedFamilyNames)
                fuzz::Check(inside(name.language) && inside(name.name));
            for (const std::string_view language : font.languages)
                fuzz::Check(inside(language));
            for (const uint32_t found : view->AssetsOffering(font.postScriptName)) {
                fuzz::Check(found < view->AssetCount());
                const QZDownloadableFontCatalog one = view->Catalog({found});
                bool holds = one.assets.empty(); // left out as damaged
                for (const QZDownloadableFontAsset& held : one.assets)
                    for (const QZDownloadableFont& other : held.fonts)
                        holds = holds || other.postScriptName == font.postScriptName;
                fuzz::Check(holds);
            }
        }
    }
    // What was accepted compiles into an index that reads the same.
    const std::string again = QZCompileCatalogIndex(catalog, key);
    QZCatalogIndexKey keyAgain;
    const auto reread = QZReadCatalogIndex(again, nullptr, &keyAgain);
    fuzz::Check(reread && keyAgain == key && reread->assets.size() == catalog.assets.size());
    return 0;
}
