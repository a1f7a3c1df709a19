// Resource properties of the file or directory that a file URL names: its name, parent
// directory, kind, dates, size and type identifier, read from the file system when asked.
//
// Every property describes the item itself: a symbolic link is reported as a link (lstat), not
// as what it points to. A URL that is not a file URL, or an item that does not exist, fails the
// lookup with an error in the POSIX domain.
#pragma once

#include <string>

#include "platform/CFArray.h"
#include "platform/CFDictionary.h"
#include "platform/CFError.h"
#include "platform/CFURL.h"

/// The last path component (string; "/" for the root).
extern const CFStringRef kCFURLNameKey;
/// The directory URL of the containing directory (URL ending in "/"); absent for the root.
extern const CFStringRef kCFURLParentDirectoryURLKey;
/// Booleans: the item's kind. A symbolic link is neither a regular file nor a directory.
extern const CFStringRef kCFURLIsRegularFileKey;
extern const CFStringRef kCFURLIsDirectoryKey;
extern const CFStringRef kCFURLIsSymbolicLinkKey;
/// Dates: the birth time, absent when the file system does not record one; the last change of
/// the contents.
extern const CFStringRef kCFURLCreationDateKey;
extern const CFStringRef kCFURLContentModificationDateKey;
/// Number (kCFNumberSInt64Type): the byte size of a regular file; absent for anything else.
extern const CFStringRef kCFURLFileSizeKey;
/// Files here have no resource fork: always absent. Kept so that requests naming it work.
extern const CFStringRef _kCFURLFileSizeOfResourceForkKey;
/// String: the MIME type of the item (CFTypeIdentifiers.h). "inode/directory",
/// "inode/symlink", "inode/fifo", "inode/socket", "inode/chardevice" or "inode/blockdevice" by
/// kind; for a regular file the type its name matches, else "application/octet-stream".
extern const CFStringRef kCFURLTypeIdentifierKey;

/// Looks up the property `key` of the item at `url`. On success returns true and stores in
/// `*value` a new reference (the caller releases it), or null when the item has no such
/// property or the key is unknown. On failure (a null URL or key, a URL that is not a file URL,
/// an item that cannot be examined) returns false, stores null, and when `error` is non-null
/// stores there a new error in kCFErrorDomainPOSIX with the errno value (EINVAL for an unusable
/// URL or key), which the caller releases. `value` must not be null.
Boolean CFURLCopyResourcePropertyForKey(CFURLRef url, CFStringRef key, CFTypeRef* value,
                                        CFErrorRef* error);

/// The properties named by `keys` (an array of key strings) of the item at `url`, examined once:
/// a new dictionary holding the keys whose property is present; null on failure, with `error`
/// filled as by CFURLCopyResourcePropertyForKey. Elements of `keys` that are not strings are
/// skipped. Returns a new reference; the caller releases it.
CFDictionaryRef CFURLCopyResourcePropertiesForKeys(CFURLRef url, CFArrayRef keys,
                                                   CFErrorRef* error);

/// Stores in `path` the file-system representation (bytes, no terminator) of `url` made
/// absolute. False when `url` is null or not a file URL.
bool CFURLGetAbsoluteFileSystemPath(CFURLRef url, std::string& path);
