#include <gtest/gtest.h>

#include <cfloat>
#include <cmath>
#include <cstdint>
#include <cstring>
#include <iomanip>
#include <limits>

#include "platform/CFNumber.h"
#include "platform/Log.h"
#include "tests/support/LogCapture.h"
#include "tests/support/Values.h"

namespace {

using glyphwell::testing::Ref;

constexpr long double kMax = std::numeric_limits<int64_t>::max();
constexpr long double kMin = std::numeric_limits<int64_t>::min();
constexpr long double kTwo63 = 9223372036854775808.0L, kTwo53 = 9007199254740992.0L;
constexpr long double kNaN = std::numeric_limits<double>::quiet_NaN();
constexpr CFNumberType S8 = kCFNumberSInt8Type, S16 = kCFNumberSInt16Type,
                       S32 = kCFNumberSInt32Type, S64 = kCFNumberSInt64Type,
                       F32 = kCFNumberFloat32Type, F64 = kCFNumberFloat64Type;

bool IsFloatCode(CFNumberType type) {
    return type == 5 || type == 6 || type == 12 || type == 13 || type == 16;
}

/// A number of `type` holding `value` (exact for every int64 and double: long double is wider).
Ref Make(CFNumberType type, long double value) {
    unsigned char bytes[8] = {};
    const int64_t integer = IsFloatCode(type) ? 0 : int64_t(value);
    const double real = double(value);
    const float single = float(value);
    if (!IsFloatCode(type))
        std::memcpy(bytes, &integer, sizeof integer); // little-endian: a narrow code's low bytes
    else if (CFNumberTypeByteSize(type) == 4)
        std::memcpy(bytes, &single, sizeof single);
    else
        std::memcpy(bytes, &real, sizeof real);
    return Ref(CFNumberCreate(nullptr, type, bytes));
}

// Integers from -1 to 15 are shared constants, one per integer type code and value.
TEST(Number, KeepsTypeCodeByteSizeFloatnessAndSmallIntegersSharedAndRefusesUnknownCodes) {
    const CFIndex sizes[17] = {0, 1, 2, 4, 8, 4, 8, 1, 2, 4, 8, 8, 4, 8, 8, 8, 8};
    for (CFNumberType type = 1; type <= 16; ++type) {
        EXPECT_EQ(CFNumberTypeByteSize(type), sizes[type]) << type;
        for (const int64_t value : {-2, -1, 0, 15, 16}) {
            SCOPED_TRACE(::testing::Message() << "type " << type << ", value " << value);
            const bool shared = !IsFloatCode(type) && value >= -1 && value <= 15;
            Ref first = Make(type, value), second = Make(type, value);
            ASSERT_TRUE(first);
            EXPECT_EQ(first.get() == second.get(), shared);
            EXPECT_EQ(CFGetRetainCount(first.get()),
                      shared ? std::numeric_limits<CFIndex>::max() : 1);
            EXPECT_EQ(CFNumberGetType(first.as<CFNumberRef>()), type);
            EXPECT_EQ(CFNumberGetByteSize(first.as<CFNumberRef>()), sizes[type]);
            EXPECT_EQ(bool(CFNumberIsFloatType(first.as<CFNumberRef>())), IsFloatCode(type));
            int64_t out = 99;
            CFNumberGetValue(first.as<CFNumberRef>(), S64, &out);
            EXPECT_EQ(out, value);
        }
    }
    int64_t value = 1;
    EXPECT_EQ(CFNumberCreate(nullptr, 0, &value), nullptr);
    EXPECT_EQ(CFNumberCreate(nullptr, 17, &value), nullptr);
    EXPECT_EQ(CFNumberTypeByteSize(17), 0);
    Ref number(CFNumberCreate(nullptr, S64, &value));
    int64_t out = 99;
    EXPECT_FALSE(CFNumberGetValue(number.as<CFNumberRef>(), 0, &out));
    EXPECT_FALSE(CFNumberGetValue(number.as<CFNumberRef>(), 17, &out));
    EXPECT_EQ(out, 99);

    // A 1-byte code reads one byte (sign-extended); the bytes after it do not matter.
    unsigned char bytes[8] = {0xff, 0x7f, 0x7f, 0x7f, 0x7f, 0x7f, 0x7f, 0x7f};
    Ref narrow(CFNumberCreate(nullptr, kCFNumberCharType, bytes));
    EXPECT_TRUE(CFNumberGetValue(narrow.as<CFNumberRef>(), S64, &out));
    EXPECT_EQ(out, -1);
}

// Narrowing keeps the low bits; float to integer truncates toward zero and saturates (NaN: 0);
// integer to float is exact only when representable; double to float rounds. The result says
// whether the value came through exactly.
TEST(Number, ConvertsBetweenTypeCodesAndReportsLoss) {
    const struct Case {
        CFNumberType from;
        long double value;
        CFNumberType to;
        long double result;
        bool exact;
    } cases[] = {
        {S32, 300, S8, 44, false},
        {S32, 300, kCFNumberShortType, 300, true},
        {S64, 0x1234567890, kCFNumberIntType, 0x34567890, false},
        {kCFNumberLongType, -1, S16, -1, true},
        {kCFNumberLongType, -1, kCFNumberCharType, -1, true},
        {S16, 128, S8, -128, false},
        {S16, -128, S8, -128, true},
        {S8, -5, kCFNumberCFIndexType, -5, true},
        {S32, 16777216, F32, 16777216, true},
        {S32, 16777217, kCFNumberFloatType, 16777216, false},
        {S32, 16777217, kCFNumberDoubleType, 16777217, true},
        {S64, kTwo53 + 1, F64, kTwo53, false},
        // INT64_MAX rounds up to 2^63, which is not INT64_MAX; INT64_MIN is -2^63 exactly.
        {S64, kMax, kCFNumberCGFloatType, kTwo63, false},
        {S64, kMax, F32, kTwo63, false},
        {S64, kMin, F64, -kTwo63, true},
        {F64, 2.7, S32, 2, false},
        {kCFNumberDoubleType, -2.7, S64, -2, false},
        {F32, -3, S8, -3, true},
        {F64, 0.5, kCFNumberShortType, 0, false},
        {F64, 1e20, S32, INT32_MAX, false},
        {F64, 1e20, S64, kMax, false},
        {F64, -1e20, kCFNumberLongLongType, kMin, false},
        {F32, 200, S8, 127, false},
        {F64, kTwo63, S64, kMax, false},
        {F64, -kTwo63, S64, kMin, true},
        {F64, -HUGE_VAL, S16, -32768, false},
        {F64, kNaN, S32, 0, false},
        {F64, 0.1, F32, 0.1f, false},
        {F64, 0.5, kCFNumberFloatType, 0.5, true},
        // Past the largest float: below the halfway point to 2^128 it rounds down to FLT_MAX, at
        // or beyond it to infinity.
        {F64, 3.4028235677973366e38, F32, FLT_MAX, false},
        {F64, -1e39, F32, -HUGE_VAL, false},
        {F32, 0.1f, kCFNumberFloatType, 0.1f, true},
        {F32, 0.1f, F64, 0.1f, true},
    };
    for (const Case& row : cases) {
        SCOPED_TRACE(testing::Message()
                     << row.from << " " << std::setprecision(21) << row.value << " as " << row.to);
        Ref number = Make(row.from, row.value);
        unsigned char out[8] = {};
        EXPECT_EQ(bool(CFNumberGetValue(number.as<CFNumberRef>(), row.to, out)), row.exact);
        Ref back(CFNumberCreate(nullptr, row.to, out)); // reads exactly the code's bytes
        int64_t integer = 0;
        double real = 0;
        CFNumberGetValue(back.as<CFNumberRef>(), S64, &integer);
        CFNumberGetValue(back.as<CFNumberRef>(), F64, &real);
        EXPECT_EQ(IsFloatCode(row.to) ? (long double)real : (long double)integer, row.result);
    }
    float value = 0;
    EXPECT_TRUE(CFNumberGetValue(Make(F64, kNaN).as<CFNumberRef>(), F32, &value));
    EXPECT_TRUE(std::isnan(value));
}

// Numbers compare by value across type codes, without rounding large integers to double; NaN
// equals NaN and sorts after everything. Equal numbers hash alike.
TEST(Number, ComparesByValueAcrossTypeCodes) {
    const struct Case {
        CFNumberType aType;
        long double a;
        CFNumberType bType;
        long double b;
        CFComparisonResult order;
    } cases[] = {
        {S8, 1, kCFNumberIntType, 1, kCFCompareEqualTo},
        {S8, 1, F64, 1, kCFCompareEqualTo},
        {S8, 1, F32, 1, kCFCompareEqualTo},
        {S8, 1, F64, 1.5, kCFCompareLessThan},
        {S32, 0, F64, -0.0, kCFCompareEqualTo},
        // Converting the integer to double would make each of these pairs look equal.
        {S64, kTwo53 + 1, F64, kTwo53, kCFCompareGreaterThan},
        {F64, kTwo53, S64, kTwo53 + 1, kCFCompareLessThan},
        {S64, kMax, F64, kTwo63, kCFCompareLessThan},
        {S64, kTwo53, F64, kTwo53, kCFCompareEqualTo},
        {F64, kNaN, F32, -kNaN, kCFCompareEqualTo},
        {F64, kNaN, F64, HUGE_VAL, kCFCompareGreaterThan},
        {S64, kMax, F64, kNaN, kCFCompareLessThan},
        {S32, -1, F32, 0.5, kCFCompareLessThan},
        {F64, -0.5, S32, -1, kCFCompareGreaterThan},
        {F32, 0.5, F64, -0.5, kCFCompareGreaterThan},
    };
    for (const Case& row : cases) {
        SCOPED_TRACE(testing::Message() << std::setprecision(21) << row.a << " vs " << row.b);
        Ref a = Make(row.aType, row.a), b = Make(row.bType, row.b);
        EXPECT_EQ(CFNumberCompare(a.as<CFNumberRef>(), b.as<CFNumberRef>(), nullptr), row.order);
        EXPECT_EQ(bool(CFEqual(a.get(), b.get())), row.order == kCFCompareEqualTo);
        if (row.order == kCFCompareEqualTo) {
            EXPECT_EQ(CFHash(a.get()), CFHash(b.get()));
        }
    }
}

} // namespace
