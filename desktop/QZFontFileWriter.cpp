#include "desktop/QZFontFileWriter.h"

#include <array>
#include <atomic>
#include <cerrno>
#include <dirent.h>
#include <fcntl.h>
#include <random>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include "desktop/DesktopTesting.h"
#include "platform/Log.h"
#include "platform/LogEscape.h"

namespace {

constexpr mode_t kFontFileMode = 0644;
constexpr size_t kRandomSuffixLength = 6; ///< as mkostemp's "XXXXXX"
constexpr int kLinkAttempts = 100;

std::array<std::atomic<int>, 5> gInjectedFaults{};

/// The injected error of `operation`; 0 when none.
int InjectedFault(QZFontFileOperation operation) {
    return gInjectedFaults[size_t(operation)].load(std::memory_order_relaxed);
}

bool Fail(int error) {
    errno = error;
    return false;
}

bool IsSuffixByte(char c) {
    return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9');
}

bool IsBaseNameByte(char c) {
    return IsSuffixByte(c) || c == '-' || c == '_' || c == '.';
}

/// Whether `name` has the shape of a temporary: ".<base name>.XXXXXX".
bool IsTemporaryName(const std::string& name) {
    const size_t minimum = 1 + 1 + 1 + kRandomSuffixLength;
    if (name.size() < minimum || name[0] != '.')
        return false;
    const size_t dot = name.size() - kRandomSuffixLength - 1;
    if (name[dot] != '.')
        return false;
    for (size_t i = dot + 1; i < name.size(); ++i)
        if (!IsSuffixByte(name[i]))
            return false;
    for (size_t i = 1; i < dot; ++i)
        if (!IsBaseNameByte(name[i]))
            return false;
    return true;
}

std::string RandomSuffix() {
    static const char letters[] = "abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ0123456789";
    thread_local std::mt19937_64 generator{std::random_device{}()};
    std::uniform_int_distribution<size_t> pick(0, sizeof letters - 2);
    std::string suffix;
    for (size_t i = 0; i < kRandomSuffixLength; ++i)
        suffix += letters[pick(generator)];
    return suffix;
}

void SyncDirectory(const std::string& directory) {
    if (const int fd = open(directory.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC); fd >= 0) {
        fsync(fd);
        close(fd);
    }
}

/// Removes the temporary `name` of the directory `directoryFd` when its lock can be taken.
void RemoveIfStale(int directoryFd, const std::string& name, const std::string& directory) {
    const int fd =
        openat(directoryFd, name.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC);
    if (fd < 0)
        return;
    struct stat opened {};
    struct stat named {};
    // The name must still lead to the file that was locked: a writer may have replaced it.
    if (fstat(fd, &opened) == 0 && S_ISREG(opened.st_mode) && flock(fd, LOCK_EX | LOCK_NB) == 0 &&
        fstatat(directoryFd, name.c_str(), &named, AT_SYMLINK_NOFOLLOW) == 0 &&
        named.st_ino == opened.st_ino && named.st_dev == opened.st_dev &&
        unlinkat(directoryFd, name.c_str(), 0) == 0)
        glyphwell::AppLog("Removed the unfinished font download %s/%s",
                          glyphwell::LogEscape(directory).c_str(),
                          glyphwell::LogEscape(name).c_str());
    close(fd);
}

} // namespace

void QZInjectFontFileFault(QZFontFileOperation operation, int error) {
    gInjectedFaults[size_t(operation)].store(error, std::memory_order_relaxed);
}

void QZRemoveStaleFontTemporaries(const std::string& directory) {
    DIR* listing = opendir(directory.c_str());
    if (!listing)
        return;
    while (const dirent* entry = readdir(listing)) {
        const std::string name = entry->d_name;
        if (IsTemporaryName(name))
            RemoveIfStale(dirfd(listing), name, directory);
    }
    closedir(listing);
}

QZFontFileWriter::~QZFontFileWriter() {
    if (!path_.empty())
        unlink(path_.c_str());
    Close();
}

bool QZFontFileWriter::Open(const std::string& directory, const std::string& baseName,
                            bool allowUnnamed) {
    directory_ = directory;
    baseName_ = baseName;
    if (allowUnnamed && OpenUnnamed(directory))
        return true;
    return OpenNamed(directory, baseName);
}

bool QZFontFileWriter::OpenUnnamed(const std::string& directory) {
    fd_ = open(directory.c_str(), O_TMPFILE | O_RDWR | O_CLOEXEC, kFontFileMode);
    if (fd_ < 0)
        return false;
    // The lock travels with the file once it is linked under a temporary name in Publish(), so
    // that no cleaner takes it for a leftover.
    flock(fd_, LOCK_EX);
    unnamed_ = true;
    return true;
}

bool QZFontFileWriter::OpenNamed(const std::string& directory, const std::string& baseName) {
    // The leading dot keeps fontconfig from scanning a file that is still being written.
    for (int attempt = 0; attempt < kLinkAttempts; ++attempt) {
        std::string pattern = directory + "/." + baseName + ".XXXXXX";
        fd_ = mkostemp(pattern.data(), O_CLOEXEC);
        if (fd_ < 0)
            return false;
        // A file that cannot be locked would be taken for a leftover: it is removed at once.
        struct stat status {};
        int error = InjectedFault(QZFontFileOperation::Lock);
        if (error == 0) {
            int locked;
            while ((locked = flock(fd_, LOCK_EX)) != 0 && errno == EINTR) {
            }
            if (locked != 0 || fstat(fd_, &status) != 0)
                error = errno;
        }
        if (error != 0) {
            unlink(pattern.c_str());
            Close();
            return Fail(error);
        }
        // A cleaner may have taken the new file for a leftover before the lock was held: then it
        // is gone from the directory, and another name is tried.
        if (status.st_nlink > 0) {
            path_ = pattern;
            fchmod(fd_, kFontFileMode);
            return true;
        }
        Close();
    }
    return Fail(EAGAIN);
}

void QZFontFileWriter::Close() {
    if (fd_ >= 0)
        close(fd_);
    fd_ = -1;
}

bool QZFontFileWriter::Write(const char* bytes, size_t count) {
    if (const int error = InjectedFault(QZFontFileOperation::Write))
        return Fail(error);
    while (count > 0) {
        const ssize_t n = write(fd_, bytes, count);
        if (n < 0 && errno == EINTR)
            continue;
        if (n <= 0)
            return Fail(n < 0 ? errno : EIO);
        bytes += n;
        count -= size_t(n);
    }
    return true;
}

bool QZFontFileWriter::Sync() {
    if (const int error = InjectedFault(QZFontFileOperation::Sync))
        return Fail(error);
    return fsync(fd_) == 0;
}

std::string QZFontFileWriter::ReadablePath() const {
    return unnamed_ ? "/proc/self/fd/" + std::to_string(fd_) : path_;
}

bool QZFontFileWriter::Publish(const std::string& target) {
    if (unnamed_ && path_.empty()) {
        // An unnamed file gets a hidden name first: linkat cannot replace an existing file.
        if (const int error = InjectedFault(QZFontFileOperation::Link))
            return Fail(error);
        const std::string source = ReadablePath();
        for (int attempt = 0; path_.empty(); ++attempt) {
            std::string name = directory_ + "/." + baseName_ + "." + RandomSuffix();
            if (linkat(AT_FDCWD, source.c_str(), AT_FDCWD, name.c_str(), AT_SYMLINK_FOLLOW) == 0)
                path_ = std::move(name);
            else if (errno != EEXIST || attempt == kLinkAttempts)
                return false;
        }
    }
    if (const int error = InjectedFault(QZFontFileOperation::Rename))
        return Fail(error);
    if (rename(path_.c_str(), target.c_str()) != 0)
        return false;
    path_.clear();
    SyncDirectory(directory_);
    return true;
}
