// The pieces of the catalog verbs that touch files, fonts and the network: the faces of a font
// file read with fontconfig, SHA-256 digests, atomic file replacement, and asset downloads.
#pragma once

#include <cstdint>
#include <functional>
#include <map>
#include <string>
#include <vector>

namespace glyphwell::tools {

/// One face of a font file.
struct FontFace {
    std::string postScriptName;
    std::string family; ///< the font's own (first listed) family name
    /// Language identifier (zh-Hans, de, ...) to the family name in that language, for the
    /// languages whose name differs from `family`.
    std::map<std::string, std::string> localizedFamilyNames;
    /// The fontconfig language tags the face covers (its FC_LANG), sorted.
    std::vector<std::string> languages;
};

/// Every face of the font file at `path` (all faces of a collection, in file order; the named
/// instances of a variable font are not faces of their own). False with a message in `*error`
/// when fontconfig cannot read it as a font or a face has no PostScript name.
bool ReadFontFaces(const std::string& path, std::vector<FontFace>* faces, std::string* error);

/// The size and SHA-256 of the file at `path`. False with a message in `*error` when it cannot
/// be read.
bool DigestFile(const std::string& path, uint64_t* size, std::string* sha256, std::string* error);

/// `prefix` joined to the percent-escaped file name of `path` with exactly one "/".
std::string AssetURL(const std::string& prefix, const std::string& path);

/// What a download gave: bytes received, their SHA-256, and why it failed (empty when it did
/// not; an HTTP status of 400 or more counts as a failure).
struct FetchResult {
    uint64_t size = 0;
    bool tooLarge = false; ///< more bytes came than the limit
    std::string sha256;
    std::string error;
};

/// Called during a download with the bytes received so far and the seconds since it began.
using FetchProgress = std::function<void(uint64_t received, double seconds)>;

/// Downloads `url` with libcurl (following redirects) and digests it on the way, keeping nothing.
/// Reading stops when more than `limit` bytes come (the result then says so).
FetchResult FetchAsset(const std::string& url, uint64_t limit, const FetchProgress& progress);

} // namespace glyphwell::tools
