// The downloadable font catalog: where it is found, what a query returns, and how bad catalogs
// and bad entries are reported.
#include <QDir>
#include <QFile>
#include <QTemporaryDir>

#include "desktop/QZDownloadableFontCatalog.h"
#include "tests/desktop/DesktopTestEnvironment.h"
#include "tests/support/LogCapture.h"
#include "tests/support/Values.h"

namespace {

using glyphwell::testing::Array;
using glyphwell::testing::Dict;
using glyphwell::testing::LogCapture;
using glyphwell::testing::Ref;
using glyphwell::testing::Str;

constexpr char kHash[] = "\"0123456789abcdef0123456789abcdef0123456789abcdef0123456789abcdef\"";

/// XDG_DATA_HOME and XDG_DATA_DIRS pointed at fresh directories while it lives.
class CatalogTest : public ::testing::Test {
protected:
    void SetUp() override {
        qputenv("XDG_DATA_HOME", home_.path().toUtf8());
        qputenv("XDG_DATA_DIRS",
                (system_.path() + "/first:" + system_.path() + "/second").toUtf8());
    }
    void TearDown() override {
        qunsetenv("XDG_DATA_HOME");
        qunsetenv("XDG_DATA_DIRS");
        QZSetInstalledFontCheck({});
    }

    /// Writes `text` as the catalog under `root`; returns its path.
    static QString WriteCatalog(const QString& root, const QByteArray& text) {
        QDir().mkpath(root + "/glyphwell");
        const QString path = root + "/glyphwell/downloadable-fonts.json";
        QFile file(path);
        EXPECT_TRUE(file.open(QIODevice::WriteOnly | QIODevice::Truncate));
        file.write(text);
        return path;
    }
    static QByteArray Asset(const char* id, const char* size, const char* fonts) {
        return QByteArray("{\"LocalID\": \"") + id + "\", \"url\": \"https://fonts.example/" + id +
               "\", \"size\": " + size + ", \"sha256\": " + kHash + ", \"fonts\": [" + fonts + "]}";
    }
    static Ref Query(std::initializer_list<const char*> names) {
        std::vector<Ref> dictionaries;
        std::vector<CFTypeRef> values;
        for (const char* name : names) {
            Ref key = Str("NSFontNameAttribute");
            dictionaries.push_back(Dict({{key.get(), Str(name).get()}}));
        }
        for (const Ref& dictionary : dictionaries)
            values.push_back(dictionary.get());
        std::vector<const void*> raw(values.begin(), values.end());
        Ref request(
            CFArrayCreate(nullptr, raw.data(), CFIndex(raw.size()), &kCFTypeArrayCallBacks));
        return Ref(QZCopyDownloadableFontAttributesForRequests(request.as<CFArrayRef>()));
    }
    static std::string StringAt(CFArrayRef array, CFIndex index, const char* key) {
        auto dictionary = static_cast<CFDictionaryRef>(CFArrayGetValueAtIndex(array, index));
        Ref name = Str(key);
        auto value = static_cast<CFStringRef>(CFDictionaryGetValue(dictionary, name.get()));
        char buffer[256] = {};
        CFStringGetCString(value, buffer, sizeof buffer, kCFStringEncodingUTF8);
        return buffer;
    }

    QTemporaryDir home_;
    QTemporaryDir system_;
};

TEST_F(CatalogTest, ReturnsTheAssetsOfEachRequestedFontInRequestOrder) {
    WriteCatalog(home_.path(),
                 "{\"assets\": [" +
                     Asset("A", "1234567",
                           "{\"postScriptName\": \"Sans-Regular\", \"family\": \"Sans\", "
                           "\"localizedFamilyNames\": {\"de\": \"Serifenlos\"}}, "
                           "{\"postScriptName\": \"Sans-Bold\"}") +
                     ", " + Asset("B", "9", "{\"postScriptName\": \"Sans-Bold\"}") + "]}");
    Ref result = Query({"Sans-Bold", "Unknown", "Sans-Regular"});
    auto array = result.as<CFArrayRef>();
    ASSERT_EQ(CFArrayGetCount(array), 3);
    EXPECT_EQ(StringAt(array, 0, "LocalID"), "A");
    EXPECT_EQ(StringAt(array, 1, "LocalID"), "B");
    EXPECT_EQ(StringAt(array, 2, "LocalID"), "A");
    EXPECT_EQ(StringAt(array, 2, "NSFontFamilyAttribute"), "Sans");
    EXPECT_EQ(StringAt(array, 2, "_DownloadURL"), "https://fonts.example/A");

    auto first = static_cast<CFDictionaryRef>(CFArrayGetValueAtIndex(array, 2));
    auto size = static_cast<CFNumberRef>(CFDictionaryGetValue(first, CFSTR("_DownloadSize")));
    SInt64 bytes = 0;
    ASSERT_TRUE(size && CFNumberGetValue(size, kCFNumberSInt64Type, &bytes));
    EXPECT_EQ(CFNumberGetType(size), kCFNumberSInt64Type);
    EXPECT_EQ(bytes, 1234567);
    auto names = static_cast<CFDictionaryRef>(
        CFDictionaryGetValue(first, CFSTR("NSCTFontLocalizedFamilyNameAttribute")));
    ASSERT_TRUE(names);
    EXPECT_TRUE(CFEqual(CFDictionaryGetValue(names, CFSTR("de")), CFSTR("Serifenlos")));

    // Fonts that are installed already need no download.
    QZSetInstalledFontCheck([](const std::string& name) { return name == "Sans-Bold"; });
    EXPECT_EQ(CFArrayGetCount(Query({"Sans-Bold", "Sans-Regular"}).as<CFArrayRef>()), 1);
    EXPECT_FALSE(QZCopyDownloadableFontAttributesForRequests(nullptr));
}

TEST_F(CatalogTest, TheUserCatalogComesBeforeTheSystemOnes) {
    WriteCatalog(system_.path() + "/second",
                 "{\"assets\": [" + Asset("System", "1", "{\"postScriptName\": \"F\"}") + "]}");
    Ref fromSystem = Query({"F"});
    ASSERT_EQ(CFArrayGetCount(fromSystem.as<CFArrayRef>()), 1);
    EXPECT_EQ(StringAt(fromSystem.as<CFArrayRef>(), 0, "LocalID"), "System");

    WriteCatalog(home_.path(),
                 "{\"assets\": [" + Asset("User", "1", "{\"postScriptName\": \"F\"}") + "]}");
    Ref fromUser = Query({"F"});
    ASSERT_EQ(CFArrayGetCount(fromUser.as<CFArrayRef>()), 1);
    EXPECT_EQ(StringAt(fromUser.as<CFArrayRef>(), 0, "LocalID"), "User");
}

TEST_F(CatalogTest, SkipsEachMalformedAssetWithOneLine) {
    const QString path = WriteCatalog(
        home_.path(), "{\"assets\": [42, " + Asset("A", "-1", "{\"postScriptName\": \"F\"}") +
                          ", " + Asset("B", "1", "{\"family\": \"F\"}") + ", " +
                          Asset("C", "5", "{\"postScriptName\": \"F\"}") + ", " +
                          Asset("C", "6", "{\"postScriptName\": \"F\"}") + "]}");
    LogCapture log;
    EXPECT_EQ(CFArrayGetCount(Query({"F"}).as<CFArrayRef>()), 1);
    const std::string where = " of the downloadable font catalog " + path.toStdString() + ": ";
    EXPECT_EQ(log.Texts(), (std::vector<std::string>{
                               "Skipping asset 0" + where + "not an object",
                               "Skipping asset 1" + where + "no \"size\" in bytes",
                               "Skipping asset 2" + where + "a font without a \"postScriptName\"",
                               "Skipping asset 4" + where + "duplicate \"LocalID\" C",
                           }));
}

TEST_F(CatalogTest, ABrokenCatalogCountsAsEmptyAndIsLoggedOnceUntilItChanges) {
    const QString path = WriteCatalog(home_.path(), "{\"fonts\": []}");
    LogCapture log;
    EXPECT_EQ(CFArrayGetCount(Query({"F"}).as<CFArrayRef>()), 0);
    EXPECT_EQ(CFArrayGetCount(Query({"F"}).as<CFArrayRef>()), 0);
    EXPECT_EQ(log.Texts(), std::vector<std::string>{"Cannot parse the downloadable font catalog " +
                                                    path.toStdString() + ": no \"assets\" array"});

    log.Clear();
    WriteCatalog(home_.path(), "{\"assets\": [");
    EXPECT_EQ(CFArrayGetCount(Query({"F"}).as<CFArrayRef>()), 0);
    EXPECT_EQ(CFArrayGetCount(Query({"F"}).as<CFArrayRef>()), 0);
    ASSERT_EQ(log.Texts().size(), 1u);
    EXPECT_EQ(log.Texts()[0].rfind("Cannot parse the downloadable font catalog " +
                                       path.toStdString() + ": [json.exception.parse_error",
                                   0),
              0u)
        << log.Texts()[0];

    WriteCatalog(home_.path(),
                 "{\"assets\": [" + Asset("A", "1", "{\"postScriptName\": \"F\"}") + "]}");
    EXPECT_EQ(CFArrayGetCount(Query({"F"}).as<CFArrayRef>()), 1);
}

} // namespace

namespace {

TEST(CatalogSample, TheDocumentedSampleIsAValidCatalog) {
    QFile sample(qEnvironmentVariable("GLYPHWELL_SOURCE_DIR") +
                 "/resources/catalog/downloadable-fonts.sample.json");
    ASSERT_TRUE(sample.open(QIODevice::ReadOnly))
        << "GLYPHWELL_SOURCE_DIR must name the source tree (the test registration sets it)";
    const QByteArray bytes = sample.readAll();
    LogCapture log;
    const auto catalog = QZDownloadableFontCatalog::Parse(
        std::string_view(bytes.constData(), size_t(bytes.size())), "sample");
    EXPECT_TRUE(log.Texts().empty());
    ASSERT_EQ(catalog.assets.size(), 2u);
    EXPECT_EQ(catalog.assets[0].fonts.size(), 2u);
    EXPECT_EQ(catalog.assets[0].fonts[0].localizedFamilyNames.at("de"), "Beispiel Sans");
}

} // namespace
