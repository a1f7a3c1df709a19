// The installed fonts, as fontconfig sees them: looking a font up by its exact PostScript name,
// and making a font file that was just written known to this process and to other applications.
//
// fontconfig's current configuration is shared by the whole process and changed by registering
// a file, so every fontconfig call of the agent goes through these functions, under one lock.
// Thread-safe.
#pragma once

#include <optional>
#include <string>
#include <vector>

/// One installed font that fontconfig lists.
struct QZInstalledFont {
    std::string postScriptName;
    std::string family; ///< fontconfig's first family name; may be empty
    std::string file;   ///< path of the file that holds the font
};

/// The installed font whose PostScript name is exactly `postScriptName` (case-sensitive), or
/// nothing. This is a listing, not a best match: a font that is not installed is not found,
/// whatever resembles it. An empty name finds nothing.
std::optional<QZInstalledFont> QZFindInstalledFont(const std::string& postScriptName);

/// Whether QZFindInstalledFont finds `postScriptName`; suits QZSetInstalledFontCheck.
bool QZIsFontInstalled(const std::string& postScriptName);

/// The PostScript names of the faces in the font file `path` (every face of a collection), in
/// file order; nothing when fontconfig cannot read the file as a font. Registers nothing.
std::optional<std::vector<std::string>> QZFontFilePostScriptNames(const std::string& path);

/// Makes the font file `path`, just written into `directory`, known at once to this process's
/// fontconfig configuration, and brings the user's fontconfig cache of `directory` (and of its
/// parent, when fontconfig scans the parent) up to date, so that other applications find the
/// font without scanning again. False, with nothing registered, when fontconfig cannot read the
/// file as a font.
///
/// NOTE: fontconfig reloads its configuration when it finds that its directories changed; a file
/// outside every configured directory is then no longer known to this process.
bool QZRegisterInstalledFontFile(const std::string& path, const std::string& directory);

/// Drops fontconfig's current configuration and loads it afresh: FONTCONFIG_FILE, the
/// configuration files and the font directories are read again, and files registered by
/// QZRegisterInstalledFontFile are forgotten unless a configured directory holds them. False when
/// the new configuration cannot be loaded (the old one then stays).
bool QZReloadFontConfiguration();
