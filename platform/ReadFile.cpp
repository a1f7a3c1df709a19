#include "platform/ReadFile.h"

#include <cerrno>
#include <fcntl.h>
#include <unistd.h>

namespace glyphwell {

bool ReadUpTo(int fd, size_t limit, std::string* bytes) {
    bytes->assign(limit, '\0');
    size_t done = 0;
    while (done < limit) {
        const ssize_t count = read(fd, bytes->data() + done, limit - done);
        if (count < 0 && errno == EINTR)
            continue;
        if (count < 0) {
            bytes->clear();
            return false;
        }
        if (count == 0)
            break;
        done += size_t(count);
    }
    bytes->resize(done);
    return true;
}

bool ReadFileStart(const std::string& path, size_t limit, std::string* bytes, int flags) {
    const int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC | flags);
    if (fd < 0)
        return false;
    const bool read = ReadUpTo(fd, limit, bytes);
    const int savedErrno = errno;
    close(fd);
    errno = savedErrno;
    return read;
}

} // namespace glyphwell
