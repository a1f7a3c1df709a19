// The compiled catalog index: what it keeps, what it refuses, and when it is compiled again.
#include <gtest/gtest.h>

#include <cstring>
#include <fcntl.h>
#include <filesystem>
#include <fstream>
#include <sys/stat.h>

#include "desktop/QZCatalogIndex.h"
#include "support/ScopedEnvironment.h"

namespace {

namespace fs = std::filesystem;

std::string Contents(const std::string& path) {
    std::ifstream file(path, std::ios::binary);
    return std::string(std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>());
}

/// Every member of every record, one line per font, for comparisons.
std::string Describe(const QZDownloadableFontCatalog& catalog) {
    std::string text;
    for (const QZDownloadableFontAsset& asset : catalog.assets)
        for (const QZDownloadableFont& font : asset.fonts) {
            text += std::string(asset.localID) + "|" + std::string(asset.url) + "|" +
                    std::to_string(asset.size) + "|" + std::string(asset.sha256) + "|" +
                    std::string(font.postScriptName) + "|" + std::string(font.family);
            for (const QZLocalizedName& name : font.localizedFamilyNames)
                text += "|" + std::string(name.language) + "=" + std::string(name.name);
            for (const std::string_view language : font.languages)
                text += "|" + std::string(language);
            text += "\n";
        }
    return text;
}

const std::string kSHA = "0123456789abcdef0123456789abcdef0123456789abcdef0123456789abcdef";
const std::string kCatalog = R"({"assets": [{"LocalID": "A", "url": "https://f/a", "size": 7,
    "sha256": ")" + kSHA + R"(", "fonts": [{"postScriptName": "A-Regular", "family": "A",
    "localizedFamilyNames": {"de": "Ä", "ja": "エー"}}, {"postScriptName": "A-Bold"}]}]})";

TEST(CatalogIndex, KeepsEveryMemberAndRefusesEveryDamagedField) {
    std::vector<QZCatalogProblem> problems;
    QZDownloadableFontCatalog catalog = QZReadDownloadableFontCatalog(kCatalog, problems);
    ASSERT_EQ(catalog.assets.size(), 1u);
    // The reader gives no languages; the index keeps them all the same.
    const std::string_view languages[] = {"ja", "und-zsye"};
    QZDownloadableFont withLanguages = catalog.assets[0].fonts[0];
    withLanguages.languages = languages;
    catalog.assets[0].fonts = {&withLanguages, 1};
    QZCatalogIndexKey key{"/c.json", 99, 12345, {1, 2}, {3}, {4}};
    const std::string index = QZCompileCatalogIndex(catalog, key);
    QZCatalogIndexKey read;
    const auto copy = QZReadCatalogIndex(index, nullptr, &read);
    ASSERT_TRUE(copy);
    EXPECT_EQ(Describe(*copy),
              "A|https://f/a|7|" + kSHA + "|A-Regular|A|de=Ä|ja=エー|ja|und-zsye\n");
    EXPECT_EQ(read, key);

    // Offsets into the file (the layout's header fields and the first records).
    const size_t assets = 224, fonts = assets + 40, names = fonts + 32;
    uint64_t lookups = 0;
    std::memcpy(&lookups, index.data() + 200, sizeof lookups);
    const auto patch = [&](size_t at, uint32_t value) {
        std::string bytes = index;
        std::memcpy(bytes.data() + at, &value, sizeof value);
        return bytes;
    };
    std::string badSHA = index;
    badSHA[badSHA.find(kSHA)] = 'A';
    std::string unsorted = index;
    std::swap_ranges(unsorted.begin() + long(names), unsorted.begin() + long(names) + 16,
                     unsorted.begin() + long(names) + 16);
    struct Case {
        const char* what;
        std::string bytes;
    } cases[] = {
        {"truncated", index.substr(0, index.size() - 1)},
        {"header only", index.substr(0, 224)},
        {"another magic", "X" + index.substr(1)},
        {"asset count beyond the file", patch(144, 0x10000000)},
        {"string offset beyond the strings", patch(assets, 0xffffff00)},
        {"string length beyond the strings", patch(assets + 4, 0x7fffffff)},
        {"font range beyond the fonts", patch(assets + 36, 2)},
        {"an asset without fonts", patch(assets + 36, 0)},
        {"name range beyond the names", patch(fonts + 16, 1)},
        {"section before the header", patch(168, 8)},
        {"a lookup entry naming no asset", patch(size_t(lookups) + 8, 5)},
        {"a lookup entry naming another asset's font", patch(size_t(lookups) + 12, 7)},
        {"a SHA-256 that is not lower-case hex", badSHA},
        {"names out of order", unsorted},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.what);
        EXPECT_FALSE(QZReadCatalogIndex(c.bytes, nullptr, &read));
    }
}

TEST(CatalogIndex, ACurrentIndexIsUsedWithoutTheSourceAndABadOneIsCompiledAgain) {
    char pattern[] = "/tmp/gw-index-XXXXXX";
    const std::string root = mkdtemp(pattern);
    glyphwell::testing::ScopedEnvironment environment;
    environment.Set("XDG_CACHE_HOME", root.c_str());
    const std::string path = root + "/downloadable-fonts.json";
    std::ofstream(path) << kCatalog;
    const QZCatalogSource source{QZCatalogSource::Kind::User, "user", path, {}, {}};
    const std::string expected = Describe(QZLoadIndexedCatalogSource(source)->Catalog({}, true));
    ASSERT_NE(expected, "");
    const std::string index = QZCatalogIndexPath(path);
    ASSERT_TRUE(fs::exists(index));

    struct stat status {};
    stat(path.c_str(), &status);
    const auto restoreTime = [&] {
        const timespec times[2] = {status.st_atim, status.st_mtim};
        utimensat(AT_FDCWD, path.c_str(), times, 0);
    };
    // Same size and time: the index answers, the (now unreadable) JSON is not read.
    std::string garbled(kCatalog.size(), '#');
    std::ofstream(path) << garbled;
    restoreTime();
    EXPECT_EQ(Describe(QZLoadIndexedCatalogSource(source)->Catalog({}, true)), expected);
    // A damaged index is compiled again from the source, whatever it holds now.
    std::ofstream(path) << kCatalog;
    restoreTime();
    for (const std::string& damage : {std::string("junk"), Contents(index).substr(0, 300)}) {
        std::ofstream(index, std::ios::binary) << damage;
        EXPECT_EQ(Describe(QZLoadIndexedCatalogSource(source)->Catalog({}, true)), expected);
        QZCatalogIndexKey key;
        EXPECT_TRUE(QZReadCatalogIndex(Contents(index), nullptr, &key));
    }
    // An asset found damaged only when it is used is left out, and the index compiled again.
    std::string index2 = Contents(index);
    index2[index2.find(kSHA)] = 'x';
    std::ofstream(index, std::ios::binary) << index2;
    EXPECT_EQ(Describe(QZLoadIndexedCatalogSource(source)->Catalog({}, true)), "");
    EXPECT_EQ(Describe(QZLoadIndexedCatalogSource(source)->Catalog({}, true)), expected);
    // A changed source is compiled again.
    std::ofstream(path) << R"({"assets": []})";
    EXPECT_EQ(Describe(QZLoadIndexedCatalogSource(source)->Catalog({}, true)), "");
    // The index of a catalog that is gone goes when another is compiled.
    const std::string other = root + "/other.json";
    fs::rename(path, other);
    QZLoadIndexedCatalogSource({QZCatalogSource::Kind::User, "user", other, {}, {}});
    EXPECT_FALSE(fs::exists(index));
    EXPECT_TRUE(fs::exists(QZCatalogIndexPath(other)));
    fs::remove_all(root);
}

} // namespace
