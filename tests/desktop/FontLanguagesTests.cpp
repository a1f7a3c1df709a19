// Languages and fonts: tags as clients send them, the catalog fonts chosen for a language or a
// family, and fontconfig's view of the installed fonts.
#include <QFile>
#include <QTemporaryDir>
#include <gtest/gtest.h>

#include "desktop/QZFontLanguages.h"
#include "tests/support/PrivateFonts.h"

namespace {

TEST(FontLanguageTag, NormalizesTagsAndRefusesTheRest) {
    const std::vector<std::pair<std::string, std::string>> cases = {
        {"ja", "ja"}, {"zh_CN", "zh-cn"}, {"und-Zsye", "und-zsye"},
        {"", ""},     {"j", ""},          {"japa", ""},
        {"ja-", ""},  {"ja--jp", ""},     {"-ja", ""},
        {"1a", ""},   {"ja\xc3\xa9", ""}, {std::string(33, 'a'), ""},
    };
    for (const auto& [text, tag] : cases) {
        SCOPED_TRACE(text);
        EXPECT_EQ(QZFontLanguageTag(text), tag);
    }
    EXPECT_TRUE(QZFontLanguageServes("zh-cn", "zh"));
    EXPECT_TRUE(QZFontLanguageServes("pt", "pt-br"));
    EXPECT_FALSE(QZFontLanguageServes("zh-tw", "zh-cn"));
    EXPECT_FALSE(QZFontLanguageServes("ko", "ja"));
}

TEST(CatalogFontChoice, TakesTheFirstCoveringFamilysRegularAndBoldFaces) {
    const std::string sha = std::string(64, 'a');
    const auto asset = [&](const std::string& id, const std::string& fonts) {
        return "{\"LocalID\": \"" + id + "\", \"url\": \"u\", \"size\": 1, \"sha256\": \"" + sha +
               "\", \"fonts\": [" + fonts + "]}";
    };
    const auto font = [](const std::string& name, const std::string& family,
                         const std::string& languages) {
        return "{\"postScriptName\": \"" + name + "\", \"family\": \"" + family +
               "\", \"languages\": [" + languages + "]}";
    };
    const std::string text = "{\"assets\": [" +
                             asset("a", font("Latin-Regular", "Latin", "\"en\"")) + "," +
                             asset("b", font("Mincho-Light", "Mincho", "\"ja\"")) + "," +
                             asset("c", font("Mincho-Bold", "Mincho", "\"ja\"")) + "," +
                             asset("d", font("Mincho-Regular", "Mincho", "\"ja\"") + "," +
                                            font("Mincho-Regular2", "Mincho", "\"ja\"")) +
                             "," + asset("e", font("Gothic-Regular", "Gothic", "\"ja\", \"ko\"")) +
                             "," + asset("f", font("Han-VF", "Han Sans", "\"zh-cn\"")) + "," +
                             asset("g", font("Emoji", "Emoji", "\"und-zsye\"")) + "]}";
    std::vector<QZCatalogProblem> problems;
    const QZDownloadableFontCatalog catalog = QZReadDownloadableFontCatalog(text, problems);
    ASSERT_TRUE(problems.empty());
    struct Case {
        std::string request; ///< a language tag, or "family=NAME"
        std::vector<std::string> fonts;
    };
    const std::vector<Case> cases = {
        {"ja", {"Mincho-Bold", "Mincho-Regular"}},
        {"ko", {"Gothic-Regular"}},
        {"zh", {"Han-VF"}},
        {"zh-tw", {}},
        {"und-zsye", {"Emoji"}},
        {"th", {}},
        {"family=hansans", {"Han-VF"}},
        {"family=MINCHO", {"Mincho-Bold", "Mincho-Regular"}},
        {"family=Nothing", {}},
    };
    for (const Case& test : cases) {
        SCOPED_TRACE(test.request);
        const auto chosen = test.request.starts_with("family=")
                                ? QZCatalogFontsForFamily(catalog, test.request.substr(7))
                                : QZCatalogFontsForLanguage(catalog, test.request);
        std::vector<std::string> names;
        for (const QZDownloadableFont* chosenFont : chosen)
            names.emplace_back(chosenFont->postScriptName);
        EXPECT_EQ(names, test.fonts);
    }
}

TEST(InstalledFontView, AsksFontconfigWhichLanguagesAndFamiliesAreInstalled) {
    QTemporaryDir root;
    const QString fonts = glyphwell::testing::UsePrivateFonts(root.path());
    ASSERT_FALSE(fonts.isEmpty());
    ASSERT_TRUE(
        QFile::copy(glyphwell::testing::kDejaVu + "DejaVuSans.ttf", fonts + "/DejaVuSans.ttf"));
    const QZInstalledFontView view;
    ASSERT_TRUE(view.IsValid());
    EXPECT_TRUE(view.CoversLanguage("en"));
    EXPECT_TRUE(view.CoversLanguage("ru"));
    EXPECT_FALSE(view.CoversLanguage("ja"));
    EXPECT_TRUE(view.HasFamily("DejaVu Sans"));
    EXPECT_FALSE(view.HasFamily("Mincho"));
}

} // namespace
