// Character sets over the Unicode code space (planes 0-16), kept as one 8192-byte bitmap per
// plane that has members.
//
// Bitmap representation: the Basic Multilingual Plane's 8192 bytes, code point c at bit (c & 7)
// of byte (c >> 3); then, for each plane 1-16 that has members, in increasing order, one byte
// with the plane number followed by that plane's 8192 bytes.
//
// Bad input: reported once through the assertion handler (naming the function called); then
// creators give null, readers 0, false or null, and modifiers change nothing (see CFBase.h).
#pragma once

#include "platform/CFBase.h"

CFTypeID CFCharacterSetGetTypeID();

/// A new set from a bitmap representation. A representation of exactly 8192 + k × 8193 bytes
/// (k from 0 to 16, plane bytes 1-16, each plane once) is accepted; an empty data object yields
/// the empty set; anything else (a null data object included) yields null.
CFCharacterSetRef CFCharacterSetCreateWithBitmapRepresentation(CFAllocatorRef allocator,
                                                               CFDataRef representation);
/// A new data object with the set's bitmap representation (the BMP bitmap always, the other
/// planes only when they have members).
CFDataRef CFCharacterSetCreateBitmapRepresentation(CFAllocatorRef allocator, CFCharacterSetRef set);
/// A new set of the code points in `range` (clipped to 0 ... 0x10FFFF); null for a negative
/// length.
CFCharacterSetRef CFCharacterSetCreateWithCharactersInRange(CFAllocatorRef allocator,
                                                            CFRange range);
/// A new set of the characters of `string` (surrogate pairs count as one code point).
CFCharacterSetRef CFCharacterSetCreateWithCharactersInString(CFAllocatorRef allocator,
                                                             CFStringRef string);
CFCharacterSetRef CFCharacterSetCreateCopy(CFAllocatorRef allocator, CFCharacterSetRef set);
CFMutableCharacterSetRef CFCharacterSetCreateMutable(CFAllocatorRef allocator);
CFMutableCharacterSetRef CFCharacterSetCreateMutableCopy(CFAllocatorRef allocator,
                                                         CFCharacterSetRef set);

Boolean CFCharacterSetIsCharacterMember(CFCharacterSetRef set, UniChar character);
Boolean CFCharacterSetIsLongCharacterMember(CFCharacterSetRef set, UTF32Char character);
/// True when the set has a member in `plane` (0-16); false for any other plane number.
Boolean CFCharacterSetHasMemberInPlane(CFCharacterSetRef set, CFIndex plane);

void CFCharacterSetAddCharactersInRange(CFMutableCharacterSetRef set, CFRange range);
void CFCharacterSetRemoveCharactersInRange(CFMutableCharacterSetRef set, CFRange range);
void CFCharacterSetAddCharactersInString(CFMutableCharacterSetRef set, CFStringRef string);
void CFCharacterSetUnion(CFMutableCharacterSetRef set, CFCharacterSetRef other);
