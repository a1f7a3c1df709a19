// TCFBookmark: bookmark data for a file or directory, and resolving it back to a URL. A bookmark
// remembers where an item was (its absolute path), which item it was (its device and inode
// numbers), and a chosen set of its resource properties as they were when it was made, so
// that those properties can be read later without touching the file system.
//
// The bookmark data is a versioned binary record of our own. All integers are big-endian:
//
//   "GWBM"                     4 bytes, magic
//   version                    u16, 1
//   path                       u32 length + bytes (file-system representation, absolute)
//   device, inode              u64 each (of the item itself, not following a final link)
//   entry count                u32
//   entries                    key: u32 length + UTF-8 bytes, then a kind byte and its value:
//                                1 string   u32 length + UTF-8 bytes
//                                2 number   i64 (integers only)
//                                3 boolean  u8, 0 or 1
//                                4 date     f64 bits as u64 (absolute time, finite)
//                                5 URL      u32 length + UTF-8 bytes (absolute URL string)
//
// Nothing may follow the last entry, and keys are unique. The reader checks every length
// against the bytes left and yields null for any record that breaks these rules.
#pragma once

#include "platform/CFArray.h"
#include "platform/CFData.h"
#include "platform/CFDictionary.h"
#include "platform/CFError.h"
#include "platform/CFURL.h"

typedef CFOptionFlags CFURLBookmarkCreationOptions;
typedef CFOptionFlags CFURLBookmarkResolutionOptions;

/// Asks that resolution find the item by its file identity. Always added by InitBookmarkData.
/// Items are found by path here; the identity only tells whether the bookmark is stale.
enum : CFURLBookmarkCreationOptions { kCFURLBookmarkCreationPreferFileIDResolutionMask = 0x100 };

class TCFBookmark {
public:
    /// The process-wide array of the nine default property keys: name, parent directory URL,
    /// is regular file, is directory, is symbolic link, creation date, content modification
    /// date, file size, resource fork size. Created on the first call (pthread_once) and never
    /// released. Not retained for the caller.
    static CFArrayRef GetDefaultProperties();
    /// Creates the array that GetDefaultProperties hands out; the once-only routine.
    static void CreateDefaultProperties();

    /// New bookmark data for the item at `url`, recording the resource properties named in
    /// `properties` (an array of key strings, may be null) that the item has. `options` (with
    /// kCFURLBookmarkCreationPreferFileIDResolutionMask added) is accepted and not recorded.
    /// Null when the URL is null or not a file URL, or the item does not exist. Returns a new
    /// reference; the caller releases it.
    static CFDataRef InitBookmarkData(CFURLRef url, CFArrayRef properties,
                                      CFURLBookmarkCreationOptions options);
    /// A new URL of the item at the bookmark's path (a directory URL when it is a directory
    /// now). `*isStale` (when non-null) is set to whether the item there is no longer the one
    /// bookmarked (another device or inode). Null for malformed `bookmark` data (`*error`
    /// receives an EINVAL error) or when nothing exists at the path (`*error` receives the
    /// errno value); errors are in kCFErrorDomainPOSIX and the caller releases them.
    /// `propertiesToInclude`, `relativeToURL` and `options` are accepted and unused: paths are
    /// absolute, and the URL values carry no cached properties. The caller releases the result.
    static CFURLRef CreateURLByResolvingBookmarkData(CFDataRef bookmark, Boolean* isStale,
                                                     CFArrayRef propertiesToInclude,
                                                     CFURLRef relativeToURL,
                                                     CFURLBookmarkResolutionOptions options,
                                                     CFErrorRef* error);
    /// A new dictionary of the recorded properties named in `keys` (all recorded properties
    /// when `keys` is null); keys not recorded are left out. Null for malformed data. Does not
    /// touch the file system. The caller releases the result.
    static CFDictionaryRef CopyPropertiesFromBookmarkData(CFDataRef bookmark, CFArrayRef keys);
    /// A new reference to the recorded property `key`, or null when it was not recorded or the
    /// data is malformed. Does not touch the file system. The caller releases the result.
    static CFTypeRef CopyPropertyFromBookmarkData(CFDataRef bookmark, CFStringRef key);
};
