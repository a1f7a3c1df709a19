#include "cfutil/TCFURL.h"

TCFURL::TCFURL(CFStringRef path, is_file_t, CFURLRef baseURL)
    : url_(path ? CFURLCreateWithFileSystemPathRelativeToBase(kCFAllocatorDefault, path,
                                                              kCFURLPOSIXPathStyle, false, baseURL)
                : nullptr) {}

TCFURL::~TCFURL() {
    TCFSafeRelease(url_);
}

CFURLRef TCFURL::Orphan() {
    CFURLRef url = url_;
    url_ = nullptr;
    return url;
}
