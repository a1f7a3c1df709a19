#include "desktop/QZPartialDownload.h"

#include <cerrno>
#include <ctime>
#include <dirent.h>
#include <fcntl.h>
#include <filesystem>
#include <memory>
#include <sstream>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include "desktop/QZCatalogPaths.h"
#include "platform/ReadFile.h"
#include "platform/ReplaceFile.h"

namespace {

struct DirectoryCloser {
    void operator()(DIR* directory) const { closedir(directory); }
};

constexpr size_t kMaximumMetadataSize = 16 << 10;

bool IsHexName(const std::string& name) {
    return name.size() == 64 && name.find_first_not_of("0123456789abcdef") == std::string::npos;
}

/// Removes the partials of `directory` (and their metadata) not used for the lifetime, unless a
/// download holds them.
void RemoveStalePartials(const std::string& directory) {
    std::unique_ptr<DIR, DirectoryCloser> listing(opendir(directory.c_str()));
    const time_t oldest = time(nullptr) - kPartialDownloadLifetime;
    while (listing) {
        const dirent* entry = readdir(listing.get());
        if (!entry)
            break;
        const std::string name = entry->d_name;
        if (!IsHexName(name))
            continue;
        const std::string path = directory + "/" + name;
        struct stat status {};
        const int fd = open(path.c_str(), O_RDWR | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK);
        if (fd < 0)
            continue;
        if (fstat(fd, &status) == 0 && S_ISREG(status.st_mode) && status.st_mtime < oldest &&
            flock(fd, LOCK_EX | LOCK_NB) == 0) {
            unlink(path.c_str());
            unlink((path + ".meta").c_str());
        }
        close(fd);
    }
}

} // namespace

std::string QZPartialDownloadDirectory() {
    return QZGlyphwellCacheDirectory() + "/partial";
}

QZPartialDownload::~QZPartialDownload() {
    if (fd_ >= 0)
        close(fd_);
}

bool QZPartialDownload::Open(const std::string& directory, const std::string& sha256,
                             const std::string& url, uint64_t size) {
    std::error_code ignored;
    std::filesystem::create_directories(directory, ignored);
    RemoveStalePartials(directory);
    url_ = url;
    expected_ = size;
    std::string name = sha256;
    for (char& c : name)
        c = char(std::tolower(static_cast<unsigned char>(c)));
    path_ = directory + "/" + name;
    fd_ =
        IsHexName(name) ? open(path_.c_str(), O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0600) : -1;
    if (fd_ >= 0 && flock(fd_, LOCK_EX | LOCK_NB) != 0) {
        close(fd_);
        fd_ = -1;
    }
    if (fd_ < 0) {
        // Held by another download, or not a name we make: a file of our own, without resume.
        path_.clear();
        fd_ = open(directory.c_str(), O_TMPFILE | O_RDWR | O_CLOEXEC, 0600);
        return fd_ >= 0;
    }
    // The bytes are kept only when the metadata says they belong to this URL and size.
    std::string text;
    glyphwell::ReadFileStart(path_ + ".meta", kMaximumMetadataSize, &text, O_NOFOLLOW);
    std::istringstream lines(text);
    std::string line, keptURL, keptSize;
    while (std::getline(lines, line)) {
        const size_t colon = line.find(": ");
        if (colon == std::string::npos)
            continue;
        const std::string key = line.substr(0, colon), value = line.substr(colon + 2);
        if (key == "url")
            keptURL = value;
        else if (key == "size")
            keptSize = value;
        else if (key == "etag")
            etag_ = value;
        else if (key == "last-modified")
            lastModified_ = value;
    }
    struct stat status {};
    if (fstat(fd_, &status) != 0)
        return false;
    size_ = uint64_t(status.st_size);
    if (keptURL != url || keptSize != std::to_string(size) || size_ > size)
        return Clear();
    // Using it counts as a use: the lifetime starts again.
    futimens(fd_, nullptr);
    return true;
}

bool QZPartialDownload::Append(const char* bytes, size_t count) {
    while (count > 0) {
        const ssize_t written = pwrite(fd_, bytes, count, off_t(size_));
        if (written < 0 && errno == EINTR)
            continue;
        if (written <= 0)
            return false;
        bytes += written;
        count -= size_t(written);
        size_ += uint64_t(written);
    }
    return true;
}

bool QZPartialDownload::Clear() {
    size_ = 0;
    etag_.clear();
    lastModified_.clear();
    if (ftruncate(fd_, 0) != 0)
        return false;
    WriteMetadata();
    return true;
}

void QZPartialDownload::SetValidators(const std::string& etag, const std::string& lastModified) {
    if (etag == etag_ && lastModified == lastModified_)
        return;
    etag_ = etag;
    lastModified_ = lastModified;
    WriteMetadata();
}

void QZPartialDownload::Remove() {
    if (path_.empty())
        return;
    unlink(path_.c_str());
    unlink((path_ + ".meta").c_str());
    path_.clear();
}

void QZPartialDownload::WriteMetadata() {
    if (path_.empty())
        return;
    // Replaced whole, so that a crash leaves the old metadata or the new.
    std::string text = "url: " + url_ + "\nsize: " + std::to_string(expected_) + "\n";
    if (!etag_.empty())
        text += "etag: " + etag_ + "\n";
    if (!lastModified_.empty())
        text += "last-modified: " + lastModified_ + "\n";
    glyphwell::ReplaceFile(path_ + ".meta", text, 0600);
}
