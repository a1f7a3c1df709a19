// UUIDs: 16 bytes in their natural order.
//
// Bad input: reported once through the assertion handler (naming the function called); then
// creators give null, readers 0, false or null, and modifiers change nothing (see CFBase.h).
#pragma once

#include "platform/CFBase.h"

CFTypeID CFUUIDGetTypeID();

struct CFUUIDBytes {
    UInt8 byte0, byte1, byte2, byte3, byte4, byte5, byte6, byte7;
    UInt8 byte8, byte9, byte10, byte11, byte12, byte13, byte14, byte15;
};

/// A new random (version 4) UUID.
CFUUIDRef CFUUIDCreate(CFAllocatorRef allocator);
CFUUIDRef CFUUIDCreateFromUUIDBytes(CFAllocatorRef allocator, CFUUIDBytes bytes);
/// From the 8-4-4-4-12 hexadecimal form (either case); null when malformed.
CFUUIDRef CFUUIDCreateFromString(CFAllocatorRef allocator, CFStringRef string);
/// A new string in upper-case 8-4-4-4-12 form.
CFStringRef CFUUIDCreateString(CFAllocatorRef allocator, CFUUIDRef uuid);
CFUUIDBytes CFUUIDGetUUIDBytes(CFUUIDRef uuid);
