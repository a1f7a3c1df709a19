#include "cfutil/TCFString.h"

UniChar TCFStr::GetCharacterAtIndex(CFIndex index) const {
    return ref_ ? CFStringGetCharacterAtIndex(ref_, index) : 0;
}

CFIndex TCFStr::GetMaxSize(CFStringEncoding encoding) const {
    return CFStringGetMaximumSizeForEncoding(GetLength(), encoding);
}

bool TCFStr::GetCString(char* buffer, CFIndex size, CFStringEncoding encoding) const {
    return ref_ && CFStringGetCString(ref_, buffer, size, encoding);
}

CFIndex TCFStr::GetMaxSizeOfFileSystemRepresentation() const {
    return ref_ ? CFStringGetMaximumSizeOfFileSystemRepresentation(ref_) : 0;
}

bool TCFStr::GetFileSystemRepresentation(char* buffer, CFIndex size) const {
    return ref_ && CFStringGetFileSystemRepresentation(ref_, buffer, size);
}

CFRange TCFStr::Find(CFStringRef string, CFStringCompareFlags options) const {
    if (!ref_ || !string)
        return CFRangeMake(kCFNotFound, 0);
    return CFStringFind(ref_, string, options);
}

bool TCFStr::HasPrefix(CFStringRef prefix) const {
    return ref_ && prefix && CFStringHasPrefix(ref_, prefix);
}

CFStringRef TCFStr::CreateSubstring(CFRange range) const {
    return ref_ ? CFStringCreateWithSubstring(kCFAllocatorDefault, ref_, range) : nullptr;
}

TCFString::TCFString(UInt32 code) : TCFString(CFString::CopyAsString(code)) {}

TCFString::TCFString(const UInt8* bytes, CFIndex length, CFStringEncoding encoding)
    : TCFString(CFStringCreateWithBytes(kCFAllocatorDefault, bytes, length, encoding, false)) {}

TCFMutableString::TCFMutableString(CFIndex maxLength)
    : TCFString(CFStringCreateMutable(kCFAllocatorDefault, maxLength)) {}
