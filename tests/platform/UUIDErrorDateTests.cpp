#include <gtest/gtest.h>

#include <cmath>
#include <cstring>
#include <ctime>
#include <string>

#include "platform/CFDate.h"
#include "platform/CFDictionary.h"
#include "platform/CFError.h"
#include "platform/CFNumber.h"
#include "platform/CFString.h"
#include "platform/CFUUID.h"
#include "platform/Log.h"
#include "tests/platform/ContainerTestSupport.h"

using glyphwell::testing::Own;
using glyphwell::testing::Owned;

namespace {

// A new UUID parsed from `text` (null when malformed).
Owned<CFUUIDRef> Parse(const char* text) {
    auto string = Own(CFStringCreateWithCString(nullptr, text, kCFStringEncodingUTF8));
    return Own(CFUUIDCreateFromString(nullptr, string.get()));
}

TEST(UUID, BytesAndTextGiveEqualValuesInEitherCase) {
    CFUUIDBytes bytes = {0x01, 0x23, 0x45, 0x67, 0x89, 0xab, 0xcd, 0xef,
                         0x00, 0x11, 0x22, 0x33, 0x44, 0x55, 0x66, 0xff};
    auto uuid = Own(CFUUIDCreateFromUUIDBytes(nullptr, bytes));
    EXPECT_EQ(glyphwell::Describe(Own(CFUUIDCreateString(nullptr, uuid.get())).get()),
              "01234567-89AB-CDEF-0011-2233445566FF");
    CFUUIDBytes back = CFUUIDGetUUIDBytes(uuid.get());
    EXPECT_EQ(std::memcmp(&back, &bytes, 16), 0);

    auto lower = Parse("01234567-89ab-cdef-0011-2233445566ff");
    auto upper = Parse("01234567-89AB-CDEF-0011-2233445566FF");
    ASSERT_TRUE(lower && upper);
    EXPECT_TRUE(CFEqual(lower.get(), upper.get()));
    EXPECT_TRUE(CFEqual(lower.get(), uuid.get()));
    EXPECT_EQ(CFHash(lower.get()), CFHash(uuid.get()));
}

TEST(UUID, MalformedTextGivesNull) {
    for (const char* text :
         {"", "0a1b2c3d-4e5f-6071-8293-a4b5c6d7e8f", "0a1b2c3d-4e5f-6071-8293-a4b5c6d7e8f90",
          "0a1b2c3d4e5f-6071-8293-a4b5c6d7e8f9-", "0a1b2c3d-4e5f-6071-8293_a4b5c6d7e8f9",
          "0a1b2c3d-4e5f-6071-8293-a4b5c6d7e8g9", "0a1b2c3d-4e5f-6071-8293-a4b5c6d7e8\xc3\xa9"})
        EXPECT_FALSE(Parse(text)) << text;
}

TEST(UUID, CreateMakesDistinctVersion4Values) {
    auto a = Own(CFUUIDCreate(nullptr)), b = Own(CFUUIDCreate(nullptr));
    EXPECT_FALSE(CFEqual(a.get(), b.get()));
    CFUUIDBytes bytes = CFUUIDGetUUIDBytes(a.get());
    EXPECT_EQ(bytes.byte6 >> 4, 4);
    EXPECT_EQ(bytes.byte8 >> 6, 2);
}

// A one-entry dictionary with property-value callbacks (empty without a key).
Owned<CFMutableDictionaryRef> Info(CFStringRef key = nullptr, CFTypeRef value = nullptr) {
    auto info = Own(CFDictionaryCreateMutable(nullptr, 0, &kCFTypeDictionaryKeyCallBacks,
                                              &kCFTypeDictionaryValueCallBacks));
    if (key)
        CFDictionarySetValue(info.get(), key, value);
    return info;
}

TEST(Error, KeepsDomainCodeAndACopyOfTheUserInfo) {
    auto info = Info(kCFErrorLocalizedFailureReasonKey, CFSTR("disk full"));
    auto error = Own(CFErrorCreate(nullptr, kCFErrorDomainPOSIX, 28, info.get()));
    CFDictionarySetValue(info.get(), kCFErrorLocalizedDescriptionKey, CFSTR("later"));
    EXPECT_TRUE(CFEqual(CFErrorGetDomain(error.get()), kCFErrorDomainPOSIX));
    EXPECT_EQ(CFErrorGetCode(error.get()), 28);
    auto copied = Own(CFErrorCopyUserInfo(error.get()));
    EXPECT_EQ(CFDictionaryGetCount(copied.get()), 1);
    EXPECT_TRUE(CFEqual(CFDictionaryGetValue(copied.get(), kCFErrorLocalizedFailureReasonKey),
                        CFSTR("disk full")));

    // Without user info the copy is an empty dictionary; without a domain there is no error.
    auto bare = Own(CFErrorCreate(nullptr, CFSTR("Domain"), -1, nullptr));
    auto empty = Own(CFErrorCopyUserInfo(bare.get()));
    ASSERT_NE(empty, nullptr);
    EXPECT_EQ(CFDictionaryGetCount(empty.get()), 0);
    EXPECT_EQ(CFErrorCreate(nullptr, nullptr, 1, nullptr), nullptr);
}

TEST(Date, KeepsItsAbsoluteTimeCountedFrom2001) {
    EXPECT_EQ(CFDateGetAbsoluteTime(Own(CFDateCreate(nullptr, 12.5)).get()), 12.5);
    // 2020-01-01 is 599,616,000 s after the reference date; the Unix epoch is 978,307,200 s
    // before it, so a clock counted from 1970 reads too late.
    const double now = CFAbsoluteTimeGetCurrent(), unix = double(time(nullptr));
    EXPECT_GT(now, 599616000.0);
    EXPECT_NEAR(now, unix - 978307200.0, 5);
}

} // namespace
