// TCFURL: owns one count of a URL value; made from a URL (retained or adopted) or from a POSIX
// path. Comparison is by value and null-safe.
#pragma once

#include "cfutil/TCFRetained.h"
#include "platform/CFURL.h"

class TCFURL {
public:
    /// Retains `url` (null-safe).
    explicit TCFURL(CFURLRef url) : url_(TCFSafeRetain(url)) {}
    /// Adopts `url` (no retain; may be null).
    TCFURL(CFURLRef url, adopted_t) : url_(url) {}
    /// Creates a URL for the POSIX-style `path`, relative to `baseURL` when the path is relative
    /// (the current directory when `baseURL` is null), never marked as a directory: a trailing
    /// slash of the path is dropped. Null when `path` is null or the platform rejects it.
    TCFURL(CFStringRef path, is_file_t, CFURLRef baseURL);
    TCFURL(const TCFURL&) = delete;
    TCFURL& operator=(const TCFURL&) = delete;
    /// Releases the held URL (null-safe).
    ~TCFURL();

    /// The held URL; does not retain.
    operator CFURLRef() const { return url_; }
    /// Value equality by TCFSafeEqual (two nulls are equal).
    bool operator==(CFURLRef url) const { return TCFSafeEqual(url_, url); }
    bool operator!=(CFURLRef url) const { return !TCFSafeEqual(url_, url); }
    /// A new URL: the held one resolved against its base; null for null. Returns a new
    /// reference; the caller releases it.
    CFURLRef CopyAbsoluteURL() const { return url_ ? CFURLCopyAbsoluteURL(url_) : nullptr; }
    /// Returns the held URL with its count and leaves this wrapper null; the caller releases
    /// the result.
    CFURLRef Orphan();

private:
    CFURLRef url_;
};
