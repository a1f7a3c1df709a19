#include "cfutil/TCFTypeRef.h"

#include "platform/CFNumber.h"
#include "platform/CFString.h"

bool TCFTypeRef::GetBooleanValue(CFTypeRef value) {
    if (!value)
        return false;
    CFTypeID type = CFGetTypeID(value);
    if (type == CFBooleanGetTypeID())
        return CFBooleanGetValue(static_cast<CFBooleanRef>(value));
    if (type == CFStringGetTypeID()) {
        auto string = static_cast<CFStringRef>(value);
        return CFStringCompare(string, CFSTR("true"), kCFCompareCaseInsensitive) ==
                   kCFCompareEqualTo ||
               CFStringCompare(string, CFSTR("YES"), kCFCompareCaseInsensitive) ==
                   kCFCompareEqualTo;
    }
    if (type == CFNumberGetTypeID()) {
        SInt32 integer = 0;
        return CFNumberGetValue(static_cast<CFNumberRef>(value), kCFNumberSInt32Type, &integer) &&
               integer != 0;
    }
    return false;
}
