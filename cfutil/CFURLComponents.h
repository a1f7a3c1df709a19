// The decomposition of a URL after RFC 2396 into scheme, user info, host, port, path components,
// parameter string, query and fragment, and the URL made back from such a decomposition.
//
// Every text field keeps the URL's own (percent-encoded) form, so decomposing and composing
// again gives back the same URL text. Unlike the RFC 3986 parsing of the URL values themselves,
// the path's parameter string (what follows its first ";") is a field of its own.
#pragma once

#include "cfutil/TNoncopyable.h"
#include "platform/CFArray.h"
#include "platform/CFURL.h"

/// The decomposition kinds; only RFC 2396 exists.
typedef CFIndex CFURLComponentDecomposition;
enum : CFURLComponentDecomposition { kCFURLComponentDecompositionRFC2396 = 2 };

/// The parts of a URL after RFC 2396. Owns one count of each non-null reference field and
/// releases it when destroyed. A null field is an absent part; an empty host is an authority
/// that is present but empty ("file:///a" has host "", "mailto:" style URLs have no host).
struct TCFURLComponentsRFC2396 : TNoncopyable {
    /// Every field zero (null).
    TCFURLComponentsRFC2396() = default;
    /// Releases the seven reference fields (null-safe).
    ~TCFURLComponentsRFC2396();

    CFStringRef scheme = nullptr;
    CFStringRef userInfo = nullptr;
    CFStringRef host = nullptr;
    /// The port; kCFNotFound after decomposing a URL without one. A port of 0 or less is not
    /// written when composing.
    CFIndex port = 0;
    /// The path split at every "/": "/a/b/c" gives ("", "a", "b", "c"), "/a/" gives ("", "a",
    /// ""); an empty path gives an empty array. May hold a mutable array.
    CFArrayRef pathComponents = nullptr;
    CFStringRef parameterString = nullptr;
    CFStringRef query = nullptr;
    CFStringRef fragment = nullptr;
};

/// Fills `components` (its previous references are released first) with the decomposition of
/// `url` made absolute. False, with `components` left empty, for a null URL or null
/// `components`, an unknown `decompositionType`, a URL without a scheme, an opaque URL (a
/// non-empty path not starting with "/" and no authority, as in "mailto:a@b"), or a port that
/// is not a decimal number below 2^31.
Boolean CFURLCopyComponents(CFURLRef url, CFURLComponentDecomposition decompositionType,
                            TCFURLComponentsRFC2396* components);

/// A new URL composed from `components`: scheme ":" ["//" [user info "@"] host [":" port]]
/// path [";" parameters] ["?" query] ["#" fragment], the path being the path components joined
/// by "/". The authority is written when the user info or host is non-null or the port is
/// positive, and also, empty, when the path would otherwise start with "//". Null when the
/// scheme is null, the type is unknown, or the text is not a valid URL. Returns a new
/// reference; the caller releases it.
CFURLRef CFURLCreateFromComponents(CFAllocatorRef allocator,
                                   CFURLComponentDecomposition decompositionType,
                                   const TCFURLComponentsRFC2396* components);
