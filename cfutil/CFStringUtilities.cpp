#include "cfutil/CFStringUtilities.h"

#include "cfutil/CFUserDirectories.h"
#include "cfutil/TCFRetained.h"
#include "cfutil/TCFString.h"
#include "cfutil/TCFStringUniquer.h"
#include "cfutil/TCFURL.h"

namespace {

constexpr UniChar kTilde = u'~';
constexpr UniChar kSlash = u'/';

/// A new reference to the home directory path of `user` (the current user when null), without
/// a trailing slash ("/" excepted); null when the password database knows no home directory.
CFStringRef CopyHomeDirectoryForUser(CFStringRef user) {
    TCFURL home(CFCopyHomeDirectoryURLForUser(user), kAdopted);
    // With the flag clear, the normalised form is a path string.
    TCFString path(static_cast<CFStringRef>(TCFURL::CopyNormalizedPath(home, false)));
    CFIndex length = path.GetLength();
    if (length > 1 && path.GetCharacterAtIndex(length - 1) == kSlash)
        return path.CreateSubstring(CFRangeMake(0, length - 1));
    return path.Orphan();
}

} // namespace

CFStringRef CFString::CopyAsString(UInt32 code) {
    const char bytes[5] = {static_cast<char>(code >> 24), static_cast<char>(code >> 16),
                           static_cast<char>(code >> 8), static_cast<char>(code), '\0'};
    return CFStringCreateWithCString(kCFAllocatorDefault, bytes, kCFStringEncodingMacRoman);
}

bool CFString::GetUTF8(CFStringRef string, std::string& out) {
    std::optional<std::string> bytes = glyphwell::UTF8String(string);
    out = bytes ? std::move(*bytes) : std::string();
    return bytes.has_value();
}

bool StringEqual(CFStringRef a, CFStringRef b) {
    return TCFSafeEqual(a, b);
}

const void* CFDictionary::GetValue(CFDictionaryRef dictionary, CFTypeRef key) {
    return dictionary && key ? CFDictionaryGetValue(dictionary, key) : nullptr;
}

const void* CFDictionary::GetValueForLanguage(CFDictionaryRef dictionary, CFStringRef language) {
    if (!dictionary || !language)
        return nullptr;
    if (const void* value = GetValue(dictionary, language))
        return value;
    TCFString base(TCFStr(language).CreateSubstringWithoutRegionalSuffix());
    return StringEqual(base, language) ? nullptr : GetValue(dictionary, base);
}

CFStringRef TCFStr::CreateStringByExpandingTildeInPath(CFStringRef path) {
    TCFStr input(path);
    CFIndex length = input.GetLength();
    if (length == 0 || input.GetCharacterAtIndex(0) != kTilde)
        return TCFSafeRetain(path);

    CFIndex userEnd = 1;
    while (userEnd < length && input.GetCharacterAtIndex(userEnd) != kSlash)
        ++userEnd;
    TCFString user(userEnd == 1 ? nullptr : input.CreateSubstring(CFRangeMake(1, userEnd - 1)));
    TCFString home(CopyHomeDirectoryForUser(user));
    if (!home)
        return TCFSafeRetain(path);

    CFMutableStringRef expanded = CFStringCreateMutableCopy(kCFAllocatorDefault, 0, home);
    if (!expanded)
        return TCFSafeRetain(path);
    TCFString rest(input.CreateSubstring(CFRangeMake(userEnd, length - userEnd)));
    CFStringAppend(expanded, rest);
    return expanded;
}

CFStringRef TCFStr::CreateSubstringWithoutRegionalSuffix() const {
    if (!ref_)
        return nullptr;
    CFRange separator = Find(CFSTR("_"), 0);
    if (separator.location == kCFNotFound)
        separator = Find(CFSTR("-"), 0);
    if (separator.location != kCFNotFound && !HasPrefix(CFSTR("zh")))
        return CreateSubstring(CFRangeMake(0, separator.location));
    return TCFRetain(ref_);
}

CFStringRef TCFStr::GetUniqueString() const {
    return ref_ ? TCFStringUniquer().GetUniqueString(ref_) : nullptr;
}
