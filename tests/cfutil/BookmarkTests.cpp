// Bookmarks: the record layout, resolution by path with staleness by file identity, recorded
// properties read without touching the file, and a reader that rejects every malformed record.
#include <cerrno>
#include <cstdio>
#include <string>
#include <sys/stat.h>
#include <tuple>
#include <vector>

#include <gtest/gtest.h>

#include "cfutil/CFURLResourceProperties.h"
#include "cfutil/FileTestSupport.h"
#include "cfutil/TCFBookmark.h"
#include "support/Values.h"

using namespace glyphwell::testing;

namespace {

/// A record with every value kind: path "/nonexistent-gw", device 1, inode 2, then "k" the
/// string "v", "n" the number 10, "b" true, "d" the date 631152000.5, "u" the URL file:///x.
const char kRecord[] = "47 57 42 4D 00 01"
                       " 00 00 00 0F 2f 6e 6f 6e 65 78 69 73 74 65 6e 74 2d 67 77"
                       " 00 00 00 00 00 00 00 01 00 00 00 00 00 00 00 02"
                       " 00 00 00 05"
                       " 00 00 00 01 6B 01 00 00 00 01 76"
                       " 00 00 00 01 6E 02 00 00 00 00 00 00 00 0A"
                       " 00 00 00 01 62 03 01"
                       " 00 00 00 01 64 04 41 c2 cf 4e c0 40 00 00"
                       " 00 00 00 01 75 05 00 00 00 09 66 69 6c 65 3a 2f 2f 2f 78";

Ref DataOf(const std::vector<uint8_t>& bytes) {
    return Ref(CFDataCreate(nullptr, bytes.data(), CFIndex(bytes.size())));
}

Ref PropertiesOf(const std::vector<uint8_t>& bytes) {
    Ref data = DataOf(bytes);
    return Ref(TCFBookmark::CopyPropertiesFromBookmarkData(data.as<CFDataRef>(), nullptr));
}

using Resolution = std::tuple<std::string, bool, CFIndex>; ///< URL, stale, error code (0: none)

Resolution Resolve(CFTypeRef bookmark) {
    Boolean stale = true;
    CFErrorRef error = nullptr;
    Ref url(TCFBookmark::CreateURLByResolvingBookmarkData(static_cast<CFDataRef>(bookmark), &stale,
                                                          nullptr, nullptr, 0, &error));
    Ref owned(error);
    return {TextOf(url.get()), stale, error ? CFErrorGetCode(error) : 0};
}

class Bookmarks : public TemporaryDirectoryTest {
protected:
    Ref Bookmark(const std::string& path, CFArrayRef properties, bool isDirectory = false) {
        Ref url(NewFileURL(path, isDirectory));
        return Ref(TCFBookmark::InitBookmarkData(url.as<CFURLRef>(), properties, 0));
    }
};

} // namespace

TEST(BookmarkRecord, ReadsEveryValueKind) {
    Ref properties = PropertiesOf(Hex(kRecord));
    ASSERT_TRUE(properties);
    auto dictionary = properties.as<CFDictionaryRef>();
    EXPECT_EQ(CFDictionaryGetCount(dictionary), 5);
    const std::pair<CFStringRef, std::string> values[] = {
        {CFSTR("k"), "v"},         {CFSTR("n"), "10"},
        {CFSTR("b"), "true"},      {CFSTR("d"), std::to_string(631152000.5)},
        {CFSTR("u"), "file:///x"},
    };
    for (const auto& [key, expected] : values)
        EXPECT_EQ(ValueText(CFDictionaryGetValue(dictionary, key)), expected) << TextOf(key);

    Ref data = DataOf(Hex(kRecord));
    Ref keys = Array({CFSTR("k"), CFSTR("absent")});
    Ref selected(
        TCFBookmark::CopyPropertiesFromBookmarkData(data.as<CFDataRef>(), keys.as<CFArrayRef>()));
    EXPECT_EQ(CFDictionaryGetCount(selected.as<CFDictionaryRef>()), 1);
    Ref single(TCFBookmark::CopyPropertyFromBookmarkData(data.as<CFDataRef>(), CFSTR("k")));
    EXPECT_EQ(TextOf(single.get()), "v");
    EXPECT_EQ(TCFBookmark::CopyPropertyFromBookmarkData(data.as<CFDataRef>(), CFSTR("absent")),
              nullptr);
}

TEST(BookmarkRecord, EveryTruncationAndTrailingByteIsRejected) {
    std::vector<uint8_t> record = Hex(kRecord);
    for (size_t length = 0; length < record.size(); ++length) {
        std::vector<uint8_t> prefix(record.begin(), record.begin() + long(length));
        EXPECT_FALSE(PropertiesOf(prefix)) << length;
    }
    record.push_back(0);
    EXPECT_FALSE(PropertiesOf(record));
}

TEST(BookmarkRecord, MalformedFieldsAreRejected) {
    const std::vector<uint8_t> good = Hex(kRecord);
    auto with = [&](size_t offset, std::vector<uint8_t> bytes) {
        std::vector<uint8_t> changed = good;
        std::copy(bytes.begin(), bytes.end(), changed.begin() + long(offset));
        return changed;
    };
    EXPECT_FALSE(PropertiesOf(with(0, {'G', 'W', 'B', 'X'})));            // magic
    EXPECT_FALSE(PropertiesOf(with(4, {0x00, 0x02})));                    // version
    EXPECT_FALSE(PropertiesOf(with(6, {0xFF, 0xFF, 0xFF, 0xFF})));        // path length
    EXPECT_FALSE(PropertiesOf(with(10, {'x'})));                          // relative path
    EXPECT_FALSE(PropertiesOf(with(11, {0x00})));                         // NUL in the path
    EXPECT_FALSE(PropertiesOf(with(41, {0x00, 0x00, 0x00, 0x06})));       // count too large
    EXPECT_FALSE(PropertiesOf(with(41, {0xFF, 0xFF, 0xFF, 0xFF})));       // count huge
    EXPECT_FALSE(PropertiesOf(with(50, {0x09})));                         // unknown kind
    EXPECT_FALSE(PropertiesOf(with(55, {0xFF})));                         // string not UTF-8
    EXPECT_FALSE(PropertiesOf(with(60, {'k'})));                          // duplicate key
    EXPECT_FALSE(PropertiesOf(with(76, {0x02})));                         // boolean 2
    EXPECT_FALSE(PropertiesOf(with(83, {0x7F, 0xF0, 0, 0, 0, 0, 0, 0}))); // infinite date
}

TEST(BookmarkRecord, NullAndNonDataInputsYieldNull) {
    EXPECT_EQ(TCFBookmark::CopyPropertiesFromBookmarkData(nullptr, nullptr), nullptr);
    EXPECT_EQ(TCFBookmark::CopyPropertyFromBookmarkData(nullptr, CFSTR("k")), nullptr);
    EXPECT_EQ(Resolve(nullptr), (Resolution{"<null>", false, EINVAL}));
}

TEST_F(Bookmarks, RecordsPathIdentityAndPropertiesReadWithoutTouchingTheFile) {
    std::string path = WriteFile("font.ttf", "0123456789");
    struct stat status;
    ASSERT_EQ(lstat(path.c_str(), &status), 0);
    Ref keys = Array({kCFURLIsRegularFileKey});
    Ref bookmark = Bookmark(path, keys.as<CFArrayRef>());
    Ref full = Bookmark(path, TCFBookmark::GetDefaultProperties());
    ASSERT_TRUE(bookmark && full);
    ASSERT_EQ(remove(path.c_str()), 0);

    std::vector<uint8_t> record = Hex("47 57 42 4D 00 01");
    auto put = [&](uint64_t value, int width) {
        for (int shift = (width - 1) * 8; shift >= 0; shift -= 8)
            record.push_back(uint8_t(value >> shift));
    };
    put(path.size(), 4);
    record.insert(record.end(), path.begin(), path.end());
    put(uint64_t(status.st_dev), 8);
    put(uint64_t(status.st_ino), 8);
    put(1, 4);
    std::string name = "kCFURLIsRegularFileKey"; // keys are stored by their text
    put(name.size(), 4);
    record.insert(record.end(), name.begin(), name.end());
    record.push_back(0x03);
    record.push_back(0x01);
    EXPECT_EQ(ToHex(bookmark.as<CFDataRef>()), ToHex(record));

    const std::pair<CFStringRef, std::string> rows[] = {
        {kCFURLNameKey, "font.ttf"},
        {kCFURLParentDirectoryURLKey, "file://" + directory_ + "/"},
        {kCFURLFileSizeKey, "10"},
        {kCFURLIsRegularFileKey, "true"},
        {kCFURLIsDirectoryKey, "false"},
        {_kCFURLFileSizeOfResourceForkKey, "<null>"},
    };
    for (const auto& [key, expected] : rows) {
        Ref value(TCFBookmark::CopyPropertyFromBookmarkData(full.as<CFDataRef>(), key));
        EXPECT_EQ(ValueText(value.get()), expected) << TextOf(key);
    }
    EXPECT_TRUE(Ref(TCFBookmark::CopyPropertyFromBookmarkData(full.as<CFDataRef>(),
                                                              kCFURLContentModificationDateKey)));
}

TEST_F(Bookmarks, ResolvesByPathAndReportsAReplacedItemAsStale) {
    std::string path = WriteFile("font.ttf", "first");
    Ref bookmark = Bookmark(path, nullptr);
    EXPECT_EQ(Resolve(bookmark.get()), (Resolution{"file://" + path, false, 0}));
    // The replacement exists before the original goes, so it cannot reuse its inode.
    std::string replacement = WriteFile("replacement", "second");
    ASSERT_EQ(rename(replacement.c_str(), path.c_str()), 0);
    EXPECT_EQ(Resolve(bookmark.get()), (Resolution{"file://" + path, true, 0}));
    ASSERT_EQ(remove(path.c_str()), 0);
    EXPECT_EQ(Resolve(bookmark.get()), (Resolution{"<null>", false, ENOENT}));
}

TEST_F(Bookmarks, DirectoryResolvesToADirectoryURLAndMissingOrNonFileItemsHaveNone) {
    Ref bookmark = Bookmark(directory_, nullptr, true);
    // Without places for staleness and error.
    Ref url(TCFBookmark::CreateURLByResolvingBookmarkData(bookmark.as<CFDataRef>(), nullptr,
                                                          nullptr, nullptr, 0, nullptr));
    EXPECT_EQ(TextOf(url.get()), "file://" + directory_ + "/");

    EXPECT_FALSE(Bookmark(PathOf("missing"), nullptr));
    Ref web(CFURLCreateWithString(nullptr, CFSTR("http://example.com/a"), nullptr));
    EXPECT_EQ(TCFBookmark::InitBookmarkData(web.as<CFURLRef>(), nullptr, 0), nullptr);
    EXPECT_EQ(TCFBookmark::InitBookmarkData(nullptr, nullptr, 0), nullptr);
}
