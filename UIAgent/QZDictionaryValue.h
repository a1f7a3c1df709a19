// Typed reads of request and progress dictionaries: a value of the wrong kind reads as absent, so
// that a client's mistake never reaches a cast.
#pragma once

#include "platform/CFArray.h"
#include "platform/CFData.h"
#include "platform/CFDictionary.h"
#include "platform/CFError.h"
#include "platform/CFNumber.h"
#include "platform/CFString.h"
#include "platform/CFURL.h"

namespace qz_detail {
inline CFTypeID TypeIDOf(CFStringRef*) {
    return CFStringGetTypeID();
}
inline CFTypeID TypeIDOf(CFNumberRef*) {
    return CFNumberGetTypeID();
}
inline CFTypeID TypeIDOf(CFArrayRef*) {
    return CFArrayGetTypeID();
}
inline CFTypeID TypeIDOf(CFDictionaryRef*) {
    return CFDictionaryGetTypeID();
}
inline CFTypeID TypeIDOf(CFURLRef*) {
    return CFURLGetTypeID();
}
inline CFTypeID TypeIDOf(CFDataRef*) {
    return CFDataGetTypeID();
}
inline CFTypeID TypeIDOf(CFErrorRef*) {
    return CFErrorGetTypeID();
}
} // namespace qz_detail

/// True when `value` is not null and of the kind `Ref` names (CFStringRef, CFArrayRef, ...).
template <class Ref> bool QZIsKind(CFTypeRef value) {
    return value && CFGetTypeID(value) == qz_detail::TypeIDOf(static_cast<Ref*>(nullptr));
}

/// `value` as `Ref` when it is of that kind, else null. Does not retain.
template <class Ref> Ref QZAsKind(CFTypeRef value) {
    return QZIsKind<Ref>(value) ? static_cast<Ref>(const_cast<void*>(value)) : nullptr;
}

/// The value of `key` in `dictionary` (may be null) when it is of the kind `Ref`, else null.
/// Does not retain.
template <class Ref> Ref QZGetTypedValue(CFDictionaryRef dictionary, CFTypeRef key) {
    return dictionary ? QZAsKind<Ref>(CFDictionaryGetValue(dictionary, key)) : nullptr;
}

/// The element at `index` of `array` when it is of the kind `Ref`, else null. Does not retain.
template <class Ref> Ref QZGetTypedElement(CFArrayRef array, CFIndex index) {
    return QZAsKind<Ref>(CFArrayGetValueAtIndex(array, index));
}
