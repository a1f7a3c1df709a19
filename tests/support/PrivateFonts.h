// Font download helpers: DejaVu files as material, and private XDG and fontconfig settings under a
// temporary root so that no font a test downloads is installed before it runs.
#pragma once

#include <QDir>
#include <QFile>
#include <QString>
#include <cstdio>
#include <string>
#include <vector>

#include "desktop/QZFontMatching.h"
#include "support/SHA256.h"
#include "support/Values.h"

namespace glyphwell::testing {

inline const QString kDejaVu = QStringLiteral("/usr/share/fonts/truetype/dejavu/");

inline std::string ReadFile(const QString& path) {
    QFile file(path);
    return file.open(QIODevice::ReadOnly) ? file.readAll().toStdString() : std::string();
}

/// Points XDG and fontconfig at `root`; the user font folder (`root`/data/fonts), empty on failure.
inline QString UsePrivateFonts(const QString& root) {
    const QString fonts = root + "/data/fonts";
    QDir().mkpath(fonts);
    QDir().mkpath(root + "/system");
    QFile config(root + "/fonts.conf");
    if (!config.open(QIODevice::WriteOnly))
        return {};
    config.write(("<?xml version=\"1.0\"?>\n<!DOCTYPE fontconfig SYSTEM \"fonts.dtd\">\n"
                  "<fontconfig>\n  <dir>" +
                  fonts + "</dir>\n  <cachedir>" + root +
                  "/cache/fontconfig</cachedir>\n</fontconfig>\n")
                     .toUtf8());
    config.close();
    qputenv("XDG_DATA_HOME", (root + "/data").toUtf8());
    qputenv("XDG_DATA_DIRS", (root + "/system").toUtf8());
    qputenv("XDG_CACHE_HOME", (root + "/cache").toUtf8());
    qputenv("FONTCONFIG_FILE", (root + "/fonts.conf").toUtf8());
    return QZReloadFontConfiguration() ? fonts : QString();
}

/// One catalog asset: `size` bytes at `url` with `sha256`, holding the font `postScriptName`.
inline std::string CatalogAsset(const std::string& localID, const std::string& url, size_t size,
                                const std::string& sha256, const std::string& postScriptName) {
    return "{\"LocalID\": \"" + localID + "\", \"url\": \"" + url +
           "\", \"size\": " + std::to_string(size) + ", \"sha256\": \"" + sha256 +
           "\", \"fonts\": [{\"postScriptName\": \"" + postScriptName + "\"}]}";
}

/// Writes the user's catalog under `dataHome` listing `assets`; false when it cannot.
inline bool WriteCatalog(const QString& dataHome, const std::vector<std::string>& assets) {
    std::string text = "{\"assets\": [";
    for (size_t i = 0; i < assets.size(); ++i)
        text += (i ? ", " : "") + assets[i];
    text += "]}";
    QDir().mkpath(dataHome + "/glyphwell");
    QFile file(dataHome + "/glyphwell/downloadable-fonts.json");
    return file.open(QIODevice::WriteOnly) &&
           file.write(text.data(), qint64(text.size())) == qint64(text.size());
}

/// An array of descriptors that each name one font, as a request for those fonts.
inline Ref FontNameDescriptors(std::initializer_list<const char*> names) {
    Ref array(CFArrayCreateMutable(nullptr, 0, &kCFTypeArrayCallBacks));
    for (const char* name : names)
        CFArrayAppendValue(array.as<CFMutableArrayRef>(),
                           Dict({{CFSTR("NSFontNameAttribute"), Str(name).get()}}).get());
    return array;
}

/// Undoes UsePrivateFonts: the process's own environment and font configuration again.
inline void StopUsingPrivateFonts() {
    for (const char* name : {"XDG_DATA_HOME", "XDG_DATA_DIRS", "XDG_CACHE_HOME", "FONTCONFIG_FILE"})
        qunsetenv(name);
    QZReloadFontConfiguration();
}

} // namespace glyphwell::testing
