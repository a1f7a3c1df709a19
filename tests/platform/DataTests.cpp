#include <gtest/gtest.h>

#include <cstdlib>
#include <cstring>
#include <functional>
#include <string>
#include <vector>

#include "platform/CFData.h"
#include "platform/Log.h"
#include "tests/platform/ContainerTestSupport.h"
#include "tests/support/Values.h"

namespace {

using glyphwell::testing::Own;

std::string Bytes(CFDataRef data) {
    const UInt8* bytes = CFDataGetBytePtr(data);
    return bytes ? std::string(reinterpret_cast<const char*>(bytes), size_t(CFDataGetLength(data)))
                 : std::string();
}

const UInt8* U(const char* text) {
    return reinterpret_cast<const UInt8*>(text);
}

TEST(Data, CreateCopiesTheBytesAndNoCopyFreesOrLeavesThemAsAsked) {
    char text[] = "abc";
    auto data = Own(CFDataCreate(nullptr, U(text), 3));
    text[0] = 'x';
    EXPECT_EQ(CFGetTypeID(data.get()), CFDataGetTypeID());
    EXPECT_EQ(Bytes(data.get()), "abc");
    char middle[2] = {};
    CFDataGetBytes(data.get(), CFRangeMake(1, 2), reinterpret_cast<UInt8*>(middle));
    EXPECT_EQ(std::string(middle, 2), "bc");
    EXPECT_EQ(CFDataGetLength(Own(CFDataCreate(nullptr, nullptr, 0)).get()), 0);

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

TEST(MutableData, BytesWrittenInTheTailCountOnlyOnceCommittedAndTrimmingKeepsThem) {
    auto data = Own(CFDataCreateMutable(nullptr, 0));
    CFDataAppendBytes(data.get(), U("ab"), 2);
    glyphwell::DataTail tail = glyphwell::DataReserveTail(data.get(), 100);
    ASSERT_GE(tail.size, 100);
    EXPECT_TRUE(tail.grown);
    EXPECT_EQ(tail.bytes, CFDataGetMutableBytePtr(data.get()) + 2);
    std::memcpy(tail.bytes, "cdef", 4);
    EXPECT_EQ(Bytes(data.get()), "ab");
    glyphwell::DataCommitTail(data.get(), 3);
    EXPECT_EQ(Bytes(data.get()), "abcde");
    // Room that is already there is handed out again without growing.
    tail = glyphwell::DataReserveTail(data.get(), 10);
    EXPECT_FALSE(tail.grown);
    EXPECT_EQ(tail.bytes[0], 'f');
    glyphwell::DataTrimRoom(data.get());
    EXPECT_EQ(Bytes(data.get()), "abcde");
    tail = glyphwell::DataReserveTail(data.get(), 1);
    EXPECT_TRUE(tail.grown);
    tail.bytes[0] = 'z';
    glyphwell::DataCommitTail(data.get(), 1);
    EXPECT_EQ(Bytes(data.get()), "abcdez");
}

TEST(MutableData, SetLengthReplaceAndDeleteCutOrGrowInPlaceAlsoWithBytesFromItself) {
    auto owned = Own(CFDataCreateMutable(nullptr, 0));
    CFMutableDataRef data = owned.get();
    const auto Fill = [data](const char* text) {
        CFDataSetLength(data, 0);
        CFDataAppendBytes(data, U(text), CFIndex(std::strlen(text)));
    };
    const std::pair<std::function<void()>, std::string> steps[] = {
        {[&] { CFDataSetLength(data, 2); }, "ab"},
        {[&] { CFDataSetLength(data, 5); }, std::string("ab\0\0\0", 5)},
        {[&] { CFDataIncreaseLength(data, 2); }, std::string("ab\0\0\0\0\0", 7)},
        {[&] { CFDataGetMutableBytePtr(data)[6] = 'z'; }, std::string("ab\0\0\0\0z", 7)},
        // Replacing grows or shrinks the range.
        {[&] { CFDataReplaceBytes(data, CFRangeMake(0, 7), U("abcdef"), 6); }, "abcdef"},
        {[&] { CFDataReplaceBytes(data, CFRangeMake(1, 2), U("XYZW"), 4); }, "aXYZWdef"},
        {[&] { CFDataReplaceBytes(data, CFRangeMake(0, 5), U("-"), 1); }, "-def"},
        {[&] { CFDataReplaceBytes(data, CFRangeMake(4, 0), U("!"), 1); }, "-def!"},
        {[&] { CFDataDeleteBytes(data, CFRangeMake(1, 3)); }, "-!"},
        {[&] { CFDataDeleteBytes(data, CFRangeMake(0, 2)); }, ""},
    };
    Fill("abcdef");
    for (const auto& [step, expected] : steps) {
        step();
        EXPECT_EQ(Bytes(data), expected);
    }

    // Bytes taken from the data itself survive overlap and growth.
    Fill("abcdef");
    CFDataReplaceBytes(data, CFRangeMake(0, 2), CFDataGetBytePtr(data) + 1, 4);
    EXPECT_EQ(Bytes(data), "bcdecdef");
    Fill("abc");
    for (int i = 0; i < 6; ++i) // each append doubles the data and eventually moves the block
        CFDataAppendBytes(data, CFDataGetBytePtr(data), CFDataGetLength(data));
    EXPECT_EQ(Bytes(data), glyphwell::testing::Repeat("abc", 64));
}

} // namespace
