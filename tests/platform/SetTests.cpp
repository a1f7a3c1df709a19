#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "platform/PropertyValues.h"
#include "support/LogCapture.h"
#include "tests/platform/ContainerTestSupport.h"
#include "tests/support/Values.h"

using namespace glyphwell::testing;

namespace {

Owned<CFSetRef> makeSet(std::vector<const void*> values,
                        const CFSetCallBacks* callBacks = &kCFTypeSetCallBacks) {
    return Own(CFSetCreate(nullptr, values.data(), CFIndex(values.size()), callBacks));
}

std::vector<const void*> membersOf(CFSetRef set) {
    std::vector<const void*> members(size_t(CFSetGetCount(set)));
    CFSetGetValues(set, members.data());
    return members;
}

} // namespace

TEST(CFSet, CreateKeepsFirstOfEqualValues) {
    auto five = Num(kCFNumberIntType, 105), wideFive = Num(kCFNumberSInt64Type, int64_t(105));
    auto realFive = Num(kCFNumberFloat32Type, 105.0f), six = Num(kCFNumberIntType, 106);
    auto set = makeSet({five.get(), wideFive.get(), six.get(), realFive.get()});
    EXPECT_EQ(CFSetGetCount(set.get()), 2);
    EXPECT_EQ(CFSetGetValue(set.get(), realFive.get()), five.get());
    EXPECT_EQ(CFSetGetCountOfValue(set.get(), wideFive.get()), 1);
    EXPECT_EQ(RetainCounts({five.get(), wideFive.get(), realFive.get()}), (Counts{2, 1, 1}));
    set.reset();
    EXPECT_EQ(RetainCounts({five.get(), six.get()}), (Counts{1, 1}));
}

// Order after removal and releases are the hashed table's, tested with dictionaries; a set adds
// its own modes of storing a member equal to one it holds.
TEST(CFSet, AddSetAndReplaceTreatEqualMembersDifferently) {
    auto one = Num(kCFNumberIntType, 101), otherOne = Num(kCFNumberSInt8Type, int8_t(101));
    auto two = Num(kCFNumberIntType, 102), three = Num(kCFNumberIntType, 103);
    auto set = Own(CFSetCreateMutable(nullptr, 0, &kCFTypeSetCallBacks));
    CFSetAddValue(set.get(), one.get());
    CFSetAddValue(set.get(), two.get());
    CFSetAddValue(set.get(), otherOne.get()); // present: left alone
    EXPECT_EQ(CFSetGetValue(set.get(), otherOne.get()), one.get());
    EXPECT_EQ(CFGetRetainCount(otherOne.get()), 1);

    CFSetSetValue(set.get(), otherOne.get()); // replaces in place
    EXPECT_EQ(membersOf(set.get()), (std::vector<const void*>{otherOne.get(), two.get()}));
    EXPECT_EQ(RetainCounts({one.get(), otherOne.get()}), (Counts{1, 2}));

    CFSetReplaceValue(set.get(), three.get()); // absent: nothing
    CFSetReplaceValue(set.get(), one.get());
    CFSetSetValue(set.get(), three.get()); // absent: added
    for (int i = 0; i < 2; ++i)            // by an equal member; then absent
        CFSetRemoveValue(set.get(), Num(kCFNumberSInt64Type, int64_t(102)).get());
    CFSetAddValue(set.get(), two.get());
    std::vector<const void*> visited;
    CFSetApplyFunction(
        set.get(),
        [](const void* value, void* context) {
            static_cast<std::vector<const void*>*>(context)->push_back(value);
        },
        &visited);
    EXPECT_EQ(visited, (std::vector<const void*>{one.get(), three.get(), two.get()}));
    EXPECT_EQ(membersOf(set.get()), visited);
    EXPECT_EQ(CFGetRetainCount(otherOne.get()), 1);
    CFSetRemoveAllValues(set.get());
    EXPECT_EQ(CFSetGetCount(set.get()), 0);
    EXPECT_EQ(RetainCounts({one.get(), two.get(), three.get()}), (Counts{1, 1, 1}));
}

TEST(CFSet, NullCallbacksUsePointerIdentity) {
    auto five = Num(kCFNumberIntType, 105), otherFive = Num(kCFNumberIntType, 105);
    auto set = makeSet({five.get(), otherFive.get(), nullptr, five.get()}, nullptr);
    EXPECT_EQ(CFSetGetCount(set.get()), 3);
    EXPECT_TRUE(CFSetContainsValue(set.get(), nullptr));
    EXPECT_EQ(CFGetRetainCount(five.get()), 1);
    auto copy = Own(CFSetCreateMutableCopy(nullptr, 0, set.get()));
    CFSetRemoveValue(copy.get(), five.get());
    EXPECT_EQ(membersOf(copy.get()), (std::vector<const void*>{otherFive.get(), nullptr}));
    EXPECT_EQ(CFGetRetainCount(five.get()), 1);
}
