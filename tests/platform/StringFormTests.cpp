// Strings made from 8-bit text keep their bytes: every read operation must give what the same
// text held as UTF-16 units gives, and both must be equal and hash the same.
#include <gtest/gtest.h>

#include <atomic>
#include <string>
#include <thread>
#include <vector>

#include "platform/CFDictionary.h"
#include "platform/CFString.h"
#include "tests/support/Values.h"

using namespace glyphwell::testing;

namespace {

/// Empty, ASCII (longer than a word), Latin-1, BMP, astral and an embedded zero.
const std::vector<std::string> kTexts = {"",
                                         "Family-Regular Bold 12",
                                         "Caf\xC3\xA9 cr\xC3\xA8me",
                                         "\xE6\x9B\xB8\xE4\xBD\x93 ab",
                                         "a\xF0\x9F\x98\x80Zb",
                                         std::string("ab\0cd", 5)};

/// The text kept as UTF-8 bytes, and its twin held as UTF-16 units (a mutable string).
struct Twins {
    explicit Twins(const std::string& utf8)
        : narrow(Str(utf8)), twin(CFStringCreateMutableCopy(nullptr, 0, a())) {}
    CFStringRef a() const { return narrow.as<CFStringRef>(); }
    CFStringRef b() const { return twin.as<CFStringRef>(); }
    Ref narrow, twin;
};

std::string Bytes(CFStringRef string, CFRange range, CFStringEncoding encoding, UInt8 loss,
                  bool external, CFIndex capacity) {
    std::string buffer(size_t(capacity), '\0');
    CFIndex used = -1;
    CFIndex units = CFStringGetBytes(string, range, encoding, loss, external,
                                     capacity ? reinterpret_cast<UInt8*>(buffer.data()) : nullptr,
                                     capacity, &used);
    return std::to_string(units) + ":" + std::to_string(used) + ":" +
           buffer.substr(0, capacity ? size_t(used) : 0);
}

TEST(StringForms, EightBitAndUTF16FormsAreEqualHashTheSameAndFindEachOtherAsKeys) {
    for (const std::string& text : kTexts) {
        SCOPED_TRACE(text);
        Twins s(text);
        ASSERT_NE(glyphwell::UTF8Bytes(s.a()).data(), nullptr);
        EXPECT_EQ(glyphwell::UTF8Bytes(s.a()), text);
        EXPECT_EQ(glyphwell::UTF8Bytes(s.b()).data(), nullptr);
        EXPECT_TRUE(CFEqual(s.a(), s.b()));
        EXPECT_TRUE(CFEqual(s.b(), s.a()));
        EXPECT_EQ(CFHash(s.a()), CFHash(s.b()));
        Ref immutable(CFStringCreateCopy(nullptr, s.b()));
        EXPECT_EQ(CFHash(immutable.get()), CFHash(s.a()));
        Ref dictionary = Dict({{s.a(), kCFBooleanTrue}});
        EXPECT_EQ(CFDictionaryGetValue(dictionary.as<CFDictionaryRef>(), s.b()), kCFBooleanTrue);
        Ref reverse = Dict({{immutable.get(), kCFBooleanTrue}});
        EXPECT_EQ(CFDictionaryGetValue(reverse.as<CFDictionaryRef>(), s.a()), kCFBooleanTrue);
        EXPECT_EQ(glyphwell::UTF8String(s.a()), glyphwell::UTF8String(s.b()));
    }
    // Same length, one unit apart, in every pairing of forms.
    Twins e("Caf\xC3\xA9"), grave("Caf\xC3\xA8"), d("Cafd");
    for (CFStringRef x : {e.a(), e.b()})
        for (CFStringRef y : {grave.a(), d.a(), d.b()})
            EXPECT_FALSE(CFEqual(x, y) || CFEqual(y, x));
    EXPECT_FALSE(CFEqual(Twins("Cafe").a(), d.b()));
}

TEST(StringForms, EveryReadOperationGivesWhatTheUTF16FormGives) {
    const CFStringEncoding encodings[] = {
        kCFStringEncodingUTF8,     kCFStringEncodingASCII,   kCFStringEncodingISOLatin1,
        kCFStringEncodingMacRoman, kCFStringEncodingUTF16,   kCFStringEncodingUTF16BE,
        kCFStringEncodingUTF16LE,  kCFStringEncodingUTF32BE, kCFStringEncodingUTF32LE};
    Twins probes[] = {Twins("a"), Twins("b"), Twins("AB"), Twins("\xC3\xA9"), Twins("Zb")};
    for (const std::string& text : kTexts) {
        SCOPED_TRACE(text);
        Twins s(text);
        const CFIndex length = CFStringGetLength(s.b());
        ASSERT_EQ(CFStringGetLength(s.a()), length);
        for (CFIndex i = 0; i < length; ++i)
            EXPECT_EQ(CFStringGetCharacterAtIndex(s.a(), i), CFStringGetCharacterAtIndex(s.b(), i));
        for (CFIndex start = 0; start <= length; ++start)
            for (CFIndex count = 0; start + count <= length; ++count) {
                const CFRange range = CFRangeMake(start, count);
                std::u16string a(size_t(count), u'?'), b(size_t(count), u'?');
                CFStringGetCharacters(s.a(), range, reinterpret_cast<UniChar*>(a.data()));
                CFStringGetCharacters(s.b(), range, reinterpret_cast<UniChar*>(b.data()));
                EXPECT_EQ(a, b);
                Ref subA(CFStringCreateWithSubstring(nullptr, s.a(), range));
                Ref subB(CFStringCreateWithSubstring(nullptr, s.b(), range));
                EXPECT_EQ(Units(subA.as<CFStringRef>()), b);
                EXPECT_TRUE(CFEqual(subA.get(), subB.get()));
                for (CFStringEncoding encoding : {kCFStringEncodingUTF8, kCFStringEncodingUTF16})
                    for (CFIndex capacity : {0, 1, 3, 64})
                        EXPECT_EQ(Bytes(s.a(), range, encoding, 0, false, capacity),
                                  Bytes(s.b(), range, encoding, 0, false, capacity));
            }
        const CFRange whole = CFRangeMake(0, length);
        for (CFStringEncoding encoding : encodings)
            for (bool external : {false, true})
                for (UInt8 loss : {UInt8(0), UInt8('?')})
                    for (CFIndex capacity : {0, 2, 5, 100}) {
                        SCOPED_TRACE(encoding);
                        EXPECT_EQ(Bytes(s.a(), whole, encoding, loss, external, capacity),
                                  Bytes(s.b(), whole, encoding, loss, external, capacity));
                    }
        for (CFStringEncoding encoding : encodings)
            for (CFIndex size : {1, 4, 100}) {
                std::string a(size_t(size), 'x'), b(size_t(size), 'y');
                EXPECT_EQ(CFStringGetCString(s.a(), a.data(), size, encoding),
                          CFStringGetCString(s.b(), b.data(), size, encoding));
                EXPECT_STREQ(a.c_str(), b.c_str());
                const char* kept = CFStringGetCStringPtr(s.a(), encoding);
                EXPECT_TRUE(!kept || kept == text);
            }
        // The kept bytes are handed out unless a zero byte would cut the text short.
        EXPECT_EQ(CFStringGetCStringPtr(s.a(), kCFStringEncodingUTF8) != nullptr,
                  text.find('\0') == std::string::npos);
        EXPECT_EQ(CFStringGetCStringPtr(s.b(), kCFStringEncodingUTF8), nullptr);
        for (const Twins& p : probes)
            for (CFStringRef probe : {p.a(), p.b()})
                for (CFOptionFlags options : {0u, 1u, 4u, 8u, 12u, 13u}) {
                    EXPECT_EQ(CFStringCompare(s.a(), probe, options),
                              CFStringCompare(s.b(), probe, options));
                    EXPECT_EQ(CFStringCompare(probe, s.a(), options),
                              CFStringCompare(probe, s.b(), options));
                    const CFRange a = CFStringFind(s.a(), probe, options);
                    const CFRange b = CFStringFind(s.b(), probe, options);
                    EXPECT_EQ(a.location, b.location);
                    EXPECT_EQ(a.length, b.length);
                    EXPECT_EQ(CFStringHasPrefix(s.a(), probe), CFStringHasPrefix(s.b(), probe));
                    EXPECT_EQ(CFStringHasSuffix(s.a(), probe), CFStringHasSuffix(s.b(), probe));
                }
        Ref copy(CFStringCreateMutableCopy(nullptr, 0, s.a()));
        auto* appended = CFStringCreateMutableCopy(nullptr, 0, probes[3].b());
        CFStringAppend(appended, s.a());
        EXPECT_EQ(Units(copy.as<CFStringRef>()), Units(s.b()));
        EXPECT_EQ(Units(appended), u"\u00e9" + Units(s.b()));
        CFRelease(appended);
        EXPECT_EQ(std::u16string(reinterpret_cast<const char16_t*>(CFStringGetCharactersPtr(s.a())),
                                 size_t(length)),
                  Units(s.b()));
    }
}

TEST(StringForms, UTF16UnitsMadeByRacingThreadsAreOneCopy) {
    constexpr int kThreads = 4;
    for (int round = 0; round < 20; ++round) {
        Ref string = Str("\xE6\x9B\xB8\xE4\xBD\x93 " + std::to_string(round) + "\xF0\x9F\x98\x80");
        const auto* value = string.as<CFStringRef>();
        std::atomic<int> ready{0};
        std::vector<const UniChar*> seen(kThreads);
        std::vector<std::thread> threads;
        for (int t = 0; t < kThreads; ++t)
            threads.emplace_back([&, t] {
                ready.fetch_add(1);
                while (ready.load() < kThreads) {
                }
                if (CFStringGetCharacterAtIndex(value, 0) == 0x66F8)
                    seen[size_t(t)] = CFStringGetCharactersPtr(value);
            });
        for (std::thread& thread : threads)
            thread.join();
        for (const UniChar* units : seen)
            EXPECT_EQ(units, seen[0]);
        ASSERT_NE(seen[0], nullptr);
        EXPECT_EQ(seen[0][CFStringGetLength(value) - 1], 0xDE00);
    }
}

} // namespace
