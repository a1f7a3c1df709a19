// Collection operations of the utility library: dictionary subsets and key filters, multi-value
// dictionaries, set algebra, sorted arrays, and the standard algorithms over array iterators.
#include <algorithm>
#include <iterator>
#include <ranges>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "cfutil/CFArraySequence.h"
#include "cfutil/TCFArray.h"
#include "cfutil/TCFDictionary.h"
#include "cfutil/TCFSet.h"
#include "platform/PropertyValues.h"
#include "support/Values.h"

using glyphwell::testing::Array;
using glyphwell::testing::Dict;
using glyphwell::testing::Num;
using glyphwell::testing::Ref;
using glyphwell::testing::Set;
using glyphwell::testing::Str;

namespace {

Ref Long(long value) {
    return Num(kCFNumberLongType, value);
}

long LongOf(CFTypeRef number) {
    long value = 0;
    CFNumberGetValue(static_cast<CFNumberRef>(number), kCFNumberLongType, &value);
    return value;
}

/// The elements of an array of numbers, read as longs.
std::vector<long> Longs(CFArrayRef array) {
    std::vector<long> values;
    for (CFIndex i = 0; i < CFArrayGetCount(array); ++i)
        values.push_back(LongOf(CFArrayGetValueAtIndex(array, i)));
    return values;
}

/// The UTF-8 texts of an array of strings.
std::vector<std::string> Texts(CFArrayRef array) {
    std::vector<std::string> texts;
    for (CFIndex i = 0; i < CFArrayGetCount(array); ++i) {
        char buffer[256];
        CFStringGetCString(static_cast<CFStringRef>(CFArrayGetValueAtIndex(array, i)), buffer,
                           sizeof buffer, kCFStringEncodingUTF8);
        texts.push_back(buffer);
    }
    return texts;
}

/// Numeric order; the context, when non-null, points to a call counter.
CFComparisonResult CompareNumbers(const void* a, const void* b, void* context) {
    if (context)
        ++*static_cast<int*>(context);
    return CFNumberCompare(static_cast<CFNumberRef>(a), static_cast<CFNumberRef>(b), nullptr);
}

/// A dictionary of `count` pairs "key<i>" -> i.
Ref NumberedDictionary(int count) {
    CFMutableDictionaryRef dictionary = CFDictionaryCreateMutable(
        nullptr, 0, &kCFTypeDictionaryKeyCallBacks, &kCFTypeDictionaryValueCallBacks);
    for (int i = 0; i < count; ++i) {
        Ref key = Str("key" + std::to_string(i));
        Ref value = Long(i);
        CFDictionarySetValue(dictionary, key.get(), value.get());
    }
    return Ref(dictionary);
}

CFArrayRef ArrayFor(const TCFDict& dictionary, const Ref& key) {
    return static_cast<CFArrayRef>(dictionary.GetValue(key.get()));
}

} // namespace

// ---------------------------------------------------------------------------------------------
// Dictionary subsets and key filters

TEST(DictionarySubset, ItselfAnEmptyAndANullOtherAreSubsets) {
    Ref a = Str("a"), one = Long(1);
    Ref dictionary = Dict({{a.get(), one.get()}});
    Ref empty = Dict({});
    TCFDict view(dictionary.as<CFDictionaryRef>());
    EXPECT_TRUE(view.ContainsSubset(dictionary.as<CFDictionaryRef>()));
    EXPECT_TRUE(view.ContainsSubset(empty.as<CFDictionaryRef>()));
    EXPECT_TRUE(view.ContainsSubset(nullptr));
}

TEST(DictionarySubset, NullReceiverContainsNothingNotEvenTheEmptySubset) {
    Ref empty = Dict({});
    EXPECT_FALSE(TCFDict(nullptr).ContainsSubset(empty.as<CFDictionaryRef>()));
}

TEST(DictionarySubset, MissingKeyOrDifferentValueIsNotASubset) {
    Ref a = Str("a"), b = Str("b"), c = Str("c"), one = Long(1), two = Long(2);
    Ref dictionary = Dict({{a.get(), one.get()}, {b.get(), two.get()}});
    Ref missingKey = Dict({{a.get(), one.get()}, {c.get(), two.get()}});
    Ref otherValue = Dict({{b.get(), one.get()}});
    TCFDict view(dictionary.as<CFDictionaryRef>());
    EXPECT_FALSE(view.ContainsSubset(missingKey.as<CFDictionaryRef>()));
    EXPECT_FALSE(view.ContainsSubset(otherValue.as<CFDictionaryRef>()));
}

TEST(DictionarySubset, ValuesCompareByContentAcrossTypeCodes) {
    Ref a = Str("a"), aAgain = Str("a");
    Ref longOne = Long(1), doubleOne = Num(kCFNumberDoubleType, 1.0);
    Ref dictionary = Dict({{a.get(), longOne.get()}});
    Ref subset = Dict({{aAgain.get(), doubleOne.get()}});
    EXPECT_TRUE(
        TCFDict(dictionary.as<CFDictionaryRef>()).ContainsSubset(subset.as<CFDictionaryRef>()));
}

TEST(DictionarySubset, SubsetsLargerThanTheInlineSnapshotAreCompared) {
    Ref big = NumberedDictionary(45);
    Ref smaller = NumberedDictionary(40);
    TCFDict bigView(big.as<CFDictionaryRef>());
    EXPECT_TRUE(bigView.ContainsSubset(smaller.as<CFDictionaryRef>()));
    EXPECT_FALSE(TCFDict(smaller.as<CFDictionaryRef>()).ContainsSubset(big.as<CFDictionaryRef>()));
}

TEST(DictionaryFilter, NullOrEmptyKeySetReturnsTheSameDictionaryWithOneMoreCount) {
    Ref a = Str("a"), one = Long(1);
    Ref dictionary = Dict({{a.get(), one.get()}});
    Ref noKeys = Set({});
    TCFDict view(dictionary.as<CFDictionaryRef>());
    for (CFSetRef keys : {static_cast<CFSetRef>(nullptr), noKeys.as<CFSetRef>()}) {
        CFDictionaryRef result = view.CreateDictionaryFilteredByKey(keys);
        EXPECT_EQ(result, dictionary.get());
        EXPECT_EQ(CFGetRetainCount(result), 2);
        CFRelease(result);
    }
    EXPECT_EQ(TCFDict(nullptr).CreateDictionaryFilteredByKey(nullptr), nullptr);
}

TEST(DictionaryFilter, KeepsOnlyThePairsWithWantedKeys) {
    Ref a = Str("a"), b = Str("b"), c = Str("c"), z = Str("z");
    Ref one = Long(1), two = Long(2), three = Long(3);
    Ref dictionary = Dict({{a.get(), one.get()}, {b.get(), two.get()}, {c.get(), three.get()}});
    Ref keys = Set({a.get(), c.get(), z.get()});
    TCFDictionary filtered(TCFDict(dictionary.as<CFDictionaryRef>())
                               .CreateDictionaryFilteredByKey(keys.as<CFSetRef>()),
                           kAdopted);
    Ref expected = Dict({{a.get(), one.get()}, {c.get(), three.get()}});
    EXPECT_NE(static_cast<CFDictionaryRef>(filtered), dictionary.get());
    EXPECT_EQ(CFGetRetainCount(filtered), 1);
    EXPECT_TRUE(CFEqual(filtered, expected.get()));
    EXPECT_EQ(filtered.GetValue(a.get()), one.get()); // the values themselves, not copies
}

TEST(DictionaryFilter, NoWantedKeyPresentGivesANewEmptyDictionary) {
    Ref a = Str("a"), z = Str("z"), one = Long(1);
    Ref dictionary = Dict({{a.get(), one.get()}});
    Ref keys = Set({z.get()});
    for (CFDictionaryRef source : {dictionary.as<CFDictionaryRef>(), CFDictionaryRef(nullptr)}) {
        TCFDictionary filtered(TCFDict(source).CreateDictionaryFilteredByKey(keys.as<CFSetRef>()),
                               kAdopted);
        ASSERT_NE(static_cast<CFDictionaryRef>(filtered), nullptr);
        EXPECT_NE(static_cast<CFDictionaryRef>(filtered), dictionary.get());
        EXPECT_EQ(filtered.GetCount(), 0);
    }
}

TEST(DictionaryFilter, KeyFilterContextHandsOutItsResult) {
    Ref a = Str("a"), b = Str("b"), one = Long(1);
    Ref keys = Set({a.get()});
    KeyFilterContext context(keys.as<CFSetRef>());
    EXPECT_EQ(CFGetRetainCount(keys.get()), 2);
    EXPECT_TRUE(context.ContainsValue(a.get()));
    EXPECT_FALSE(context.ContainsValue(b.get()));
    context.AddPair(a.get(), one.get());
    TCFDictionary result(context.OrphanResult(), kAdopted);
    EXPECT_EQ(result.GetValue(a.get()), one.get());
    EXPECT_EQ(CFGetRetainCount(result), 1);
}

// ---------------------------------------------------------------------------------------------
// Copying pairs and multi-value dictionaries

TEST(DictionarySetPairs, AddsNewPairsAndReplacesPresentValues) {
    Ref a = Str("a"), b = Str("b"), one = Long(1), two = Long(2), three = Long(3);
    TCFMutableDictionary dictionary;
    dictionary.SetPair(a.get(), one.get());
    Ref other = Dict({{a.get(), two.get()}, {b.get(), three.get()}});
    dictionary.SetPairs(other.as<CFDictionaryRef>());
    dictionary.SetPairs(nullptr);
    EXPECT_EQ(dictionary.GetCount(), 2);
    EXPECT_EQ(dictionary.GetValue(a.get()), two.get());
    EXPECT_EQ(dictionary.GetValue(b.get()), three.get());
    EXPECT_EQ(CFGetRetainCount(one.get()), 1); // the replaced value was released
}

TEST(DictionarySetPairs, CopiesMoreThanTheInlineSnapshotAndToleratesItself) {
    Ref source = NumberedDictionary(50);
    TCFMutableDictionary dictionary;
    dictionary.SetPairs(source.as<CFDictionaryRef>());
    dictionary.SetPairs(dictionary);
    EXPECT_TRUE(CFEqual(dictionary, source.get()));
}

TEST(MultiValueDictionary, FirstValueMakesAnArrayAndLaterOnesAppendDuplicatesIncluded) {
    Ref k = Str("k"), a = Str("a"), b = Str("b");
    TCFMutableDictionary dictionary;
    dictionary.AddMultiValue(k.get(), a.get());
    CFArrayRef values = ArrayFor(dictionary, k);
    ASSERT_NE(values, nullptr);
    EXPECT_EQ(CFGetRetainCount(values), 1); // the dictionary holds its only count
    dictionary.AddMultiValue(k.get(), a.get());
    dictionary.AddMultiValue(k.get(), b.get());
    EXPECT_EQ(ArrayFor(dictionary, k), values); // appended in place
    EXPECT_EQ(Texts(values), (std::vector<std::string>{"a", "a", "b"}));
}

TEST(MultiValueDictionary, AbsentKeyStoresAMutableCopyOfTheValues) {
    Ref k = Str("k"), empty = Str("empty"), none = Str("none"), a = Str("a");
    Ref values = Array({a.get()});
    Ref noValues = Array({});
    TCFMutableDictionary dictionary;
    dictionary.AddMultiValues(k.get(), values.as<CFArrayRef>());
    dictionary.AddMultiValues(empty.get(), noValues.as<CFArrayRef>());
    dictionary.AddMultiValues(none.get(), nullptr);

    CFArrayRef stored = ArrayFor(dictionary, k);
    EXPECT_NE(stored, values.get());
    dictionary.AddMultiValue(k.get(), a.get()); // the copy is mutable
    EXPECT_EQ(Texts(stored), (std::vector<std::string>{"a", "a"}));
    EXPECT_EQ(CFArrayGetCount(values.as<CFArrayRef>()), 1);
    ASSERT_NE(ArrayFor(dictionary, empty), nullptr);
    EXPECT_EQ(CFArrayGetCount(ArrayFor(dictionary, empty)), 0);
    ASSERT_NE(ArrayFor(dictionary, none), nullptr);
    EXPECT_EQ(CFArrayGetCount(ArrayFor(dictionary, none)), 0);
}

TEST(MultiValueDictionary, PresentKeyAppendsAllValuesInOrderInPlace) {
    Ref k = Str("k"), a = Str("a"), b = Str("b"), c = Str("c");
    Ref more = Array({b.get(), c.get(), a.get()});
    TCFMutableDictionary dictionary;
    dictionary.AddMultiValue(k.get(), a.get());
    CFArrayRef values = ArrayFor(dictionary, k);
    dictionary.AddMultiValues(k.get(), more.as<CFArrayRef>());
    dictionary.AddMultiValues(k.get(), nullptr);
    EXPECT_EQ(ArrayFor(dictionary, k), values);
    EXPECT_EQ(CFGetRetainCount(values), 1);
    EXPECT_EQ(Texts(values), (std::vector<std::string>{"a", "b", "c", "a"}));
    dictionary.AddMultiValues(k.get(), values); // its own array: appended once, from a copy
    EXPECT_EQ(Texts(values), (std::vector<std::string>{"a", "b", "c", "a", "a", "b", "c", "a"}));
}

TEST(MultiValueDictionary, MergesEveryKeyOfAnotherMultiValueDictionary) {
    Ref k = Str("k"), m = Str("m"), a = Str("a"), b = Str("b"), c = Str("c");
    TCFMutableDictionary dictionary, other;
    dictionary.AddMultiValue(k.get(), a.get());
    other.AddMultiValue(k.get(), b.get());
    other.AddMultiValue(m.get(), c.get());
    dictionary.AddMultiValues(other);
    EXPECT_EQ(Texts(ArrayFor(dictionary, k)), (std::vector<std::string>{"a", "b"}));
    EXPECT_EQ(Texts(ArrayFor(dictionary, m)), (std::vector<std::string>{"c"}));
    EXPECT_NE(ArrayFor(dictionary, m), ArrayFor(other, m)); // copied, not shared
    dictionary.AddMultiValues(dictionary);
    EXPECT_EQ(Texts(ArrayFor(dictionary, k)), (std::vector<std::string>{"a", "b", "a", "b"}));
}

TEST(MultiValueDictionary, APresentValueThatIsNotAnArrayIsKeptInFront) {
    Ref k = Str("k"), j = Str("j"), single = Str("single"), a = Str("a"), b = Str("b");
    Ref more = Array({b.get()});
    TCFMutableDictionary dictionary;
    dictionary.SetPair(k.get(), single.get());
    dictionary.SetPair(j.get(), single.get());
    dictionary.AddMultiValue(k.get(), a.get());
    dictionary.AddMultiValues(j.get(), more.as<CFArrayRef>());
    EXPECT_EQ(Texts(ArrayFor(dictionary, k)), (std::vector<std::string>{"single", "a"}));
    EXPECT_EQ(Texts(ArrayFor(dictionary, j)), (std::vector<std::string>{"single", "b"}));
}

// ---------------------------------------------------------------------------------------------
// Set algebra

TEST(SetAlgebra, AddValuesAddsEachDistinctElementAndNullAddsNothing) {
    Ref a = Str("a"), b = Str("b"), aAgain = Str("a");
    Ref values = Array({a.get(), b.get(), aAgain.get()});
    TCFMutableSet set;
    set.AddValues(values.as<CFArrayRef>());
    set.AddValues(nullptr);
    EXPECT_EQ(set.GetCount(), 2);
    EXPECT_TRUE(set.ContainsValue(b.get()));
    EXPECT_EQ(CFGetRetainCount(aAgain.get()), 2); // held by the array only: the first a won
}

TEST(SetAlgebra, UnionAddsTheMembersOfTheOtherSet) {
    Ref a = Str("a"), b = Str("b"), c = Str("c");
    Ref other = Set({b.get(), c.get()});
    TCFMutableSet set;
    set.AddValue(a.get());
    set.AddValue(b.get());
    set.Union(other.as<CFSetRef>());
    EXPECT_EQ(set.GetCount(), 3);
    EXPECT_TRUE(set.ContainsValue(c.get()));
}

TEST(SetAlgebra, UnionWithNullOrItselfChangesNothing) {
    Ref a = Str("a");
    TCFMutableSet set;
    set.AddValue(a.get());
    set.Union(nullptr);
    set.Union(set);
    EXPECT_EQ(set.GetCount(), 1);
}

TEST(SetAlgebra, MinusSetRemovesTheMembersOfTheOtherSet) {
    Ref a = Str("a"), b = Str("b"), c = Str("c");
    Ref other = Set({b.get(), c.get()});
    TCFMutableSet set;
    set.AddValue(a.get());
    set.AddValue(b.get());
    set.MinusSet(other.as<CFSetRef>());
    set.MinusSet(nullptr);
    EXPECT_EQ(set.GetCount(), 1);
    EXPECT_TRUE(set.ContainsValue(a.get()));
    EXPECT_EQ(CFGetRetainCount(b.get()), 2); // released by this set, still in the other
    set.MinusSet(set);
    EXPECT_EQ(set.GetCount(), 0);
}

TEST(SetAlgebra, IntersectKeepsOnlyCommonMembers) {
    Ref a = Str("a"), b = Str("b"), c = Str("c"), z = Str("z");
    Ref disjoint = Set({z.get()});
    Ref superset = Set({a.get(), b.get(), c.get(), z.get()});
    Ref some = Set({b.get(), z.get()});
    TCFMutableSet set;
    set.AddValue(a.get());
    set.AddValue(b.get());
    set.AddValue(c.get());
    set.Intersect(superset.as<CFSetRef>());
    EXPECT_EQ(set.GetCount(), 3);
    set.Intersect(set);
    EXPECT_EQ(set.GetCount(), 3);
    set.Intersect(some.as<CFSetRef>());
    EXPECT_EQ(set.GetCount(), 1);
    EXPECT_TRUE(set.ContainsValue(b.get()));
    EXPECT_EQ(CFGetRetainCount(a.get()), 2); // released by this set, still in the superset
    set.Intersect(disjoint.as<CFSetRef>());
    EXPECT_EQ(set.GetCount(), 0);
}

TEST(SetAlgebra, IntersectSnapshotsMoreMembersThanFitInline) {
    TCFMutableSet set, evens;
    for (long i = 0; i < 100; ++i) {
        Ref number = Long(i);
        set.AddValue(number.get());
        if (i % 2 == 0)
            evens.AddValue(number.get());
    }
    set.Intersect(evens);
    EXPECT_EQ(set.GetCount(), 50);
    EXPECT_TRUE(CFEqual(set, evens));
    set.Intersect(nullptr); // reads as the empty set
    EXPECT_EQ(set.GetCount(), 0);
}

// ---------------------------------------------------------------------------------------------
// Sorted arrays and merging

TEST(SortedArray, InsertUniqueIntoEmptyArrayThenRejectsAnEqualValue) {
    TCFSortedArray sorted(CompareNumbers, nullptr);
    Ref five = Long(5), alsoFive = Num(kCFNumberDoubleType, 5.0);
    EXPECT_TRUE(sorted.InsertUnique(five.get()));
    EXPECT_EQ(sorted.At(0), five.get());
    EXPECT_FALSE(sorted.InsertUnique(alsoFive.get()));
    EXPECT_EQ(sorted.GetCount(), 1);
    EXPECT_EQ(CFGetRetainCount(alsoFive.get()), 1);
}

TEST(SortedArray, InsertUniqueKeepsAscendingOrderAtBothEnds) {
    TCFSortedArray sorted(CompareNumbers, nullptr);
    for (long value : {5, 1, 9, 3, 7, 3, 0, 10, 9}) {
        Ref number = Long(value);
        sorted.InsertUnique(number.get());
    }
    EXPECT_EQ(Longs(sorted), (std::vector<long>{0, 1, 3, 5, 7, 9, 10}));
}

TEST(SortedArray, InsertUniqueSearchesWithLogarithmicComparisons) {
    int calls = 0;
    TCFSortedArray sorted(CompareNumbers, &calls);
    for (long value = 0; value < 1024; value += 2) {
        Ref number = Long(value);
        sorted.InsertUnique(number.get());
    }
    calls = 0;
    Ref odd = Long(501);
    EXPECT_TRUE(sorted.InsertUnique(odd.get()));
    EXPECT_EQ(sorted.At(251), odd.get());
    EXPECT_LE(calls, 2 * 11); // two binary searches over 512 elements at most
}

TEST(SortedArrayMerge, TakesTheFirstInputOnTiesAndKeepsDuplicates) {
    Ref firstOne = Num(kCFNumberCharType, SInt8(1)), three = Long(3);
    Ref secondOne = Long(1), two = Long(2);
    Ref first = Array({firstOne.get(), three.get()});
    Ref second = Array({secondOne.get(), two.get()});
    TCFSortedArray sorted(CompareNumbers, nullptr);
    Merge(first.as<CFArrayRef>(), second.as<CFArrayRef>(), sorted);
    ASSERT_EQ(Longs(sorted), (std::vector<long>{1, 1, 2, 3}));
    EXPECT_EQ(sorted.At(0), firstOne.get());
    EXPECT_EQ(sorted.At(1), secondOne.get());
}

TEST(SortedArrayMerge, AppendsBehindThePreviousContentsWithoutMergingThem) {
    Ref nine = Long(9), one = Long(1), four = Long(4), two = Long(2);
    Ref first = Array({one.get(), four.get()});
    Ref second = Array({two.get()});
    Ref empty = Array({});
    TCFSortedArray sorted(CompareNumbers, nullptr);
    sorted.InsertUnique(nine.get());
    Merge(first.as<CFArrayRef>(), second.as<CFArrayRef>(), sorted);
    Merge(empty.as<CFArrayRef>(), second.as<CFArrayRef>(), sorted);
    Merge(first.as<CFArrayRef>(), empty.as<CFArrayRef>(), sorted);
    Merge(nullptr, second.as<CFArrayRef>(), sorted);
    EXPECT_EQ(Longs(sorted), (std::vector<long>{9, 1, 2, 4, 2, 1, 4, 2}));
}

TEST(SortedArrayMerge, ItsOwnArrayAsAnInputIsReadUpToItsCountOnEntry) {
    Ref one = Long(1), three = Long(3), two = Long(2);
    Ref other = Array({two.get()});
    TCFSortedArray sorted(CompareNumbers, nullptr);
    sorted.InsertUnique(one.get());
    sorted.InsertUnique(three.get());
    Merge(sorted, other.as<CFArrayRef>(), sorted);
    EXPECT_EQ(Longs(sorted), (std::vector<long>{1, 3, 1, 2, 3}));
}

// ---------------------------------------------------------------------------------------------
// Standard algorithms over array values

static_assert(std::random_access_iterator<CFArray_iterator<CFStringRef>>);
static_assert(std::ranges::random_access_range<CFArray_sequence<CFStringRef>>);
static_assert(std::ranges::sized_range<CFArray_sequence<CFStringRef>>);
static_assert(std::same_as<std::iterator_traits<CFArray_iterator<CFStringRef>>::iterator_category,
                           std::random_access_iterator_tag>);
static_assert(std::output_iterator<CFMutableArray_back_insert_iterator<CFStringRef>, CFStringRef>);

TEST(ArrayIterators, ArithmeticAndComparisonFollowTheIndex) {
    Ref zero = Long(0), one = Long(1), two = Long(2), three = Long(3);
    Ref array = Array({zero.get(), one.get(), two.get(), three.get()});
    CFArray_sequence<CFNumberRef> numbers(array.as<CFArrayRef>());
    auto begin = numbers.begin(), end = numbers.end();
    EXPECT_EQ(end - begin, 4);
    EXPECT_EQ(*(begin + 2), two.get());
    EXPECT_EQ(*(2 + begin), two.get());
    EXPECT_EQ(begin[3], three.get());
    EXPECT_EQ(*std::prev(end), three.get());
    EXPECT_EQ(*(end - 4), zero.get());
    EXPECT_TRUE(begin < end && end > begin && begin <= begin && begin != end);
    auto it = begin;
    EXPECT_EQ(*it++, zero.get());
    EXPECT_EQ(*it, one.get());
    EXPECT_EQ(*--it, zero.get());
    EXPECT_EQ(CFArray_sequence<CFNumberRef>(nullptr).size(), 0);
}

TEST(ArrayIterators, SequenceKeepsTheCountTakenAtConstruction) {
    Ref a = Str("a"), b = Str("b");
    TCFMutableArray array(0);
    array.Append(a.get());
    CFArray_sequence<CFStringRef> strings(array);
    array.Append(b.get());
    EXPECT_EQ(strings.end() - strings.begin(), 1);
    EXPECT_EQ(std::ranges::distance(strings), 1);
}

TEST(ArrayIterators, StandardAlgorithmsReadArraysAndAppendThroughTheBackInserter) {
    std::vector<Ref> numbers;
    std::vector<const void*> values;
    for (long value : {1, 3, 3, 5, 8, 13}) {
        numbers.push_back(Long(value));
        values.push_back(numbers.back().get());
    }
    Ref array(
        CFArrayCreate(nullptr, values.data(), CFIndex(values.size()), &kCFTypeArrayCallBacks));
    CFArray_sequence<CFNumberRef> sequence(array.as<CFArrayRef>());
    TCFComparatorFunctor<kCFCompareLessThan> less(CompareNumbers, nullptr);

    Ref three = Long(3), four = Long(4);
    auto [first, last] = std::equal_range(sequence.begin(), sequence.end(), three.get(), less);
    EXPECT_EQ(first.GetIndex(), 1);
    EXPECT_EQ(last.GetIndex(), 3);
    EXPECT_EQ(std::lower_bound(sequence.begin(), sequence.end(), four.get(), less).GetIndex(), 3);
    EXPECT_FALSE(std::binary_search(sequence.begin(), sequence.end(), four.get(), less));
    EXPECT_EQ(std::ranges::count_if(sequence, [](CFNumberRef n) { return LongOf(n) % 2 == 1; }), 5);

    TCFMutableArray reversed(0);
    std::reverse_copy(sequence.begin(), sequence.end(),
                      CFMutableArray_back_inserter<CFNumberRef>(reversed.GetMutable()));
    EXPECT_EQ(Longs(reversed), (std::vector<long>{13, 8, 5, 3, 3, 1}));
    EXPECT_EQ(CFGetRetainCount(values[0]), 3); // the test, the array and the reversed copy
}

TEST(ArrayIterators, ComparatorFunctorYieldsTrueOnlyForItsResult) {
    Ref one = Long(1), two = Long(2);
    TCFComparatorFunctor<-1> less(CompareNumbers, nullptr);
    TCFComparatorFunctor<1> greater(CompareNumbers, nullptr);
    TCFComparatorFunctor<0> equal(CompareNumbers, nullptr);
    EXPECT_TRUE(less(one.get(), two.get()));
    EXPECT_FALSE(less(two.get(), one.get()));
    EXPECT_FALSE(less(one.get(), one.get()));
    EXPECT_TRUE(greater(two.get(), one.get()));
    EXPECT_TRUE(equal(one.get(), one.get()));
}
