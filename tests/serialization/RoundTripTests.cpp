// Every value the writer writes reads back equal: generated trees of every kind.
#include <gtest/gtest.h>

#include <random>
#include <string>
#include <vector>

#include "serialization/TCFFlattenContext.h"
#include "serialization/TCFResurrectContext.h"
#include "support/FlattenedBytes.h"
#include "support/LogCapture.h"
#include "support/Values.h"

using namespace glyphwell::testing;

namespace {

class ValueGenerator {
public:
    explicit ValueGenerator(unsigned seed) : random_(seed) {}

    Ref Any(int depth) {
        // Texts, numbers and data come twice as often as the other scalars; containers only
        // above the last level.
        using Scalar = Ref (ValueGenerator::*)();
        static const Scalar scalars[] = {
            &ValueGenerator::Text,   &ValueGenerator::Number,       &ValueGenerator::Bool,
            &ValueGenerator::Data,   &ValueGenerator::CharacterSet, &ValueGenerator::URL,
            &ValueGenerator::UUID,   &ValueGenerator::Error,        &ValueGenerator::Text,
            &ValueGenerator::Number, &ValueGenerator::Data};
        const int kind = Below(depth > 0 ? 14 : 11);
        if (kind < 11)
            return (this->*scalars[kind])();
        return kind < 13 ? Collection(depth - 1, Below(2)) : Dictionary(depth - 1);
    }

    Ref Bool() { return Ref(CFRetain(Below(2) ? kCFBooleanTrue : kCFBooleanFalse)); }

    Ref Text() {
        // One to four UTF-8 bytes, the largest scalar, the replacement character, DEL.
        static const char* const pieces[] = {"a",
                                             "Zz",
                                             " ",
                                             "\xC3\xA9",
                                             "\xE6\x97\xA5",
                                             "\xF0\x9F\x98\x80",
                                             "\xF4\x8F\xBF\xBF",
                                             "\xEF\xBF\xBD",
                                             "~",
                                             "\x7F"};
        std::string text;
        for (int i = Below(12); i > 0; --i)
            text += pieces[Below(10)];
        return Str(text);
    }

    Ref Number() {
        const CFNumberType type = 1 + Below(16);
        const double real = std::ldexp(double(int64_t(random_())) - 2147483648.0, Below(80) - 40);
        if (IsFloat(type))
            return CFNumberTypeByteSize(type) == 4 ? Num<float>(type, float(real))
                                                   : Num<double>(type, real);
        // The low bytes of a 64-bit integer give every narrower width (a little-endian machine).
        return Num<int64_t>(type, int64_t(random_()) << 32 ^ int64_t(random_()));
    }

    Ref Data() {
        std::vector<UInt8> bytes(size_t(Below(40)));
        for (UInt8& b : bytes)
            b = UInt8(random_());
        return Ref(CFDataCreate(nullptr, bytes.data(), CFIndex(bytes.size())));
    }

    Ref CharacterSet() {
        Ref set(CFCharacterSetCreateMutable(nullptr));
        for (int i = Below(6); i > 0; --i) {
            const CFIndex plane = Below(3) ? 0 : Below(17);
            CFCharacterSetAddCharactersInRange(
                const_cast<__CFCharacterSet*>(set.as<CFCharacterSetRef>()),
                CFRangeMake(plane * 0x10000 + Below(0x10000), 1 + Below(300)));
        }
        return set;
    }

    Ref URL() {
        static const char* const urls[] = {"file:///tmp/a%20b.ttf", "https://example.org/f?q=1#x",
                                           "mailto:a@b", "", "urn:x:y"};
        const std::string text = urls[Below(5)];
        return Ref(CFURLCreateWithBytes(nullptr, reinterpret_cast<const UInt8*>(text.data()),
                                        CFIndex(text.size()), kCFStringEncodingUTF8, nullptr));
    }

    Ref UUID() {
        CFUUIDBytes bytes;
        for (UInt8* b = &bytes.byte0; b <= &bytes.byte15; ++b)
            *b = UInt8(random_());
        return Ref(CFUUIDCreateFromUUIDBytes(nullptr, bytes));
    }

    Ref Error() {
        Ref domain = Str(Below(2) ? "NSPOSIXErrorDomain" : "example.domain");
        return Ref(CFErrorCreate(nullptr, domain.as<CFStringRef>(), int32_t(random_()), nullptr));
    }

    Ref Collection(int depth, bool isSet) {
        Ref collection(isSet ? CFTypeRef(CFSetCreateMutable(nullptr, 0, &kCFTypeSetCallBacks))
                             : CFArrayCreateMutable(nullptr, 0, &kCFTypeArrayCallBacks));
        for (int i = Below(6); i > 0; --i) {
            Ref item = Any(depth);
            if (isSet)
                CFSetAddValue(collection.as<CFMutableSetRef>(), item.get());
            else
                CFArrayAppendValue(collection.as<CFMutableArrayRef>(), item.get());
        }
        return collection;
    }

    Ref Dictionary(int depth) {
        Ref dictionary(CFDictionaryCreateMutable(nullptr, 0, &kCFTypeDictionaryKeyCallBacks,
                                                 &kCFTypeDictionaryValueCallBacks));
        for (int i = Below(6); i > 0; --i) {
            Ref key = Any(0), value = Any(depth);
            CFDictionarySetValue(dictionary.as<CFMutableDictionaryRef>(), key.get(), value.get());
        }
        return dictionary;
    }

private:
    static bool IsFloat(CFNumberType type) {
        return type == 5 || type == 6 || type == 12 || type == 13 || type == 16;
    }
    int Below(int n) { return int(random_() % unsigned(n)); }

    std::mt19937 random_;
};

Ref ReadBack(const std::vector<uint8_t>& bytes) {
    TCFResurrectContext context(bytes.data(), bytes.size());
    Ref value(context.Resurrect(kTCFTypeAny));
    EXPECT_FALSE(context.IsCorrupted());
    return value;
}

} // namespace

TEST(RoundTrip, GeneratedTreesOfEveryKindReadBackEqual) {
    LogCapture log;
    ValueGenerator generator(20261206);
    for (int i = 0; i < 400; ++i) {
        Ref value = generator.Any(4);
        const std::vector<uint8_t> bytes = FlattenedBytes(value.get());
        Ref back = ReadBack(bytes);
        ASSERT_TRUE(back) << "tree " << i << ": " << glyphwell::Describe(value.get());
        EXPECT_TRUE(CFEqual(back.get(), value.get()))
            << "tree " << i << ": " << glyphwell::Describe(value.get()) << "\nread back as "
            << glyphwell::Describe(back.get());
        // Written again, the same bytes: CFEqual alone lets numbers of different type codes match.
        EXPECT_EQ(FlattenedBytes(back.get()), bytes) << "tree " << i;
    }
    EXPECT_TRUE(log.Texts().empty());
}

TEST(RoundTrip, WideContainersAndTextsAtTheLimits) {
    ValueGenerator generator(7);
    Ref wide(CFArrayCreateMutable(nullptr, 0, &kCFTypeArrayCallBacks));
    for (int i = 0; i < 100000; ++i)
        CFArrayAppendValue(const_cast<CFMutableArrayRef>(wide.as<CFArrayRef>()),
                           (i % 2 ? generator.Number() : generator.Text()).get());
    EXPECT_TRUE(CFEqual(ReadBack(FlattenedBytes(wide.get())).get(), wide.get()));

    for (const auto& [unit, count] :
         {std::pair{"x", 0x100000}, {"\xC3\xA9", 0x80000}, {"\xF0\x9F\x98\x80", 0x40000}}) {
        std::string text;
        for (int i = 0; i < count; ++i)
            text += unit;
        Ref string = Str(text);
        EXPECT_TRUE(CFEqual(ReadBack(FlattenedBytes(string.get())).get(), string.get()));
    }
}
