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

TEST(Data, EqualityAndHashFollowTheBytes) {
    using glyphwell::testing::Own;
    auto a = Own(CFDataCreate(nullptr, U("hello"), 5));
    auto b = Own(CFDataCreateMutableCopy(nullptr, 0, a.get()));
    EXPECT_TRUE(CFEqual(a.get(), b.get()));
    EXPECT_EQ(CFHash(a.get()), CFHash(b.get()));
    EXPECT_FALSE(CFEqual(a.get(), Own(CFDataCreate(nullptr, U("hellp"), 5)).get()));
    EXPECT_FALSE(CFEqual(a.get(), Own(CFDataCreate(nullptr, U("hell"), 4)).get()));

    // Past the hashed prefix the length still tells long data apart.
    std::string longText(100, 'q');
    EXPECT_NE(CFHash(Own(CFDataCreate(nullptr, U(longText.c_str()), 100)).get()),
              CFHash(Own(CFDataCreate(nullptr, U(longText.c_str()), 99)).get()));
}

TEST(Data, DescriptionShowsLengthAndUpTo64BytesInHex) {
    CFDataRef data = CFDataCreate(nullptr, U("ab\x01\xff"), 4);
    std::string text = glyphwell::Describe(data);
    EXPECT_EQ(text.substr(0, 8), "<CFData ");
    EXPECT_EQ(text.substr(text.find('>') + 1), "{length = 4, bytes = 0x616201ff}");
    CFRelease(data);

    std::string seventy(70, '\x11');
    CFDataRef big = CFDataCreate(nullptr, U(seventy.c_str()), 70);
    text = glyphwell::Describe(big);
    EXPECT_EQ(text.substr(text.find('>') + 1),
              "{length = 70, bytes = 0x" + std::string(128, '1') + "...}");
    CFRelease(big);
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

TEST_F(MutableDataTest, RangesOutsideTheDataAreReportedAndIgnored) {
    Fill("abc");
    glyphwell::testing::LogCapture log;
    CFDataDeleteBytes(data, CFRangeMake(2, 2));
    CFDataReplaceBytes(data, CFRangeMake(-1, 1), U("x"), 1);
    CFDataReplaceBytes(data, CFRangeMake(0, 1), U("x"), -1);
    CFDataSetLength(data, -1);
    CFDataIncreaseLength(data, -1);
    CFDataAppendBytes(data, U("x"), -1);
    UInt8 buffer[4] = {'-', '-', '-', '-'};
    CFDataGetBytes(data, CFRangeMake(1, 3), buffer);
    EXPECT_EQ(Bytes(data), "abc");
    EXPECT_EQ(buffer[0], '-');
    std::vector<std::string> texts = log.Texts();
    ASSERT_EQ(texts.size(), 14u);
    EXPECT_EQ(texts[1], "Invalid parameter not satisfying: RangeInside(range, object->length)");
}

TEST(Data, MutatingImmutableDataIsReportedAndIgnored) {
    CFDataRef data = CFDataCreate(nullptr, U("abc"), 3);
    CFMutableDataRef forced = const_cast<CFMutableDataRef>(data);
    glyphwell::testing::LogCapture log;
    CFDataAppendBytes(forced, U("d"), 1);
    CFDataSetLength(forced, 0);
    EXPECT_EQ(CFDataGetMutableBytePtr(forced), nullptr);
    EXPECT_EQ(Bytes(data), "abc");
    std::vector<std::string> texts = log.Texts();
    ASSERT_EQ(texts.size(), 6u);
    EXPECT_EQ(texts[1], "Invalid parameter not satisfying: object != nullptr && object->isMutable");
    CFRelease(data);
}

} // namespace
