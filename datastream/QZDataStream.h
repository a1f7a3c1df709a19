// Segmented data stream: a growable byte buffer divided into nested segments, with a writer and
// a reader over the same buffer.
//
// The buffer is the segment tree written depth-first. Every segment starts with a 24-byte header
// (QZDataStreamSegment) followed by its content; a nested segment lies inside its parent's
// content where it was opened. The root's header is at position 0. Because the headers travel in
// the buffer, a finished buffer can be handed to QZDataStreamWithData and read by another stream.
//
// The open segments form two stacks linked through the headers' `parent` fields: the read stack
// (top: readTop) and the write stack (top: writeTop). Both start at the root, so the root's
// `position` is the one cursor for writing and for reading the root: write a stream, then
// QZDataStreamResetStream, then read it.
//
// Untrusted buffers. QZDataStreamWithData accepts any bytes, so the readers never trust a header:
// whatever its fields hold, no function reads or writes outside the buffer and no walk up the
// stacks loops. Concretely:
//   - an operation on a header that does not fit inside the buffer is refused (it does nothing,
//     or returns null, -1 or 0 as its contract says);
//   - a parent must lie before its child (as in every buffer this library writes); a header whose
//     parent does not is treated as having no parent, and the root (position 0) is never closed;
//   - reads stop at the end of the current segment and at the end of the buffer.
// Positions and lengths are signed 32-bit: a stream holds less than 2 GiB, and an append that
// would take the buffer past INT32_MAX bytes is refused.
//
// Null stream arguments are accepted everywhere and do nothing (or return null, -1 or 0).
// A stream is used by one thread at a time; the functions take no locks.
//
// NOTE: The header pointers returned by QZDataStreamCurrentReadSegment,
// QZDataStreamCurrentWriteSegment and QZDataStreamSkipReadSegment, and the string pointers
// returned by QZDataStreamReadString and QZDataStreamReadCString, point into the buffer. They are
// valid only until the buffer next grows or changes (any append, open of a write segment, clear,
// or change made to the data object by its owner) and until the stream is freed.
#pragma once

#include <cstdint>

#include "platform/CFData.h"

/// A segment header as stored in the buffer: six 32-bit fields in host byte order. The struct is
/// packed (alignment 1) because headers sit at arbitrary byte positions; a header pointer handed
/// out by this library may therefore be dereferenced wherever it points.
struct __attribute__((packed)) QZDataStreamSegment {
    uint32_t segmentID; ///< low 32 bits of QZDataStreamNextSegmentID at creation
    int32_t start;      ///< position of the first content byte: the header's position + 24
    int32_t length;     ///< content bytes, nested headers and contents included
    int32_t position;   ///< cursor: where the next item is read or written
    int32_t parent;     ///< position of the enclosing segment's header; -1 for the root
    uint32_t count;     ///< items written into, or read from, the segment
};
static_assert(sizeof(QZDataStreamSegment) == 24, "a segment header is 24 bytes in the buffer");
static_assert(alignof(QZDataStreamSegment) == 1, "headers sit at arbitrary positions");

/// The stream record. One heap block per stream, from QZDataStreamCreateStream or
/// QZDataStreamWithData until QZDataStreamFree.
struct QZDataStream {
    CFMutableDataRef data;  ///< the whole buffer (headers and contents); one reference held
    uint64_t nextSegmentID; ///< next id to hand out
    int64_t readTop;        ///< header position of the innermost open read segment
    int64_t writeTop;       ///< header position of the innermost open write segment; -1 before
                            ///< the root header exists
};
typedef QZDataStream* QZDataStreamRef;

// ---------------------------------------------------------------------------------------------
// Lifetime

/// A new stream over a new empty buffer holding only the root header (id 0, start 24, length 0,
/// position 24, parent -1, count 0); readTop = writeTop = 0, the next id is 1. The caller frees
/// it with QZDataStreamFree.
QZDataStreamRef QZDataStreamCreateStream();

/// A new stream over `data`, which it retains and will change: a fresh root header (id 0) is
/// written over the first 24 bytes (a shorter buffer is first grown with zeros to 24 bytes), and
/// the root's length is the buffer length - 24, so its content is everything after the header.
/// readTop = writeTop = 0. Null `data`, or a buffer longer than INT32_MAX bytes, gives null.
/// The caller frees the stream with QZDataStreamFree.
QZDataStreamRef QZDataStreamWithData(CFMutableDataRef data);

/// Releases the buffer, clears the record and frees it. Null is a no-op.
void QZDataStreamFree(QZDataStreamRef stream);

/// Returns the next segment id and advances the counter. 0 for a null stream.
uint64_t QZDataStreamNextSegmentID(QZDataStreamRef stream);

/// Debug dump to the standard error stream: "readStack:\n", one line per open read segment from
/// the innermost to the root ("\tid:%ld\tcnt:%ld\t <s:%ld l:%ld/%ld p:%ld>\n": id, count, start,
/// length, buffer length, position), "writeStack:\n" and the write stack the same way, "\n", then
/// CFShow of the buffer.
void QZDataStreamShow(QZDataStreamRef stream);

// ---------------------------------------------------------------------------------------------
// Reading

/// Enters the segment whose header is at the current read segment's position: that segment's
/// position is reset to its start and it becomes the current read segment. Returns its header's
/// position. When no 24-byte header fits between the cursor and the end of the current segment's
/// content (and of the buffer), nothing changes and -1 is returned.
int64_t QZDataStreamOpenReadSegment(QZDataStreamRef stream);

/// Leaves the current read segment: its parent becomes current and the parent's position moves
/// to the byte after the closed segment's content (start + length). At the root, or when the
/// header has no usable parent, nothing happens.
void QZDataStreamCloseReadSegment(QZDataStreamRef stream);

/// Skips the segment whose header is at the current read segment's position: the position moves
/// to that segment's start + length. Returns the current read segment's header; null, with
/// nothing changed, when no header fits there (as for QZDataStreamOpenReadSegment).
QZDataStreamSegment* QZDataStreamSkipReadSegment(QZDataStreamRef stream);

/// Moves the current read segment's position back to its start.
void QZDataStreamResetReadSegment(QZDataStreamRef stream);

/// Closes read segments until the root is current, then moves the root's position to its start.
/// A chain of parents that breaks off (corrupt headers) ends at the root all the same.
void QZDataStreamResetStream(QZDataStreamRef stream);

/// The current read segment's header, or null when it does not fit inside the buffer.
/// Does not copy: see the NOTE at the top about how long the pointer stays valid.
QZDataStreamSegment* QZDataStreamCurrentReadSegment(QZDataStreamRef stream);

/// Copies up to `n` bytes from the cursor to `destination`, no more than are left in the current
/// segment (start + length - position) nor in the buffer; advances the position by that many and
/// returns it. The segment's count is not changed. n <= 0, or a null destination, reads nothing.
int32_t QZDataStreamReadBytes(QZDataStreamRef stream, void* destination, CFIndex n);

/// The buffer length - the current read segment's position: every byte after the cursor, across
/// segment ends. 0 when the current header does not fit inside the buffer.
int64_t QZDataStreamBytesLeftToRead(QZDataStreamRef stream);

/// start + length - position of the current read segment (negative once a string without
/// terminator has moved the cursor past the end; saturated to the 32-bit range for corrupt
/// headers). 0 when the current header does not fit inside the buffer.
int32_t QZDataStreamBytesLeftToReadInCurrentSegment(QZDataStreamRef stream);

/// Reads 4 bytes in host byte order; bytes not available in the segment read as zero.
uint32_t QZDataStreamReadUInt32(QZDataStreamRef stream);

/// Reads an 8-byte IEEE 754 double in host byte order; bytes not available read as zero.
double QZDataStreamReadDouble(QZDataStreamRef stream);

/// Reads a zero-terminated string at the cursor and returns a pointer to it inside the buffer
/// (not a copy), storing its length without the terminator in `outLength` when given. The length
/// is capped at the bytes left in the segment and in the buffer: a string without a terminator
/// there is returned up to that end. The position moves past the terminator (length + 1, so one
/// byte past the end for an unterminated string) and the count grows by 1.
/// Returns null and stores 0, with nothing changed, when the segment is empty or no byte is left
/// before its end (or the buffer's end), including when the cursor is already past the end.
/// Without `outLength` the caller relies on a terminator: when no zero byte follows anywhere in
/// the buffer, the read still happens but null is returned.
const char* QZDataStreamReadString(QZDataStreamRef stream, int32_t* outLength);

/// QZDataStreamReadString without the length. When the string has no terminator inside the
/// segment, "hi\n" is written to the standard error stream; null is returned when no zero byte
/// follows anywhere in the buffer, since the caller would run off its end.
const char* QZDataStreamReadCString(QZDataStreamRef stream);

// ---------------------------------------------------------------------------------------------
// Writing. Items are appended at the end of the buffer; the current write segment's position
// and length grow by the item's size and its count by 1.

/// Opens a segment at the current write segment's position: the buffer is grown with zeros to
/// reach position + 24 when shorter, a new header (next id, length 0, position = start, count 0,
/// parent = the current write segment) is written there, and it becomes the current write
/// segment. The parent's length, position and count change only when the child is closed.
/// Refused when the position is negative or the header would end past INT32_MAX.
void QZDataStreamOpenWriteSegment(QZDataStreamRef stream);

/// Closes the current write segment C: its parent P becomes current, P's length grows by
/// C's position - P's position (C's header and content), P's position becomes C's position and
/// P's count grows by 1. At the root, or when C has no usable parent, nothing happens.
void QZDataStreamCloseWriteSegment(QZDataStreamRef stream);

/// Opens and closes a segment: a 24-byte header with length 0, one item of the enclosing segment.
void QZDataStreamAppendEmptySegment(QZDataStreamRef stream);

/// `n` times QZDataStreamAppendEmptySegment; nothing for n <= 0.
void QZDataStreamAppendEmptySegments(QZDataStreamRef stream, CFIndex n);

/// The current write segment's header, or null when it does not fit inside the buffer.
/// Does not copy: see the NOTE at the top about how long the pointer stays valid.
QZDataStreamSegment* QZDataStreamCurrentWriteSegment(QZDataStreamRef stream);

/// Appends `n` bytes as one item (n = 0 still counts one item). Refused for n < 0, null bytes
/// with n > 0, or a buffer that would exceed INT32_MAX bytes. `bytes` may point into this
/// stream's own buffer (a string just read, say): the data object copies them before it grows.
void QZDataStreamAppendBytes(QZDataStreamRef stream, const void* bytes, CFIndex n);

/// Appends the 4 bytes of `value` in host byte order, one item.
void QZDataStreamAppendUInt32(QZDataStreamRef stream, uint32_t value);

/// Appends the 8 bytes of `value` in host byte order, one item.
void QZDataStreamAppendDouble(QZDataStreamRef stream, double value);

/// Appends the `n` bytes and a zero byte: one item of n + 1 bytes. Same refusals as
/// QZDataStreamAppendBytes.
void QZDataStreamAppendString(QZDataStreamRef stream, const char* bytes, CFIndex n);

/// Appends `text` with its terminator as one item. Null text is refused.
void QZDataStreamAppendCString(QZDataStreamRef stream, const char* text);

/// `n` times an empty string: n zero bytes, n items; nothing for n <= 0.
void QZDataStreamAppendEmptyStrings(QZDataStreamRef stream, CFIndex n);

/// QZDataStreamResetStream, then cuts the buffer to the current write segment's start and sets
/// that segment's length to 0 and its position to its start; its count stays. Nothing is cut
/// when the start does not lie between the end of the segment's header and the buffer's end.
void QZDataStreamClearToStartOfSegment(QZDataStreamRef stream);

/// Closes write segments until the root is current, then QZDataStreamClearToStartOfSegment: the
/// buffer is the root header alone. The id counter and the root's count keep their values.
void QZDataStreamClearStream(QZDataStreamRef stream);
