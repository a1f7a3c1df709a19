// Texts are written the same whichever form their string holds, and read back as strings that
// keep the UTF-8 bytes they were read from.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "cfutil/TCFStringUniquer.h"
#include "serialization/TCFResurrectContext.h"
#include "support/FlattenedBytes.h"
#include "support/Values.h"

using namespace glyphwell::testing;

namespace {

TEST(StringStream, EveryFormWritesTheSameBytesAndReadsBackAsKeptUTF8) {
    // Short texts go out in one append with their head, texts past 120 bytes in two. The uniquer
    // is process-wide: a text with a zero byte must not share its key with any other test's.
    const std::vector<std::string> texts = {"a",
                                            "Caf\xC3\xA9",
                                            "\xE6\x9B\xB8\xE4\xBD\x93",
                                            "\xF0\x9F\x98\x80!",
                                            std::string("stream-form\0y", 13),
                                            std::string(200, 'n'),
                                            std::string(150, 'e') + "\xC3\xA9"};
    for (const std::string& text : texts) {
        SCOPED_TRACE(text);
        Ref narrow = Str(text);
        // The same text held as UTF-16 units: mutable, and immutable where it is not all ASCII.
        Ref twin(CFStringCreateMutableCopy(nullptr, 0, narrow.as<CFStringRef>()));
        Ref immutable(CFStringCreateCopy(nullptr, twin.as<CFStringRef>()));
        std::vector<uint8_t> expected = {
            0, 0, 0, 7, 0, 0, uint8_t(text.size() >> 8), uint8_t(text.size())};
        expected.insert(expected.end(), text.begin(), text.end());
        for (CFTypeRef form : {narrow.get(), twin.get(), immutable.get()})
            EXPECT_EQ(FlattenedBytes(form), expected);

        TCFResurrectContext context(expected.data(), expected.size());
        Ref read(context.RetrieveCFString());
        ASSERT_TRUE(read);
        EXPECT_TRUE(CFEqual(read.get(), narrow.get()));
        EXPECT_TRUE(CFEqual(read.get(), twin.get()));
        ASSERT_NE(glyphwell::UTF8Bytes(read.as<CFStringRef>()).data(), nullptr);
        EXPECT_EQ(glyphwell::UTF8Bytes(read.as<CFStringRef>()), text);

        // The uniquer takes the text up to its first zero byte from either form.
        const std::string key = text.substr(0, text.find('\0'));
        CFStringRef unique = TCFStringUniquer().GetUniqueString(key.data(), CFIndex(key.size()));
        EXPECT_EQ(TCFStringUniquer().GetUniqueString(narrow.as<CFStringRef>()), unique);
        EXPECT_EQ(TCFStringUniquer().GetUniqueString(twin.as<CFStringRef>()), unique);
    }
}

} // namespace
