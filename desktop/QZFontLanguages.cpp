#include "desktop/QZFontLanguages.h"

#include <dlfcn.h>
#include <fontconfig/fontconfig.h>

#include <algorithm>
#include <memory>

#include "platform/ASCIIText.h"

namespace {

constexpr size_t kMaximumTagSize = 32;

bool IsASCIILetter(char c) {
    return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z');
}

std::string_view PrimaryLanguage(std::string_view tag) {
    return tag.substr(0, tag.find('-'));
}

/// `text` without blanks and in ASCII lower case, as fontconfig compares family names.
std::string FamilyKey(std::string_view text) {
    std::string key;
    for (char c : text)
        if (c != ' ')
            key += glyphwell::LowerASCII(c);
    return key;
}

enum class Style { Regular, Bold, Other };

/// The style a PostScript name says after its last "-": none, Regular, Roman or Book is the
/// upright regular face, Bold the bold one.
Style StyleOf(std::string_view postScriptName) {
    const size_t dash = postScriptName.rfind('-');
    if (dash == std::string_view::npos)
        return Style::Regular;
    const std::string_view style = postScriptName.substr(dash + 1);
    if (style == "Regular" || style == "Roman" || style == "Book")
        return Style::Regular;
    return style == "Bold" ? Style::Bold : Style::Other;
}

/// Of `family` (a catalog family key), the fonts that `accepts`, narrowed to the upright regular
/// and bold faces when there are any, else to the first one.
template <typename Accepts>
std::vector<const QZDownloadableFont*> FacesOfFamily(const QZDownloadableFontCatalog& catalog,
                                                     const std::string& family, Accepts accepts) {
    std::vector<const QZDownloadableFont*> fonts;
    for (const QZDownloadableFontAsset& asset : catalog.assets)
        for (const QZDownloadableFont& font : asset.fonts)
            if (FamilyKey(font.family) == family && accepts(font))
                fonts.push_back(&font);
    std::vector<const QZDownloadableFont*> chosen;
    bool haveRegular = false, haveBold = false;
    for (const QZDownloadableFont* font : fonts) {
        const Style style = StyleOf(font->postScriptName);
        bool& have = style == Style::Regular ? haveRegular : haveBold;
        if (style != Style::Other && !have) {
            have = true;
            chosen.push_back(font);
        }
    }
    if (chosen.empty() && !fonts.empty())
        chosen.push_back(fonts.front());
    return chosen;
}

bool CoversLanguage(const QZDownloadableFont& font, std::string_view tag) {
    return std::any_of(font.languages.begin(), font.languages.end(),
                       [tag](std::string_view own) { return QZFontLanguageServes(own, tag); });
}

} // namespace

std::string QZFontLanguageTag(std::string_view text) {
    if (text.empty() || text.size() > kMaximumTagSize)
        return {};
    std::string tag;
    for (char c : text) {
        if (c == '_')
            c = '-';
        if (!IsASCIILetter(c) && !(c >= '0' && c <= '9') && c != '-')
            return {};
        tag += glyphwell::LowerASCII(c);
    }
    if (tag.front() == '-' || tag.back() == '-' || tag.find("--") != std::string::npos)
        return {};
    const std::string_view primary = PrimaryLanguage(tag);
    if (primary.size() < 2 || primary.size() > 3 ||
        !std::all_of(primary.begin(), primary.end(), IsASCIILetter))
        return {};
    return tag;
}

bool QZFontLanguageServes(std::string_view tag, std::string_view wanted) {
    if (tag == wanted)
        return true;
    return PrimaryLanguage(tag) == PrimaryLanguage(wanted) &&
           (tag.find('-') == std::string_view::npos || wanted.find('-') == std::string_view::npos);
}

/// The fontconfig functions the view calls. When the process has not loaded fontconfig, the view
/// loads it and, once done, ends and unloads it (FcFini, dlclose): a long-running process that
/// asks now and then, such as the bus bridge, then keeps none of it mapped in between.
struct QZInstalledFontView::Library {
    void* handle = nullptr;
    bool loadedHere = false;
    decltype(&::FcInitLoadConfigAndFonts) FcInitLoadConfigAndFonts = nullptr;
    decltype(&::FcConfigDestroy) FcConfigDestroy = nullptr;
    decltype(&::FcPatternCreate) FcPatternCreate = nullptr;
    decltype(&::FcPatternDestroy) FcPatternDestroy = nullptr;
    decltype(&::FcObjectSetBuild) FcObjectSetBuild = nullptr;
    decltype(&::FcObjectSetDestroy) FcObjectSetDestroy = nullptr;
    decltype(&::FcLangSetCreate) FcLangSetCreate = nullptr;
    decltype(&::FcLangSetAdd) FcLangSetAdd = nullptr;
    decltype(&::FcLangSetDestroy) FcLangSetDestroy = nullptr;
    decltype(&::FcPatternAddLangSet) FcPatternAddLangSet = nullptr;
    decltype(&::FcPatternAddString) FcPatternAddString = nullptr;
    decltype(&::FcFontList) FcFontList = nullptr;
    decltype(&::FcFontSetDestroy) FcFontSetDestroy = nullptr;
    decltype(&::FcFini) FcFini = nullptr;

    template <typename Function> bool Resolve(Function& function, const char* name) {
        function = reinterpret_cast<Function>(dlsym(handle, name));
        return function != nullptr;
    }
    bool Load() {
        handle = dlopen("libfontconfig.so.1", RTLD_NOW | RTLD_LOCAL | RTLD_NOLOAD);
        loadedHere = !handle;
        if (!handle)
            handle = dlopen("libfontconfig.so.1", RTLD_NOW | RTLD_LOCAL);
        return handle && Resolve(FcInitLoadConfigAndFonts, "FcInitLoadConfigAndFonts") &&
               Resolve(FcConfigDestroy, "FcConfigDestroy") &&
               Resolve(FcPatternCreate, "FcPatternCreate") &&
               Resolve(FcPatternDestroy, "FcPatternDestroy") &&
               Resolve(FcObjectSetBuild, "FcObjectSetBuild") &&
               Resolve(FcObjectSetDestroy, "FcObjectSetDestroy") &&
               Resolve(FcLangSetCreate, "FcLangSetCreate") &&
               Resolve(FcLangSetAdd, "FcLangSetAdd") &&
               Resolve(FcLangSetDestroy, "FcLangSetDestroy") &&
               Resolve(FcPatternAddLangSet, "FcPatternAddLangSet") &&
               Resolve(FcPatternAddString, "FcPatternAddString") &&
               Resolve(FcFontList, "FcFontList") && Resolve(FcFontSetDestroy, "FcFontSetDestroy") &&
               Resolve(FcFini, "FcFini");
    }
    ~Library() {
        if (!handle)
            return;
        if (loadedHere && FcFini)
            FcFini();
        dlclose(handle);
    }
};

QZInstalledFontView::QZInstalledFontView() : library_(std::make_unique<Library>()) {
    if (library_->Load())
        config_ = library_->FcInitLoadConfigAndFonts();
}

QZInstalledFontView::~QZInstalledFontView() {
    if (config_)
        library_->FcConfigDestroy(config_);
}

bool QZInstalledFontView::Lists(const char* object, const std::string& value) const {
    if (!config_)
        return false;
    const Library& fc = *library_;
    std::unique_ptr<FcPattern, decltype(fc.FcPatternDestroy)> pattern(fc.FcPatternCreate(),
                                                                      fc.FcPatternDestroy);
    std::unique_ptr<FcObjectSet, decltype(fc.FcObjectSetDestroy)> objects(
        fc.FcObjectSetBuild(FC_FAMILY, nullptr), fc.FcObjectSetDestroy);
    if (!pattern || !objects)
        return false;
    if (object == std::string_view(FC_LANG)) {
        FcLangSet* languages = fc.FcLangSetCreate();
        if (!languages)
            return false;
        fc.FcLangSetAdd(languages, reinterpret_cast<const FcChar8*>(value.c_str()));
        fc.FcPatternAddLangSet(pattern.get(), FC_LANG, languages);
        fc.FcLangSetDestroy(languages);
    } else {
        fc.FcPatternAddString(pattern.get(), object,
                              reinterpret_cast<const FcChar8*>(value.c_str()));
    }
    FcFontSet* set = fc.FcFontList(config_, pattern.get(), objects.get());
    const bool found = set && set->nfont > 0;
    if (set)
        fc.FcFontSetDestroy(set);
    return found;
}

bool QZInstalledFontView::CoversLanguage(const std::string& tag) const {
    return Lists(FC_LANG, tag);
}

bool QZInstalledFontView::HasFamily(const std::string& family) const {
    return Lists(FC_FAMILY, family);
}

std::vector<const QZDownloadableFont*>
QZCatalogFontsForLanguage(const QZDownloadableFontCatalog& catalog, std::string_view tag) {
    for (const QZDownloadableFontAsset& asset : catalog.assets)
        for (const QZDownloadableFont& font : asset.fonts)
            if (CoversLanguage(font, tag))
                return FacesOfFamily(catalog, FamilyKey(font.family),
                                     [tag](const QZDownloadableFont& candidate) {
                                         return CoversLanguage(candidate, tag);
                                     });
    return {};
}

std::vector<const QZDownloadableFont*>
QZCatalogFontsForFamily(const QZDownloadableFontCatalog& catalog, std::string_view family) {
    const std::string key = FamilyKey(family);
    if (key.empty())
        return {};
    return FacesOfFamily(catalog, key, [](const QZDownloadableFont&) { return true; });
}
