#include <gtest/gtest.h>

#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

#include "platform/CFData.h"
#include "platform/Log.h"
#include "tests/platform/ContainerTestSupport.h"
#include "tests/support/LogCapture.h"

namespace {

std::string Bytes(CFDataRef data) {
    const UInt8* bytes = CFDataGetBytePtr(data);
    return bytes ? std::string(reinterpret_cast<const char*>(bytes), size_t(CFDataGetLength(data)))
                 : std::string();
}

const UInt8* U(const char* text) {
    return reinterpret_cast<const UInt8*>(text);
}

// A mutable data object holding `text`, released at the end of the test.
class MutableDataTest : public ::testing::Test {
protected:
    void SetUp() override { data = CFDataCreateMutable(nullptr, 0); }
    void TearDown() override { CFRelease(data); }
    void Fill(const char* text) {
        CFDataSetLength(data, 0);
        CFDataAppendBytes(data, U(text), CFIndex(std::strlen(text)));
    }
    CFMutableDataRef data = nullptr;
};

TEST(Data, CreateCopiesTheBytesAndNoCopyFreesOrLeavesThemAsAsked) {
    char text[] = "abc";
    CFDataRef data = CFDataCreate(nullptr, U(text), 3);
    text[0] = 'x';
    EXPECT_EQ(CFGetTypeID(data), CFDataGetTypeID());
    EXPECT_EQ(Bytes(data), "abc");
    UInt8 middle[2] = {};
    CFDataGetBytes(data, CFRangeMake(1, 2), middle);
    EXPECT_EQ(middle[0], 'b');
    EXPECT_EQ(middle[1], 'c');
    CFRelease(data);
    CFDataRef empty = CFDataCreate(nullptr, nullptr, 0);
    EXPECT_EQ(CFDataGetLength(empty), 0);
    CFRelease(empty);

    // Leak checks fail if the malloc'd bytes are not freed; AddressSanitizer fails if the stack
    // bytes are.
    UInt8* heap = static_cast<UInt8*>(std::malloc(4));
    std::memcpy(heap, "wxyz", 4);
    CFDataRef owned = CFDataCreateWithBytesNoCopy(nullptr, heap, 4, kCFAllocatorMalloc);
    EXPECT_EQ(CFDataGetBytePtr(owned), heap);
    CFRelease(owned);

    UInt8* heap2 = static_cast<UInt8*>(std::malloc(2));
    CFRelease(CFDataCreateWithBytesNoCopy(nullptr, heap2, 2, kCFAllocatorDefault));

    UInt8 stack[3] = {1, 2, 3};
    CFDataRef borrowed = CFDataCreateWithBytesNoCopy(nullptr, stack, 3, kCFAllocatorNull);
    EXPECT_EQ(CFDataGetBytePtr(borrowed), stack);
    CFRelease(borrowed);
}

TEST_F(MutableDataTest, ManySmallAppendsKeepEveryByte) {
    std::string expected;
    for (int i = 0; i < 5000; ++i) {
        char piece[3] = {char('a' + i % 26), char(i & 0xff), char(i >> 8)};
        CFDataAppendBytes(data, U(piece), 3);
        expected.append(piece, 3);
    }
    EXPECT_EQ(Bytes(data), expected);
}

TEST_F(MutableDataTest, SetLengthAndReplaceCutOrGrowInPlace) {
    Fill("abcdef");
    CFDataSetLength(data, 2);
    EXPECT_EQ(Bytes(data), "ab");
    CFDataSetLength(data, 5);
    EXPECT_EQ(Bytes(data), std::string("ab\0\0\0", 5));
    CFDataIncreaseLength(data, 2);
    EXPECT_EQ(Bytes(data), std::string("ab\0\0\0\0\0", 7));
    CFDataGetMutableBytePtr(data)[6] = 'z';
    EXPECT_EQ(Bytes(data), std::string("ab\0\0\0\0z", 7));

    Fill("abcdef"); // replacing grows or shrinks the range

    CFDataReplaceBytes(data, CFRangeMake(1, 2), U("XYZW"), 4);
    EXPECT_EQ(Bytes(data), "aXYZWdef");
    CFDataReplaceBytes(data, CFRangeMake(0, 5), U("-"), 1);
    EXPECT_EQ(Bytes(data), "-def");
    CFDataReplaceBytes(data, CFRangeMake(4, 0), U("!"), 1);
    EXPECT_EQ(Bytes(data), "-def!");
    CFDataDeleteBytes(data, CFRangeMake(1, 3));
    EXPECT_EQ(Bytes(data), "-!");
    CFDataDeleteBytes(data, CFRangeMake(0, 2));
    EXPECT_EQ(CFDataGetLength(data), 0);
}

TEST_F(MutableDataTest, BytesTakenFromItselfSurviveGrowthAndOverlap) {
    Fill("abcdef");
    CFDataReplaceBytes(data, CFRangeMake(0, 2), CFDataGetBytePtr(data) + 1, 4);
    EXPECT_EQ(Bytes(data), "bcdecdef");

    Fill("abc");
    for (int i = 0; i < 6; ++i) // each append doubles the data and eventually moves the block
        CFDataAppendBytes(data, CFDataGetBytePtr(data), CFDataGetLength(data));
    std::string expected;
    for (int i = 0; i < 64; ++i)
        expected += "abc";
    EXPECT_EQ(Bytes(data), expected);
}

} // namespace
