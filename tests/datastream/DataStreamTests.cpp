// Segmented data stream: buffer layout and header fields byte for byte, writer and reader
// round trips, the debug dump, and corrupt buffers.
#include <cstring>
#include <iterator>
#include <random>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "datastream/QZDataStream.h"
#include "platform/CFData.h"

namespace {

using Bytes = std::vector<uint8_t>;

Bytes BufferOf(QZDataStreamRef stream) {
    const UInt8* bytes = CFDataGetBytePtr(stream->data);
    return Bytes(bytes, bytes + CFDataGetLength(stream->data));
}

QZDataStreamSegment HeaderAt(QZDataStreamRef stream, CFIndex position) {
    QZDataStreamSegment header;
    std::memcpy(&header, CFDataGetBytePtr(stream->data) + position, sizeof header);
    return header;
}

void ExpectHeader(const QZDataStreamSegment& h, uint32_t id, int32_t start, int32_t length,
                  int32_t position, int32_t parent, uint32_t count) {
    EXPECT_EQ(h.segmentID, id);
    EXPECT_EQ(h.start, start);
    EXPECT_EQ(h.length, length);
    EXPECT_EQ(h.position, position);
    EXPECT_EQ(h.parent, parent);
    EXPECT_EQ(h.count, count);
}

// A stream's buffer copied into a new mutable data object, as another process would receive it.
CFMutableDataRef CopyBuffer(QZDataStreamRef stream) {
    return CFDataCreateMutableCopy(kCFAllocatorDefault, 0, stream->data);
}

CFMutableDataRef MakeData(const Bytes& bytes) {
    CFMutableDataRef data = CFDataCreateMutable(kCFAllocatorDefault, 0);
    CFDataAppendBytes(data, bytes.data(), CFIndex(bytes.size()));
    return data;
}

class DataStream : public ::testing::Test {
protected:
    void TearDown() override { QZDataStreamFree(stream); }
    QZDataStreamRef stream = QZDataStreamCreateStream();
};

TEST_F(DataStream, NewStreamIsTheRootHeaderAlone) {
    EXPECT_EQ(BufferOf(stream), (Bytes{0,  0, 0, 0, 24,   0,    0,    0,    0, 0, 0, 0,
                                       24, 0, 0, 0, 0xff, 0xff, 0xff, 0xff, 0, 0, 0, 0}));
    EXPECT_EQ(stream->readTop, 0);
    EXPECT_EQ(stream->writeTop, 0);
    EXPECT_EQ(QZDataStreamNextSegmentID(stream), 1u);
    EXPECT_EQ(QZDataStreamNextSegmentID(stream), 2u);
}

TEST_F(DataStream, AppendedItemsGrowRootLengthPositionAndCount) {
    QZDataStreamAppendBytes(stream, "ab", 2);
    QZDataStreamAppendUInt32(stream, 1);
    EXPECT_EQ(BufferOf(stream),
              (Bytes{0, 0,    0,    0,    24,   0, 0, 0, 6, 0,   0,   0, 30, 0, 0,
                     0, 0xff, 0xff, 0xff, 0xff, 2, 0, 0, 0, 'a', 'b', 1, 0,  0, 0}));
}

TEST_F(DataStream, ClosedWriteSegmentCountsOnceInItsParent) {
    QZDataStreamOpenWriteSegment(stream);
    EXPECT_EQ(stream->writeTop, 24);
    QZDataStreamAppendUInt32(stream, 0x04030201);
    // While the child is open the parent is untouched.
    ExpectHeader(HeaderAt(stream, 0), 0, 24, 0, 24, -1, 0);
    QZDataStreamCloseWriteSegment(stream);
    EXPECT_EQ(stream->writeTop, 0);
    EXPECT_EQ(BufferOf(stream),
              (Bytes{0,    0,    0, 0, 24, 0, 0, 0, 28, 0, 0,  0, 52, 0, 0, 0, 0xff, 0xff,
                     0xff, 0xff, 1, 0, 0,  0, 1, 0, 0,  0, 48, 0, 0,  0, 4, 0, 0,    0,
                     52,   0,    0, 0, 0,  0, 0, 0, 1,  0, 0,  0, 1,  2, 3, 4}));

    QZDataStreamResetStream(stream);
    EXPECT_EQ(QZDataStreamOpenReadSegment(stream), 24);
    EXPECT_EQ(QZDataStreamReadUInt32(stream), 0x04030201u);
    QZDataStreamCloseReadSegment(stream);
    EXPECT_EQ(stream->readTop, 0);
    ExpectHeader(HeaderAt(stream, 0), 0, 24, 28, 52, -1, 1);
    ExpectHeader(HeaderAt(stream, 24), 1, 48, 4, 52, 0, 1); // reading bytes does not count
}

TEST_F(DataStream, SkipLandsAfterASegmentHoldingANestedSegment) {
    QZDataStreamOpenWriteSegment(stream);
    QZDataStreamAppendUInt32(stream, 7);
    QZDataStreamOpenWriteSegment(stream);
    QZDataStreamAppendCString(stream, "xyz");
    QZDataStreamCloseWriteSegment(stream);
    QZDataStreamCloseWriteSegment(stream);
    QZDataStreamAppendUInt32(stream, 0xdeadbeef);
    ExpectHeader(HeaderAt(stream, 24), 1, 48, 32, 80, 0, 2);
    ExpectHeader(HeaderAt(stream, 52), 2, 76, 4, 80, 24, 1);

    QZDataStreamResetStream(stream);
    QZDataStreamSegment* root = QZDataStreamSkipReadSegment(stream);
    EXPECT_EQ(root, QZDataStreamCurrentReadSegment(stream));
    EXPECT_EQ(root->position, 80);
    EXPECT_EQ(QZDataStreamReadUInt32(stream), 0xdeadbeefu);
    EXPECT_EQ(QZDataStreamBytesLeftToRead(stream), 0);
}

TEST_F(DataStream, StringReadsBackWithItsLengthAndCounts) {
    QZDataStreamAppendString(stream, "abcdef", 3);
    ExpectHeader(HeaderAt(stream, 0), 0, 24, 4, 28, -1, 1);
    EXPECT_EQ(BufferOf(stream).size(), 28u);

    QZDataStreamResetStream(stream);
    int32_t length = -1;
    const char* text = QZDataStreamReadString(stream, &length);
    EXPECT_EQ(length, 3);
    EXPECT_STREQ(text, "abc");
    EXPECT_EQ(HeaderAt(stream, 0).count, 2u);
    EXPECT_EQ(QZDataStreamReadString(stream, &length), nullptr);
    EXPECT_EQ(length, 0);
}

TEST_F(DataStream, StringReadFromTheBufferCanBeAppendedToIt) {
    QZDataStreamAppendCString(stream, "echo");
    QZDataStreamResetStream(stream);
    QZDataStreamAppendCString(stream, QZDataStreamReadCString(stream));
    ExpectHeader(HeaderAt(stream, 0), 0, 24, 10, 34, -1, 3);
    const Bytes buffer = BufferOf(stream);
    EXPECT_EQ(Bytes(buffer.begin() + 24, buffer.end()),
              (Bytes{'e', 'c', 'h', 'o', 0, 'e', 'c', 'h', 'o', 0}));
}

TEST_F(DataStream, EmptyStringsAreOneZeroByteAndOneItemEach) {
    QZDataStreamAppendEmptyStrings(stream, 0);
    QZDataStreamAppendEmptyStrings(stream, -2);
    QZDataStreamAppendEmptyStrings(stream, 3);
    EXPECT_EQ(BufferOf(stream).size(), 27u);
    ExpectHeader(HeaderAt(stream, 0), 0, 24, 3, 27, -1, 3);

    QZDataStreamResetStream(stream);
    for (int i = 0; i < 3; ++i) {
        int32_t length = -1;
        const char* text = QZDataStreamReadString(stream, &length);
        ASSERT_NE(text, nullptr);
        EXPECT_STREQ(text, "");
        EXPECT_EQ(length, 0);
    }
    EXPECT_EQ(QZDataStreamReadCString(stream), nullptr);
}

TEST_F(DataStream, EmptySegmentsAreBareHeaders) {
    QZDataStreamAppendEmptySegments(stream, -1);
    QZDataStreamAppendEmptySegments(stream, 2);
    EXPECT_EQ(BufferOf(stream).size(), 72u);
    ExpectHeader(HeaderAt(stream, 0), 0, 24, 48, 72, -1, 2);
    ExpectHeader(HeaderAt(stream, 24), 1, 48, 0, 48, 0, 0);
    ExpectHeader(HeaderAt(stream, 48), 2, 72, 0, 72, 0, 0);
}

TEST_F(DataStream, ReadsStopAtTheSegmentEnd) {
    QZDataStreamOpenWriteSegment(stream);
    QZDataStreamAppendBytes(stream, "\x11\x22", 2);
    QZDataStreamCloseWriteSegment(stream);
    QZDataStreamAppendDouble(stream, 2.5);

    QZDataStreamResetStream(stream);
    QZDataStreamOpenReadSegment(stream);
    EXPECT_EQ(QZDataStreamBytesLeftToReadInCurrentSegment(stream), 2);
    EXPECT_EQ(QZDataStreamBytesLeftToRead(stream), 10);
    EXPECT_EQ(QZDataStreamReadUInt32(stream), 0x2211u); // zero-padded
    char spare[4];
    EXPECT_EQ(QZDataStreamReadBytes(stream, spare, 4), 0);
    EXPECT_EQ(QZDataStreamBytesLeftToReadInCurrentSegment(stream), 0);
    QZDataStreamCloseReadSegment(stream);
    EXPECT_EQ(QZDataStreamReadDouble(stream), 2.5);
    EXPECT_EQ(QZDataStreamReadDouble(stream), 0.0);
}

TEST_F(DataStream, UnterminatedCStringWarnsAndMovesOnePastTheEnd) {
    QZDataStreamOpenWriteSegment(stream);
    QZDataStreamAppendBytes(stream, "ab", 2);
    QZDataStreamCloseWriteSegment(stream);
    QZDataStreamAppendCString(stream, "z");

    QZDataStreamResetStream(stream);
    QZDataStreamOpenReadSegment(stream);
    testing::internal::CaptureStderr();
    const char* text = QZDataStreamReadCString(stream);
    EXPECT_EQ(testing::internal::GetCapturedStderr(), "hi\n");
    ASSERT_NE(text, nullptr); // a zero byte follows in the buffer
    EXPECT_EQ(std::string(text, 2), "ab");
    EXPECT_EQ(QZDataStreamBytesLeftToReadInCurrentSegment(stream), -1);
    // Past the end, the readers give nothing and say nothing.
    testing::internal::CaptureStderr();
    EXPECT_EQ(QZDataStreamReadCString(stream), nullptr);
    int32_t length = -1;
    EXPECT_EQ(QZDataStreamReadString(stream, &length), nullptr);
    EXPECT_EQ(length, 0);
    EXPECT_EQ(testing::internal::GetCapturedStderr(), "");
}

TEST(DataStreamBuffer, CStringWithoutAnyZeroBeforeTheBufferEndIsNull) {
    QZDataStreamRef stream = QZDataStreamCreateStream();
    QZDataStreamAppendBytes(stream, "abc", 3);
    QZDataStreamResetStream(stream);
    testing::internal::CaptureStderr();
    EXPECT_EQ(QZDataStreamReadCString(stream), nullptr);
    EXPECT_EQ(testing::internal::GetCapturedStderr(), "hi\n");
    EXPECT_EQ(HeaderAt(stream, 0).position, 28); // the read still happened

    QZDataStreamResetStream(stream);
    int32_t length = 0;
    const char* text = QZDataStreamReadString(stream, &length);
    EXPECT_EQ(length, 3);
    EXPECT_EQ(std::string(text, 3), "abc");
    QZDataStreamFree(stream);
}

TEST_F(DataStream, ShowDumpsBothStacksThenTheBuffer) {
    testing::internal::CaptureStderr();
    QZDataStreamShow(stream);
    std::string dump = testing::internal::GetCapturedStderr();
    const std::string stacks = "readStack:\n"
                               "\tid:0\tcnt:0\t <s:24 l:0/24 p:24>\n"
                               "writeStack:\n"
                               "\tid:0\tcnt:0\t <s:24 l:0/24 p:24>\n"
                               "\n";
    EXPECT_EQ(dump.substr(0, stacks.size()), stacks);
    EXPECT_GT(dump.size(), stacks.size()); // the buffer's description follows

    QZDataStreamOpenWriteSegment(stream);
    QZDataStreamAppendUInt32(stream, 9);
    testing::internal::CaptureStderr();
    QZDataStreamShow(stream);
    dump = testing::internal::GetCapturedStderr();
    const std::string nested = "readStack:\n"
                               "\tid:0\tcnt:0\t <s:24 l:0/52 p:24>\n"
                               "writeStack:\n"
                               "\tid:1\tcnt:1\t <s:48 l:4/52 p:52>\n"
                               "\tid:0\tcnt:0\t <s:24 l:0/52 p:24>\n"
                               "\n";
    EXPECT_EQ(dump.substr(0, nested.size()), nested);
}

TEST_F(DataStream, FinishedBufferReadsBackInAnotherStream) {
    QZDataStreamAppendCString(stream, "name");
    QZDataStreamOpenWriteSegment(stream);
    QZDataStreamAppendUInt32(stream, 42);
    QZDataStreamAppendDouble(stream, -0.125);
    QZDataStreamCloseWriteSegment(stream);
    QZDataStreamAppendEmptySegment(stream);
    QZDataStreamAppendString(stream, "tail", 4);

    CFMutableDataRef copy = CopyBuffer(stream);
    QZDataStreamRef reader = QZDataStreamWithData(copy);
    CFRelease(copy);
    ASSERT_NE(reader, nullptr);
    const CFIndex size = CFDataGetLength(stream->data);
    EXPECT_EQ(CFDataGetLength(reader->data), size);
    ExpectHeader(HeaderAt(reader, 0), 0, 24, int32_t(size - 24), 24, -1, 0);

    EXPECT_STREQ(QZDataStreamReadCString(reader), "name");
    EXPECT_GE(QZDataStreamOpenReadSegment(reader), 0);
    EXPECT_EQ(QZDataStreamReadUInt32(reader), 42u);
    EXPECT_EQ(QZDataStreamReadDouble(reader), -0.125);
    QZDataStreamCloseReadSegment(reader);
    EXPECT_NE(QZDataStreamSkipReadSegment(reader), nullptr);
    int32_t length = 0;
    EXPECT_STREQ(QZDataStreamReadString(reader, &length), "tail");
    EXPECT_EQ(length, 4);
    EXPECT_EQ(QZDataStreamBytesLeftToRead(reader), 0);
    QZDataStreamFree(reader);
}

TEST(DataStreamBuffer, WithDataGrowsShortBuffersToARootHeader) {
    CFMutableDataRef data = MakeData({1, 2, 3});
    QZDataStreamRef stream = QZDataStreamWithData(data);
    CFRelease(data);
    EXPECT_EQ(BufferOf(stream), (Bytes{0,  0, 0, 0, 24,   0,    0,    0,    0, 0, 0, 0,
                                       24, 0, 0, 0, 0xff, 0xff, 0xff, 0xff, 0, 0, 0, 0}));
    EXPECT_EQ(QZDataStreamReadString(stream, nullptr), nullptr);
    QZDataStreamFree(stream);
    EXPECT_EQ(QZDataStreamWithData(nullptr), nullptr);
}

TEST_F(DataStream, ClearStreamClosesOpenSegmentsAndKeepsCounters) {
    QZDataStreamAppendUInt32(stream, 1);
    QZDataStreamOpenWriteSegment(stream);
    QZDataStreamOpenWriteSegment(stream);
    QZDataStreamAppendCString(stream, "deep");
    QZDataStreamClearStream(stream);
    EXPECT_EQ(stream->writeTop, 0);
    EXPECT_EQ(stream->readTop, 0);
    EXPECT_EQ(BufferOf(stream).size(), 24u);
    ExpectHeader(HeaderAt(stream, 0), 0, 24, 0, 24, -1, 2);
    QZDataStreamOpenWriteSegment(stream);
    EXPECT_EQ(QZDataStreamCurrentWriteSegment(stream)->segmentID, 3u);
}

TEST_F(DataStream, ClearToStartOfSegmentEmptiesOnlyTheCurrentSegment) {
    QZDataStreamAppendUInt32(stream, 1);
    QZDataStreamOpenWriteSegment(stream);
    QZDataStreamAppendUInt32(stream, 2);
    QZDataStreamClearToStartOfSegment(stream);
    EXPECT_EQ(BufferOf(stream).size(), 52u);
    EXPECT_EQ(stream->writeTop, 28);
    ExpectHeader(HeaderAt(stream, 28), 1, 52, 0, 52, 0, 1);
    ExpectHeader(HeaderAt(stream, 0), 0, 24, 4, 24, -1, 1); // the stream was reset first
}

TEST_F(DataStream, RootCannotBeClosedAndMissingHeadersCannotBeOpened) {
    QZDataStreamAppendUInt32(stream, 5);
    QZDataStreamCloseWriteSegment(stream);
    QZDataStreamCloseReadSegment(stream);
    EXPECT_EQ(stream->writeTop, 0);
    EXPECT_EQ(stream->readTop, 0);
    ExpectHeader(HeaderAt(stream, 0), 0, 24, 4, 28, -1, 1);

    QZDataStreamResetStream(stream);
    const Bytes before = BufferOf(stream);
    EXPECT_EQ(QZDataStreamOpenReadSegment(stream), -1); // 4 content bytes hold no header
    EXPECT_EQ(QZDataStreamSkipReadSegment(stream), nullptr);
    EXPECT_EQ(stream->readTop, 0);
    EXPECT_EQ(BufferOf(stream), before);
}

TEST(DataStreamBuffer, NullStreamIsANoOp) {
    QZDataStreamShow(nullptr);
    QZDataStreamAppendCString(nullptr, "x");
    QZDataStreamClearStream(nullptr);
    EXPECT_EQ(QZDataStreamOpenReadSegment(nullptr), -1);
    EXPECT_EQ(QZDataStreamReadUInt32(nullptr), 0u);
    EXPECT_EQ(QZDataStreamReadCString(nullptr), nullptr);
    EXPECT_EQ(QZDataStreamCurrentWriteSegment(nullptr), nullptr);
    QZDataStreamFree(nullptr);
}

// A header planted in an otherwise valid buffer whose parent points at itself: closing it is
// refused, and resetting still returns to the root instead of looping.
TEST(DataStreamCorrupt, ParentLoopDoesNotHangReset) {
    Bytes bytes(24, 0);
    const int32_t fields[6] = {9, 48, 0, 48, 24, 0}; // header at 24, parent 24
    bytes.resize(48);
    std::memcpy(bytes.data() + 24, fields, sizeof fields);
    CFMutableDataRef data = MakeData(bytes);
    QZDataStreamRef stream = QZDataStreamWithData(data);
    CFRelease(data);
    EXPECT_EQ(QZDataStreamOpenReadSegment(stream), 24);
    QZDataStreamCloseReadSegment(stream);
    EXPECT_EQ(stream->readTop, 24);
    QZDataStreamResetStream(stream);
    EXPECT_EQ(stream->readTop, 0);
    EXPECT_EQ(HeaderAt(stream, 0).position, 24);
    QZDataStreamFree(stream);
}

// Random buffers with headers full of extreme values, driven through every reader: nothing may
// touch memory outside the buffer (the sanitizers watch), and the results stay in range.
TEST(DataStreamCorrupt, RandomHeadersStayInsideTheBuffer) {
    std::mt19937 random(20240611);
    const int32_t extremes[] = {-1, 0, 1, 23, 24, 25, 48, 1000, INT32_MAX, INT32_MIN, -24};
    auto field = [&](CFIndex size) -> int32_t {
        switch (random() % 4) {
        case 0:
            return extremes[random() % std::size(extremes)];
        case 1:
            return int32_t(random() % (size + 30)) - 5;
        default:
            return int32_t(random());
        }
    };
    testing::internal::CaptureStderr(); // Show and "hi" lines
    for (int round = 0; round < 3000; ++round) {
        Bytes bytes(random() % 160);
        for (uint8_t& b : bytes)
            b = uint8_t(random() % 3 == 0 ? 0 : random());
        for (size_t at = 24; at + 24 <= bytes.size(); at += 4 + random() % 24) {
            int32_t fields[6];
            for (int32_t& f : fields)
                f = field(CFIndex(bytes.size()));
            std::memcpy(bytes.data() + at, fields, sizeof fields);
        }
        CFMutableDataRef data = MakeData(bytes);
        QZDataStreamRef stream = QZDataStreamWithData(data);
        CFRelease(data);
        const CFIndex size = CFDataGetLength(stream->data);
        const UInt8* base = CFDataGetBytePtr(stream->data);
        for (int step = 0; step < 40; ++step) {
            char out[16];
            int32_t length = -1;
            const char* text = nullptr;
            switch (random() % 10) {
            case 0:
                QZDataStreamOpenReadSegment(stream);
                break;
            case 1:
                QZDataStreamCloseReadSegment(stream);
                break;
            case 2:
                QZDataStreamSkipReadSegment(stream);
                break;
            case 3:
                QZDataStreamResetReadSegment(stream);
                break;
            case 4:
                EXPECT_LE(QZDataStreamReadBytes(stream, out, random() % 17), 16);
                break;
            case 5:
                QZDataStreamReadUInt32(stream), QZDataStreamReadDouble(stream);
                break;
            case 6:
                text = QZDataStreamReadString(stream, &length);
                EXPECT_GE(length, 0);
                if (text) {
                    EXPECT_GE((const UInt8*)text, base);
                    EXPECT_LE((const UInt8*)text + length, base + size);
                }
                break;
            case 7:
                QZDataStreamReadCString(stream);
                break;
            case 8:
                QZDataStreamShow(stream);
                break;
            default:
                QZDataStreamBytesLeftToRead(stream);
                QZDataStreamBytesLeftToReadInCurrentSegment(stream);
                break;
            }
            QZDataStreamSegment* current = QZDataStreamCurrentReadSegment(stream);
            if (current) {
                EXPECT_GE((const UInt8*)current, base);
                EXPECT_LE((const UInt8*)current + 24, base + size);
            }
        }
        QZDataStreamResetStream(stream);
        EXPECT_EQ(stream->readTop, 0);
        QZDataStreamClearStream(stream);
        EXPECT_EQ(CFDataGetLength(stream->data), 24);
        QZDataStreamFree(stream);
    }
    testing::internal::GetCapturedStderr();
}

} // namespace
