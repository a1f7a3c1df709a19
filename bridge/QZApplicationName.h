// Naming the application that asked for fonts: the `Name` of its desktop entry in the user's
// language, else its executable's name.
#pragma once

#include <string>
#include <string_view>
#include <sys/types.h>

/// The desktop entry file of the desktop file id `desktopID` (`org.example.App.desktop`; the
/// ".desktop" suffix may be missing): the first `applications/ID` under the XDG data
/// directories that exists. Empty for an id that cannot name a file (empty, over 255 bytes, a
/// "/", a leading ".") or when none exists.
std::string QZDesktopEntryPath(std::string_view desktopID);

/// The `Name` of the [Desktop Entry] group of the file `path` in the user's language (from
/// LANGUAGE, then LC_ALL, LC_MESSAGES or LANG: `Name[ll_CC@m]`, `Name[ll_CC]`, `Name[ll@m]`,
/// `Name[ll]`, then `Name`). Empty when the file cannot be read, is over 1 MiB or has none.
std::string QZDesktopEntryName(const std::string& path);

/// The name of the executable of process `pid` (the file name of /proc/PID/exe, else
/// /proc/PID/comm); empty when the process is gone or cannot be inspected.
std::string QZExecutableName(pid_t pid);
