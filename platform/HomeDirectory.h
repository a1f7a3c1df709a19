// The user's home directory, found the one way every part of the tree uses.
#pragma once

#include <string>

namespace glyphwell {

/// The current user's home directory: $HOME when it is set and an absolute path, else the
/// password database's entry for the real user id (getpwuid_r). Empty when neither gives an
/// absolute path. Reads the environment on every call.
std::string HomeDirectory();

/// The home directory that the password database gives for the user named `user`, or for the
/// real user id when `user` is null (getpwnam_r / getpwuid_r; $HOME is not consulted). Empty when
/// there is no such entry or its home is not an absolute path.
std::string PasswordDatabaseHome(const char* user);

} // namespace glyphwell
