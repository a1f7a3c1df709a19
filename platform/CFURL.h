// URLs: a UTF-8 string (RFC 3986 reference) and an optional base URL it is relative to. Parsing
// and resolution follow RFC 3986.
//
// Bad input: reported once through the assertion handler (naming the function called); then
// creators give null, readers 0, false or null, and modifiers change nothing (see CFBase.h).
#pragma once

#include "platform/CFBase.h"
#include "platform/CFString.h"

CFTypeID CFURLGetTypeID();

typedef CFIndex CFURLPathStyle;
enum : CFURLPathStyle { kCFURLPOSIXPathStyle = 0 };

/// A new URL from bytes in `encoding` (UTF-8 or ASCII), relative to `baseURL` when given. Null
/// when the bytes are not a URI reference. Zero bytes give an empty relative URL.
CFURLRef CFURLCreateWithBytes(CFAllocatorRef allocator, const UInt8* bytes, CFIndex length,
                              CFStringEncoding encoding, CFURLRef baseURL);
CFURLRef CFURLCreateWithString(CFAllocatorRef allocator, CFStringRef string, CFURLRef baseURL);
/// A new URL for a POSIX path: an absolute path gives a file URL; a relative path gives a
/// relative URL whose base is the current directory's file URL. `isDirectory` adds a
/// trailing slash when missing (and without it, one is removed, "/" excepted). The path is
/// percent-encoded as needed.
CFURLRef CFURLCreateWithFileSystemPath(CFAllocatorRef allocator, CFStringRef path,
                                       CFURLPathStyle style, Boolean isDirectory);
/// As CFURLCreateWithFileSystemPath, but a relative path is relative to `baseURL` (the current
/// directory when null).
CFURLRef CFURLCreateWithFileSystemPathRelativeToBase(CFAllocatorRef allocator, CFStringRef path,
                                                     CFURLPathStyle style, Boolean isDirectory,
                                                     CFURLRef baseURL);
CFURLRef CFURLCreateFromFileSystemRepresentation(CFAllocatorRef allocator, const UInt8* buffer,
                                                 CFIndex length, Boolean isDirectory);
/// A new URL: the given one resolved against its base; a URL without base is returned retained.
CFURLRef CFURLCopyAbsoluteURL(CFURLRef url);
/// The URL's own bytes (without its base): with a null buffer, the length; otherwise the bytes
/// copied when they fit in `bufferLength`, and their length; -1 when they do not fit.
CFIndex CFURLGetBytes(CFURLRef url, UInt8* buffer, CFIndex bufferLength);
/// The URL's own string (without its base), not retained.
CFStringRef CFURLGetString(CFURLRef url);
/// The base URL, not retained; null when there is none.
CFURLRef CFURLGetBaseURL(CFURLRef url);
/// Returns a new string; null when the part is absent.
CFStringRef CFURLCopyScheme(CFURLRef url);
CFStringRef CFURLCopyHostName(CFURLRef url);
/// The path of the absolute URL, percent-decoded; a trailing slash is removed except for "/".
CFStringRef CFURLCopyFileSystemPath(CFURLRef url, CFURLPathStyle style);
/// The path as it stands in the URL (still percent-encoded), of the URL itself.
CFStringRef CFURLCopyPath(CFURLRef url);
CFStringRef CFURLCopyLastPathComponent(CFURLRef url);
CFStringRef CFURLCopyQueryString(CFURLRef url, CFStringRef charactersToLeaveEscaped);
CFStringRef CFURLCopyFragment(CFURLRef url, CFStringRef charactersToLeaveEscaped);
/// The zero-terminated, percent-decoded path (resolved against the base when asked) for file
/// URLs and relative references; false for other schemes or when it does not fit.
Boolean CFURLGetFileSystemRepresentation(CFURLRef url, Boolean resolveAgainstBase, UInt8* buffer,
                                         CFIndex maxBufLen);
/// True when the path ends with a slash.
Boolean CFURLHasDirectoryPath(CFURLRef url);
Boolean CFURLCanBeDecomposed(CFURLRef url);
CFURLRef CFURLCreateCopyAppendingPathComponent(CFAllocatorRef allocator, CFURLRef url,
                                               CFStringRef component, Boolean isDirectory);
CFURLRef CFURLCreateCopyDeletingLastPathComponent(CFAllocatorRef allocator, CFURLRef url);
/// "." and ".." segments removed from the path (RFC 3986 section 5.2.4).
CFURLRef CFURLCreateStandardizedURL(CFURLRef url);
/// Percent-decoding of `string`; null when an escape is malformed or the result is not UTF-8.
CFStringRef CFURLCreateStringByReplacingPercentEscapes(CFAllocatorRef allocator, CFStringRef string,
                                                       CFStringRef charactersToLeaveEscaped);
