// Where a user's files live on Linux: home directories ($HOME, the password database), the per-user
// directories of the XDG base directory scheme, and the XDG data directories searched for shared
// data such as the MIME database.
//
// Environment variables are read on every call (nothing is cached), and a variable that is
// unset, empty or not an absolute path counts as unset, as the XDG scheme asks.
#pragma once

#include <cstddef>
#include <string>
#include <vector>

#include "platform/CFURL.h"

/// A new directory URL (ending in "/") of the home directory of the user named `user`, as the
/// password database gives it, or of the current user when `user` is null ($HOME when it is set
/// and absolute, else the password database: glyphwell::HomeDirectory). Null when there is no
/// such user or no absolute home. Returns a new reference; the caller releases it.
CFURLRef CFCopyHomeDirectoryURLForUser(CFStringRef user);

/// The per-user directories that a configuration string names, and where they are found:
enum confstr_path_t : int {
    /// $XDG_RUNTIME_DIR; no value when it is unset.
    kUserRuntimeDirectory = 1,
    /// $XDG_CACHE_HOME, else ".cache" in the current user's home directory.
    kUserCacheDirectory = 2,
    /// $TMPDIR, else "/tmp".
    kUserTemporaryDirectory = 3,
};

/// Reads the directory path named by `name` with the contract of confstr(3): copies up to
/// `length` - 1 bytes of the path and a terminating NUL into `buffer` (when `length` is not 0)
/// and returns the size the whole value needs, NUL included; returns 0 when there is no value
/// (an unknown name, an unset variable, no home directory). A result above `length` means the
/// copy was cut short.
size_t GetConfigurationPath(confstr_path_t name, char* buffer, size_t length);

/// The per-user base directories of the XDG scheme.
enum class XDGUserDirectory { Cache, Config, Data, State };

/// $XDG_CACHE_HOME, $XDG_CONFIG_HOME, $XDG_DATA_HOME or $XDG_STATE_HOME, else ".cache",
/// ".config", ".local/share" or ".local/state" in the current user's home directory. Empty when
/// the variable is unset and there is no home directory.
std::string GetUserBaseDirectory(XDGUserDirectory which);

/// The absolute entries of $XDG_DATA_DIRS (else /usr/local/share and /usr/share), in order,
/// without trailing slashes.
std::vector<std::string> GetSystemDataDirectories();

/// The XDG data directories, most important first: $XDG_DATA_HOME (else ".local/share" in the
/// current user's home directory), then each absolute entry of $XDG_DATA_DIRS (else
/// /usr/local/share and /usr/share). Paths carry no trailing slash.
std::vector<std::string> GetDataDirectories();
