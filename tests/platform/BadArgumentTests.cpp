#include <gtest/gtest.h>

#include <functional>
#include <memory>
#include <string>
#include <tuple>

#include "platform/CFKind.h"
#include "platform/PropertyValues.h"
#include "tests/platform/ContainerTestSupport.h"
#include "tests/support/LogCapture.h"

namespace {

using glyphwell::testing::Own;
using glyphwell::testing::Token;

struct BadCall {
    const char* function; ///< the public function the report must name
    std::function<const void*()> call;
    const char* condition = nullptr; ///< what the report's second line names (null: not checked)
};

/// A call that gives nothing, as a row's call.
template <class F> std::function<const void*()> Void(F call) {
    return [call] { return call(), nullptr; };
}

struct Counting : CFKindPayload {
    explicit Counting(int* destroyed) : destroyed(destroyed) {}
    ~Counting() override { ++*destroyed; }
    int* destroyed;
};

// Every creator given an invalid argument gives null, and its one report names the public
// function called, also when a shared helper found the fault. Readers and modifiers given a bad
// reference, a range outside the value or an immutable value report the public function too and
// change nothing; their rows give null when the result is the one expected for bad input.
TEST(BadArguments, CallsGiveNullChangeNothingAndNameThePublicFunction) {
    static const UniChar units[] = {'a'};
    static const UInt8 bytes[] = {'a'};
    static const int value = 1;
    const CFStringRef text = CFSTR("abc");
    CFMutableStringRef immutable = const_cast<CFMutableStringRef>(CFSTR("abc"));
    auto edited = Own(CFStringCreateMutableCopy(nullptr, 0, text));
    CFIndex used = -1;
    const void* tokens[] = {Token(1), Token(2)};
    auto array = Own(const_cast<CFMutableArrayRef>(CFArrayCreate(nullptr, tokens, 2, nullptr)));
    auto dictionary = Own(const_cast<CFMutableDictionaryRef>(
        CFDictionaryCreate(nullptr, nullptr, nullptr, 0, nullptr, nullptr)));
    auto set = Own(const_cast<CFMutableSetRef>(CFSetCreate(nullptr, tokens, 1, nullptr)));
    auto frozen = Own(const_cast<CFMutableDataRef>(CFDataCreate(nullptr, bytes, 1)));
    auto data = Own(CFDataCreateMutable(nullptr, 0));
    CFDataAppendBytes(data.get(), reinterpret_cast<const UInt8*>("abc"), 3);
    auto characters = Own(const_cast<CFMutableCharacterSetRef>(
        CFCharacterSetCreateWithCharactersInRange(nullptr, CFRangeMake('a', 1))));
    UInt8 buffer[4] = {'-', '-', '-', '-'};
    int32_t number = 7;
    int destroyed = 0;
    const char* range = "RangeInside(range, object->length)";
    const char* mutableData = "object != nullptr && object->isMutable";
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
        {"CFStringGetLength", [] { return Token(intptr_t(CFStringGetLength(nullptr))); }},
        {"CFStringAppend", Void([&] { CFStringAppend(immutable, CFSTR("d")); })},
        {"CFStringDelete", Void([&] { CFStringDelete(edited.get(), CFRangeMake(2, 5)); })},
        {"CFStringGetBytes",
         [&] {
             return Token(intptr_t(CFStringGetBytes(text, CFRangeMake(2, 2), kCFStringEncodingUTF8,
                                                    0, false, nullptr, 0, &used)));
         }},
        {"CFURLGetString", [] { return CFTypeRef(CFURLGetString(nullptr)); }},
        {"CFCharacterSetIsLongCharacterMember",
         [] { return Token(intptr_t(CFCharacterSetIsLongCharacterMember(nullptr, 'a'))); }},
        {"CFCharacterSetAddCharactersInRange",
         Void([&] { CFCharacterSetAddCharactersInRange(characters.get(), CFRangeMake('z', 1)); })},
        {"CFNumberGetValue",
         [&] {
             return Token(intptr_t(CFNumberGetValue(reinterpret_cast<CFNumberRef>(kCFBooleanTrue),
                                                    kCFNumberSInt32Type, &number)));
         },
         "object != nullptr"},
        {"CFArrayAppendValue", Void([&] { CFArrayAppendValue(array.get(), Token(3)); }),
         "array is mutable"},
        {"CFArrayGetValueAtIndex", [&] { return CFArrayGetValueAtIndex(array.get(), 2); },
         "index lies inside the array"},
        {"CFArrayGetValueAtIndex", [&] { return CFArrayGetValueAtIndex(array.get(), -1); }},
        {"CFArrayGetCountOfValue",
         [&] {
             return Token(
                 intptr_t(CFArrayGetCountOfValue(array.get(), CFRangeMake(1, 2), tokens[1])));
         },
         "range lies inside the collection"},
        {"CFDictionarySetValue",
         Void([&] { CFDictionarySetValue(dictionary.get(), tokens[0], tokens[1]); }),
         "dictionary is mutable"},
        {"CFSetRemoveValue", Void([&] { CFSetRemoveValue(set.get(), tokens[0]); }),
         "set is mutable"},
        {"CFDataAppendBytes", Void([&] { CFDataAppendBytes(frozen.get(), bytes, 1); }),
         mutableData},
        {"CFDataSetLength", Void([&] { CFDataSetLength(frozen.get(), 0); }), mutableData},
        {"CFDataGetMutableBytePtr",
         [&] { return CFTypeRef(CFDataGetMutableBytePtr(frozen.get())); }},
        {"CFDataDeleteBytes", Void([&] { CFDataDeleteBytes(data.get(), CFRangeMake(2, 2)); }),
         range},
        {"CFDataReplaceBytes",
         Void([&] { CFDataReplaceBytes(data.get(), CFRangeMake(-1, 1), bytes, 1); })},
        {"CFDataReplaceBytes",
         Void([&] { CFDataReplaceBytes(data.get(), CFRangeMake(0, 1), bytes, -1); })},
        {"CFDataSetLength", Void([&] { CFDataSetLength(data.get(), -1); })},
        {"CFDataIncreaseLength", Void([&] { CFDataIncreaseLength(data.get(), -1); })},
        {"CFDataAppendBytes", Void([&] { CFDataAppendBytes(data.get(), bytes, -1); })},
        {"CFDataGetBytes", Void([&] { CFDataGetBytes(data.get(), CFRangeMake(1, 3), buffer); }),
         range},
        {"DataReserveTail",
         [&] { return CFTypeRef(glyphwell::DataReserveTail(frozen.get(), 1).bytes); }, mutableData},
        {"DataReserveTail",
         [&] { return CFTypeRef(glyphwell::DataReserveTail(data.get(), -1).bytes); }},
        {"DataCommitTail", Void([&] { glyphwell::DataCommitTail(data.get(), CFIndex(1) << 40); })},
        {"CFKindRegister", [] { return Token(intptr_t(CFKindRegister("", nullptr))); }},
        {"CFKindCreateValue",
         [&] { return CFKindCreateValue(3, std::make_unique<Counting>(&destroyed)); }},
        {"CFKindCreateValue",
         [] { return CFKindCreateValue(CFKindRegister("TestKindBad", nullptr), nullptr); }},
    };
    for (const BadCall& bad : calls) {
        SCOPED_TRACE(bad.function);
        glyphwell::testing::LogCapture log;
        EXPECT_EQ(bad.call(), nullptr);
        const std::vector<std::string> lines = log.Texts();
        ASSERT_EQ(lines.size(), 2u);
        EXPECT_EQ(lines[0].rfind(std::string("*** Assertion failure in ") + bad.function + ", ", 0),
                  0u)
            << lines[0];
        if (bad.condition) {
            EXPECT_EQ(lines[1], std::string("Invalid parameter not satisfying: ") + bad.condition);
        }
    }
    // Nothing changed, and the refused payload was destroyed.
    const std::string dataBytes(reinterpret_cast<const char*>(CFDataGetBytePtr(data.get())),
                                size_t(CFDataGetLength(data.get())));
    EXPECT_EQ(std::make_tuple(CFArrayGetCount(array.get()), CFDictionaryGetCount(dictionary.get()),
                              CFSetGetCount(set.get()), CFDataGetLength(frozen.get()), dataBytes,
                              buffer[0], number, destroyed, CFStringGetLength(immutable), used,
                              CFStringGetLength(edited.get()),
                              bool(CFCharacterSetIsCharacterMember(characters.get(), 'z'))),
              std::make_tuple(2, 0, 1, 1, "abc", '-', 7, 1, 3, 0, 3, false));
}

} // namespace
