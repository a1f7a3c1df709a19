// Collection operations of the utility library: dictionary subsets and key filters, multi-value
// dictionaries, set algebra, sorted arrays, and the standard algorithms over array iterators.
#include <algorithm>
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

using namespace glyphwell::testing;
using Strings = std::vector<std::string>;

namespace {

Ref Long(long value) {
    return Num(kCFNumberLongType, value);
}

long LongOf(CFTypeRef number) {
    long value = 0;
    CFNumberGetValue(static_cast<CFNumberRef>(number), kCFNumberLongType, &value);
    return value;
}

std::vector<long> Longs(CFArrayRef array) {
    std::vector<long> values;
    for (CFIndex i = 0; i < CFArrayGetCount(array); ++i)
        values.push_back(LongOf(CFArrayGetValueAtIndex(array, i)));
    return values;
}

CFComparisonResult CompareNumbers(const void* a, const void* b, void*) {
    return CFNumberCompare(static_cast<CFNumberRef>(a), static_cast<CFNumberRef>(b), nullptr);
}

/// `count` pairs "key<i>" -> i: more than a snapshot holds inline when count > 30.
Ref NumberedDictionary(int count) {
    TCFMutableDictionary dictionary;
    for (int i = 0; i < count; ++i)
        dictionary.SetPair(Str("key" + std::to_string(i)).get(), Long(i).get());
    return Ref(dictionary.Orphan());
}

} // namespace

TEST(DictionarySubset, EveryPairOfTheOtherMustBePresentWithAnEqualValue) {
    Ref a = Str("a"), b = Str("b"), c = Str("c"), one = Long(1), two = Long(2);
    Ref oneAsDouble = Num(kCFNumberDoubleType, 1.0);
    Ref dictionary = Dict({{a.get(), one.get()}, {b.get(), two.get()}});
    TCFDict view(dictionary.as<CFDictionaryRef>());
    EXPECT_TRUE(view.ContainsSubset(dictionary.as<CFDictionaryRef>()));
    EXPECT_TRUE(view.ContainsSubset(Dict({}).as<CFDictionaryRef>()));
    EXPECT_TRUE(view.ContainsSubset(Dict({{a.get(), oneAsDouble.get()}}).as<CFDictionaryRef>()));
    EXPECT_FALSE(view.ContainsSubset(Dict({{c.get(), two.get()}}).as<CFDictionaryRef>()));
    EXPECT_FALSE(view.ContainsSubset(Dict({{b.get(), one.get()}}).as<CFDictionaryRef>()));
    EXPECT_FALSE(TCFDict(nullptr).ContainsSubset(Dict({}).as<CFDictionaryRef>()));

    Ref big = NumberedDictionary(45), smaller = NumberedDictionary(40);
    EXPECT_TRUE(TCFDict(big.as<CFDictionaryRef>()).ContainsSubset(smaller.as<CFDictionaryRef>()));
    EXPECT_FALSE(TCFDict(smaller.as<CFDictionaryRef>()).ContainsSubset(big.as<CFDictionaryRef>()));
}

TEST(DictionaryFilter, KeepsOnlyPairsWithWantedKeysInANewDictionary) {
    Ref a = Str("a"), b = Str("b"), c = Str("c"), z = Str("z"), one = Long(1), three = Long(3);
    Ref dictionary = Dict({{a.get(), one.get()}, {b.get(), Long(2).get()}, {c.get(), three.get()}});
    TCFDict view(dictionary.as<CFDictionaryRef>());
    // A null or empty key set returns the same dictionary with one more count.
    Ref noKeys = Set({});
    for (CFSetRef keys : {CFSetRef(nullptr), noKeys.as<CFSetRef>()}) {
        TCFDictionary same(view.CreateDictionaryFilteredByKey(keys), kAdopted);
        EXPECT_EQ(same.Get(), dictionary.get());
        EXPECT_EQ(CFGetRetainCount(same), 2);
    }
    TCFDictionary filtered(
        view.CreateDictionaryFilteredByKey(Set({a.get(), c.get(), z.get()}).as<CFSetRef>()),
        kAdopted);
    EXPECT_EQ(CFGetRetainCount(filtered), 1);
    EXPECT_TRUE(CFEqual(filtered, Dict({{a.get(), one.get()}, {c.get(), three.get()}}).get()));

    Ref onlyZ = Set({z.get()});
    for (CFDictionaryRef source : {dictionary.as<CFDictionaryRef>(), CFDictionaryRef(nullptr)}) {
        TCFDictionary none(TCFDict(source).CreateDictionaryFilteredByKey(onlyZ.as<CFSetRef>()),
                           kAdopted);
        ASSERT_NE(none.Get(), nullptr);
        EXPECT_EQ(none.GetCount(), 0);
    }
}

TEST(DictionarySetPairs, AddsAndReplacesEveryPairOfTheOther) {
    Ref a = Str("key0"), stale = Long(-100);
    TCFMutableDictionary dictionary;
    dictionary.SetPair(a.get(), stale.get());
    Ref source = NumberedDictionary(50);
    dictionary.SetPairs(source.as<CFDictionaryRef>());
    dictionary.SetPairs(nullptr);
    dictionary.SetPairs(dictionary);
    EXPECT_TRUE(CFEqual(dictionary, source.get()));
    EXPECT_EQ(CFGetRetainCount(stale.get()), 1); // the replaced value was released
}

TEST(MultiValueDictionary, FirstValueMakesAnArrayAndLaterOnesAppendInPlace) {
    Ref k = Str("k"), a = Str("a"), b = Str("b");
    TCFMutableDictionary dictionary;
    dictionary.AddMultiValue(k.get(), a.get());
    CFTypeRef values = dictionary.GetValue(k.get());
    ASSERT_NE(values, nullptr);
    EXPECT_EQ(CFGetRetainCount(values), 1); // the dictionary holds its only count
    dictionary.AddMultiValue(k.get(), a.get());
    dictionary.AddMultiValues(k.get(), Array({b.get(), a.get()}).as<CFArrayRef>());
    dictionary.AddMultiValues(k.get(), nullptr);
    EXPECT_EQ(dictionary.GetValue(k.get()), values);
    EXPECT_EQ(Texts(values), (Strings{"a", "a", "b", "a"}));
    dictionary.AddMultiValues(k.get(), static_cast<CFArrayRef>(values)); // its own array
    EXPECT_EQ(Texts(values), (Strings{"a", "a", "b", "a", "a", "a", "b", "a"}));
}

TEST(MultiValueDictionary, AbsentKeyStoresAMutableCopyAndAPresentNonArrayValueStaysInFront) {
    Ref k = Str("k"), empty = Str("empty"), none = Str("none"), a = Str("a");
    Ref j = Str("j"), m = Str("m"), single = Str("single");
    Ref values = Array({a.get()});
    TCFMutableDictionary dictionary;
    dictionary.AddMultiValues(k.get(), values.as<CFArrayRef>());
    dictionary.AddMultiValues(empty.get(), Array({}).as<CFArrayRef>());
    dictionary.AddMultiValues(none.get(), nullptr);
    EXPECT_NE(dictionary.GetValue(k.get()), values.get());
    dictionary.AddMultiValue(k.get(), a.get());
    EXPECT_EQ(CFArrayGetCount(values.as<CFArrayRef>()), 1);

    dictionary.SetPair(j.get(), single.get());
    dictionary.SetPair(m.get(), single.get());
    dictionary.AddMultiValue(j.get(), a.get());
    dictionary.AddMultiValues(m.get(), Array({a.get()}).as<CFArrayRef>());
    std::vector<Strings> texts;
    for (const Ref* key : {&k, &empty, &none, &j, &m})
        texts.push_back(Texts(dictionary.GetValue(key->get())));
    EXPECT_EQ(texts, (std::vector<Strings>{{"a", "a"}, {}, {}, {"single", "a"}, {"single", "a"}}));
}

TEST(MultiValueDictionary, MergesEveryKeyOfAnotherMultiValueDictionary) {
    Ref k = Str("k"), m = Str("m"), a = Str("a"), b = Str("b"), c = Str("c");
    TCFMutableDictionary dictionary, other;
    dictionary.AddMultiValue(k.get(), a.get());
    other.AddMultiValue(k.get(), b.get());
    other.AddMultiValue(m.get(), c.get());
    dictionary.AddMultiValues(other);
    EXPECT_NE(dictionary.GetValue(m.get()), other.GetValue(m.get())); // copied, not shared
    dictionary.AddMultiValues(dictionary);
    EXPECT_EQ(
        (std::vector{Texts(dictionary.GetValue(k.get())), Texts(dictionary.GetValue(m.get()))}),
        (std::vector<Strings>{{"a", "b", "a", "b"}, {"c", "c"}}));
}

TEST(SetAlgebra, AddValuesAndUnionAddOnlyAbsentMembersAndMinusSetRemoves) {
    Ref a = Str("a"), b = Str("b"), c = Str("c"), aAgain = Str("a");
    TCFMutableSet set;
    set.AddValues(Array({a.get(), b.get(), aAgain.get()}).as<CFArrayRef>());
    set.AddValues(nullptr);
    EXPECT_EQ(set.GetCount(), 2);
    // The set retains its members, and the first a stayed.
    EXPECT_EQ((std::pair{CFGetRetainCount(a.get()), CFGetRetainCount(aAgain.get())}),
              std::pair(2L, 1L));
    set.Union(Set({b.get(), c.get()}).as<CFSetRef>());
    set.Union(nullptr);
    set.Union(set);
    EXPECT_EQ(set.GetCount(), 3);
    EXPECT_TRUE(set.ContainsValue(c.get()));

    set.MinusSet(Set({b.get(), c.get()}).as<CFSetRef>());
    set.MinusSet(nullptr);
    EXPECT_EQ(set.GetCount(), 1);
    EXPECT_TRUE(set.ContainsValue(a.get()));
    EXPECT_EQ(CFGetRetainCount(b.get()), 1);
    set.MinusSet(set);
    EXPECT_EQ(set.GetCount(), 0);
}

TEST(SetAlgebra, IntersectKeepsOnlyMembersTheOtherContains) {
    TCFMutableSet set, evens;
    for (long i = 0; i < 100; ++i) {
        set.AddValue(Long(i).get());
        if (i % 2 == 0)
            evens.AddValue(Long(i).get());
    }
    set.Intersect(set);
    EXPECT_EQ(set.GetCount(), 100);
    set.Intersect(evens);
    EXPECT_TRUE(CFEqual(set, evens));
    Ref superset = Set({Long(0).get(), Long(2).get(), Long(4).get()});
    TCFMutableSet small;
    small.AddValue(Long(2).get());
    small.Intersect(superset.as<CFSetRef>());
    EXPECT_EQ(small.GetCount(), 1);
    small.Intersect(Set({Long(3).get()}).as<CFSetRef>());
    EXPECT_EQ(small.GetCount(), 0);
    set.Intersect(nullptr); // reads as the empty set
    EXPECT_EQ(set.GetCount(), 0);
}

TEST(SortedArray, InsertUniqueKeepsAscendingOrderAndRejectsEqualValues) {
    TCFSortedArray sorted(CompareNumbers, nullptr);
    Ref five = Long(5), alsoFive = Num(kCFNumberDoubleType, 5.0);
    EXPECT_TRUE(sorted.InsertUnique(five.get()));
    EXPECT_FALSE(sorted.InsertUnique(alsoFive.get()));
    EXPECT_EQ(CFGetRetainCount(alsoFive.get()), 1);
    for (long value : {1, 9, 3, 7, 3, 0, 10, 9})
        sorted.InsertUnique(Long(value).get());
    EXPECT_EQ(Longs(sorted), (std::vector<long>{0, 1, 3, 5, 7, 9, 10}));
    EXPECT_EQ(sorted.At(3), five.get());
}

TEST(SortedArrayMerge, TakesTheFirstInputOnTiesKeepsDuplicatesAndAppends) {
    Ref firstOne = Num(kCFNumberCharType, SInt8(1)), secondOne = Long(1);
    TCFSortedArray sorted(CompareNumbers, nullptr);
    Merge(Array({firstOne.get(), Long(3).get()}).as<CFArrayRef>(),
          Array({secondOne.get(), Long(2).get()}).as<CFArrayRef>(), sorted);
    ASSERT_EQ(Longs(sorted), (std::vector<long>{1, 1, 2, 3}));
    EXPECT_TRUE(sorted.At(0) == firstOne.get() && sorted.At(1) == secondOne.get());

    // New elements go behind the ones held before, which are not merged with them.
    Ref second = Array({Long(2).get()});
    Merge(nullptr, second.as<CFArrayRef>(), sorted);
    EXPECT_EQ(Longs(sorted), (std::vector<long>{1, 1, 2, 3, 2}));
    Merge(sorted, second.as<CFArrayRef>(), sorted); // read up to its count on entry
    EXPECT_EQ(Longs(sorted), (std::vector<long>{1, 1, 2, 3, 2, 1, 1, 2, 2, 3, 2}));
}

static_assert(std::random_access_iterator<CFArray_iterator<CFStringRef>>);
static_assert(std::ranges::random_access_range<CFArray_sequence<CFStringRef>>);
static_assert(std::same_as<std::iterator_traits<CFArray_iterator<CFStringRef>>::iterator_category,
                           std::random_access_iterator_tag>);
static_assert(std::output_iterator<CFMutableArray_back_insert_iterator<CFStringRef>, CFStringRef>);

TEST(ArrayIterators, MoveByIndexOverTheCountTakenAtConstructionAndServeTheAlgorithms) {
    Ref three = Long(103); // above the small numbers shared by the platform, so counted
    TCFMutableArray array(0);
    for (long value : {101, 103, 103, 105, 108})
        array.Append(Long(value).get());
    CFArray_sequence<CFNumberRef> sequence(array);
    array.Append(Long(113).get());
    auto begin = sequence.begin(), end = sequence.end();
    EXPECT_EQ(end - begin, 5);
    EXPECT_EQ(LongOf(*(2 + begin)), 103);
    EXPECT_EQ(LongOf(begin[3]), 105);
    EXPECT_EQ(LongOf(*--end), 108);
    EXPECT_TRUE(begin < end && begin != end && begin + 4 == end);
    EXPECT_EQ(CFArray_sequence<CFNumberRef>(nullptr).size(), 0);

    TCFComparatorFunctor<kCFCompareLessThan> less(CompareNumbers, nullptr);
    auto [first, last] = std::equal_range(sequence.begin(), sequence.end(), three.get(), less);
    EXPECT_EQ(first.GetIndex(), 1);
    EXPECT_EQ(last.GetIndex(), 3);
    TCFMutableArray reversed(0);
    std::reverse_copy(sequence.begin(), sequence.end(),
                      CFMutableArray_back_inserter<CFNumberRef>(reversed.GetMutable()));
    EXPECT_EQ(Longs(reversed), (std::vector<long>{108, 105, 103, 103, 101}));
    EXPECT_EQ(CFGetRetainCount(TCFDeque<CFTypeRef>(array).At(0)), 2); // both arrays
}
