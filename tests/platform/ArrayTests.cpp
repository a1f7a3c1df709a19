#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "platform/PropertyValues.h"
#include "support/LogCapture.h"
#include "tests/platform/ContainerTestSupport.h"
#include "tests/support/Values.h"

using namespace glyphwell::testing;
using Tokens = std::vector<intptr_t>;

namespace {

CFComparisonResult CompareTokens(const void* a, const void* b, void*) {
    intptr_t left = TokenValue(a), right = TokenValue(b);
    return left < right   ? kCFCompareLessThan
           : left > right ? kCFCompareGreaterThan
                          : kCFCompareEqualTo;
}

// Orders tokens by their hundreds only, so that tokens with the same hundreds tie.
CFComparisonResult CompareHundreds(const void* a, const void* b, void* context) {
    ++*static_cast<int*>(context);
    return CompareTokens(Token(TokenValue(a) / 100), Token(TokenValue(b) / 100), nullptr);
}

Owned<CFMutableArrayRef> TokenArray(Tokens numbers) {
    auto array = Own(CFArrayCreateMutable(nullptr, 0, nullptr));
    for (intptr_t number : numbers)
        CFArrayAppendValue(array.get(), Token(number));
    return array;
}

Tokens TokensOf(CFArrayRef array) {
    Tokens numbers;
    for (CFIndex i = 0; i < CFArrayGetCount(array); ++i)
        numbers.push_back(TokenValue(CFArrayGetValueAtIndex(array, i)));
    return numbers;
}

} // namespace

TEST(CFArray, RetainsWhatItHoldsAndCopiesAreIndependent) {
    auto one = Num(kCFNumberIntType, 101), two = Num(kCFNumberIntType, 102);
    auto array = Own(CFArrayCreateMutable(nullptr, 0, &kCFTypeArrayCallBacks));
    CFArrayAppendValue(array.get(), one.get());
    CFArrayInsertValueAtIndex(array.get(), 0, one.get());
    CFArrayAppendValue(array.get(), two.get());
    EXPECT_EQ(RetainCounts({one.get(), two.get()}), (Counts{3, 2}));
    CFArraySetValueAtIndex(array.get(), 0, two.get()); // one -> two
    EXPECT_EQ(RetainCounts({one.get(), two.get()}), (Counts{2, 3}));
    CFArrayRemoveValueAtIndex(array.get(), 2);
    EXPECT_EQ(CFGetRetainCount(two.get()), 2);
    // Replacing a value by itself must not free it in between.
    const void* same[] = {one.get()};
    CFArrayReplaceValues(array.get(), CFRangeMake(1, 1), same, 1);
    EXPECT_EQ(CFGetRetainCount(one.get()), 2);

    auto frozen = Own(CFArrayCreateCopy(nullptr, array.get()));
    auto copy = Own(CFArrayCreateMutableCopy(nullptr, 0, frozen.get()));
    CFArrayAppendValue(copy.get(), one.get());
    EXPECT_EQ(CFGetRetainCount(one.get()), 5);
    CFArrayRemoveAllValues(array.get());
    EXPECT_EQ(CFArrayGetCount(frozen.get()), 2);
    EXPECT_EQ(CFGetTypeID(frozen.get()), CFArrayGetTypeID());
    array.reset();
    frozen.reset();
    copy.reset();
    EXPECT_EQ(RetainCounts({one.get(), two.get()}), (Counts{1, 1}));
}

TEST(CFArray, NullCallbacksKeepCountsAndCompareByPointer) {
    auto five = Num(kCFNumberIntType, 105), otherFive = Num(kCFNumberIntType, 105);
    const void* values[] = {five.get(), nullptr};
    auto array = Own(CFArrayCreate(nullptr, values, 2, nullptr));
    EXPECT_EQ(CFGetRetainCount(five.get()), 1);
    EXPECT_EQ(CFArrayGetFirstIndexOfValue(array.get(), CFRangeMake(0, 2), otherFive.get()),
              kCFNotFound);
    EXPECT_EQ(CFArrayGetFirstIndexOfValue(array.get(), CFRangeMake(0, 2), nullptr), 1);
    auto copy = Own(CFArrayCreateMutableCopy(nullptr, 0, array.get()));
    CFArrayAppendValue(copy.get(), five.get());
    EXPECT_EQ(CFGetRetainCount(five.get()), 1);
    EXPECT_EQ(CFArrayGetCountOfValue(copy.get(), CFRangeMake(0, 3), five.get()), 2);
}

TEST(CFArray, FindsCountsAndVisitsValuesWithinRange) {
    auto x = Str("x"), y = Str("y"), alsoX = Str("x");
    const void* values[] = {x.get(), y.get(), x.get(), y.get(), x.get()};
    auto array = Own(CFArrayCreate(nullptr, values, 5, &kCFTypeArrayCallBacks));
    EXPECT_EQ(CFArrayGetCountOfValue(array.get(), CFRangeMake(0, 5), alsoX.get()), 3);
    EXPECT_EQ(CFArrayGetCountOfValue(array.get(), CFRangeMake(1, 3), alsoX.get()), 1);
    EXPECT_EQ(CFArrayGetFirstIndexOfValue(array.get(), CFRangeMake(1, 4), alsoX.get()), 2);
    EXPECT_EQ(CFArrayGetLastIndexOfValue(array.get(), CFRangeMake(0, 4), alsoX.get()), 2);
    EXPECT_EQ(CFArrayGetLastIndexOfValue(array.get(), CFRangeMake(1, 1), alsoX.get()), kCFNotFound);
    EXPECT_TRUE(CFArrayContainsValue(array.get(), CFRangeMake(3, 1), y.get()));
    EXPECT_FALSE(CFArrayContainsValue(array.get(), CFRangeMake(0, 0), x.get()));

    auto tokens = TokenArray({1, 2, 3, 4, 5});
    Tokens seen;
    CFArrayApplyFunction(
        tokens.get(), CFRangeMake(1, 3),
        [](const void* value, void* context) {
            static_cast<Tokens*>(context)->push_back(TokenValue(value));
        },
        &seen);
    EXPECT_EQ(seen, (Tokens{2, 3, 4}));
}

// The index of an equal value, else where it would be inserted, never outside the range.
TEST(CFArray, BinarySearchGivesEqualOrInsertionIndex) {
    auto array = TokenArray({10, 20, 20, 30, 40});
    const struct {
        CFIndex location, length;
        intptr_t value;
        CFIndex index;
    } cases[] = {{0, 5, 10, 0}, {0, 5, 20, 1}, {0, 5, 40, 4}, {0, 5, 5, 0}, {0, 5, 25, 3},
                 {0, 5, 50, 5}, {1, 3, 5, 1},  {1, 3, 35, 4}, {2, 0, 99, 2}};
    for (const auto& row : cases)
        EXPECT_EQ(CFArrayBSearchValues(array.get(), CFRangeMake(row.location, row.length),
                                       Token(row.value), CompareTokens, nullptr),
                  row.index)
            << row.location << "+" << row.length << " " << row.value;
}

TEST(CFArray, SortIsStableAndStaysInItsRange) {
    auto array = TokenArray({999, 301, 102, 303, 104, 205, 306, 107, 0});
    int calls = 0;
    CFArraySortValues(array.get(), CFRangeMake(1, 7), CompareHundreds, &calls);
    EXPECT_GT(calls, 0);
    EXPECT_EQ(TokensOf(array.get()), (Tokens{999, 102, 104, 107, 205, 301, 303, 306, 0}));
}

TEST(CFArray, EditsSpliceInPlace) {
    auto array = TokenArray({1, 2, 3, 4});
    const void* inserted[] = {Token(7), Token(8), Token(9)};
    CFArrayReplaceValues(array.get(), CFRangeMake(1, 2), inserted, 3);
    EXPECT_EQ(TokensOf(array.get()), (Tokens{1, 7, 8, 9, 4}));
    CFArrayReplaceValues(array.get(), CFRangeMake(0, 4), nullptr, 0);
    EXPECT_EQ(TokensOf(array.get()), (Tokens{4}));
    CFArrayInsertValueAtIndex(array.get(), 1, Token(5)); // an index equal to the count appends
    CFArrayInsertValueAtIndex(array.get(), 0, Token(3));
    CFArrayExchangeValuesAtIndices(array.get(), 0, 2);
    EXPECT_EQ(TokensOf(array.get()), (Tokens{5, 4, 3}));
    CFArraySetValueAtIndex(array.get(), 3, Token(6));
    // Appending a range of the array to itself reads the values before the storage moves.
    CFArrayAppendArray(array.get(), array.get(), CFRangeMake(0, 4));
    EXPECT_EQ(TokensOf(array.get()), (Tokens{5, 4, 3, 6, 5, 4, 3, 6}));
}
