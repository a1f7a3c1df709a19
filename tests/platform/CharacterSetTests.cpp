#include <gtest/gtest.h>

#include <string>

#include "platform/CFCharacterSet.h"
#include "platform/CFData.h"
#include "tests/platform/ContainerTestSupport.h"
#include "tests/support/LogCapture.h"

using glyphwell::testing::LogCapture;
using glyphwell::testing::Own;
using glyphwell::testing::Owned;

namespace {

constexpr size_t kPlane = 8192;

Owned<CFCharacterSetRef> FromRepresentation(const std::string& bytes) {
    auto data = Own(
        CFDataCreate(nullptr, reinterpret_cast<const UInt8*>(bytes.data()), CFIndex(bytes.size())));
    return Own(CFCharacterSetCreateWithBitmapRepresentation(nullptr, data.get()));
}

std::string Representation(CFCharacterSetRef set) {
    auto data = Own(CFCharacterSetCreateBitmapRepresentation(nullptr, set));
    return std::string(reinterpret_cast<const char*>(CFDataGetBytePtr(data.get())),
                       size_t(CFDataGetLength(data.get())));
}

/// A plane record: the plane number, then 8192 bytes with `byte` at `index`.
std::string PlaneRecord(char plane, size_t index = 0, char byte = 0) {
    std::string record(1 + kPlane, '\0');
    record[0] = plane;
    record[1 + index] = byte;
    return record;
}

Owned<CFMutableCharacterSetRef> SetOf(std::initializer_list<UTF32Char> members) {
    auto set = Own(CFCharacterSetCreateMutable(nullptr));
    for (UTF32Char c : members)
        CFCharacterSetAddCharactersInRange(set.get(), CFRangeMake(c, 1));
    return set;
}

TEST(CharacterSetBitmap, RoundTripsMembersOfSeveralPlanes) {
    auto set = SetOf({0x41, 0x1F600, 0xE0001, 0x10FFFF});
    std::string bytes = Representation(set.get());
    ASSERT_EQ(bytes.size(), kPlane + 3 * (1 + kPlane));

    // 'A' (0x41): bit 1 of byte 8 of the BMP.
    std::string expected(kPlane, '\0');
    expected[8] = 0x02;
    expected += PlaneRecord(1, 0xF600 >> 3, 0x01);   // U+1F600: bit 0 of byte 0x1EC0
    expected += PlaneRecord(14, 0, 0x02);            // U+E0001: bit 1 of byte 0
    expected += PlaneRecord(16, 0x1FFF, char(0x80)); // U+10FFFF: bit 7 of the last byte
    EXPECT_EQ(bytes, expected);

    auto back = FromRepresentation(bytes);
    ASSERT_TRUE(back);
    EXPECT_TRUE(CFEqual(back.get(), set.get()));
    EXPECT_EQ(CFHash(back.get()), CFHash(set.get()));
    EXPECT_TRUE(CFCharacterSetIsLongCharacterMember(back.get(), 0x1F600));
    EXPECT_FALSE(CFCharacterSetIsLongCharacterMember(back.get(), 0x1F601));
    EXPECT_TRUE(CFCharacterSetHasMemberInPlane(back.get(), 14));
    EXPECT_FALSE(CFCharacterSetHasMemberInPlane(back.get(), 2));
    EXPECT_FALSE(CFCharacterSetHasMemberInPlane(back.get(), 17));
    // The empty set is the BMP's bitmap alone.
    EXPECT_EQ(Representation(SetOf({}).get()), std::string(kPlane, '\0'));
}

TEST(CharacterSetBitmap, AcceptsPlanesInAnyOrderAndStoresNothingForAllZeroRecords) {
    std::string bytes(kPlane, '\0');
    bytes += PlaneRecord(3, 0, 0x01);
    bytes += PlaneRecord(2);
    auto set = FromRepresentation(bytes);
    ASSERT_TRUE(set);
    EXPECT_TRUE(CFCharacterSetHasMemberInPlane(set.get(), 3));
    EXPECT_FALSE(CFCharacterSetHasMemberInPlane(set.get(), 2));
    EXPECT_FALSE(CFCharacterSetHasMemberInPlane(set.get(), 0));
    EXPECT_TRUE(CFEqual(set.get(), SetOf({0x30000}).get()));
    EXPECT_EQ(Representation(set.get()), std::string(kPlane, '\0') + PlaneRecord(3, 0, 0x01));
}

TEST(CharacterSetBitmap, RejectsMalformedRepresentationsAndNull) {
    std::string bmp(kPlane, '\0');
    EXPECT_FALSE(FromRepresentation(bmp.substr(1)));
    EXPECT_FALSE(FromRepresentation(bmp + '\x01'));
    EXPECT_FALSE(FromRepresentation(bmp + PlaneRecord(1).substr(1)));
    EXPECT_FALSE(FromRepresentation(bmp + PlaneRecord(0)));
    EXPECT_FALSE(FromRepresentation(bmp + PlaneRecord(17)));
    EXPECT_FALSE(FromRepresentation(bmp + PlaneRecord(5) + PlaneRecord(5, 1, 1)));
    std::string seventeen = bmp;
    for (char plane = 1; plane <= 16; ++plane)
        seventeen += PlaneRecord(plane);
    EXPECT_TRUE(FromRepresentation(seventeen));
    EXPECT_FALSE(FromRepresentation(seventeen + PlaneRecord(1)));

    // Empty data is the empty set.
    auto fromEmpty = FromRepresentation("");
    ASSERT_TRUE(fromEmpty);
    EXPECT_FALSE(CFCharacterSetHasMemberInPlane(fromEmpty.get(), 0));
}

TEST(CharacterSetRange, ClipsToTheCodeSpaceDropsPlanesThatEmptyAndTakesPairsWhole) {
    auto set = Own(CFCharacterSetCreateMutable(nullptr));
    CFCharacterSetAddCharactersInRange(set.get(), CFRangeMake(0xFFF0, 0x20)); // into plane 1
    EXPECT_TRUE(CFCharacterSetIsLongCharacterMember(set.get(), 0xFFF0));
    EXPECT_TRUE(CFCharacterSetIsLongCharacterMember(set.get(), 0x1000F));
    EXPECT_FALSE(CFCharacterSetIsLongCharacterMember(set.get(), 0x10010));
    CFCharacterSetRemoveCharactersInRange(set.get(), CFRangeMake(0x10000, 0x10));
    EXPECT_FALSE(CFCharacterSetHasMemberInPlane(set.get(), 1));
    EXPECT_TRUE(CFCharacterSetIsCharacterMember(set.get(), 0xFFFF));

    auto clipped = Own(CFCharacterSetCreateWithCharactersInRange(nullptr, CFRangeMake(-5, 8)));
    EXPECT_TRUE(CFEqual(clipped.get(), SetOf({0, 1, 2}).get()));
    auto top = Own(CFCharacterSetCreateWithCharactersInRange(
        nullptr, CFRangeMake(0x10FFFE, 0x7FFFFFFFFFFFFFFF)));
    EXPECT_TRUE(CFEqual(top.get(), SetOf({0x10FFFE, 0x10FFFF}).get()));
    EXPECT_FALSE(CFCharacterSetIsLongCharacterMember(top.get(), 0x110000));

    // A surrogate pair in a string is one code point.
    auto pair =
        Own(CFCharacterSetCreateWithCharactersInString(nullptr, CFSTR("a\xF0\x9F\x98\x80")));
    EXPECT_TRUE(CFEqual(pair.get(), SetOf({'a', 0x1F600}).get()));
    EXPECT_FALSE(CFCharacterSetIsCharacterMember(pair.get(), 0xD83D));
}

TEST(CharacterSetMutation, UnionAddsAndCopiesAreIndependent) {
    auto set = SetOf({'a'});
    CFCharacterSetUnion(set.get(), SetOf({'b', 0x20000}).get());
    EXPECT_TRUE(CFEqual(set.get(), SetOf({'a', 'b', 0x20000}).get()));

    auto copy = Own(CFCharacterSetCreateCopy(nullptr, set.get()));
    CFCharacterSetAddCharactersInRange(set.get(), CFRangeMake('c', 1));
    EXPECT_FALSE(CFCharacterSetIsCharacterMember(copy.get(), 'c'));
}

} // namespace
