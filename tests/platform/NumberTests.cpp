#include <gtest/gtest.h>

#include <cfloat>
#include <cmath>
#include <cstdint>
#include <limits>

#include "platform/CFNumber.h"
#include "platform/Log.h"
#include "tests/support/LogCapture.h"

namespace {

// Owns a number for the length of a test.
struct Number {
    template <class T>
    Number(CFNumberType type, T value) : ref(CFNumberCreate(nullptr, type, &value)) {}
    ~Number() {
        if (ref)
            CFRelease(ref);
    }
    Number(const Number&) = delete;
    Number& operator=(const Number&) = delete;
    CFNumberRef ref;
};

// The value converted to T's type code, and whether the conversion was exact.
template <class T> std::pair<T, bool> Get(const Number& number, CFNumberType type) {
    T value{};
    bool exact = CFNumberGetValue(number.ref, type, &value);
    return {value, exact};
}

TEST(Number, KeepsTypeCodeByteSizeAndFloatness) {
    const CFIndex sizes[17] = {0, 1, 2, 4, 8, 4, 8, 1, 2, 4, 8, 8, 4, 8, 8, 8, 8};
    const bool floats[17] = {false, false, false, false, false, true,  true,  false, false,
                             false, false, false, true,  true,  false, false, true};
    unsigned char zeros[8] = {};
    for (CFNumberType type = 1; type <= 16; ++type) {
        CFNumberRef number = CFNumberCreate(nullptr, type, zeros);
        ASSERT_NE(number, nullptr) << type;
        EXPECT_EQ(CFGetTypeID(number), CFNumberGetTypeID());
        EXPECT_EQ(CFNumberGetType(number), type);
        EXPECT_EQ(CFNumberGetByteSize(number), sizes[type]) << type;
        EXPECT_EQ(CFNumberTypeByteSize(type), sizes[type]) << type;
        EXPECT_EQ(bool(CFNumberIsFloatType(number)), floats[type]) << type;
        CFRelease(number);
    }
}

TEST(Number, CreateRejectsUnknownTypeAndNullValue) {
    int64_t value = 1;
    EXPECT_EQ(CFNumberCreate(nullptr, 0, &value), nullptr);
    EXPECT_EQ(CFNumberCreate(nullptr, 17, &value), nullptr);
    EXPECT_EQ(CFNumberCreate(nullptr, kCFNumberSInt32Type, nullptr), nullptr);
    EXPECT_EQ(CFNumberTypeByteSize(17), 0);
    Number number(kCFNumberSInt64Type, value);
    int64_t out = 99;
    EXPECT_FALSE(CFNumberGetValue(number.ref, 0, &out));
    EXPECT_FALSE(CFNumberGetValue(number.ref, 17, &out));
    EXPECT_EQ(out, 99);
}

TEST(Number, ReadsOnlyItsTypesBytes) {
    // A 1-byte code reads one byte (sign-extended); the bytes after it do not matter.
    unsigned char bytes[8] = {0xff, 0x7f, 0x7f, 0x7f, 0x7f, 0x7f, 0x7f, 0x7f};
    CFNumberRef number = CFNumberCreate(nullptr, kCFNumberCharType, bytes);
    int64_t value = 0;
    EXPECT_TRUE(CFNumberGetValue(number, kCFNumberSInt64Type, &value));
    EXPECT_EQ(value, -1);
    CFRelease(number);
}

TEST(NumberConversion, IntegerNarrowingKeepsLowBitsAndReportsLoss) {
    Number n300(kCFNumberSInt32Type, int32_t(300));
    EXPECT_EQ(Get<int8_t>(n300, kCFNumberSInt8Type), std::make_pair(int8_t(44), false));
    EXPECT_EQ(Get<int16_t>(n300, kCFNumberShortType), std::make_pair(int16_t(300), true));

    Number big(kCFNumberSInt64Type, int64_t(0x1234567890));
    EXPECT_EQ(Get<int32_t>(big, kCFNumberIntType), std::make_pair(int32_t(0x34567890), false));

    Number minusOne(kCFNumberLongType, int64_t(-1));
    EXPECT_EQ(Get<int16_t>(minusOne, kCFNumberSInt16Type), std::make_pair(int16_t(-1), true));
    EXPECT_EQ(Get<int8_t>(minusOne, kCFNumberCharType), std::make_pair(int8_t(-1), true));

    Number n128(kCFNumberSInt16Type, int16_t(128));
    EXPECT_EQ(Get<int8_t>(n128, kCFNumberSInt8Type), std::make_pair(int8_t(-128), false));
    Number nMinus128(kCFNumberSInt16Type, int16_t(-128));
    EXPECT_EQ(Get<int8_t>(nMinus128, kCFNumberSInt8Type), std::make_pair(int8_t(-128), true));

    Number widened(kCFNumberSInt8Type, int8_t(-5));
    EXPECT_EQ(Get<int64_t>(widened, kCFNumberCFIndexType), std::make_pair(int64_t(-5), true));
}

TEST(NumberConversion, IntegerToFloatIsExactOnlyWhenRepresentable) {
    Number two24(kCFNumberSInt32Type, int32_t(16777216));
    EXPECT_EQ(Get<float>(two24, kCFNumberFloat32Type), std::make_pair(16777216.0f, true));
    Number two24Plus1(kCFNumberSInt32Type, int32_t(16777217));
    EXPECT_EQ(Get<float>(two24Plus1, kCFNumberFloatType), std::make_pair(16777216.0f, false));
    EXPECT_EQ(Get<double>(two24Plus1, kCFNumberDoubleType), std::make_pair(16777217.0, true));

    Number two53Plus1(kCFNumberSInt64Type, int64_t(9007199254740993));
    EXPECT_EQ(Get<double>(two53Plus1, kCFNumberFloat64Type),
              std::make_pair(9007199254740992.0, false));

    // INT64_MAX rounds up to 2^63, which is not INT64_MAX; INT64_MIN is -2^63 exactly.
    Number max(kCFNumberSInt64Type, std::numeric_limits<int64_t>::max());
    EXPECT_EQ(Get<double>(max, kCFNumberCGFloatType), std::make_pair(9223372036854775808.0, false));
    EXPECT_EQ(Get<float>(max, kCFNumberFloat32Type), std::make_pair(9223372036854775808.0f, false));
    Number min(kCFNumberSInt64Type, std::numeric_limits<int64_t>::min());
    EXPECT_EQ(Get<double>(min, kCFNumberFloat64Type), std::make_pair(-9223372036854775808.0, true));
}

TEST(NumberConversion, FloatToIntegerTruncatesTowardZero) {
    Number positive(kCFNumberFloat64Type, 2.7);
    EXPECT_EQ(Get<int32_t>(positive, kCFNumberSInt32Type), std::make_pair(int32_t(2), false));
    Number negative(kCFNumberDoubleType, -2.7);
    EXPECT_EQ(Get<int64_t>(negative, kCFNumberSInt64Type), std::make_pair(int64_t(-2), false));
    Number whole(kCFNumberFloat32Type, -3.0f);
    EXPECT_EQ(Get<int8_t>(whole, kCFNumberSInt8Type), std::make_pair(int8_t(-3), true));
    Number half(kCFNumberFloat64Type, 0.5);
    EXPECT_EQ(Get<int16_t>(half, kCFNumberShortType), std::make_pair(int16_t(0), false));
}

TEST(NumberConversion, FloatToIntegerSaturatesAndMapsNaNToZero) {
    Number huge(kCFNumberFloat64Type, 1e20);
    EXPECT_EQ(Get<int32_t>(huge, kCFNumberSInt32Type), std::make_pair(INT32_MAX, false));
    EXPECT_EQ(Get<int64_t>(huge, kCFNumberSInt64Type), std::make_pair(INT64_MAX, false));
    Number tiny(kCFNumberFloat64Type, -1e20);
    EXPECT_EQ(Get<int64_t>(tiny, kCFNumberLongLongType), std::make_pair(INT64_MIN, false));
    Number n200(kCFNumberFloat32Type, 200.0f);
    EXPECT_EQ(Get<int8_t>(n200, kCFNumberSInt8Type), std::make_pair(int8_t(127), false));

    // 2^63 is just past INT64_MAX; -2^63 is INT64_MIN exactly.
    Number two63(kCFNumberFloat64Type, 9223372036854775808.0);
    EXPECT_EQ(Get<int64_t>(two63, kCFNumberSInt64Type), std::make_pair(INT64_MAX, false));
    Number minusTwo63(kCFNumberFloat64Type, -9223372036854775808.0);
    EXPECT_EQ(Get<int64_t>(minusTwo63, kCFNumberSInt64Type), std::make_pair(INT64_MIN, true));

    Number infinity(kCFNumberFloat64Type, -HUGE_VAL);
    EXPECT_EQ(Get<int16_t>(infinity, kCFNumberSInt16Type), std::make_pair(int16_t(-32768), false));
    Number nan(kCFNumberFloat64Type, std::nan(""));
    EXPECT_EQ(Get<int32_t>(nan, kCFNumberSInt32Type), std::make_pair(int32_t(0), false));
}

TEST(NumberConversion, DoubleToFloatRoundsAndReportsLoss) {
    Number tenth(kCFNumberFloat64Type, 0.1);
    EXPECT_EQ(Get<float>(tenth, kCFNumberFloat32Type), std::make_pair(0.1f, false));
    Number half(kCFNumberFloat64Type, 0.5);
    EXPECT_EQ(Get<float>(half, kCFNumberFloatType), std::make_pair(0.5f, true));

    // Past the largest float: below the halfway point to 2^128 it rounds down to FLT_MAX, at
    // or beyond it to infinity.
    Number justAbove(kCFNumberFloat64Type, 3.4028235677973366e38);
    EXPECT_EQ(Get<float>(justAbove, kCFNumberFloat32Type), std::make_pair(FLT_MAX, false));
    Number far(kCFNumberFloat64Type, -1e39);
    EXPECT_EQ(Get<float>(far, kCFNumberFloat32Type), std::make_pair(-HUGE_VALF, false));

    float value = 0;
    Number nan(kCFNumberFloat64Type, std::nan(""));
    EXPECT_TRUE(CFNumberGetValue(nan.ref, kCFNumberFloat32Type, &value));
    EXPECT_TRUE(std::isnan(value));
}

TEST(NumberConversion, Float32KeepsItsExactValue) {
    Number tenth(kCFNumberFloat32Type, 0.1f);
    EXPECT_EQ(Get<float>(tenth, kCFNumberFloatType), std::make_pair(0.1f, true));
    EXPECT_EQ(Get<double>(tenth, kCFNumberFloat64Type), std::make_pair(double(0.1f), true));
}

TEST(NumberEquality, ComparesNumericValueAcrossTypeCodes) {
    Number int8One(kCFNumberSInt8Type, int8_t(1));
    Number intOne(kCFNumberIntType, int32_t(1));
    Number doubleOne(kCFNumberFloat64Type, 1.0);
    Number floatOne(kCFNumberFloat32Type, 1.0f);
    for (const Number* other : {&intOne, &doubleOne, &floatOne}) {
        EXPECT_TRUE(CFEqual(int8One.ref, other->ref));
        EXPECT_EQ(CFHash(int8One.ref), CFHash(other->ref));
        EXPECT_EQ(CFNumberCompare(int8One.ref, other->ref, nullptr), kCFCompareEqualTo);
    }
    Number half(kCFNumberFloat64Type, 1.5);
    EXPECT_FALSE(CFEqual(int8One.ref, half.ref));
    Number zero(kCFNumberSInt32Type, int32_t(0));
    Number minusZero(kCFNumberFloat64Type, -0.0);
    EXPECT_TRUE(CFEqual(zero.ref, minusZero.ref));
    EXPECT_EQ(CFHash(zero.ref), CFHash(minusZero.ref));
    EXPECT_FALSE(CFEqual(int8One.ref, kCFBooleanTrue));
}

TEST(NumberEquality, ComparesLargeIntegersWithDoublesWithoutRounding) {
    // Converting the integer to double would make each pair look equal.
    Number two53Plus1(kCFNumberSInt64Type, int64_t(9007199254740993));
    Number two53(kCFNumberFloat64Type, 9007199254740992.0);
    EXPECT_FALSE(CFEqual(two53Plus1.ref, two53.ref));
    EXPECT_EQ(CFNumberCompare(two53Plus1.ref, two53.ref, nullptr), kCFCompareGreaterThan);
    EXPECT_EQ(CFNumberCompare(two53.ref, two53Plus1.ref, nullptr), kCFCompareLessThan);

    Number max(kCFNumberSInt64Type, std::numeric_limits<int64_t>::max());
    Number two63(kCFNumberFloat64Type, 9223372036854775808.0);
    EXPECT_FALSE(CFEqual(max.ref, two63.ref));
    EXPECT_EQ(CFNumberCompare(max.ref, two63.ref, nullptr), kCFCompareLessThan);

    Number two53Int(kCFNumberSInt64Type, int64_t(9007199254740992));
    EXPECT_TRUE(CFEqual(two53Int.ref, two53.ref));
    EXPECT_EQ(CFHash(two53Int.ref), CFHash(two53.ref));
}

TEST(NumberEquality, NaNEqualsNaNAndSortsLast) {
    Number nan(kCFNumberFloat64Type, std::nan(""));
    Number otherNaN(kCFNumberFloat32Type, std::nanf("1"));
    Number infinity(kCFNumberFloat64Type, HUGE_VAL);
    Number max(kCFNumberSInt64Type, std::numeric_limits<int64_t>::max());
    EXPECT_TRUE(CFEqual(nan.ref, otherNaN.ref));
    EXPECT_EQ(CFHash(nan.ref), CFHash(otherNaN.ref));
    EXPECT_EQ(CFNumberCompare(nan.ref, infinity.ref, nullptr), kCFCompareGreaterThan);
    EXPECT_EQ(CFNumberCompare(max.ref, nan.ref, nullptr), kCFCompareLessThan);
    EXPECT_FALSE(CFEqual(nan.ref, max.ref));
}

TEST(NumberCompare, OrdersIntegersAndFloatsByValue) {
    Number minusOne(kCFNumberSInt32Type, int32_t(-1));
    Number half(kCFNumberFloat32Type, 0.5f);
    Number minusHalf(kCFNumberFloat64Type, -0.5);
    EXPECT_EQ(CFNumberCompare(minusOne.ref, half.ref, nullptr), kCFCompareLessThan);
    EXPECT_EQ(CFNumberCompare(minusHalf.ref, minusOne.ref, nullptr), kCFCompareGreaterThan);
    EXPECT_EQ(CFNumberCompare(half.ref, minusHalf.ref, nullptr), kCFCompareGreaterThan);
}

TEST(Number, DescriptionIsTheValue) {
    EXPECT_EQ(glyphwell::Describe(Number(kCFNumberSInt32Type, int32_t(1)).ref), "1");
    EXPECT_EQ(glyphwell::Describe(Number(kCFNumberSInt64Type, int64_t(-42)).ref), "-42");
    EXPECT_EQ(glyphwell::Describe(Number(kCFNumberFloat64Type, 1.5).ref), "1.5");
    EXPECT_EQ(glyphwell::Describe(Number(kCFNumberFloat64Type, 1.0).ref), "1");
    EXPECT_EQ(glyphwell::Describe(Number(kCFNumberFloat32Type, 0.1f).ref), "0.1");
}

TEST(Number, WrongKindIsReportedAndGivesNothing) {
    glyphwell::testing::LogCapture log;
    int32_t value = 7;
    EXPECT_FALSE(CFNumberGetValue(reinterpret_cast<CFNumberRef>(kCFBooleanTrue),
                                  kCFNumberSInt32Type, &value));
    EXPECT_EQ(value, 7);
    ASSERT_EQ(log.Texts().size(), 2u);
    EXPECT_EQ(log.Texts()[1], "Invalid parameter not satisfying: object != nullptr");
}

TEST(Boolean, SharedConstantsCarryTheirValue) {
    EXPECT_EQ(CFGetTypeID(kCFBooleanTrue), CFBooleanGetTypeID());
    EXPECT_TRUE(CFBooleanGetValue(kCFBooleanTrue));
    EXPECT_FALSE(CFBooleanGetValue(kCFBooleanFalse));
    EXPECT_FALSE(CFEqual(kCFBooleanTrue, kCFBooleanFalse));
    EXPECT_NE(CFHash(kCFBooleanTrue), CFHash(kCFBooleanFalse));
    EXPECT_EQ(glyphwell::Describe(kCFBooleanTrue), "true");
    EXPECT_EQ(glyphwell::Describe(kCFBooleanFalse), "false");
}

TEST(Boolean, IsNeverDestroyed) {
    for (int i = 0; i < 3; ++i)
        CFRelease(kCFBooleanTrue);
    CFRetain(kCFBooleanFalse);
    EXPECT_EQ(CFGetRetainCount(kCFBooleanTrue), 0x7fffffffffffffffL);
    EXPECT_EQ(CFGetRetainCount(kCFBooleanFalse), 0x7fffffffffffffffL);
    EXPECT_TRUE(CFBooleanGetValue(kCFBooleanTrue));
}

} // namespace
