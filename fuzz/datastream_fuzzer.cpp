// The segmented data stream's readers over untrusted buffers. Input: a little-endian 16-bit length
// N, N bytes of buffer (padded to a root header), then one byte per reader operation, some with an
// argument byte. Every pointer handed out must lie inside the buffer. Run with -close_fd_mask=2.
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstring>

#include "FuzzSupport.h"
#include "datastream/QZDataStream.h"
#include "platform/CFBase.h"
#include "platform/CFData.h"

namespace {

bool inside(QZDataStreamRef stream, const void* pointer, int64_t size) {
    const UInt8* base = CFDataGetBytePtr(stream->data);
    const UInt8* at = static_cast<const UInt8*>(pointer);
    return at >= base && at + size <= base + CFDataGetLength(stream->data);
}

void run(QZDataStreamRef stream, const uint8_t* program, size_t size) {
    unsigned char scratch[256];
    for (size_t i = 0; i < size; ++i) {
        uint8_t op = program[i] % 14;
        uint8_t argument = i + 1 < size ? program[i + 1] : 0;
        int32_t length = -1;
        const char* text = nullptr;
        QZDataStreamSegment* header = nullptr;
        switch (op) {
        case 0: {
            int64_t opened = QZDataStreamOpenReadSegment(stream);
            fuzz::Check(opened == -1 || opened == stream->readTop);
            break;
        }
        case 1:
            QZDataStreamCloseReadSegment(stream);
            break;
        case 2:
            header = QZDataStreamSkipReadSegment(stream);
            fuzz::Check(!header || inside(stream, header, sizeof *header));
            break;
        case 3:
            QZDataStreamResetReadSegment(stream);
            break;
        case 4:
            QZDataStreamResetStream(stream);
            fuzz::Check(stream->readTop == 0);
            break;
        case 5:
            fuzz::Check(QZDataStreamReadBytes(stream, scratch, argument) <= argument);
            ++i;
            break;
        case 6:
            QZDataStreamReadUInt32(stream);
            break;
        case 7:
            QZDataStreamReadDouble(stream);
            break;
        case 8:
            text = QZDataStreamReadString(stream, &length);
            fuzz::Check(length >= 0 && (!text || inside(stream, text, length)));
            fuzz::Check(text || length == 0);
            break;
        case 9:
            text = QZDataStreamReadString(stream, nullptr);
            fuzz::Check(!text || inside(stream, text, int64_t(strlen(text)) + 1));
            break;
        case 10:
            text = QZDataStreamReadCString(stream);
            fuzz::Check(!text || inside(stream, text, int64_t(strlen(text)) + 1));
            break;
        case 11:
            QZDataStreamBytesLeftToRead(stream);
            QZDataStreamBytesLeftToReadInCurrentSegment(stream);
            break;
        case 12:
            header = QZDataStreamCurrentReadSegment(stream);
            fuzz::Check(!header || inside(stream, header, sizeof *header));
            break;
        default:
            if (argument % 16 == 0)
                QZDataStreamShow(stream); // rare: it describes the whole buffer
            ++i;
            break;
        }
    }
}

} // namespace

// Buffered: the readers' stderr lines go to a closed descriptor (sanitizer reports bypass stdio).
extern "C" int LLVMFuzzerInitialize(int*, char***) {
    static char buffer[1 << 16];
    setvbuf(stderr, buffer, _IOFBF, sizeof buffer);
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* input, size_t size) {
    if (size < 2)
        return 0;
    size_t bufferSize = input[0] | size_t(input[1]) << 8;
    input += 2;
    size -= 2;
    if (bufferSize > size)
        bufferSize = size;

    CFMutableDataRef data = CFDataCreateMutable(kCFAllocatorDefault, 0);
    CFDataAppendBytes(data, input, CFIndex(bufferSize));
    QZDataStreamRef stream = QZDataStreamWithData(data);
    CFRelease(data);
    fuzz::Check(stream && CFDataGetLength(stream->data) >= 24);

    run(stream, input + bufferSize, size - bufferSize);

    QZDataStreamClearStream(stream);
    fuzz::Check(CFDataGetLength(stream->data) == 24);
    QZDataStreamFree(stream);
    return 0;
}
