#include "desktop/QZCatalogPaths.h"

#include <cstdlib>

#include "platform/HomeDirectory.h"

namespace {

constexpr char kCatalogRelativePath[] = "glyphwell/downloadable-fonts.json";

/// The absolute directory in `variable`, else `fallback` under the home directory.
std::string BaseDirectory(const char* variable, const char* fallback) {
    const char* value = std::getenv(variable);
    if (value && value[0] == '/')
        return value;
    return glyphwell::HomeDirectory() + "/" + fallback;
}

} // namespace

std::string QZGlyphwellCacheDirectory() {
    return BaseDirectory("XDG_CACHE_HOME", ".cache") + "/glyphwell";
}

std::string QZUserCatalogPath() {
    return BaseDirectory("XDG_DATA_HOME", ".local/share") + "/" + kCatalogRelativePath;
}

std::vector<std::string> QZSystemCatalogPaths() {
    const char* value = std::getenv("XDG_DATA_DIRS");
    const std::string list = value && *value ? value : "/usr/local/share:/usr/share";
    std::vector<std::string> paths;
    for (size_t start = 0; start <= list.size();) {
        size_t end = list.find(':', start);
        if (end == std::string::npos)
            end = list.size();
        std::string directory = list.substr(start, end - start);
        while (directory.size() > 1 && directory.back() == '/')
            directory.pop_back();
        if (!directory.empty() && directory[0] == '/')
            paths.push_back(directory + "/" + kCatalogRelativePath);
        start = end + 1;
    }
    return paths;
}

std::vector<std::string> QZCatalogPublisherDirectories() {
    return {BaseDirectory("XDG_CONFIG_HOME", ".config") + "/glyphwell/publishers.d",
            "/etc/glyphwell/publishers.d"};
}
