// Small files read with plain POSIX reads (no stream or locale machinery is kept resident).
#pragma once

#include <string>

namespace glyphwell {

/// Reads `fd` into `bytes` until its end or `limit` bytes, whichever comes first, retrying
/// interrupted reads. False with errno set when a read fails.
bool ReadUpTo(int fd, size_t limit, std::string* bytes);

/// The first `limit` bytes of the file at `path`, opened with `flags` added to O_RDONLY and
/// O_CLOEXEC; false with errno set when it cannot be opened or read.
bool ReadFileStart(const std::string& path, size_t limit, std::string* bytes, int flags = 0);

} // namespace glyphwell
