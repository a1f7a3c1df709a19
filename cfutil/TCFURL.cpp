#include "cfutil/TCFURL.h"

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <sys/stat.h>

#include "cfutil/CFTypeIdentifiers.h"
#include "cfutil/CFURLComponents.h"
#include "cfutil/CFURLResourceProperties.h"
#include "cfutil/TCFArray.h"
#include "cfutil/TCFString.h"
#include "cfutil/TStackBuffer.h"

const CFStringRef TCFURL::kCFURLFragmentSeparator = CFSTR("#");
const CFStringRef TCFURL::kCFURLParameterSeparator = CFSTR(";");
const CFStringRef TCFURL::kCFURLParameterKeyValueSeparator = CFSTR("=");
const CFStringRef TCFURL::kCFURLParameterSandboxExtension = CFSTR("sbx");
const CFStringRef TCFURL::kPercentEscapedCharsForSandboxExtension = CFSTR("=;#");

namespace {

/// The prefix that the system's private directories carry and normalised paths drop.
constexpr CFIndex kPrivatePrefixLength = 8; // "/private"
/// Marks, anywhere in a URL's string, a font held in memory rather than in a file.
const CFStringRef kInMemoryFontMarker = CFSTR("iNmEmOrYcGfOnT_");
/// The directory path buffer of CopyConfigurationDirectoryURL, terminating NUL included.
constexpr size_t kConfigurationPathBufferSize = 1024;

bool IsURL(CFTypeRef value) {
    return value && CFGetTypeID(value) == CFURLGetTypeID();
}

} // namespace

TCFURL::TCFURL(CFStringRef path, is_file_t, CFURLRef baseURL)
    : TCFURL(path ? CFURLCreateWithFileSystemPathRelativeToBase(
                        kCFAllocatorDefault, path, kCFURLPOSIXPathStyle, false, baseURL)
                  : nullptr,
             kAdopted) {}

CFTypeRef TCFURL::CopyNormalizedPath(CFURLRef url, bool asURL) {
    if (!url)
        return nullptr;
    TCFString path(CFURLCopyFileSystemPath(url, kCFURLPOSIXPathStyle));
    if (path.GetLength() > 0) {
        if (path.Find(CFSTR("/private"), kCFCompareAnchored).location == kCFNotFound)
            return asURL ? TCFRetain<CFTypeRef>(url) : path.Orphan();
        TCFString rest(path.CreateSubstring(
            CFRangeMake(kPrivatePrefixLength, path.GetLength() - kPrivatePrefixLength)));
        if (asURL)
            return CFURLCreateWithFileSystemPath(kCFAllocatorDefault, rest, kCFURLPOSIXPathStyle,
                                                 false);
        return rest.Orphan();
    }
    CFStringRef string = CFURLGetString(url);
    if (TCFStr(string).Find(kInMemoryFontMarker, 0).location == kCFNotFound)
        return nullptr;
    return asURL ? TCFRetain<CFTypeRef>(url) : TCFRetain<CFTypeRef>(string);
}

CFStringRef TCFURL::CopyNormalizedPath() const {
    return static_cast<CFStringRef>(CopyNormalizedPath(ref_, false));
}

CFArrayRef TCFURL::CreateComponentPathURLs() const {
    if (!ref_)
        return nullptr;
    TCFURLComponentsRFC2396 components;
    if (!CFURLCopyComponents(ref_, kCFURLComponentDecompositionRFC2396, &components) ||
        !components.pathComponents || CFArrayGetCount(components.pathComponents) == 0)
        return nullptr;

    TCFSafeRelease(components.parameterString);
    components.parameterString = nullptr;
    TCFSafeRelease(components.query);
    components.query = nullptr;

    CFIndex count = CFArrayGetCount(components.pathComponents);
    CFMutableArrayRef path =
        CFArrayCreateMutableCopy(kCFAllocatorDefault, count, components.pathComponents);
    CFRelease(components.pathComponents);
    components.pathComponents = path; // released with the components
    if (!path)
        return nullptr;

    TCFLazyMutableArray urls;
    for (CFIndex i = count - 1; i >= 1; --i) {
        TCFAdopted<CFURLRef> url(CFURLCreateFromComponents(
            kCFAllocatorDefault, kCFURLComponentDecompositionRFC2396, &components));
        if (url)
            urls.Append(url);
        CFArrayRemoveValueAtIndex(path, CFArrayGetCount(path) - 1);
    }
    return urls.Orphan();
}

bool TCFURL::ConformsToUTI(CFStringRef type) const {
    TCFString identifier(static_cast<CFStringRef>(CopyProperty(kCFURLTypeIdentifierKey, nullptr)));
    return identifier && type && CFGetTypeID(identifier) == CFStringGetTypeID() &&
           UTTypeConformsTo(identifier, type);
}

CFTypeRef TCFURL::CopyProperty(CFStringRef key, CFErrorRef* error) const {
    if (!ref_)
        return nullptr;
    CFTypeRef value = nullptr;
    CFURLCopyResourcePropertyForKey(ref_, key, &value, error);
    return value;
}

CFURLRef TCFURL::CopyConfigurationDirectoryURL(confstr_path_t name) {
    char path[kConfigurationPathBufferSize];
    size_t size = GetConfigurationPath(name, path, sizeof path);
    // A value that did not fit was cut short: its truncated path names some other directory.
    if (size == 0 || size > sizeof path)
        return nullptr;
    struct stat status;
    if (stat(path, &status) != 0 && mkdir(path, 0700) != 0 &&
        !(errno == EEXIST && stat(path, &status) == 0))
        return nullptr;
    return CFURLCreateFromFileSystemRepresentation(
        kCFAllocatorDefault, reinterpret_cast<const UInt8*>(path), CFIndex(size - 1), true);
}

CFURLRef TCFURL::CopySymlinkTarget(CFURLRef url) {
    if (!url)
        return nullptr;
    TCFString path(CFURLCopyFileSystemPath(url, kCFURLPOSIXPathStyle));
    TStackBuffer<char, 30> representation(uint64_t(path.GetMaxSizeOfFileSystemRepresentation()) +
                                          1);
    if (!path.GetFileSystemRepresentation(representation.GetBuffer(),
                                          CFIndex(representation.GetCount() - 1)))
        return nullptr;
    char* resolved = realpath(representation.GetBuffer(), nullptr);
    if (!resolved)
        return TCFRetain(url);
    // Made from the path's bytes, so that a resolved path that is not UTF-8 still gives a URL.
    CFURLRef target = CFURLCreateFromFileSystemRepresentation(
        kCFAllocatorDefault, reinterpret_cast<const UInt8*>(resolved), CFIndex(strlen(resolved)),
        false);
    free(resolved);
    return target ? target : TCFRetain(url);
}

CFStringRef TCFURL::CopyFilePath(CFURLPathStyle style) const {
    return ref_ ? CFURLCopyFileSystemPath(ref_, style) : nullptr;
}

CFStringRef TCFURL::CopyAbsoluteFilePath() const {
    TCFURL absolute(CopyAbsoluteURL(), kAdopted);
    return absolute.CopyFilePath(kCFURLPOSIXPathStyle);
}

CFURLRef TCFURL::CreateStandardizedURLFromURL(CFURLRef url) {
    if (!url)
        return nullptr;
    CFStringRef localhostPrefix = CFSTR("file://localhost/");
    TCFStr string(CFURLGetString(url));
    if (!string.HasPrefix(localhostPrefix))
        return TCFRetain(url);
    TCFString standardized(CFStringCreateMutableCopy(kCFAllocatorDefault, 0, string));
    if (!standardized)
        return nullptr;
    CFStringReplace(const_cast<CFMutableStringRef>(static_cast<CFStringRef>(standardized)),
                    CFRangeMake(0, CFStringGetLength(localhostPrefix)), CFSTR("file:///"));
    return CFURLCreateWithString(kCFAllocatorDefault, standardized, nullptr);
}

CFArrayRef TCFURL::ConvertURLArrayToStringArray(CFArrayRef urls) {
    TCFDeque<CFTypeRef> elements(urls);
    TCFLazyMutableArray strings;
    for (CFIndex i = 0; i < elements.GetCount(); ++i) {
        CFTypeRef element = elements.At(i);
        if (IsURL(element))
            strings.Append(CFURLGetString(static_cast<CFURLRef>(element)));
    }
    return strings.Orphan();
}
