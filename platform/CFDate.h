// Dates and the null value: kinds that exist on the platform but that the flattened value
// stream does not carry.
//
// Bad input: reported once through the assertion handler (naming the function called); then
// creators give null, readers 0, false or null, and modifiers change nothing (see CFBase.h).
#pragma once

#include "platform/CFBase.h"

typedef double CFTimeInterval;
typedef CFTimeInterval CFAbsoluteTime; ///< seconds since 2001-01-01 00:00:00 UTC

CFTypeID CFDateGetTypeID();
CFDateRef CFDateCreate(CFAllocatorRef allocator, CFAbsoluteTime at);
CFAbsoluteTime CFDateGetAbsoluteTime(CFDateRef date);
CFAbsoluteTime CFAbsoluteTimeGetCurrent();

CFTypeID CFNullGetTypeID();
extern const CFNullRef kCFNull;
