#include <gtest/gtest.h>

#include "platform/CFKind.h"
#include "platform/CFString.h"
#include "platform/Log.h"
#include "tests/support/LogCapture.h"

namespace {

/// Counts its own destruction, so a test sees when the value let go of it.
struct CountingPayload : CFKindPayload {
    explicit CountingPayload(int* destroyed) : destroyed(destroyed) {}
    ~CountingPayload() override { ++*destroyed; }
    int* destroyed;
};

std::string DescribeCounting(CFTypeRef, const CFKindPayload& payload) {
    return "counting " + std::to_string(*static_cast<const CountingPayload&>(payload).destroyed);
}

TEST(Kind, RegistryHandsOutDistinctIdsWithTheirNames) {
    const CFTypeID first = CFKindRegister("TestKindOne", nullptr);
    const CFTypeID second = CFKindRegister("TestKindTwo", DescribeCounting);
    EXPECT_GE(first, 256u);
    EXPECT_NE(first, second);
    EXPECT_NE(first, CFStringGetTypeID());
    CFStringRef name = CFCopyTypeIDDescription(second);
    EXPECT_EQ(glyphwell::Describe(name), "TestKindTwo");
    CFRelease(name);
    EXPECT_EQ(CFCopyTypeIDDescription(second + 1000), nullptr);
}

TEST(Kind, ValueOwnsItsPayloadAndIsEqualOnlyToItself) {
    static const CFTypeID kind = CFKindRegister("TestKindValue", nullptr);
    static const CFTypeID described = CFKindRegister("TestKindDescribed", DescribeCounting);
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

TEST(Kind, BadArgumentsGiveNullWithOneLine) {
    glyphwell::testing::LogCapture log;
    int destroyed = 0;
    EXPECT_EQ(CFKindRegister("", nullptr), 0u);
    EXPECT_EQ(CFKindCreateValue(3, std::make_unique<CountingPayload>(&destroyed)), nullptr);
    EXPECT_EQ(destroyed, 1);
    EXPECT_EQ(CFKindCreateValue(CFKindRegister("TestKindBad", nullptr), nullptr), nullptr);
    EXPECT_EQ(log.Texts().size(), 6u); // two lines per assertion
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

} // namespace
