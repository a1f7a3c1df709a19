#include "desktop/QZFontMatching.h"

#include <fontconfig/fontconfig.h>
#include <mutex>

#include "platform/Log.h"
#include "platform/LogEscape.h"

namespace {

std::mutex& FontconfigMutex() {
    static std::mutex mutex;
    return mutex;
}

/// The current configuration, loaded on first use. Called under the lock.
FcConfig* CurrentConfig() {
    static std::once_flag once;
    std::call_once(once, [] { FcInit(); });
    return FcConfigGetCurrent();
}

std::string PatternString(FcPattern* pattern, const char* object) {
    FcChar8* value = nullptr;
    if (FcPatternGetString(pattern, object, 0, &value) != FcResultMatch || !value)
        return {};
    return reinterpret_cast<const char*>(value);
}

/// Whether fontconfig already scans `directory` (a configured directory or one below it).
bool IsConfiguredFontDirectory(FcConfig* config, const std::string& directory) {
    FcStrList* directories = FcConfigGetFontDirs(config);
    if (!directories)
        return false;
    bool found = false;
    while (FcChar8* entry = FcStrListNext(directories)) {
        if (directory == reinterpret_cast<const char*>(entry)) {
            found = true;
            break;
        }
    }
    FcStrListDone(directories);
    return found;
}

/// Writes the cache of `directory` afresh. Called under the lock.
void RescanDirectoryCache(FcConfig* config, const std::string& directory) {
    const auto* path = reinterpret_cast<const FcChar8*>(directory.c_str());
    // A rescan keeps the fonts of an existing cache and reads only what changed; a directory
    // without a cache is scanned whole.
    FcCache* cache = FcDirCacheRescan(path, config);
    if (!cache)
        cache = FcDirCacheRead(path, FcTrue, config);
    if (cache)
        FcDirCacheUnload(cache);
    else
        glyphwell::AppLog("Cannot update the font cache of %s",
                          glyphwell::LogEscape(directory).c_str());
}

} // namespace

std::optional<QZInstalledFont> QZFindInstalledFont(const std::string& postScriptName) {
    if (postScriptName.empty())
        return std::nullopt;
    std::lock_guard<std::mutex> lock(FontconfigMutex());
    CurrentConfig();
    FcPattern* pattern = FcPatternCreate();
    FcObjectSet* objects = FcObjectSetBuild(FC_POSTSCRIPT_NAME, FC_FAMILY, FC_FILE, nullptr);
    if (!pattern || !objects) {
        if (pattern)
            FcPatternDestroy(pattern);
        if (objects)
            FcObjectSetDestroy(objects);
        return std::nullopt;
    }
    FcPatternAddString(pattern, FC_POSTSCRIPT_NAME,
                       reinterpret_cast<const FcChar8*>(postScriptName.c_str()));
    // No configuration given: fontconfig first brings the current one up to date when its
    // directories changed since the last check (at most every rescan interval).
    FcFontSet* fonts = FcFontList(nullptr, pattern, objects);
    std::optional<QZInstalledFont> found;
    // fontconfig compares names without regard to case; a PostScript name is exact.
    for (int i = 0; fonts && i < fonts->nfont && !found; ++i) {
        QZInstalledFont font{PatternString(fonts->fonts[i], FC_POSTSCRIPT_NAME),
                             PatternString(fonts->fonts[i], FC_FAMILY),
                             PatternString(fonts->fonts[i], FC_FILE)};
        if (font.postScriptName == postScriptName)
            found = std::move(font);
    }
    if (fonts)
        FcFontSetDestroy(fonts);
    FcObjectSetDestroy(objects);
    FcPatternDestroy(pattern);
    return found;
}

bool QZIsFontInstalled(const std::string& postScriptName) {
    return QZFindInstalledFont(postScriptName).has_value();
}

std::optional<std::vector<std::string>> QZFontFilePostScriptNames(const std::string& path) {
    std::lock_guard<std::mutex> lock(FontconfigMutex());
    CurrentConfig();
    FcFontSet* faces = FcFontSetCreate();
    if (!faces)
        return std::nullopt;
    int count = 0;
    // Face index -1 (all bits set) asks for every face of the file.
    const unsigned read = FcFreeTypeQueryAll(reinterpret_cast<const FcChar8*>(path.c_str()),
                                             unsigned(-1), nullptr, &count, faces);
    std::optional<std::vector<std::string>> names;
    if (read > 0 && faces->nfont > 0) {
        names.emplace();
        for (int i = 0; i < faces->nfont; ++i)
            names->push_back(PatternString(faces->fonts[i], FC_POSTSCRIPT_NAME));
    }
    FcFontSetDestroy(faces);
    return names;
}

bool QZRegisterInstalledFontFile(const std::string& path, const std::string& directory) {
    std::lock_guard<std::mutex> lock(FontconfigMutex());
    FcConfig* config = CurrentConfig();
    if (!FcConfigAppFontAddFile(config, reinterpret_cast<const FcChar8*>(path.c_str())))
        return false;
    RescanDirectoryCache(config, directory);
    // A directory that was just created is new to its parent's cache too.
    const size_t slash = directory.find_last_of('/');
    if (slash != std::string::npos && slash > 0) {
        const std::string parent = directory.substr(0, slash);
        if (IsConfiguredFontDirectory(config, parent))
            RescanDirectoryCache(config, parent);
    }
    return true;
}

bool QZReloadFontConfiguration() {
    std::lock_guard<std::mutex> lock(FontconfigMutex());
    CurrentConfig();
    return FcInitReinitialize() == FcTrue;
}
