// Matching the fonts a document names to installed and catalog faces: each rule, in order.
#include <gtest/gtest.h>

#include "desktop/QZDocumentFontMatching.h"

namespace {

using Kind = QZDocumentFontKind;
using Rule = QZFontMatchRule;

QZMatchableFace Face(const char* postScriptName, std::vector<std::string> families,
                     const char* style, int weight, bool italic,
                     std::vector<std::string> full = {}) {
    return {postScriptName, std::move(families), style, std::move(full), weight, italic};
}

QZDocumentFont Named(const char* name, Kind kind, const char* style = "", bool embedded = false) {
    return {name, kind, style, embedded};
}

TEST(DocumentFontMatching, RulesApplyInOrder) {
    const std::vector<QZMatchableFace> faces = {
        Face("Lato-Regular", {"Lato"}, "Regular", 400, false, {"Lato"}),
        Face("Lato-Semibold", {"Lato"}, "Semibold", 600, false, {"Lato Semibold"}),
        Face("Lato-Black", {"Lato"}, "Black", 900, false, {"Lato Black"}),
        Face("Lato-Italic", {"Lato"}, "Italic", 400, true, {"Lato Italic"}),
        Face("NotoSerifJP-Regular", {"Noto Serif JP", "源ノ明朝"}, "Regular", 400, false),
        Face("Odd-Name", {"Quirky"}, "Heavy Display", 900, false),
    };
    struct Case {
        QZDocumentFont font;
        Rule rule;
        std::vector<std::string> names;
    };
    const std::vector<Case> cases = {
        {Named("Lato-Black", Kind::PostScript), Rule::PostScriptName, {"Lato-Black"}},
        {Named("Lato", Kind::Family, "semibold"), Rule::FamilyAndStyle, {"Lato-Semibold"}},
        {Named("Quirky", Kind::Family, "Heavy Display"), Rule::FamilyAndStyle, {"Odd-Name"}},
        {Named("Lato Black", Kind::Full), Rule::FullName, {"Lato-Black"}},
        // The nearest weight of the right slant: Bold is nearer Semibold than Black.
        {Named("Lato", Kind::Family, "Bold"), Rule::NearestInFamily, {"Lato-Semibold"}},
        {Named("Lato", Kind::Family, "Bold Italic"), Rule::NearestInFamily, {"Lato-Italic"}},
        {Named("NotoSerifJP", Kind::Family, "regular"),
         Rule::FamilyAndStyle,
         {"NotoSerifJP-Regular"}},
        {Named("Lato-ExtraBold", Kind::PostScript), Rule::NearestInFamily, {"Lato-Black"}},
        {Named("源ノ明朝", Kind::Family, "Regular"), Rule::FamilyAndStyle, {"NotoSerifJP-Regular"}},
        {Named("Lato", Kind::Family),
         Rule::NearestInFamily,
         {"Lato-Regular", "Lato-Semibold", "Lato-Black", "Lato-Italic"}},
        {Named("Vollkorn", Kind::Family), Rule::None, {}},
        // PostScript names are exact; the full name then compares without case or punctuation.
        {Named("lato-black", Kind::PostScript), Rule::FullName, {"Lato-Black"}},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.font.name + " " + c.font.style);
        Rule rule;
        std::vector<std::string> names;
        for (const QZMatchableFace* face : QZMatchDocumentFont(c.font, faces, &rule))
            names.push_back(face->postScriptName);
        EXPECT_EQ(rule, c.rule);
        EXPECT_EQ(names, c.names);
    }
}

// Catalog faces take their style from the PostScript name, split into words, and their family
// from the catalog when it names one.
TEST(DocumentFontMatching, CatalogFacesOfferedByStyleAndFamily) {
    QZDownloadableFontCatalog catalog = QZDownloadableFontCatalog::Parse(
        R"({"assets": [{"LocalID": "a", "url": "http://h/a", "size": 1, "sha256": ")" +
            std::string(64, '0') +
            R"(", "fonts": [{"postScriptName": "Lato-BoldItalic"}, {"postScriptName": "Lato-Bold"},
              {"postScriptName": "Gelasio-Regular", "family": "Gelasio Text"}]}]})",
        "test");
    const QZDocumentFontMatcher matcher({}, QZCatalogMatchableFaces(catalog));
    for (const auto& [font, name] :
         {std::pair{Named("Lato", Kind::Family, "Bold Italic"), "Lato-BoldItalic"},
          std::pair{Named("Gelasio Text", Kind::Family), "Gelasio-Regular"}}) {
        SCOPED_TRACE(font.name);
        const QZDocumentFontMatch match = matcher.Match(font);
        EXPECT_EQ(match.state, QZDocumentFontState::Offered);
        EXPECT_EQ(match.postScriptNames, std::vector<std::string>{name});
    }
}

} // namespace
