#include "platform/ReplaceFile.h"

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace glyphwell {

std::string WriteFileBeside(const std::string& target, std::string_view bytes, mode_t mode) {
    const size_t slash = target.rfind('/');
    std::string path = slash == std::string::npos ? "." + target + ".XXXXXX"
                                                  : target.substr(0, slash + 1) + "." +
                                                        target.substr(slash + 1) + ".XXXXXX";
    // Close-on-exec: a process that spawns helpers (the bridge, the agent) hands them no copy.
    const int fd = mkostemp(path.data(), O_CLOEXEC);
    if (fd < 0)
        return {};
    bool good = fchmod(fd, mode) == 0;
    for (size_t done = 0; good && done < bytes.size();) {
        const ssize_t written = write(fd, bytes.data() + done, bytes.size() - done);
        if (written < 0 && errno == EINTR)
            continue;
        good = written > 0;
        done += good ? size_t(written) : 0;
    }
    good = good && fsync(fd) == 0;
    int savedErrno = errno;
    if (close(fd) != 0 && good) {
        savedErrno = errno;
        good = false;
    }
    if (good)
        return path;
    unlink(path.c_str());
    errno = savedErrno;
    return {};
}

bool ReplaceFile(const std::string& target, std::string_view bytes, mode_t mode) {
    const std::string temporary = WriteFileBeside(target, bytes, mode);
    if (temporary.empty())
        return false;
    if (rename(temporary.c_str(), target.c_str()) == 0)
        return true;
    const int savedErrno = errno;
    unlink(temporary.c_str());
    errno = savedErrno;
    return false;
}

} // namespace glyphwell
