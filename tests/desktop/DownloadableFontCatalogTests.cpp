// The downloadable font catalog: where it is found, what a query returns, and how bad catalogs
// and bad entries are reported.
#include <QDir>
#include <QFile>
#include <QTemporaryDir>
#include <gmock/gmock.h>

#include "desktop/QZDownloadableFontCatalog.h"
#include "platform/LogEscape.h"
#include "tests/desktop/DesktopTestEnvironment.h"
#include "tests/support/LogCapture.h"
#include "tests/support/PrivateFonts.h"
#include "tests/support/Values.h"

namespace {

using namespace glyphwell::testing;

QByteArray Asset(const char* id, const char* size, const char* fonts) {
    return QByteArray("{\"LocalID\": \"") + id + "\", \"url\": \"https://f/" + id +
           "\", \"size\": " + size +
           ", \"sha256\": \"0123456789abcdef0123456789abcdef0123456789abcdef0123456789abcdef\", "
           "\"fonts\": [" +
           fonts + "]}";
}

/// XDG_DATA_HOME and XDG_DATA_DIRS pointed at fresh directories while it lives.
class CatalogTest : public ::testing::Test {
protected:
    void SetUp() override {
        qputenv("XDG_DATA_HOME", home_.path().toUtf8());
        qputenv("XDG_DATA_DIRS", (system_.path() + "/a:" + system_.path() + "/b").toUtf8());
        qputenv("XDG_CACHE_HOME", (system_.path() + "/cache").toUtf8());
    }
    void TearDown() override {
        qunsetenv("XDG_DATA_HOME");
        qunsetenv("XDG_DATA_DIRS");
        qunsetenv("XDG_CACHE_HOME");
        QZSetInstalledFontCheck({});
    }

    /// Writes the catalog under `root`; returns its path.
    static QString WriteCatalog(const QString& root, const QByteArray& text) {
        QDir().mkpath(root + "/glyphwell");
        QFile file(root + "/glyphwell/downloadable-fonts.json");
        EXPECT_TRUE(file.open(QIODevice::WriteOnly | QIODevice::Truncate));
        file.write(text);
        return file.fileName();
    }
    /// The "LocalID"s a query for `names` returns, in order.
    std::vector<std::string> Query(std::initializer_list<const char*> names) {
        last_ = Ref(QZCopyDownloadableFontAttributesForRequests(
            FontNameDescriptors(names).as<CFArrayRef>()));
        std::vector<std::string> identifiers;
        for (CFIndex i = 0; i < CFArrayGetCount(last_.as<CFArrayRef>()); ++i)
            identifiers.push_back(String(At(i), "LocalID"));
        return identifiers;
    }
    CFDictionaryRef At(CFIndex i) const {
        return static_cast<CFDictionaryRef>(CFArrayGetValueAtIndex(last_.as<CFArrayRef>(), i));
    }
    static std::string String(CFDictionaryRef dictionary, const char* key) {
        return TextOf(CFDictionaryGetValue(dictionary, Str(key).get()));
    }

    QTemporaryDir home_;
    QTemporaryDir system_;
    Ref last_;
};

TEST_F(CatalogTest, ReturnsTheAssetsOfEachRequestedFontInRequestOrder) {
    WriteCatalog(home_.path(), "{\"assets\": [" +
                                   Asset("A", "1234567",
                                         "{\"postScriptName\": \"Regular\", \"family\": \"Sans\", "
                                         "\"localizedFamilyNames\": {\"de\": \"Serifenlos\"}}, "
                                         "{\"postScriptName\": \"Bold\"}") +
                                   ", " + Asset("B", "9", "{\"postScriptName\": \"Bold\"}") + "]}");
    EXPECT_EQ(Query({"Bold", "Unknown", "Regular"}), (std::vector<std::string>{"A", "B", "A"}));
    EXPECT_EQ(String(At(2), "NSFontFamilyAttribute"), "Sans");
    EXPECT_EQ(String(At(2), "_DownloadURL"), "https://f/A");
    EXPECT_TRUE(CFEqual(CFDictionaryGetValue(At(2), CFSTR("_DownloadSize")),
                        Num(kCFNumberSInt64Type, SInt64(1234567)).get()));
    auto names = static_cast<CFDictionaryRef>(
        CFDictionaryGetValue(At(2), CFSTR("NSCTFontLocalizedFamilyNameAttribute")));
    EXPECT_EQ(String(names, "de"), "Serifenlos");

    // Fonts that are installed already need no download.
    QZSetInstalledFontCheck([](const std::string& name) { return name == "Bold"; });
    EXPECT_EQ(Query({"Bold", "Regular"}), std::vector<std::string>{"A"});
}

TEST_F(CatalogTest, TheUserCatalogComesFirstAndChangesAreReadAgain) {
    const QByteArray text =
        "{\"assets\": [" + Asset("B", "1", "{\"postScriptName\": \"F\"}") + "]}";
    WriteCatalog(system_.path() + "/b", text);
    EXPECT_EQ(Query({"F"}), std::vector<std::string>{"B"});
    WriteCatalog(home_.path(), QByteArray(text).replace("\"B\"", "\"User\""));
    EXPECT_EQ(Query({"F"}), std::vector<std::string>{"User"});
}

TEST_F(CatalogTest, ABrokenCatalogCountsAsEmptyAndIsLoggedOnceUntilItChanges) {
    const std::string path = WriteCatalog(home_.path(), "{\"fonts\": []}").toStdString();
    LogCapture log;
    EXPECT_TRUE(Query({"F"}).empty());
    EXPECT_TRUE(Query({"F"}).empty());
    EXPECT_EQ(log.Texts(), std::vector<std::string>{"Cannot parse the downloadable font catalog " +
                                                    path + ": no \"assets\" array"});
    log.Clear();
    WriteCatalog(home_.path(), "{\"assets\": [");
    EXPECT_TRUE(Query({"F"}).empty());
    EXPECT_TRUE(Query({"F"}).empty());
    EXPECT_THAT(log.Texts(), testing::ElementsAre(
                                 testing::StartsWith("Cannot parse the downloadable font catalog " +
                                                     path + ": [json.exception.parse_error")));
}

TEST(CatalogParse, SkipsEachMalformedAssetWithOneLine) {
    const QByteArray text = "{\"assets\": [42, " + Asset("A", "-1", "{\"postScriptName\": \"F\"}") +
                            ", " + Asset("B", "1", "{\"family\": \"F\"}") + ", " +
                            Asset("C", "5", "{\"postScriptName\": \"F\"}") + ", " +
                            Asset("C", "6", "{\"postScriptName\": \"F\"}") + ", " +
                            Asset("E\\n\\u001b", "1", "{\"postScriptName\": \"F\"}") + ", " +
                            Asset("E\\n\\u001b", "1", "{\"postScriptName\": \"F\"}") + "]}";
    LogCapture log;
    const auto catalog = QZDownloadableFontCatalog::Parse(text.toStdString(), "test");
    ASSERT_EQ(catalog.assets.size(), 2u);
    EXPECT_EQ(catalog.assets[0].size, 5u);
    EXPECT_EQ(log.Texts(),
              (std::vector<std::string>{
                  "Skipping asset 0 of the downloadable font catalog test: not an object",
                  "Skipping asset 1 of the downloadable font catalog test: no \"size\" in bytes",
                  "Skipping asset 2 of the downloadable font catalog test: a font without a "
                  "\"postScriptName\"",
                  "Skipping asset 4 of the downloadable font catalog test: duplicate \"LocalID\" C",
                  // A value from the catalog cannot start a line of its own.
                  "Skipping asset 6 of the downloadable font catalog test: duplicate \"LocalID\" "
                  "E\\n\\x1b",
              }));
}

TEST(CatalogParse, StringsLongerThanAStorageBlockKeepTheirNeighboursIntact) {
    // Strings stored after one that fills its own storage block must not land past its end.
    const std::string longID(100000, 'L');
    const QByteArray text =
        "{\"assets\": [" + Asset(longID.c_str(), "1", "{\"postScriptName\": \"F\"}") + ", " +
        Asset(("X" + longID).c_str(), "-1", "{\"postScriptName\": \"F\"}") + ", " +
        Asset("B", "2", "{\"postScriptName\": \"G\", \"family\": \"H\"}") + "]}";
    std::vector<QZCatalogProblem> problems;
    const auto catalog = QZReadDownloadableFontCatalog(text.toStdString(), problems);
    ASSERT_EQ(catalog.assets.size(), 2u);
    EXPECT_EQ(catalog.assets[0].localID, longID);
    EXPECT_EQ(catalog.assets[0].url, "https://f/" + longID);
    EXPECT_EQ(catalog.assets[1].localID, "B");
    EXPECT_EQ(catalog.assets[1].fonts[0].family, "H");
    EXPECT_EQ(problems.size(), 1u);
}

TEST(CatalogParse, TheDocumentedSampleIsAValidCatalog) {
    QFile sample(qEnvironmentVariable("GLYPHWELL_SOURCE_DIR") +
                 "/resources/catalog/downloadable-fonts.sample.json");
    ASSERT_TRUE(sample.open(QIODevice::ReadOnly))
        << "GLYPHWELL_SOURCE_DIR must name the source tree (the test registration sets it)";
    LogCapture log;
    const auto catalog = QZDownloadableFontCatalog::Parse(sample.readAll().toStdString(), "sample");
    EXPECT_TRUE(log.Texts().empty());
    ASSERT_EQ(catalog.assets.size(), 2u);
    EXPECT_EQ(catalog.assets[0].fonts[1].LocalizedFamilyName("de"), "Beispiel Sans");
}

TEST(LogEscape, EscapesControlsBackslashesAndMalformedUTF8) {
    const std::vector<std::pair<std::string, std::string>> cases = {
        {"plain ünïcode ✓ 😀", "plain ünïcode ✓ 😀"},
        {"a\nb\r\tc", "a\\nb\\r\\tc"},
        {"\x1b[31mred", "\\x1b[31mred"},
        {std::string("nul\0x", 5), "nul\\x00x"},
        {"back\\slash", "back\\\\slash"},
        {"\x7f \xc2\x85", "\\x7f \\xc2\\x85"},                   // DEL and a C1 control
        {"\xff\xfe", "\\xff\\xfe"},                              // never valid
        {"\xc3", "\\xc3"},                                       // truncated
        {"\xc0\xaf \xe0\x80\xaf", "\\xc0\\xaf \\xe0\\x80\\xaf"}, // overlong
        {"\xed\xa0\x80", "\\xed\\xa0\\x80"},                     // surrogate
        {"\xf4\x90\x80\x80", "\\xf4\\x90\\x80\\x80"},            // beyond U+10FFFF
    };
    for (const auto& [value, escaped] : cases)
        EXPECT_EQ(glyphwell::LogEscape(value), escaped);
}

/// Each problem as "line:column asset: message" (asset problems) or "kind: message".
std::vector<std::string> Problems(const std::vector<QZCatalogProblem>& problems) {
    std::vector<std::string> texts;
    for (const QZCatalogProblem& p : problems)
        texts.push_back(
            p.kind == QZCatalogProblem::Kind::Asset
                ? std::to_string(p.line) + ":" + std::to_string(p.column) + " " +
                      std::to_string(p.asset) + ": " + p.message
                : (p.kind == QZCatalogProblem::Kind::Unreadable ? "unreadable: " : "malformed: ") +
                      p.message.substr(0, 32));
    return texts;
}

TEST(CatalogRead, ReportsEachProblemWithItsPlaceAndReadsMembersAsAJSONObjectDoes) {
    const std::string sha = "\"sha256\": \"" + std::string(64, 'a') + "\"";
    const auto asset = [&](const std::string& members, const std::string& fonts) {
        return "{\"LocalID\": \"A\", \"url\": \"u\", \"size\": 1, " + sha + ", " + members +
               "\"fonts\": [" + fonts + "]}";
    };
    struct Case {
        std::string text;
        std::vector<std::string> problems;
        std::vector<std::string> kept; ///< LocalIDs
    };
    const std::vector<Case> cases = {
        {"{\"assets\": [\n " + asset("\"size\": 1.5, ", "{\"postScriptName\": \"F\"}") + ",\n  " +
             asset("\"LocalID\": \"\", ", "{\"postScriptName\": \"F\"}") + ",\n" +
             asset("\"size\": 18446744073709551615, ", "{\"postScriptName\": \"F\"}") + ",\n" +
             asset("", "{\"postScriptName\": \"F\", \"family\": 3}") + ",\n" +
             asset("", "{\"postScriptName\": \"F\", \"localizedFamilyNames\": []}") + ",\n" +
             asset("", "{\"postScriptName\": \"F\", \"localizedFamilyNames\": {\"de\": 1}}") +
             ",\n" +
             asset("\"LocalID\": \"B\", \"fonts\": 1, ",
                   "{\"postScriptName\": \"F\", \"localizedFamilyNames\": {\"de\": 1, \"fr\": "
                   "\"y\", \"de\": \"x\"}}") +
             "]}",
         {"2:2 0: no \"size\" in bytes", "3:3 1: no \"LocalID\"", "4:1 2: no \"size\" in bytes",
          "5:1 3: a \"family\" that is not a string",
          "6:1 4: \"localizedFamilyNames\" that is not an object",
          "7:1 5: a localized family name that is not a string"},
         {"B"}},
        {"[]", {"malformed: no \"assets\" array"}, {}},
        {"{\"assets\": [], \"assets\": {}}", {"malformed: no \"assets\" array"}, {}},
        {"{\"assets\": [{}], \"assets\": [" + asset("", "{\"postScriptName\": \"F\"}") + "]}",
         {},
         {"A"}},
        {"{\"assets\": [{}, {",
         {"1:13 0: no \"LocalID\"", "malformed: [json.exception.parse_error.101]"},
         {}},
        {"{\"assets\": [" + asset("", "{\"postScriptName\": \"F\", \"languages\": \"ja\"}") +
             ",\n" +
             asset("\"LocalID\": \"B\", ",
                   "{\"postScriptName\": \"F\", \"languages\": [\"ja\", [1]]}") +
             ",\n" +
             asset("\"LocalID\": \"C\", ",
                   "{\"postScriptName\": \"F\", \"languages\": [\"ko\"], \"languages\": [\"ja\", "
                   "\"zh-cn\"]}, {\"postScriptName\": \"G\"}") +
             "]}",
         {"1:13 0: \"languages\" that is not an array of language tags",
          "2:1 1: \"languages\" that is not an array of language tags"},
         {"C"}},
    };
    for (const Case& test : cases) {
        SCOPED_TRACE(test.text);
        std::vector<QZCatalogProblem> problems;
        const QZDownloadableFontCatalog catalog =
            QZReadDownloadableFontCatalog(test.text, problems);
        EXPECT_EQ(Problems(problems), test.problems);
        std::vector<std::string> kept;
        for (const QZDownloadableFontAsset& entry : catalog.assets)
            kept.emplace_back(entry.localID);
        EXPECT_EQ(kept, test.kept);
    }
    std::vector<QZCatalogProblem> problems;
    const auto catalog = QZReadDownloadableFontCatalog(cases[0].text, problems);
    const QZDownloadableFont& font = catalog.assets.at(0).fonts[0];
    EXPECT_EQ(font.localizedFamilyNames.size(), 2u);
    EXPECT_EQ(font.LocalizedFamilyName("de"), "x");
    EXPECT_EQ(font.LocalizedFamilyName("fr"), "y");
    EXPECT_EQ(font.LocalizedFamilyName("it"), "");
    const auto withLanguages = QZReadDownloadableFontCatalog(cases.back().text, problems);
    const auto fonts = withLanguages.assets.at(0).fonts;
    EXPECT_EQ(std::vector<std::string_view>(fonts[0].languages.begin(), fonts[0].languages.end()),
              (std::vector<std::string_view>{"ja", "zh-cn"}));
    EXPECT_TRUE(fonts[1].languages.empty());
}

TEST(CatalogRead, AFileThatCannotBeReadOrIsTooLargeGivesAnEmptyCatalog) {
    QTemporaryDir directory;
    const std::string large = (directory.path() + "/large.json").toStdString();
    QFile file(QString::fromStdString(large));
    ASSERT_TRUE(file.open(QIODevice::WriteOnly) && file.resize((64 << 20) + 1));
    file.close();
    std::vector<QZCatalogProblem> problems;
    EXPECT_TRUE(QZReadDownloadableFontCatalogFile(large, problems).assets.empty());
    EXPECT_TRUE(QZReadDownloadableFontCatalogFile(large + ".missing", problems).assets.empty());
    EXPECT_EQ(Problems(problems),
              (std::vector<std::string>{"unreadable: larger than 67108864 bytes",
                                        "unreadable: No such file or directory"}));
}

} // namespace
