// Segmented data stream: buffer layout and header fields byte for byte, writer and reader
// round trips, the debug dump, and corrupt buffers.
#include <array>
#include <cstring>
#include <functional>
#include <iterator>
#include <memory>
#include <random>
#include <string>
#include <tuple>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

#include "datastream/QZDataStream.h"
#include "platform/CFData.h"
#include "support/Values.h"

namespace {

using Bytes = std::vector<uint8_t>;
using glyphwell::testing::Hex;

// The root header alone: id 0, start 24, length 0, position 24, parent -1, count 0.
const Bytes kRootAlone =
    Hex("00 00 00 00 18 00 00 00 00 00 00 00 18 00 00 00 FF FF FF FF 00 00 00 00");

Bytes BufferOf(QZDataStreamRef stream) {
    const UInt8* bytes = CFDataGetBytePtr(stream->data);
    return Bytes(bytes, bytes + CFDataGetLength(stream->data));
}

using Fields = std::array<int64_t, 6>; ///< id, start, length, position, parent, count

/// The fields of the header at `position`, for one-line comparisons.
Fields HeaderAt(QZDataStreamRef stream, CFIndex position) {
    QZDataStreamSegment h;
    std::memcpy(&h, CFDataGetBytePtr(stream->data) + position, sizeof h);
    return {h.segmentID, h.start, h.length, h.position, h.parent, h.count};
}

using Stream = std::unique_ptr<QZDataStream, decltype(&QZDataStreamFree)>;

/// A stream over a copy of `bytes`, as another process would receive a buffer.
Stream WithBytes(const Bytes& bytes) {
    CFMutableDataRef data = CFDataCreateMutable(kCFAllocatorDefault, 0);
    CFDataAppendBytes(data, bytes.data(), CFIndex(bytes.size()));
    Stream stream(QZDataStreamWithData(data), QZDataStreamFree);
    CFRelease(data);
    return stream;
}

/// What `action` writes to the standard error stream.
std::string StderrOf(const std::function<void()>& action) {
    testing::internal::CaptureStderr();
    action();
    return testing::internal::GetCapturedStderr();
}

/// The stacks in QZDataStreamShow's dump, up to the blank line; empty unless the buffer follows.
std::string ShownStacks(QZDataStreamRef stream) {
    const std::string dump = StderrOf([&] { QZDataStreamShow(stream); });
    const size_t end = dump.find("\n\n");
    return end != std::string::npos && end + 2 < dump.size() ? dump.substr(0, end + 2) : "";
}

class DataStream : public ::testing::Test {
protected:
    void TearDown() override { QZDataStreamFree(stream); }
    QZDataStreamRef stream = QZDataStreamCreateStream();
};

TEST_F(DataStream, NewAndShortBuffersAreTheRootHeaderAloneAndItemsGrowIt) {
    EXPECT_EQ(BufferOf(stream), kRootAlone);
    EXPECT_EQ(QZDataStreamNextSegmentID(stream), 1u);
    EXPECT_EQ(QZDataStreamNextSegmentID(stream), 2u);

    // A buffer shorter than a header is grown to the root header alone.
    Stream other = WithBytes({1, 2, 3});
    EXPECT_EQ(BufferOf(other.get()), kRootAlone);
    EXPECT_EQ(QZDataStreamReadString(other.get(), nullptr), nullptr);
    EXPECT_EQ(QZDataStreamWithData(nullptr), nullptr);

    // Appended items grow the root's length, position and count.
    QZDataStreamAppendBytes(stream, "ab", 2);
    QZDataStreamAppendUInt32(stream, 1);
    EXPECT_EQ(BufferOf(stream), Hex("00 00 00 00 18 00 00 00 06 00 00 00 1E 00 00 00 FF FF FF FF "
                                    "02 00 00 00 61 62 01 00 00 00"));
    // Empty segments are bare headers, one item each (ids 1 and 2 were handed out above).
    QZDataStreamAppendEmptySegments(stream, -1);
    QZDataStreamAppendEmptySegments(stream, 2);
    EXPECT_EQ(BufferOf(stream).size(), 78u);
    EXPECT_EQ(HeaderAt(stream, 0), (Fields{0, 24, 54, 78, -1, 4}));
    EXPECT_EQ(HeaderAt(stream, 30), (Fields{3, 54, 0, 54, 0, 0}));
    EXPECT_EQ(HeaderAt(stream, 54), (Fields{4, 78, 0, 78, 0, 0}));
}

TEST_F(DataStream, ClosedWriteSegmentCountsOnceInItsParentAndReadsBackElsewhere) {
    EXPECT_EQ(ShownStacks(stream), "readStack:\n\tid:0\tcnt:0\t <s:24 l:0/24 p:24>\n"
                                   "writeStack:\n\tid:0\tcnt:0\t <s:24 l:0/24 p:24>\n\n");
    QZDataStreamOpenWriteSegment(stream);
    QZDataStreamAppendUInt32(stream, 0x04030201);
    // While the child is open the parent is untouched.
    EXPECT_EQ(HeaderAt(stream, 0), (Fields{0, 24, 0, 24, -1, 0}));
    EXPECT_EQ(
        ShownStacks(stream),
        "readStack:\n\tid:0\tcnt:0\t <s:24 l:0/52 p:24>\n"
        "writeStack:\n\tid:1\tcnt:1\t <s:48 l:4/52 p:52>\n\tid:0\tcnt:0\t <s:24 l:0/52 p:24>\n\n");
    QZDataStreamCloseWriteSegment(stream);
    EXPECT_EQ(stream->writeTop, 0);
    EXPECT_EQ(BufferOf(stream), Hex("00 00 00 00 18 00 00 00 1C 00 00 00 34 00 00 00 FF FF FF FF "
                                    "01 00 00 00 01 00 00 00 30 00 00 00 04 00 00 00 34 00 00 00 "
                                    "00 00 00 00 01 00 00 00 01 02 03 04"));

    QZDataStreamResetStream(stream);
    EXPECT_EQ(QZDataStreamOpenReadSegment(stream), 24);
    EXPECT_EQ(QZDataStreamReadUInt32(stream), 0x04030201u);
    QZDataStreamCloseReadSegment(stream);
    EXPECT_EQ(stream->readTop, 0);
    EXPECT_EQ(HeaderAt(stream, 0), (Fields{0, 24, 28, 52, -1, 1}));
    EXPECT_EQ(HeaderAt(stream, 24), (Fields{1, 48, 4, 52, 0, 1})); // reading bytes does not count

    // The finished buffer reads back in another stream, whose root holds all of it.
    Stream reader = WithBytes(BufferOf(stream));
    ASSERT_TRUE(reader);
    EXPECT_EQ(HeaderAt(reader.get(), 0), (Fields{0, 24, 28, 24, -1, 0}));
    EXPECT_EQ(QZDataStreamOpenReadSegment(reader.get()), 24);
    EXPECT_EQ(QZDataStreamReadUInt32(reader.get()), 0x04030201u);
    QZDataStreamCloseReadSegment(reader.get());
    EXPECT_EQ(QZDataStreamBytesLeftToRead(reader.get()), 0);
}

TEST_F(DataStream, SkipLandsAfterASegmentHoldingANestedSegment) {
    QZDataStreamOpenWriteSegment(stream);
    QZDataStreamAppendUInt32(stream, 7);
    QZDataStreamOpenWriteSegment(stream);
    QZDataStreamAppendCString(stream, "xyz");
    QZDataStreamCloseWriteSegment(stream);
    QZDataStreamCloseWriteSegment(stream);
    QZDataStreamAppendUInt32(stream, 0xdeadbeef);
    EXPECT_EQ(HeaderAt(stream, 24), (Fields{1, 48, 32, 80, 0, 2}));
    EXPECT_EQ(HeaderAt(stream, 52), (Fields{2, 76, 4, 80, 24, 1}));

    QZDataStreamResetStream(stream);
    QZDataStreamSegment* root = QZDataStreamSkipReadSegment(stream);
    EXPECT_EQ(root, QZDataStreamCurrentReadSegment(stream));
    EXPECT_EQ(root->position, 80);
    EXPECT_EQ(QZDataStreamReadUInt32(stream), 0xdeadbeefu);
    EXPECT_EQ(QZDataStreamBytesLeftToRead(stream), 0);
}

TEST_F(DataStream, StringsAreOneItemEachAndReadBackInPlace) {
    QZDataStreamAppendString(stream, "abcdef", 3);
    QZDataStreamAppendEmptyStrings(stream, 0);
    QZDataStreamAppendEmptyStrings(stream, -2);
    QZDataStreamAppendEmptyStrings(stream, 2);
    EXPECT_EQ(HeaderAt(stream, 0), (Fields{0, 24, 6, 30, -1, 3}));

    QZDataStreamResetStream(stream);
    std::vector<std::pair<std::string, int32_t>> read; // past the end: null and length 0
    for (int32_t i = 0, length = -1; i < 4; ++i, length = -1) {
        const char* text = QZDataStreamReadString(stream, &length);
        read.emplace_back(text ? text : "<null>", length);
    }
    EXPECT_EQ(read, (decltype(read){{"abc", 3}, {"", 0}, {"", 0}, {"<null>", 0}}));
    EXPECT_EQ(HeaderAt(stream, 0)[5], 6); // reads count too
    EXPECT_EQ(QZDataStreamReadCString(stream), nullptr);

    // A string read from the buffer may be appended to it.
    QZDataStreamResetStream(stream);
    QZDataStreamAppendCString(stream, QZDataStreamReadCString(stream));
    const Bytes buffer = BufferOf(stream);
    EXPECT_EQ(Bytes(buffer.begin() + 24, buffer.end()), Hex("61 62 63 00 00 00 61 62 63 00"));
}

TEST_F(DataStream, ReadsStopAtTheSegmentEnd) {
    QZDataStreamOpenWriteSegment(stream);
    QZDataStreamAppendBytes(stream, "ab", 2);
    QZDataStreamCloseWriteSegment(stream);
    QZDataStreamAppendDouble(stream, 2.5);

    QZDataStreamResetStream(stream);
    QZDataStreamOpenReadSegment(stream);
    EXPECT_EQ(QZDataStreamBytesLeftToReadInCurrentSegment(stream), 2);
    EXPECT_EQ(QZDataStreamBytesLeftToRead(stream), 10);
    EXPECT_EQ(QZDataStreamReadUInt32(stream), 0x6261u); // zero-padded
    char spare[4];
    EXPECT_EQ(QZDataStreamReadBytes(stream, spare, 4), 0);
    EXPECT_EQ(QZDataStreamBytesLeftToReadInCurrentSegment(stream), 0);

    // Unterminated in its segment, a zero byte later in the buffer: the text, a warning, and the
    // cursor one past the segment's end.
    QZDataStreamResetReadSegment(stream);
    const char* text = nullptr;
    EXPECT_EQ(StderrOf([&] { text = QZDataStreamReadCString(stream); }), "hi\n");
    ASSERT_NE(text, nullptr);
    EXPECT_EQ(std::string(text, 2), "ab");
    EXPECT_EQ(QZDataStreamBytesLeftToReadInCurrentSegment(stream), -1);
    // Past the end, the readers give nothing and say nothing.
    int32_t length = -1;
    EXPECT_EQ(StderrOf([&] {
                  EXPECT_EQ(QZDataStreamReadCString(stream), nullptr);
                  EXPECT_EQ(QZDataStreamReadString(stream, &length), nullptr);
              }),
              "");
    EXPECT_EQ(length, 0);
    QZDataStreamCloseReadSegment(stream);
    EXPECT_EQ(QZDataStreamReadDouble(stream), 2.5);
    EXPECT_EQ(QZDataStreamReadDouble(stream), 0.0);
}

TEST_F(DataStream, CStringWithoutAnyZeroBeforeTheBufferEndIsNull) {
    QZDataStreamAppendBytes(stream, "abc", 3);
    QZDataStreamResetStream(stream);
    EXPECT_EQ(StderrOf([&] { EXPECT_EQ(QZDataStreamReadCString(stream), nullptr); }), "hi\n");
    EXPECT_EQ(HeaderAt(stream, 0)[3], 28); // the read still happened
    QZDataStreamResetStream(stream);
    int32_t length = 0;
    const char* text = QZDataStreamReadString(stream, &length);
    EXPECT_EQ(std::string(text, size_t(length)), "abc");
}

TEST_F(DataStream, ClearingEmptiesTheCurrentSegmentOrTheStreamAndKeepsCounters) {
    QZDataStreamAppendUInt32(stream, 1);
    QZDataStreamOpenWriteSegment(stream);
    QZDataStreamAppendUInt32(stream, 2);
    QZDataStreamClearToStartOfSegment(stream);
    EXPECT_EQ(BufferOf(stream).size(), 52u);
    EXPECT_EQ(stream->writeTop, 28);
    EXPECT_EQ(HeaderAt(stream, 28), (Fields{1, 52, 0, 52, 0, 1}));
    EXPECT_EQ(HeaderAt(stream, 0), (Fields{0, 24, 4, 24, -1, 1})); // the stream was reset first

    QZDataStreamOpenWriteSegment(stream);
    QZDataStreamAppendCString(stream, "deep");
    QZDataStreamClearStream(stream); // closes both open segments first
    EXPECT_EQ(std::make_pair(stream->writeTop, stream->readTop), (std::pair<int64_t, int64_t>{}));
    EXPECT_EQ(BufferOf(stream).size(), 24u);
    EXPECT_EQ(HeaderAt(stream, 0), (Fields{0, 24, 0, 24, -1, 2}));
    QZDataStreamOpenWriteSegment(stream);
    EXPECT_EQ(QZDataStreamCurrentWriteSegment(stream)->segmentID, 3u);
}

TEST_F(DataStream, RootCannotBeClosedMissingHeadersCannotBeOpenedAndNullDoesNothing) {
    QZDataStreamAppendUInt32(stream, 5);
    QZDataStreamCloseWriteSegment(stream);
    QZDataStreamCloseReadSegment(stream);
    EXPECT_EQ(std::make_pair(stream->writeTop, stream->readTop), (std::pair<int64_t, int64_t>{}));
    EXPECT_EQ(HeaderAt(stream, 0), (Fields{0, 24, 4, 28, -1, 1}));

    QZDataStreamResetStream(stream);
    const Bytes before = BufferOf(stream);
    EXPECT_EQ(QZDataStreamOpenReadSegment(stream), -1); // 4 content bytes hold no header
    EXPECT_EQ(QZDataStreamSkipReadSegment(stream), nullptr);
    EXPECT_EQ(stream->readTop, 0);
    EXPECT_EQ(BufferOf(stream), before);

    // A null stream does nothing.
    QZDataStreamShow(nullptr);
    QZDataStreamAppendCString(nullptr, "x");
    QZDataStreamClearStream(nullptr);
    QZDataStreamFree(nullptr);
    EXPECT_EQ(std::make_tuple(QZDataStreamOpenReadSegment(nullptr), QZDataStreamReadUInt32(nullptr),
                              QZDataStreamReadCString(nullptr),
                              QZDataStreamCurrentWriteSegment(nullptr)),
              std::make_tuple(-1, 0u, nullptr, nullptr));
}

// A header planted in an otherwise valid buffer whose parent points at itself: closing it is
// refused, and resetting still returns to the root instead of looping.
TEST(DataStreamCorrupt, ParentLoopDoesNotHangReset) {
    Bytes bytes(48, 0);
    const int32_t fields[6] = {9, 48, 0, 48, 24, 0}; // header at 24, parent 24
    std::memcpy(bytes.data() + 24, fields, sizeof fields);
    Stream owned = WithBytes(bytes);
    QZDataStreamRef stream = owned.get();
    EXPECT_EQ(QZDataStreamOpenReadSegment(stream), 24);
    QZDataStreamCloseReadSegment(stream);
    EXPECT_EQ(stream->readTop, 24);
    QZDataStreamResetStream(stream);
    EXPECT_EQ(stream->readTop, 0);
    EXPECT_EQ(HeaderAt(stream, 0)[3], 24);
}

// Random buffers with headers full of extreme values, driven through every reader: nothing may
// touch memory outside the buffer (the sanitizers watch), and the results stay in range.
TEST(DataStreamCorrupt, RandomHeadersStayInsideTheBuffer) {
    std::mt19937 random(20240611);
    const int32_t extremes[] = {-1, 0, 1, 23, 24, 25, 48, 1000, INT32_MAX, INT32_MIN, -24};
    testing::internal::CaptureStderr(); // Show and "hi" lines
    for (int round = 0; round < 3000; ++round) {
        Bytes bytes(random() % 160);
        for (uint8_t& b : bytes)
            b = uint8_t(random() % 3 == 0 ? 0 : random());
        for (size_t at = 24; at + 24 <= bytes.size(); at += 4 + random() % 24) {
            int32_t fields[6];
            for (int32_t& f : fields) // an extreme, near the buffer's size, or anything
                f = random() % 4 == 0   ? extremes[random() % std::size(extremes)]
                    : random() % 3 == 0 ? int32_t(random() % (bytes.size() + 30)) - 5
                                        : int32_t(random());
            std::memcpy(bytes.data() + at, fields, sizeof fields);
        }
        Stream owned = WithBytes(bytes);
        QZDataStreamRef stream = owned.get();
        const CFIndex size = CFDataGetLength(stream->data);
        const UInt8* base = CFDataGetBytePtr(stream->data);
        char out[16];
        const std::function<void()> operations[] = {
            [&] { QZDataStreamOpenReadSegment(stream); },
            [&] { QZDataStreamCloseReadSegment(stream); },
            [&] { QZDataStreamSkipReadSegment(stream); },
            [&] { QZDataStreamResetReadSegment(stream); },
            [&] { EXPECT_LE(QZDataStreamReadBytes(stream, out, random() % 17), 16); },
            [&] { QZDataStreamReadUInt32(stream), QZDataStreamReadDouble(stream); },
            [&] {
                int32_t length = -1;
                const auto* text = (const UInt8*)QZDataStreamReadString(stream, &length);
                EXPECT_GE(length, 0);
                EXPECT_TRUE(!text || (text >= base && text + length <= base + size));
            },
            [&] { QZDataStreamReadCString(stream); },
            [&] { QZDataStreamShow(stream); },
            [&] { QZDataStreamBytesLeftToRead(stream); },
            [&] { QZDataStreamBytesLeftToReadInCurrentSegment(stream); },
        };
        for (int step = 0; step < 40; ++step) {
            operations[random() % std::size(operations)]();
            const auto* current = (const UInt8*)QZDataStreamCurrentReadSegment(stream);
            EXPECT_TRUE(!current || (current >= base && current + 24 <= base + size));
        }
        QZDataStreamResetStream(stream);
        EXPECT_EQ(stream->readTop, 0);
        QZDataStreamClearStream(stream);
        EXPECT_EQ(CFDataGetLength(stream->data), 24);
    }
    testing::internal::GetCapturedStderr();
}

} // namespace
