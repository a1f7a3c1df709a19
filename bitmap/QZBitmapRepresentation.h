// Bitmap representation codec: shrinks a character set's bitmap representation (the BMP's 8192
// bytes, then a plane number and 8192 bytes per further plane) by run-length coding its 16-bit
// words against one fill word, and restores it. The bytes are opaque to the codec.
//
// Compressed layout, all counts little-endian:
//   uint32 format              1: the fill word is 0xFFFF; anything else: 0x0000
//   uint32 uncompressedLength  the input's byte length (its low 32 bits)
//   records                    uint16 literal count L, L words copied as they are, then, when
//                              words remain, uint16 fill count R standing for R fill words;
//                              repeated until every word is accounted for
//   trailing byte              only for an odd length: the input's last byte
#pragma once

#include "platform/CFData.h"

/// Compresses `length` bytes at `bytes`. Returns a new data object; the caller releases it.
/// Null when `bytes` is null, `length` is not positive, or memory runs out.
CFDataRef QZCreateCompressedBitmapRepresentation(const UInt8* bytes, CFIndex length);

/// Restores the bytes of the compressed representation of `length` bytes at `bytes`. Returns a
/// new data object of `uncompressedLength` bytes; the caller releases it. Null for null or empty
/// input, a header shorter than 8 bytes, a zero `uncompressedLength`, records that run past the
/// input or past the output, records that leave output bytes unwritten, a missing trailing
/// byte, or no memory. Never reads outside the input; the output is allocated only after the
/// records have been checked to fill it exactly.
CFDataRef QZCopyUncompressedBitmapRepresentation(const UInt8* bytes, CFIndex length);
