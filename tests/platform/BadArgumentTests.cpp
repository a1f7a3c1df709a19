#include <gtest/gtest.h>

#include <functional>
#include <string>

#include "platform/PropertyValues.h"
#include "tests/support/LogCapture.h"

namespace {

struct BadCall {
    const char* function; ///< the public function the report must name
    std::function<CFTypeRef()> call;
};

// Every creator given an invalid argument gives null, and its one report names the public
// function called, also when a shared helper found the fault. Readers and modifiers given a bad
// reference report the public function too; their rows give null when the result is the one
// expected for bad input.
TEST(BadArguments, CallsGiveNullAndNameThePublicFunction) {
    static const UniChar units[] = {'a'};
    static const UInt8 bytes[] = {'a'};
    const CFStringRef text = CFSTR("abc");
    CFMutableStringRef immutable = const_cast<CFMutableStringRef>(CFSTR("abc"));
    const CFDataRef data = CFDataCreate(nullptr, nullptr, 0);
    static const int value = 1;
    const BadCall calls[] = {
        {"CFStringCreateWithBytes",
         [] { return CFStringCreateWithBytes(nullptr, bytes, -1, kCFStringEncodingUTF8, false); }},
        {"CFStringCreateWithCharacters",
         [] { return CFStringCreateWithCharacters(nullptr, units, -1); }},
        {"CFStringCreateWithCharacters",
         [] { return CFStringCreateWithCharacters(nullptr, nullptr, 2); }},
        {"CFStringCreateCopy", [] { return CFStringCreateCopy(nullptr, nullptr); }},
        {"CFStringCreateMutableCopy",
         [] { return CFStringCreateMutableCopy(nullptr, 0, nullptr); }},
        {"CFStringCreateMutable", [] { return CFStringCreateMutable(nullptr, -1); }},
        {"CFStringCreateWithSubstring",
         [&] { return CFStringCreateWithSubstring(nullptr, text, CFRangeMake(2, 5)); }},
        {"CFDataCreate", [] { return CFDataCreate(nullptr, nullptr, 3); }},
        {"CFDataCreateCopy", [] { return CFDataCreateCopy(nullptr, nullptr); }},
        {"CFDataCreateMutable", [] { return CFDataCreateMutable(nullptr, -1); }},
        {"CFDataCreateMutableCopy", [] { return CFDataCreateMutableCopy(nullptr, 0, nullptr); }},
        {"CFArrayCreate", [] { return CFArrayCreate(nullptr, nullptr, 2, nullptr); }},
        {"CFArrayCreateMutable", [] { return CFArrayCreateMutable(nullptr, -1, nullptr); }},
        {"CFArrayCreateMutableCopy", [] { return CFArrayCreateMutableCopy(nullptr, 0, nullptr); }},
        {"CFSetCreateMutable", [] { return CFSetCreateMutable(nullptr, -1, nullptr); }},
        {"CFSetCreateMutableCopy", [] { return CFSetCreateMutableCopy(nullptr, 0, nullptr); }},
        {"CFDictionaryCreateMutable",
         [] { return CFDictionaryCreateMutable(nullptr, -1, nullptr, nullptr); }},
        {"CFDictionaryCreateCopy", [] { return CFDictionaryCreateCopy(nullptr, nullptr); }},
        {"CFCharacterSetCreateWithCharactersInString",
         [] { return CFCharacterSetCreateWithCharactersInString(nullptr, nullptr); }},
        {"CFCharacterSetCreateWithCharactersInRange",
         [] { return CFCharacterSetCreateWithCharactersInRange(nullptr, CFRangeMake(0, -1)); }},
        {"CFCharacterSetCreateMutableCopy",
         [] { return CFCharacterSetCreateMutableCopy(nullptr, nullptr); }},
        {"CFCharacterSetCreateWithBitmapRepresentation",
         [] { return CFCharacterSetCreateWithBitmapRepresentation(nullptr, nullptr); }},
        {"CFNumberCreate", [] { return CFNumberCreate(nullptr, CFNumberType(99), &value); }},
        {"CFNumberCreate", [] { return CFNumberCreate(nullptr, kCFNumberIntType, nullptr); }},
        {"CFURLCreateWithString", [] { return CFURLCreateWithString(nullptr, nullptr, nullptr); }},
        {"CFURLCopyAbsoluteURL", [] { return CFURLCopyAbsoluteURL(nullptr); }},
        {"CFStringGetLength", [] { return CFStringGetLength(nullptr) ? kCFNull : nullptr; }},
        {"CFStringAppend", [&] { return CFStringAppend(immutable, CFSTR("d")), CFTypeRef(); }},
        {"CFDataAppendBytes",
         [&] { return CFDataAppendBytes((CFMutableDataRef)data, nullptr, 0), CFTypeRef(); }},
        {"CFCharacterSetIsLongCharacterMember",
         [] { return CFCharacterSetIsLongCharacterMember(nullptr, 'a') ? kCFNull : nullptr; }},
        {"CFURLGetString", [] { return CFTypeRef(CFURLGetString(nullptr)); }},
    };
    for (const BadCall& bad : calls) {
        glyphwell::testing::LogCapture log;
        EXPECT_EQ(bad.call(), nullptr) << bad.function;
        const std::vector<std::string> lines = log.Texts();
        ASSERT_EQ(lines.size(), 2u) << bad.function;
        EXPECT_EQ(lines[0].rfind(std::string("*** Assertion failure in ") + bad.function + ", ", 0),
                  0u)
            << lines[0];
    }
    CFRelease(data);
}

} // namespace
