// Conversions between property values and plain numbers and truth values: the number type each
// C++ type is stored as, the shared boolean numbers, parsing strings, and the total readings.
#include <climits>
#include <clocale>
#include <string>
#include <tuple>
#include <vector>

#include <gtest/gtest.h>

#include "cfutil/TCFNumber.h"
#include "cfutil/TCFRetained.h"
#include "cfutil/TCFTypeRef.h"
#include "platform/PropertyValues.h"
#include "support/Values.h"

using namespace glyphwell::testing;

namespace {

/// The number parsed from UTF-8 `text`, owned by the returned holder.
Ref Parse(const std::string& text) {
    Ref string = Str(text);
    return Ref(TCFNumber::CreateForString(string.as<CFStringRef>()));
}

long LongOf(CFTypeRef number) {
    long value = 0;
    CFNumberGetValue(static_cast<CFNumberRef>(number), kCFNumberLongType, &value);
    return value;
}

double DoubleOf(CFTypeRef number) {
    double value = 0;
    CFNumberGetValue(static_cast<CFNumberRef>(number), kCFNumberDoubleType, &value);
    return value;
}

} // namespace

TEST(NumberCreate, EachNativeTypeKeepsItsPlatformNumberType) {
    TCFAdopted<CFNumberRef> character(TCFNumber::Create<SInt8>(-5));
    TCFAdopted<CFNumberRef> integer(TCFNumber::Create<SInt64>(LONG_MIN));
    TCFAdopted<CFNumberRef> real(TCFNumber::Create<double>(2.25));
    // The boolean numbers are integers 1 and 0, not the platform's boolean values.
    TCFAdopted<CFNumberRef> yes(TCFNumber::CreateFromBoolean(true));
    TCFAdopted<CFNumberRef> no(TCFNumber::CreateFromBoolean(false));
    using Kind = std::tuple<CFNumberType, CFIndex, double>;
    auto kind = [](CFNumberRef number) {
        return Kind{CFNumberGetType(number), CFNumberGetByteSize(number), DoubleOf(number)};
    };
    EXPECT_EQ((std::vector{kind(character), kind(integer), kind(real), kind(yes), kind(no)}),
              (std::vector<Kind>{{kCFNumberCharType, 1, -5},
                                 {kCFNumberLongType, 8, double(LONG_MIN)},
                                 {kCFNumberDoubleType, 8, 2.25},
                                 {kCFNumberIntType, 4, 1},
                                 {kCFNumberIntType, 4, 0}}));

    // Each call hands out the same number with one more count, which the caller owns.
    const CFIndex count = CFGetRetainCount(yes);
    TCFAdopted<CFNumberRef> again(TCFNumber::CreateFromBoolean(true));
    EXPECT_EQ(again.Get(), yes.Get());
    EXPECT_EQ(CFGetRetainCount(again), count + 1);
}

TEST(NumberFromString, WholeNumbersBecomeLongsAndOthersDoubles) {
    for (auto [text, expected] :
         std::vector<std::pair<std::string, long>>{{"42", 42},
                                                   {"-7", -7},
                                                   {" \t+5", 5},
                                                   {"007", 7},
                                                   {"99999999999999999999", LONG_MAX},
                                                   {"-99999999999999999999", LONG_MIN},
                                                   {std::string(60, '0') + "42", 42}}) {
        Ref number = Parse(text);
        ASSERT_TRUE(number) << text;
        EXPECT_EQ(CFNumberGetType(number.as<CFNumberRef>()), kCFNumberLongType) << text;
        EXPECT_EQ(LongOf(number.get()), expected) << text;
    }
    for (auto [text, expected] : std::vector<std::pair<std::string, double>>{
             {"3.5", 3.5}, {"1e3", 1000.0}, {"-.25", -0.25}, {"2.", 2.0}}) {
        Ref number = Parse(text);
        ASSERT_TRUE(number) << text;
        EXPECT_EQ(CFNumberGetType(number.as<CFNumberRef>()), kCFNumberDoubleType) << text;
        EXPECT_EQ(DoubleOf(number.get()), expected) << text;
    }
}

TEST(NumberFromString, TextBesidesTheNumberIsRejected) {
    for (const std::string& text :
         std::vector<std::string>{"42 ", "42\n", "", " ", "abc", "4 2", "1.5x", "3,5", "-",
                                  "\xEF\xBC\x94\xEF\xBC\x92" /* fullwidth 42 */,
                                  std::string("42\0x", 4), std::string("42\0", 3)}) {
        EXPECT_FALSE(Parse(text)) << '"' << text << '"';
    }
    EXPECT_EQ(TCFNumber::CreateForString(nullptr), nullptr);
}

TEST(NumberFromString, DecimalPointIsAFullStopUnderACommaLocale) {
    const std::string previous = std::setlocale(LC_ALL, nullptr);
    const bool comma =
        std::setlocale(LC_ALL, "de_DE.UTF-8") && *std::localeconv()->decimal_point == ',';
    Ref real = Parse("3.5"), withComma = Parse("3,5");
    std::setlocale(LC_ALL, previous.c_str());
    if (!comma)
        GTEST_SKIP() << "no de_DE.UTF-8 locale (scripts/install-deps generates it)";
    EXPECT_TRUE(real && DoubleOf(real.get()) == 3.5);
    EXPECT_FALSE(withComma);
}

TEST(BooleanValue, TrueForTrueOrYesInAnyCaseAndExactNonZeroThirtyTwoBitIntegers) {
    for (const char* text : {"true", "TRUE", "True", "YES", "yes", "yEs"})
        EXPECT_TRUE(TCFTypeRef::GetBooleanValue(Str(text).get())) << text;
    for (const char* text : {"1", "false", "", "true ", "y"})
        EXPECT_FALSE(TCFTypeRef::GetBooleanValue(Str(text).get())) << text;
    const std::pair<Ref, bool> rows[] = {
        {Num(kCFNumberLongType, 1L), true},     {Num(kCFNumberLongType, -1L), true},
        {Num(kCFNumberDoubleType, 3.0), true},  {Num(kCFNumberLongType, 0L), false},
        {Num(kCFNumberDoubleType, 2.5), false}, {Num(kCFNumberLongType, 1L << 32), false},
        {Ref(CFRetain(kCFBooleanTrue)), true},  {Ref(CFRetain(kCFBooleanFalse)), false},
        {Array({kCFBooleanTrue}), false},       {Ref(), false},
    };
    for (const auto& [value, expected] : rows)
        EXPECT_EQ(TCFTypeRef::GetBooleanValue(value.get()), expected)
            << glyphwell::Describe(value.get());
}

TEST(NumberValue, BooleansGiveOneAndZeroNumbersTheirSixtyFourBitValueAndOtherKindsZero) {
    const struct {
        Ref value;
        unsigned long expected;
        bool isNumber; // else only the safe reading takes it, and refuses it
    } rows[] = {
        {Ref(CFRetain(kCFBooleanTrue)), 1, true},
        {Ref(CFRetain(kCFBooleanFalse)), 0, true},
        {Num(kCFNumberSInt8Type, SInt8(42)), 42, true},
        {Num(kCFNumberDoubleType, -2.9), 0xFFFFFFFFFFFFFFFEUL, true},
        {Num(kCFNumberLongType, -1L), 0xFFFFFFFFFFFFFFFFUL, true},
        {Str("42"), 0, false},
        {Ref(), 0, false},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(glyphwell::Describe(row.value.get()));
        unsigned long plain = 99, safe = 99;
        if (row.isNumber)
            TCFNumber::GetCFNumberValue(row.value.get(), plain);
        EXPECT_EQ(TCFNumber::GetCFNumberValueSafely(row.value.get(), safe), row.isNumber);
        EXPECT_EQ(safe, row.expected);
        EXPECT_EQ(plain, row.isNumber ? row.expected : 99);
    }
}
