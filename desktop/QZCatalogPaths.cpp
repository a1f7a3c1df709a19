#include "desktop/QZCatalogPaths.h"

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include "cfutil/CFUserDirectories.h"
#include "platform/ReadFile.h"

namespace {

constexpr char kCatalogRelativePath[] = "glyphwell/downloadable-fonts.json";

} // namespace

std::string QZGlyphwellCacheDirectory() {
    return GetUserBaseDirectory(XDGUserDirectory::Cache) + "/glyphwell";
}

std::string QZUserCatalogPath() {
    return GetUserBaseDirectory(XDGUserDirectory::Data) + "/" + kCatalogRelativePath;
}

std::vector<std::string> QZSystemCatalogPaths() {
    std::vector<std::string> paths;
    for (const std::string& directory : GetSystemDataDirectories())
        paths.push_back(directory + "/" + kCatalogRelativePath);
    return paths;
}

std::vector<std::string> QZCatalogPublisherDirectories() {
    return {GetUserBaseDirectory(XDGUserDirectory::Config) + "/glyphwell/publishers.d",
            "/etc/glyphwell/publishers.d"};
}

std::optional<std::string> QZReadCatalogFile(const std::string& path, uint64_t limit,
                                             std::string* problem) {
    std::string reason;
    std::string bytes;
    const int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY);
    struct stat status {};
    if (fd < 0 || fstat(fd, &status) != 0)
        reason = std::strerror(errno);
    else if (!S_ISREG(status.st_mode))
        reason = "not a regular file";
    else if (uint64_t(status.st_size) > limit)
        reason = "larger than " + std::to_string(limit) + " bytes";
    // A file that grows while it is read is cut at the size it had; one that shrinks, at its end.
    else if (!glyphwell::ReadUpTo(fd, size_t(status.st_size), &bytes))
        reason = std::strerror(errno);
    if (fd >= 0)
        close(fd);
    if (reason.empty())
        return bytes;
    if (problem)
        *problem = reason;
    return std::nullopt;
}
