// TCFURL: owns one count of a URL value; made from a URL (retained or adopted) or from a POSIX
// path. Comparison is by value and null-safe. The URL and file utilities are members: normalised
// paths, the URLs of a URL's ancestors, symbolic link resolution, per-user configuration
// directories, resource properties and type conformance.
//
// None of them throws or logs: failures are null results (or false). Every operation on the
// held URL treats a null URL as "nothing" and yields null or false.
#pragma once

#include "cfutil/CFUserDirectories.h"
#include "cfutil/TCFRetained.h"
#include "platform/CFArray.h"
#include "platform/CFError.h"
#include "platform/CFURL.h"

class TCFURL : public TCFReferenceHolder<CFURLRef> {
public:
    /// Retains `url` (null-safe), or adopts it with kAdopted (no retain; may be null).
    using TCFReferenceHolder::TCFReferenceHolder;
    /// Creates a URL for the POSIX-style `path`, relative to `baseURL` when the path is relative
    /// (the current directory when `baseURL` is null), never marked as a directory: a trailing
    /// slash of the path is dropped. Null when `path` is null or the platform rejects it.
    TCFURL(CFStringRef path, is_file_t, CFURLRef baseURL);

    /// Value equality by TCFSafeEqual (two nulls are equal).
    bool operator==(CFURLRef url) const { return TCFSafeEqual(ref_, url); }
    bool operator!=(CFURLRef url) const { return !TCFSafeEqual(ref_, url); }
    /// A new URL: the held one resolved against its base; null for null. Returns a new
    /// reference; the caller releases it.
    CFURLRef CopyAbsoluteURL() const { return ref_ ? CFURLCopyAbsoluteURL(ref_) : nullptr; }

    /// URL text constants; no operation here reads them.
    static const CFStringRef kCFURLFragmentSeparator;                 ///< "#"
    static const CFStringRef kCFURLParameterSeparator;                ///< ";"
    static const CFStringRef kCFURLParameterKeyValueSeparator;        ///< "="
    static const CFStringRef kCFURLParameterSandboxExtension;         ///< "sbx"
    static const CFStringRef kPercentEscapedCharsForSandboxExtension; ///< "=;#"

    /// The POSIX path of `url` with a leading "/private" taken away (matched on those eight
    /// characters alone, so "/privateer/x" gives "er/x"): a new path string when `asURL` is
    /// false, else a new file URL of that path (never a directory; null for an empty path) or,
    /// when nothing was taken away, `url` itself retained. A URL without a path (not a file
    /// URL, or an empty path) yields its own string (or itself), retained, when that string
    /// holds the in-memory font marker "iNmEmOrYcGfOnT_", else null. Null for null. Returns a
    /// new reference; the caller releases it.
    static CFTypeRef CopyNormalizedPath(CFURLRef url, bool asURL);
    /// CopyNormalizedPath(held URL, false): a new path string, or null.
    CFStringRef CopyNormalizedPath() const;
    /// A new array of the URLs of the held URL and its ancestors, deepest first, made from its
    /// RFC 2396 decomposition (CFURLComponents.h) by dropping the last path component each
    /// time: file:///a/b/c gives file:///a/b/c, file:///a/b, file:///a (the root alone is never
    /// included). Scheme, user info, host, port and fragment are kept on every URL; the
    /// parameter string and the query are dropped from all. Null when the URL is null, cannot
    /// be decomposed, or yields no URL. The caller releases the result.
    CFArrayRef CreateComponentPathURLs() const;
    /// True when the type identifier of the held URL's item (kCFURLTypeIdentifierKey, a MIME
    /// type) conforms to `type` (UTTypeConformsTo); false when it has none or either is null.
    bool ConformsToUTI(CFStringRef type) const;
    /// A new reference to the resource property `key` of the held URL's item
    /// (CFURLResourceProperties.h), or null for a null URL, an absent property or a failed
    /// lookup; on a failed lookup `*error` (when `error` is non-null) receives a new error that
    /// the caller releases. The caller releases the result.
    CFTypeRef CopyProperty(CFStringRef key, CFErrorRef* error) const;
    /// A new directory URL for the per-user directory `name` (CFUserDirectories.h), created
    /// with mode 0700 when nothing exists at its path (an existing file counts as present).
    /// Null when there is no value for `name`, its path needs more than 1024 bytes with the
    /// terminating NUL, or the directory cannot be created. The caller releases the result.
    static CFURLRef CopyConfigurationDirectoryURL(confstr_path_t name);
    /// A new file URL (never marked as a directory) of the path of `url` with every symbolic
    /// link, "." and ".." resolved (realpath); `url` itself, retained, when that fails (for
    /// instance when the item does not exist). Null for null, or for a URL without a POSIX path.
    /// The caller releases the result.
    static CFURLRef CopySymlinkTarget(CFURLRef url);
    /// A new string of the held URL's file-system path in `style` (resolved against its base);
    /// null for null or for a URL that is not a file URL. The caller releases it.
    CFStringRef CopyFilePath(CFURLPathStyle style) const;
    /// A new string of the POSIX path of the held URL made absolute; null when there is none.
    /// The caller releases it.
    CFStringRef CopyAbsoluteFilePath() const;
    /// A new URL: `url` with a leading "file://localhost/" (case-sensitive) written as
    /// "file:///", else `url` itself retained. Null for null. The caller releases the result.
    static CFURLRef CreateStandardizedURLFromURL(CFURLRef url);
    /// A new array of the own strings (CFURLGetString, not made absolute) of the URLs in
    /// `urls`, in order; elements that are not URLs are skipped. Null when `urls` is null or
    /// yields no string. The caller releases the result.
    static CFArrayRef ConvertURLArrayToStringArray(CFArrayRef urls);
};
