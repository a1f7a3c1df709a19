// What every kind of value shares: the kind registry, descriptions, equality and hashing.
#include <gtest/gtest.h>

#include <regex>
#include <string>
#include <vector>

#include "platform/CFKind.h"
#include "platform/CFString.h"
#include "platform/Log.h"
#include "platform/PropertyValues.h"
#include "tests/support/LogCapture.h"
#include "tests/support/Values.h"

namespace {

using glyphwell::testing::Array;
using glyphwell::testing::Dict;
using glyphwell::testing::Num;
using glyphwell::testing::Ref;
using glyphwell::testing::Set;
using glyphwell::testing::Str;

/// Counts its own destruction, so a test sees when the value let go of it.
struct CountingPayload : CFKindPayload {
    explicit CountingPayload(int* destroyed) : destroyed(destroyed) {}
    ~CountingPayload() override { ++*destroyed; }
    int* destroyed;
};

std::string DescribeCounting(CFTypeRef, const CFKindPayload& payload) {
    return "counting " + std::to_string(*static_cast<const CountingPayload&>(payload).destroyed);
}

TEST(Kind, RegistryNamesDistinctIdsAndValuesOwnTheirPayloadAndEqualOnlyThemselves) {
    static const CFTypeID kind = CFKindRegister("TestKindValue", nullptr);
    static const CFTypeID described = CFKindRegister("TestKindDescribed", DescribeCounting);
    EXPECT_GE(kind, 256u) << "after the built-in kinds";
    EXPECT_NE(kind, described);
    EXPECT_EQ(glyphwell::Describe(Ref(CFCopyTypeIDDescription(described)).get()),
              "TestKindDescribed");
    EXPECT_EQ(CFCopyTypeIDDescription(described + 1000), nullptr);
    int destroyed = 0;
    CFTypeRef a = CFKindCreateValue(kind, std::make_unique<CountingPayload>(&destroyed));
    CFTypeRef b = CFKindCreateValue(described, std::make_unique<CountingPayload>(&destroyed));
    ASSERT_TRUE(a && b);
    EXPECT_EQ(CFGetTypeID(a), kind);
    EXPECT_EQ(CFKindGetPayload(b, kind), nullptr);
    EXPECT_EQ(CFKindGetPayload(nullptr, kind), nullptr);
    ASSERT_NE(CFKindGetPayload(a, kind), nullptr);
    EXPECT_EQ(static_cast<const CountingPayload*>(CFKindGetPayload(a, kind))->destroyed,
              &destroyed);
    EXPECT_TRUE(CFEqual(a, a));
    EXPECT_FALSE(CFEqual(a, b));
    EXPECT_EQ(glyphwell::Describe(a).rfind("<TestKindValue 0x", 0), 0u) << glyphwell::Describe(a);
    EXPECT_EQ(glyphwell::Describe(b), "counting 0");

    CFRetain(a);
    CFRelease(a);
    EXPECT_EQ(destroyed, 0);
    CFRelease(a);
    CFRelease(b);
    EXPECT_EQ(destroyed, 2);
}

TEST(Kind, SharedValueIgnoresRetainAndRelease) {
    // Held by a static, as shared values are, so the leak checker sees it reachable.
    static CFStringRef text = CFStringCreateWithCString(nullptr, "shared", kCFStringEncodingUTF8);
    CFMakeShared(text);
    CFMakeShared(nullptr);
    CFRelease(text);
    CFRelease(text);
    EXPECT_EQ(glyphwell::Describe(text), "shared");
}

Ref Bytes(const std::string& bytes) {
    return Ref(
        CFDataCreate(nullptr, reinterpret_cast<const UInt8*>(bytes.data()), CFIndex(bytes.size())));
}

Ref Error(CFTypeRef domain, CFIndex code, CFTypeRef info = nullptr) {
    return Ref(CFErrorCreate(nullptr, CFStringRef(domain), code, CFDictionaryRef(info)));
}

TEST(Values, SharedConstantsCarryTheirValueAndAreNeverDestroyed) {
    for (int i = 0; i < 3; ++i) {
        CFRelease(kCFBooleanTrue);
        CFRelease(kCFNull);
    }
    CFRetain(kCFBooleanFalse);
    const CFIndex immortal = 0x7fffffffffffffffL;
    EXPECT_EQ((std::vector<CFIndex>{CFGetRetainCount(kCFBooleanTrue),
                                    CFGetRetainCount(kCFBooleanFalse), CFGetRetainCount(kCFNull)}),
              (std::vector<CFIndex>{immortal, immortal, immortal}));
    EXPECT_EQ((std::vector<CFTypeID>{CFGetTypeID(kCFBooleanTrue), CFGetTypeID(kCFNull)}),
              (std::vector<CFTypeID>{CFBooleanGetTypeID(), CFNullGetTypeID()}));
    EXPECT_NE(CFNullGetTypeID(), CFDateGetTypeID());
    EXPECT_TRUE(CFBooleanGetValue(kCFBooleanTrue));
    EXPECT_FALSE(CFBooleanGetValue(kCFBooleanFalse));
    EXPECT_TRUE(CFEqual(kCFNull, kCFNull));
}

// The address after the kind's name differs from run to run; the rest is exact.
TEST(Values, DescriptionsShowTheKindAndTheValue) {
    const struct {
        Ref value;
        std::string text;
    } cases[] = {
        {Array({Str("alpha").get(), Str("beta").get()}),
         "<CFArray @>{count = 2, values = (\n\t0 : alpha\n\t1 : beta\n)}"},
        {Set({Str("a").get()}), "<CFSet @>{count = 1, values = (\n\ta\n)}"},
        {Dict({{Str("name").get(), Str("value").get()}}),
         "<CFDictionary @>{count = 1, entries = (\n\tname = value\n)}"},
        {Bytes("ab\x01\xff"), "<CFData @>{length = 4, bytes = 0x616201ff}"},
        {Bytes(std::string(70, '\x11')),
         "<CFData @>{length = 70, bytes = 0x" + std::string(128, '1') + "...}"}, // 64 bytes at most
        {Ref(CFDateCreate(nullptr, 86400 + 3661)), "<CFDate @> 2001-01-02 01:01:01 +0000"},
        {Num(kCFNumberSInt32Type, 1), "1"},
        {Num(kCFNumberSInt64Type, int64_t(-42)), "-42"},
        {Num(kCFNumberFloat64Type, 1.5), "1.5"},
        {Num(kCFNumberFloat64Type, 1.0), "1"},
        {Num(kCFNumberFloat32Type, 0.1f), "0.1"},
        {Ref(kCFBooleanTrue), "true"},
        {Ref(kCFBooleanFalse), "false"},
        {Ref(kCFNull), "<null>"},
    };
    const std::regex address("^(<\\w+) 0x[0-9a-f]+>");
    std::vector<std::string> texts, expected;
    for (const auto& row : cases) {
        texts.push_back(std::regex_replace(glyphwell::Describe(row.value.get()), address, "$1 @>",
                                           std::regex_constants::format_first_only));
        expected.push_back(row.text);
    }
    EXPECT_EQ(texts, expected);
}

// Equal values hash alike; the relation holds both ways round.
TEST(Values, EqualityComparesContentsAndHashFollowsIt) {
    enum Relation { Equal, Unequal, HashesDiffer };
    Ref one = Num(kCFNumberIntType, 1), realOne = Num(kCFNumberFloat64Type, 1.0);
    Ref two = Str("two"), alsoTwo = Str("two"), x = Str("x"), y = Str("y"), z = Str("z");
    Ref a = Str("a"), b = Str("b"), domain = Str("Domain");
    Ref empty = Dict({}), reason = Dict({{kCFErrorLocalizedFailureReasonKey, CFSTR("why")}});
    const struct {
        const char* what;
        Ref left, right;
        Relation relation;
    } cases[] = {
        {"arrays, equal elements in order", Array({one.get(), two.get()}),
         Array({realOne.get(), alsoTwo.get()}), Equal},
        {"arrays, other order", Array({one.get(), two.get()}), Array({two.get(), one.get()}),
         Unequal},
        {"arrays, a prefix", Array({one.get(), two.get()}), Array({one.get()}), Unequal},
        {"sets, other order", Set({x.get(), y.get()}), Set({y.get(), x.get()}), Equal},
        {"sets, other member", Set({x.get(), y.get()}), Set({x.get(), z.get()}), Unequal},
        {"sets, a subset", Set({x.get(), y.get()}), Set({x.get(), y.get(), z.get()}), Unequal},
        {"dictionaries, other order", Dict({{a.get(), one.get()}, {b.get(), two.get()}}),
         Dict({{b.get(), two.get()}, {a.get(), one.get()}}), Equal},
        {"dictionaries, values swapped", Dict({{a.get(), one.get()}, {b.get(), two.get()}}),
         Dict({{a.get(), two.get()}, {b.get(), one.get()}}), Unequal},
        {"dictionaries, a subset", Dict({{a.get(), one.get()}, {b.get(), two.get()}}),
         Dict({{a.get(), one.get()}}), Unequal},
        {"data, a mutable copy", Bytes("hello"),
         Ref(CFDataCreateMutableCopy(nullptr, 0, Bytes("hello").as<CFDataRef>())), Equal},
        {"data, one byte differs", Bytes("hello"), Bytes("hellp"), Unequal},
        {"data, shorter", Bytes("hello"), Bytes("hell"), Unequal},
        // Past the hashed prefix the length still tells long data apart.
        {"data, long", Bytes(std::string(100, 'q')), Bytes(std::string(99, 'q')), HashesDiffer},
        {"errors, no user info and an empty one", Error(CFSTR("Domain"), 1),
         Error(domain.get(), 1, empty.get()), Equal},
        {"errors, other code", Error(CFSTR("Domain"), 1), Error(domain.get(), 2), Unequal},
        {"errors, a reason", Error(CFSTR("Domain"), 1), Error(domain.get(), 1, reason.get()),
         Unequal},
        {"errors, the same reason", Error(domain.get(), 1, reason.get()),
         Error(CFSTR("Domain"), 1, reason.get()), Equal},
        {"dates, same time", Ref(CFDateCreate(nullptr, 12.5)), Ref(CFDateCreate(nullptr, 12.5)),
         Equal},
        {"dates, other time", Ref(CFDateCreate(nullptr, 12.5)), Ref(CFDateCreate(nullptr, 13)),
         Unequal},
        {"booleans", Ref(kCFBooleanTrue), Ref(kCFBooleanFalse), HashesDiffer},
        {"a number and a boolean", Num(kCFNumberSInt8Type, int8_t(1)), Ref(kCFBooleanTrue),
         Unequal},
    };
    for (const auto& row : cases) {
        SCOPED_TRACE(row.what);
        ASSERT_TRUE(row.left && row.right);
        EXPECT_EQ(bool(CFEqual(row.left.get(), row.right.get())), row.relation == Equal);
        EXPECT_EQ(bool(CFEqual(row.right.get(), row.left.get())), row.relation == Equal);
        if (row.relation != Unequal) {
            EXPECT_EQ(CFHash(row.left.get()) == CFHash(row.right.get()), row.relation == Equal);
        }
    }
}

} // namespace
