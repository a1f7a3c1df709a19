// Files replaced whole: the new contents go into a hidden file beside the target, flushed to the
// disk, then take the target's name in one rename, so that a reader sees the old file or the new
// one and a crash leaves the old file in place.
#pragma once

#include <string>
#include <string_view>
#include <sys/types.h>

namespace glyphwell {

/// Writes `bytes` into a new hidden file ".<name>.XXXXXX" in the directory of `target`, with
/// `mode`, flushed to the disk. Its path, or empty with errno set and nothing left behind.
std::string WriteFileBeside(const std::string& target, std::string_view bytes, mode_t mode = 0644);

/// Replaces `target` by a file holding `bytes` (WriteFileBeside, then one rename). False with
/// errno set, the file at `target` untouched and nothing left behind.
bool ReplaceFile(const std::string& target, std::string_view bytes, mode_t mode = 0644);

} // namespace glyphwell
