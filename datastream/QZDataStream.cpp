// Segmented data stream: headers are addressed by position and copied in and out of the buffer
// with memcpy (positions are arbitrary, so headers are unaligned), and every position taken from
// a header is checked against the buffer before it is used. The public functions' contracts are
// in QZDataStream.h.
#include "datastream/QZDataStream.h"

#include <algorithm>
#include <cstdio>
#include <cstring>

namespace {

constexpr int64_t kHeaderSize = sizeof(QZDataStreamSegment);

/// Adds in 64 bits and keeps the low 32 bits: header fields of corrupt buffers may hold anything,
/// and their sums must not overflow. Streams this library writes never wrap (buffer < 2 GiB).
int32_t wrap32(int64_t value) {
    return static_cast<int32_t>(static_cast<uint32_t>(value));
}

int64_t bufferLength(QZDataStreamRef stream) {
    return CFDataGetLength(stream->data);
}

UInt8* bufferBytes(QZDataStreamRef stream) {
    return CFDataGetMutableBytePtr(stream->data);
}

/// True when a whole header at `position` lies inside the buffer.
bool headerFits(QZDataStreamRef stream, int64_t position) {
    return position >= 0 && position <= bufferLength(stream) - kHeaderSize;
}

QZDataStreamSegment load(const QZDataStreamSegment* header) {
    QZDataStreamSegment value;
    std::memcpy(&value, header, sizeof value);
    return value;
}

void store(QZDataStreamSegment* header, const QZDataStreamSegment& value) {
    std::memcpy(header, &value, sizeof value);
}

/// The header at `position`; null for -1 and for any position where a header does not fit
/// inside the buffer.
QZDataStreamSegment* segmentAtPosition(QZDataStreamRef stream, int64_t position) {
    if (!headerFits(stream, position))
        return nullptr;
    return reinterpret_cast<QZDataStreamSegment*>(bufferBytes(stream) + position);
}

/// The position of `header` in the buffer, or -1 for null. This equals its start - 24 for every
/// header this library writes; it is taken from the address so a corrupt start cannot mislead it.
int64_t indexOfSegment(QZDataStreamRef stream, const QZDataStreamSegment* header) {
    if (!header)
        return -1;
    return reinterpret_cast<const UInt8*>(header) - bufferBytes(stream);
}

/// The header of `header`'s parent; null for the root. A parent must lie before its child, as in
/// every buffer this library writes: any other parent field counts as none, so that every walk
/// up a stack moves strictly backwards and ends.
QZDataStreamSegment* parentOfSegment(QZDataStreamRef stream, const QZDataStreamSegment* header) {
    if (!header)
        return nullptr;
    int64_t parent = load(header).parent;
    if (parent >= indexOfSegment(stream, header))
        return nullptr;
    return segmentAtPosition(stream, parent);
}

/// The innermost open read segment's header (null when it does not fit inside the buffer).
QZDataStreamSegment* readStack(QZDataStreamRef stream) {
    return segmentAtPosition(stream, stream->readTop);
}

/// The innermost open write segment's header (null when it does not fit inside the buffer).
QZDataStreamSegment* writeStack(QZDataStreamRef stream) {
    return segmentAtPosition(stream, stream->writeTop);
}

/// Grows the buffer with zeros to reach position + 24, writes a new header there whose parent
/// is the current write segment, and makes it the current write segment. Returns the header, or
/// null (nothing changed) for a negative position or one whose header would end past INT32_MAX.
QZDataStreamSegment* writeSegmentAtPosition(QZDataStreamRef stream, int64_t position) {
    if (position < 0 || position > INT32_MAX - kHeaderSize)
        return nullptr;
    int64_t missing = position + kHeaderSize - bufferLength(stream);
    if (missing > 0)
        CFDataIncreaseLength(stream->data, missing);
    QZDataStreamSegment header;
    header.segmentID = static_cast<uint32_t>(QZDataStreamNextSegmentID(stream));
    header.start = static_cast<int32_t>(position + kHeaderSize);
    header.length = 0;
    header.position = header.start;
    header.parent = static_cast<int32_t>(stream->writeTop);
    header.count = 0;
    QZDataStreamSegment* slot = segmentAtPosition(stream, position);
    store(slot, header);
    stream->writeTop = position;
    return slot;
}

/// The header at the cursor of `current`, the one QZDataStreamOpenReadSegment and
/// QZDataStreamSkipReadSegment act on; null unless a whole header fits between the cursor and the
/// end of `current`'s content (and of the buffer).
QZDataStreamSegment* nestedReadSegment(QZDataStreamRef stream, QZDataStreamSegment* current) {
    if (!current)
        return nullptr;
    QZDataStreamSegment s = load(current);
    int64_t end = static_cast<int64_t>(s.start) + s.length;
    if (s.position < s.start || s.position + kHeaderSize > end)
        return nullptr;
    return segmentAtPosition(stream, s.position);
}

/// The string at the cursor of the current read segment, for both string readers: moves past
/// it and counts it. Returns null (nothing changed, *length 0) when no byte is left before the
/// segment's or the buffer's end. *terminated says whether a zero byte ended it inside the
/// segment; *terminatedInBuffer whether a zero byte follows anywhere in the buffer.
const char* readString(QZDataStreamRef stream, int32_t* length, bool* terminated,
                       bool* terminatedInBuffer) {
    *length = 0;
    *terminated = *terminatedInBuffer = false;
    QZDataStreamSegment* current = readStack(stream);
    if (!current)
        return nullptr;
    QZDataStreamSegment s = load(current);
    int64_t segmentEnd = static_cast<int64_t>(s.start) + s.length;
    int64_t limit = std::min(segmentEnd, bufferLength(stream));
    if (s.length == 0 || s.position < 0 || s.position >= limit)
        return nullptr;

    const UInt8* text = bufferBytes(stream) + s.position;
    const void* zero = std::memchr(text, 0, static_cast<size_t>(limit - s.position));
    int64_t found = zero ? static_cast<const UInt8*>(zero) - text : limit - s.position;
    *terminated = zero != nullptr;
    *terminatedInBuffer =
        zero || std::memchr(text, 0, static_cast<size_t>(bufferLength(stream) - s.position));
    *length = static_cast<int32_t>(found);

    s.position = wrap32(static_cast<int64_t>(s.position) + found + 1);
    s.count += 1;
    store(current, s);
    return reinterpret_cast<const char*>(text);
}

/// Appends `n` bytes and then `zeros` zero bytes as one item of the current write segment.
/// Refused (false, nothing changed) for bad arguments or when the buffer would exceed INT32_MAX
/// bytes.
bool appendItem(QZDataStreamRef stream, const void* bytes, CFIndex n, CFIndex zeros) {
    if (!stream || n < 0 || (n > 0 && !bytes) || n > INT32_MAX)
        return false;
    QZDataStreamSegment* current = writeStack(stream);
    if (!current || bufferLength(stream) + n + zeros > INT32_MAX)
        return false;
    QZDataStreamSegment s = load(current);
    int64_t writeTop = stream->writeTop;
    if (n > 0)
        CFDataAppendBytes(stream->data, static_cast<const UInt8*>(bytes), n);
    if (zeros > 0)
        CFDataIncreaseLength(stream->data, zeros);
    s.position = wrap32(static_cast<int64_t>(s.position) + n + zeros);
    s.length = wrap32(static_cast<int64_t>(s.length) + n + zeros);
    s.count += 1;
    store(segmentAtPosition(stream, writeTop), s); // the buffer may have moved
    return true;
}

/// Opens a write segment; false when it was refused.
bool openWriteSegment(QZDataStreamRef stream) {
    QZDataStreamSegment* current = writeStack(stream);
    return current && writeSegmentAtPosition(stream, load(current).position);
}

/// Closes the current write segment; false when it was refused (root, or no usable parent).
bool closeWriteSegment(QZDataStreamRef stream) {
    QZDataStreamSegment* child = writeStack(stream);
    QZDataStreamSegment* parent = parentOfSegment(stream, child);
    if (stream->writeTop == 0 || !parent)
        return false;
    int32_t end = load(child).position;
    QZDataStreamSegment p = load(parent);
    p.length = wrap32(static_cast<int64_t>(p.length) + end - p.position);
    p.position = end;
    p.count += 1;
    store(parent, p);
    stream->writeTop = indexOfSegment(stream, parent);
    return true;
}

/// Appends an empty segment; false when it was refused.
bool appendEmptySegment(QZDataStreamRef stream) {
    return stream && openWriteSegment(stream) && closeWriteSegment(stream);
}

/// Closes the current read segment; false when it was refused (root, or no usable parent).
bool closeReadSegment(QZDataStreamRef stream) {
    QZDataStreamSegment* child = readStack(stream);
    QZDataStreamSegment* parent = parentOfSegment(stream, child);
    if (stream->readTop == 0 || !parent)
        return false;
    QZDataStreamSegment c = load(child);
    QZDataStreamSegment p = load(parent);
    p.position = wrap32(static_cast<int64_t>(c.start) + c.length);
    store(parent, p);
    stream->readTop = indexOfSegment(stream, parent);
    return true;
}

/// Writes one stack, innermost first, in the debug dump's line format.
void showStack(QZDataStreamRef stream, QZDataStreamSegment* header) {
    for (; header; header = parentOfSegment(stream, header)) {
        QZDataStreamSegment s = load(header);
        fprintf(stderr, "\tid:%ld\tcnt:%ld\t <s:%ld l:%ld/%ld p:%ld>\n", long(s.segmentID),
                long(s.count), long(s.start), long(s.length), long(bufferLength(stream)),
                long(s.position));
    }
}

} // namespace

// ---------------------------------------------------------------------------------------------
// Lifetime

QZDataStreamRef QZDataStreamCreateStream() {
    QZDataStreamRef stream = new QZDataStream{};
    stream->data = CFDataCreateMutable(kCFAllocatorDefault, 0);
    stream->writeTop = -1;
    writeSegmentAtPosition(stream, 0);
    stream->readTop = 0;
    return stream;
}

QZDataStreamRef QZDataStreamWithData(CFMutableDataRef data) {
    if (!data || CFDataGetLength(data) > INT32_MAX)
        return nullptr;
    QZDataStreamRef stream = new QZDataStream{};
    CFRetain(data);
    stream->data = data;
    stream->writeTop = -1;
    QZDataStreamSegment* root = writeSegmentAtPosition(stream, 0);
    QZDataStreamSegment s = load(root);
    s.length = static_cast<int32_t>(bufferLength(stream) - kHeaderSize);
    store(root, s);
    stream->readTop = 0;
    return stream;
}

void QZDataStreamFree(QZDataStreamRef stream) {
    if (!stream)
        return;
    if (stream->data)
        CFRelease(stream->data);
    *stream = QZDataStream{};
    delete stream;
}

uint64_t QZDataStreamNextSegmentID(QZDataStreamRef stream) {
    return stream ? stream->nextSegmentID++ : 0;
}

void QZDataStreamShow(QZDataStreamRef stream) {
    if (!stream)
        return;
    fprintf(stderr, "readStack:\n");
    showStack(stream, readStack(stream));
    fprintf(stderr, "writeStack:\n");
    showStack(stream, writeStack(stream));
    fprintf(stderr, "\n");
    CFShow(stream->data);
}

// ---------------------------------------------------------------------------------------------
// Reading

int64_t QZDataStreamOpenReadSegment(QZDataStreamRef stream) {
    if (!stream)
        return -1;
    QZDataStreamSegment* child = nestedReadSegment(stream, readStack(stream));
    if (!child)
        return -1;
    QZDataStreamSegment c = load(child);
    c.position = c.start;
    store(child, c);
    stream->readTop = indexOfSegment(stream, child);
    return stream->readTop;
}

void QZDataStreamCloseReadSegment(QZDataStreamRef stream) {
    if (stream)
        closeReadSegment(stream);
}

QZDataStreamSegment* QZDataStreamSkipReadSegment(QZDataStreamRef stream) {
    if (!stream)
        return nullptr;
    QZDataStreamSegment* current = readStack(stream);
    QZDataStreamSegment* skipped = nestedReadSegment(stream, current);
    if (!skipped)
        return nullptr;
    QZDataStreamSegment k = load(skipped);
    QZDataStreamSegment s = load(current);
    s.position = wrap32(static_cast<int64_t>(k.start) + k.length);
    store(current, s);
    return current;
}

void QZDataStreamResetReadSegment(QZDataStreamRef stream) {
    QZDataStreamSegment* current = stream ? readStack(stream) : nullptr;
    if (!current)
        return;
    QZDataStreamSegment s = load(current);
    s.position = s.start;
    store(current, s);
}

void QZDataStreamResetStream(QZDataStreamRef stream) {
    if (!stream)
        return;
    // Every close moves readTop strictly backwards, so this ends; a broken chain jumps to the root.
    while (stream->readTop != 0) {
        if (!closeReadSegment(stream))
            stream->readTop = 0;
    }
    QZDataStreamResetReadSegment(stream);
}

QZDataStreamSegment* QZDataStreamCurrentReadSegment(QZDataStreamRef stream) {
    return stream ? readStack(stream) : nullptr;
}

int32_t QZDataStreamReadBytes(QZDataStreamRef stream, void* destination, CFIndex n) {
    QZDataStreamSegment* current = stream ? readStack(stream) : nullptr;
    if (!current || !destination || n <= 0)
        return 0;
    QZDataStreamSegment s = load(current);
    if (s.position < 0)
        return 0;
    int64_t segmentLeft = static_cast<int64_t>(s.start) + s.length - s.position;
    int64_t bufferLeft = bufferLength(stream) - s.position;
    int64_t k = std::max<int64_t>(0, std::min({static_cast<int64_t>(n), segmentLeft, bufferLeft}));
    if (k == 0)
        return 0;
    std::memcpy(destination, bufferBytes(stream) + s.position, static_cast<size_t>(k));
    s.position = static_cast<int32_t>(s.position + k); // stays inside the buffer: < 2 GiB
    store(current, s);
    return static_cast<int32_t>(k);
}

int64_t QZDataStreamBytesLeftToRead(QZDataStreamRef stream) {
    QZDataStreamSegment* current = stream ? readStack(stream) : nullptr;
    return current ? bufferLength(stream) - load(current).position : 0;
}

int32_t QZDataStreamBytesLeftToReadInCurrentSegment(QZDataStreamRef stream) {
    QZDataStreamSegment* current = stream ? readStack(stream) : nullptr;
    if (!current)
        return 0;
    QZDataStreamSegment s = load(current);
    int64_t left = static_cast<int64_t>(s.start) + s.length - s.position;
    return static_cast<int32_t>(std::clamp<int64_t>(left, INT32_MIN, INT32_MAX));
}

uint32_t QZDataStreamReadUInt32(QZDataStreamRef stream) {
    unsigned char bytes[sizeof(uint32_t)] = {};
    QZDataStreamReadBytes(stream, bytes, sizeof bytes);
    uint32_t value;
    std::memcpy(&value, bytes, sizeof value);
    return value;
}

double QZDataStreamReadDouble(QZDataStreamRef stream) {
    unsigned char bytes[sizeof(double)] = {};
    QZDataStreamReadBytes(stream, bytes, sizeof bytes);
    double value;
    std::memcpy(&value, bytes, sizeof value);
    return value;
}

const char* QZDataStreamReadString(QZDataStreamRef stream, int32_t* outLength) {
    int32_t length = 0;
    bool terminated = false, terminatedInBuffer = false;
    const char* text =
        stream ? readString(stream, &length, &terminated, &terminatedInBuffer) : nullptr;
    if (outLength)
        *outLength = length;
    return outLength || terminatedInBuffer ? text : nullptr;
}

const char* QZDataStreamReadCString(QZDataStreamRef stream) {
    int32_t length = 0;
    bool terminated = false, terminatedInBuffer = false;
    const char* text =
        stream ? readString(stream, &length, &terminated, &terminatedInBuffer) : nullptr;
    if (text && !terminated)
        fprintf(stderr, "hi\n");
    return terminatedInBuffer ? text : nullptr;
}

// ---------------------------------------------------------------------------------------------
// Writing

void QZDataStreamOpenWriteSegment(QZDataStreamRef stream) {
    if (stream)
        openWriteSegment(stream);
}

void QZDataStreamCloseWriteSegment(QZDataStreamRef stream) {
    if (stream)
        closeWriteSegment(stream);
}

void QZDataStreamAppendEmptySegment(QZDataStreamRef stream) {
    appendEmptySegment(stream);
}

void QZDataStreamAppendEmptySegments(QZDataStreamRef stream, CFIndex n) {
    for (CFIndex i = 0; i < n; ++i) {
        if (!appendEmptySegment(stream))
            return; // every later one would be refused too
    }
}

QZDataStreamSegment* QZDataStreamCurrentWriteSegment(QZDataStreamRef stream) {
    return stream ? writeStack(stream) : nullptr;
}

void QZDataStreamAppendBytes(QZDataStreamRef stream, const void* bytes, CFIndex n) {
    appendItem(stream, bytes, n, 0);
}

void QZDataStreamAppendUInt32(QZDataStreamRef stream, uint32_t value) {
    appendItem(stream, &value, sizeof value, 0);
}

void QZDataStreamAppendDouble(QZDataStreamRef stream, double value) {
    appendItem(stream, &value, sizeof value, 0);
}

void QZDataStreamAppendString(QZDataStreamRef stream, const char* bytes, CFIndex n) {
    appendItem(stream, bytes, n, 1);
}

void QZDataStreamAppendCString(QZDataStreamRef stream, const char* text) {
    if (text)
        appendItem(stream, text, static_cast<CFIndex>(std::strlen(text)) + 1, 0);
}

void QZDataStreamAppendEmptyStrings(QZDataStreamRef stream, CFIndex n) {
    for (CFIndex i = 0; i < n; ++i) {
        if (!appendItem(stream, nullptr, 0, 1))
            return; // every later one would be refused too
    }
}

void QZDataStreamClearToStartOfSegment(QZDataStreamRef stream) {
    if (!stream)
        return;
    QZDataStreamResetStream(stream);
    QZDataStreamSegment* current = writeStack(stream);
    if (!current)
        return;
    QZDataStreamSegment s = load(current);
    if (s.start < stream->writeTop + kHeaderSize || s.start > bufferLength(stream))
        return;
    int64_t writeTop = stream->writeTop;
    CFDataSetLength(stream->data, s.start);
    s.length = 0;
    s.position = s.start;
    store(segmentAtPosition(stream, writeTop), s);
}

void QZDataStreamClearStream(QZDataStreamRef stream) {
    if (!stream)
        return;
    // Every close moves writeTop strictly backwards, so this ends; a broken chain jumps to the
    // root.
    while (stream->writeTop != 0) {
        if (!closeWriteSegment(stream))
            stream->writeTop = 0;
    }
    QZDataStreamClearToStartOfSegment(stream);
}
