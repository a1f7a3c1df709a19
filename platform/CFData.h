// Byte buffers, immutable or mutable. A mutable data object grows without limit when its
// capacity is 0.
//
// NOTE: CFDataGetBytePtr and CFDataGetMutableBytePtr are valid until the data object next
// changes its length (append, set length, increase, replace, delete) or is destroyed.
//
// Bad input: reported once through the assertion handler (naming the function called); then
// creators give null, readers 0, false or null, and modifiers change nothing (see CFBase.h).
#pragma once

#include "platform/CFBase.h"

CFTypeID CFDataGetTypeID();

/// A new data object with a copy of `length` bytes (null `bytes` allowed when `length` is 0).
CFDataRef CFDataCreate(CFAllocatorRef allocator, const UInt8* bytes, CFIndex length);
/// A new data object over `bytes` without copying them. When the data object is destroyed the
/// bytes are given to `bytesDeallocator`: kCFAllocatorMalloc (and the default allocator) frees
/// them with free(), kCFAllocatorNull leaves them alone.
CFDataRef CFDataCreateWithBytesNoCopy(CFAllocatorRef allocator, const UInt8* bytes, CFIndex length,
                                      CFAllocatorRef bytesDeallocator);
CFDataRef CFDataCreateCopy(CFAllocatorRef allocator, CFDataRef data);
/// A new empty mutable data object; `capacity` 0 means unlimited (a limit is not enforced).
CFMutableDataRef CFDataCreateMutable(CFAllocatorRef allocator, CFIndex capacity);
CFMutableDataRef CFDataCreateMutableCopy(CFAllocatorRef allocator, CFIndex capacity,
                                         CFDataRef data);

CFIndex CFDataGetLength(CFDataRef data);
/// Null for an empty data object is allowed; never dereference past the length.
const UInt8* CFDataGetBytePtr(CFDataRef data);
UInt8* CFDataGetMutableBytePtr(CFMutableDataRef data);
/// Copies the bytes of `range` (kept inside the data by the caller) to `buffer`.
void CFDataGetBytes(CFDataRef data, CFRange range, UInt8* buffer);

/// Cuts or grows the length; new bytes are zero.
void CFDataSetLength(CFMutableDataRef data, CFIndex length);
/// Grows the length by `extraLength` zero bytes.
void CFDataIncreaseLength(CFMutableDataRef data, CFIndex extraLength);
void CFDataAppendBytes(CFMutableDataRef data, const UInt8* bytes, CFIndex length);
/// Replaces the bytes of `range` with `newLength` bytes from `newBytes`.
void CFDataReplaceBytes(CFMutableDataRef data, CFRange range, const UInt8* newBytes,
                        CFIndex newLength);
void CFDataDeleteBytes(CFMutableDataRef data, CFRange range);

namespace glyphwell {

/// Room after the end of a mutable data object: `bytes` points just past its last byte and
/// `size` bytes may be written there. They become part of the data only through DataCommitTail;
/// any other change to the data object may move the room or overwrite it.
struct DataTail {
    UInt8* bytes = nullptr;
    CFIndex size = 0;
    /// Whether this call enlarged the block (which may also have moved it).
    bool grown = false;
};

/// Makes room for at least `minimum` bytes after the end of `data` without changing its length
/// (the block grows geometrically, as for an append) and returns all of the room there is. For
/// writers that fill many small pieces in place and then commit them in one call. Bad input
/// (not mutable data, a negative or overflowing `minimum`) is reported and gives {null, 0}.
DataTail DataReserveTail(CFMutableDataRef data, CFIndex minimum);
/// Adds the first `count` bytes of the room after the end of `data` to its length: bytes
/// written there since DataReserveTail. A `count` beyond the room is reported and nothing
/// changes.
void DataCommitTail(CFMutableDataRef data, CFIndex count);
/// Gives back the room after the end of `data`, so that its block holds its bytes and no more:
/// for a writer that reserved generously and is done. Bad input is reported.
void DataTrimRoom(CFMutableDataRef data);

} // namespace glyphwell
