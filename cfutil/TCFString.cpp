#include "cfutil/TCFString.h"

#include "cfutil/TCFRetained.h"

UniChar TCFStr::GetCharacterAtIndex(CFIndex index) const {
    return string_ ? CFStringGetCharacterAtIndex(string_, index) : 0;
}

CFIndex TCFStr::GetMaxSize(CFStringEncoding encoding) const {
    return CFStringGetMaximumSizeForEncoding(GetLength(), encoding);
}

bool TCFStr::GetCString(char* buffer, CFIndex size, CFStringEncoding encoding) const {
    return string_ && CFStringGetCString(string_, buffer, size, encoding);
}

CFIndex TCFStr::GetMaxSizeOfFileSystemRepresentation() const {
    return string_ ? CFStringGetMaximumSizeOfFileSystemRepresentation(string_) : 0;
}

bool TCFStr::GetFileSystemRepresentation(char* buffer, CFIndex size) const {
    return string_ && CFStringGetFileSystemRepresentation(string_, buffer, size);
}

CFRange TCFStr::Find(CFStringRef string, CFStringCompareFlags options) const {
    if (!string_ || !string)
        return CFRangeMake(kCFNotFound, 0);
    return CFStringFind(string_, string, options);
}

bool TCFStr::HasPrefix(CFStringRef prefix) const {
    return string_ && prefix && CFStringHasPrefix(string_, prefix);
}

CFStringRef TCFStr::CreateSubstring(CFRange range) const {
    return string_ ? CFStringCreateWithSubstring(kCFAllocatorDefault, string_, range) : nullptr;
}

TCFString::TCFString(UInt32 code) : TCFStr(CFString::CopyAsString(code)) {}

TCFString::TCFString(const UInt8* bytes, CFIndex length, CFStringEncoding encoding)
    : TCFStr(CFStringCreateWithBytes(kCFAllocatorDefault, bytes, length, encoding, false)) {}

TCFString::~TCFString() {
    TCFSafeRelease(string_);
}

CFStringRef TCFString::Orphan() {
    CFStringRef string = string_;
    string_ = nullptr;
    return string;
}

TCFMutableString::TCFMutableString(CFIndex maxLength)
    : TCFString(CFStringCreateMutable(kCFAllocatorDefault, maxLength)) {}
