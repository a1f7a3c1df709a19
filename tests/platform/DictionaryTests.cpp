#include <string>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

#include "platform/PropertyValues.h"
#include "support/LogCapture.h"
#include "tests/platform/ContainerTestSupport.h"
#include "tests/support/Values.h"

using namespace glyphwell::testing;

namespace {

using Pairs = std::vector<std::pair<const void*, const void*>>;

Owned<CFMutableDictionaryRef> makeMutable() {
    return Own(CFDictionaryCreateMutable(nullptr, 0, &kCFTypeDictionaryKeyCallBacks,
                                         &kCFTypeDictionaryValueCallBacks));
}

Pairs pairsOf(CFDictionaryRef dictionary) {
    size_t count = size_t(CFDictionaryGetCount(dictionary));
    std::vector<const void*> keys(count), values(count);
    CFDictionaryGetKeysAndValues(dictionary, keys.data(), values.data());
    Pairs pairs;
    for (size_t i = 0; i < count; ++i)
        pairs.emplace_back(keys[i], values[i]);
    return pairs;
}

} // namespace

TEST(CFDictionary, CreateWithRepeatedKeyKeepsLastValueInFirstPlace) {
    auto a = Str("a"), b = Str("b"), alsoA = Str("a");
    auto v1 = Num(kCFNumberIntType, 101), v2 = Num(kCFNumberIntType, 102),
         v3 = Num(kCFNumberIntType, 103);
    Ref dictionary = Dict({{a.get(), v1.get()}, {b.get(), v2.get()}, {alsoA.get(), v3.get()}});
    EXPECT_EQ(pairsOf(dictionary.as<CFDictionaryRef>()),
              (Pairs{{a.get(), v3.get()}, {b.get(), v2.get()}}));
    EXPECT_EQ(RetainCounts({v1.get(), alsoA.get()}), (Counts{1, 1}));
}

TEST(CFDictionary, ReplacingAndRemovingKeepOrder) {
    auto a = Str("a"), b = Str("b"), c = Str("c"), d = Str("d");
    auto one = Num(kCFNumberIntType, 101), two = Num(kCFNumberIntType, 102);
    auto dictionary = makeMutable();
    for (CFTypeRef key : {a.get(), b.get(), c.get()})
        CFDictionaryAddValue(dictionary.get(), key, one.get());
    CFDictionarySetValue(dictionary.get(), a.get(), two.get());
    CFDictionaryReplaceValue(dictionary.get(), b.get(), two.get());
    CFDictionaryReplaceValue(dictionary.get(), d.get(), two.get()); // absent: nothing
    CFDictionaryAddValue(dictionary.get(), c.get(), two.get());     // present: nothing
    EXPECT_EQ(pairsOf(dictionary.get()),
              (Pairs{{a.get(), two.get()}, {b.get(), two.get()}, {c.get(), one.get()}}));

    CFDictionaryRemoveValue(dictionary.get(), b.get());
    CFDictionarySetValue(dictionary.get(), d.get(), one.get());
    CFDictionarySetValue(dictionary.get(), b.get(), one.get());
    EXPECT_EQ(pairsOf(dictionary.get()), (Pairs{{a.get(), two.get()},
                                                {c.get(), one.get()},
                                                {d.get(), one.get()},
                                                {b.get(), one.get()}}));
    std::vector<const void*> visited;
    CFDictionaryApplyFunction(
        dictionary.get(),
        [](const void* key, const void*, void* context) {
            static_cast<std::vector<const void*>*>(context)->push_back(key);
        },
        &visited);
    EXPECT_EQ(visited, (std::vector<const void*>{a.get(), c.get(), d.get(), b.get()}));
    EXPECT_EQ(CFDictionaryGetCountOfValue(dictionary.get(), one.get()), 3);
    EXPECT_TRUE(CFDictionaryContainsValue(dictionary.get(), two.get()));
    // Replaced and removed pairs gave their counts back; a copy takes its own.
    auto copy = Own(CFDictionaryCreateCopy(nullptr, dictionary.get()));
    CFDictionaryRemoveAllValues(dictionary.get());
    EXPECT_EQ(CFDictionaryGetCount(dictionary.get()), 0);
    EXPECT_EQ(RetainCounts({a.get(), b.get(), one.get(), two.get()}), (Counts{2, 2, 4, 2}));
    copy.reset();
    EXPECT_EQ(RetainCounts({a.get(), one.get()}), (Counts{1, 1}));
}

TEST(CFDictionary, NullCallbacksTakeNullAndLeaveCounts) {
    auto five = Num(kCFNumberIntType, 105), otherFive = Num(kCFNumberIntType, 105);
    const void *created[] = {five.get(), nullptr}, *values[] = {nullptr, Token(7)};
    auto dictionary = Own(CFDictionaryCreate(nullptr, created, values, 2, nullptr, nullptr));
    EXPECT_EQ(CFGetRetainCount(five.get()), 1);
    const void* value = Token(1);
    EXPECT_TRUE(CFDictionaryGetValueIfPresent(dictionary.get(), five.get(), &value));
    EXPECT_EQ(value, nullptr);
    EXPECT_EQ(CFDictionaryGetValue(dictionary.get(), nullptr), Token(7));
    EXPECT_FALSE(CFDictionaryContainsKey(dictionary.get(), otherFive.get()));

    auto copy = Own(CFDictionaryCreateMutableCopy(nullptr, 0, dictionary.get()));
    CFDictionarySetValue(copy.get(), otherFive.get(), otherFive.get());
    EXPECT_EQ(CFDictionaryGetCount(copy.get()), 3);
    EXPECT_EQ(CFGetRetainCount(otherFive.get()), 1);
    std::vector<const void*> keys(3);
    CFDictionaryGetKeysAndValues(copy.get(), keys.data(), nullptr);
    EXPECT_EQ(keys, (std::vector<const void*>{five.get(), nullptr, otherFive.get()}));
}

// A hundred thousand pairs: every key is found, a third removed keeps the others in order, and
// adding them back (in reverse) gives an equal dictionary.
TEST(CFDictionary, LargeDictionaryFindsEveryKey) {
    const int count = 100000;
    std::vector<Ref> owned;
    std::vector<const void*> keys;
    for (int i = 0; i < count; ++i) {
        owned.push_back(Str("key" + std::to_string(i)));
        keys.push_back(owned.back().get());
    }
    auto dictionary = Own(CFDictionaryCreate(nullptr, keys.data(), keys.data(), count,
                                             &kCFTypeDictionaryKeyCallBacks, nullptr));
    EXPECT_EQ(CFDictionaryGetValue(dictionary.get(), Str("key4242").get()), keys[4242]);
    auto edited = Own(CFDictionaryCreateMutableCopy(nullptr, 0, dictionary.get()));
    for (int i = 0; i < count; i += 3)
        CFDictionaryRemoveValue(edited.get(), keys[size_t(i)]);
    Pairs remaining = pairsOf(edited.get());
    ASSERT_EQ(remaining.size(), size_t(count - (count + 2) / 3));
    for (size_t i = 0, k = 1; i < remaining.size(); ++i, k += (k % 3 == 2) ? 2 : 1)
        ASSERT_EQ(remaining[i].first, keys[k]) << i;
    for (int i = 0; i < count; ++i)
        ASSERT_EQ(CFDictionaryGetValue(edited.get(), keys[size_t(i)]),
                  i % 3 ? keys[size_t(i)] : nullptr);
    for (int i = count; i-- > 0;)
        if (i % 3 == 0)
            CFDictionaryAddValue(edited.get(), keys[size_t(i)], keys[size_t(i)]);
    EXPECT_TRUE(CFEqual(dictionary.get(), edited.get()));
    edited.reset();
    dictionary.reset();
    EXPECT_EQ(CFGetRetainCount(keys[0]), 1);
}

TEST(CFDictionary, LookupsHoldWhileGrowingAndShrinkingAcrossEightPairs) {
    // Small dictionaries keep four pairs inline, are searched without an index and get one
    // past eight pairs (removed pairs count until compacted); every lookup must agree with a
    // plain model throughout.
    const int keyCount = 20;
    std::vector<Ref> keys;
    for (int i = 0; i < keyCount; ++i)
        keys.push_back(Num(kCFNumberIntType, 100 + i));
    auto dictionary = makeMutable();
    std::vector<bool> present(keyCount, false);
    uint32_t state = 12345;
    for (int step = 0; step < 3000; ++step) {
        state = state * 1664525u + 1013904223u;
        const int key = int(state >> 16) % keyCount;
        // Add more often while small and remove more often while large, to cross 8 both ways.
        const bool add = int((state >> 8) & 15) >= int(CFDictionaryGetCount(dictionary.get()));
        if (add) {
            CFDictionarySetValue(dictionary.get(), keys[size_t(key)].get(), kCFBooleanTrue);
            present[size_t(key)] = true;
        } else {
            CFDictionaryRemoveValue(dictionary.get(), keys[size_t(key)].get());
            present[size_t(key)] = false;
        }
        CFIndex expected = 0;
        for (int i = 0; i < keyCount; ++i) {
            auto probe = Num(kCFNumberIntType, 100 + i); // an equal key, not the same object
            ASSERT_EQ(CFDictionaryContainsKey(dictionary.get(), probe.get()), present[size_t(i)])
                << "step " << step << ", key " << i;
            expected += present[size_t(i)];
        }
        ASSERT_EQ(CFDictionaryGetCount(dictionary.get()), expected);
    }
    // Emptying gives every key its count back, whether the pairs were inline or on the heap.
    CFDictionaryRemoveAllValues(dictionary.get());
    EXPECT_EQ(CFDictionaryGetCount(dictionary.get()), 0);
    for (const auto& key : keys)
        EXPECT_EQ(CFGetRetainCount(key.get()), 1);
}

// Containers nested a hundred thousand levels deep: a recursive teardown would overrun the stack.
TEST(CFDictionary, DestroysDeepNestingWithoutDeepRecursion) {
    for (const int kinds : {1, 3}) { // arrays only; dictionaries, sets and arrays in turn
        SCOPED_TRACE(kinds);
        Ref inner = Array({});
        for (int level = 0; level < 100000; ++level) {
            const int kind = kinds == 1 ? 2 : level % 3;
            inner = kind == 0   ? Dict({{CFSTR("k"), inner.get()}})
                    : kind == 1 ? Set({inner.get()})
                                : Array({inner.get()});
        }
    }
}
