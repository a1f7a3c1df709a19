// Where the catalogs and their caches live, by the XDG base directory rules, without Qt: the
// user's own catalog, the system catalogs, the publishers' files and the cache; and how their
// files are read.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

/// $XDG_CACHE_HOME/glyphwell (an unset or relative variable: ~/.cache/glyphwell).
std::string QZGlyphwellCacheDirectory();

/// The user's own catalog: $XDG_DATA_HOME/glyphwell/downloadable-fonts.json (default
/// ~/.local/share).
std::string QZUserCatalogPath();

/// glyphwell/downloadable-fonts.json under each of $XDG_DATA_DIRS (default /usr/local/share and
/// /usr/share), in order; relative entries are ignored.
std::vector<std::string> QZSystemCatalogPaths();

/// The folders of publisher files, the user's first: $XDG_CONFIG_HOME/glyphwell/publishers.d
/// (default ~/.config) and /etc/glyphwell/publishers.d.
std::vector<std::string> QZCatalogPublisherDirectories();

/// The whole regular file at `path` when it has at most `limit` bytes, read without ever waiting
/// on a FIFO or a device. Nothing otherwise, with the reason in `*problem` when it is given.
std::optional<std::string> QZReadCatalogFile(const std::string& path, uint64_t limit,
                                             std::string* problem = nullptr);
