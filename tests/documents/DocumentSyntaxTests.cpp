// The syntaxes that name fonts, on short inputs that each hold one trap: the font shorthand,
// comments and escapes, @font-face, raw text in HTML, reordered subtitle fields, namespace
// prefixes, and broken XML.
#include <gtest/gtest.h>

#include "documents/QZDocumentFonts.h"

namespace {

struct Case {
    const char* input;
    const char* format;
    std::vector<std::string> fonts; ///< "name/kind/style/e-or-dash"
    const char* error = "";
};

TEST(DocumentSyntax, NamesComeFromWhereEachSyntaxPutsThem) {
    const std::vector<Case> cases = {
        {"<svg xmlns='http://www.w3.org/2000/svg'><style>p { font: italic bold 12px/30px Georgia, "
         "\"Times New Roman\", serif } q { font: 1.2em / 2 Arial }</style></svg>",
         "svg",
         {"Georgia/family//-", "Times New Roman/family//-", "Arial/family//-"}},
        {"<svg xmlns='http://www.w3.org/2000/svg'><style>/* font-family: Fake */ h1 { "
         "font-family: 'It\\'s', Open   Sans !important; } h2 { font-family: inherit "
         "}</style></svg>",
         "svg",
         {"It's/family//-", "Open Sans/family//-"}},
        {"<!DOCTYPE html><style>@font-face { font-family: X; src: local(\"Lato Black\"), "
         "local(Lato-Black) } @font-face{font-family:\"Gelasio\";font-weight:700;font-style:"
         "italic;src:url(g.woff2)} @media screen { @supports (x) { b { font-family: Gelasio } } }"
         "</style>",
         "html",
         {"Lato Black/full//-", "Lato-Black/full//-", "Gelasio/family/Bold Italic/e",
          "Gelasio/family//-"}},
        {"<HTML><p style=\"font-family: &quot;Fira Sans&quot;, -vendor-system, sans-serif\">"
         "<font face=Lato,Arial>"
         "<script>var s = '<style>p{font-family:Nope}</style>'</script><!-- <font face=No> -->",
         "html",
         {"Fira Sans/family//-", "Lato/family//-", "Arial/family//-"}},
        {"\xEF\xBB\xBF[Script Info]\n[V4 Styles]\nFormat: Name, Bold, Fontname\nStyle: A,-1,@Lato\n"
         "[Events]\nDialogue: 0,0:00:00.00,0:00:01.00,A,,0,0,0,,{\\b1\\fn Serif Display \\i1}x\n",
         "ssa",
         {"Lato/family/Bold/-", "Serif Display/family//-"}},
        {"<x:document xmlns:x='urn:oasis:names:tc:opendocument:xmlns:office:1.0' "
         "xmlns:s='urn:oasis:names:tc:opendocument:xmlns:style:1.0' "
         "x:mimetype='application/vnd.oasis.opendocument.spreadsheet'><s:font-face "
         "xmlns:q='urn:oasis:names:tc:opendocument:xmlns:svg-compatible:1.0' "
         "q:font-family=\"&apos;A B&apos;\"/><s:style x:style='font-family: C' "
         "s:font-family-asian='D'/></x:document>",
         "fods",
         {"A B/family//-", "D/family//-"}},
        {"<svg xmlns='http://www.w3.org/2000/svg'><text font-family='Lato'>",
         "svg",
         {},
         "XML error at line 1: no element found"},
        {"<html xmlns='http://www.w3.org/1999/xhtml'><p style='font-family: Lato'>&nbsp;</p>",
         "html",
         {"Lato/family//-"}},
        {"<note/>", "", {}, "an XML document in no format glyphwell reads (root element note)"},
        {"%PDF-1.4\n%%EOF\n", "pdf", {}, "damaged PDF"},
        {"PK\x05\x06", "", {}, "not a ZIP archive"},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.input);
        const QZDocumentScan scan = QZScanDocumentBytes(c.input);
        EXPECT_EQ(scan.format, c.format);
        if (*c.error)
            EXPECT_EQ(scan.error.substr(0, std::string_view(c.error).size()), c.error);
        else
            EXPECT_EQ(scan.error, "");
        std::vector<std::string> fonts;
        for (const QZDocumentFont& font : scan.fonts)
            fonts.push_back(font.name + "/" + QZDocumentFontKindName(font.kind) + "/" + font.style +
                            "/" + (font.embedded ? "e" : "-"));
        EXPECT_EQ(fonts, c.fonts);
    }
}

// A document that names more fonts than any real one is refused rather than listed in part.
TEST(DocumentSyntax, TooManyFontsIsAnError) {
    std::string html = "<html><p style=\"font-family: F0";
    for (int i = 1; i <= 4096; ++i)
        html += ", F" + std::to_string(i) + ", f" + std::to_string(i);
    const QZDocumentScan scan = QZScanDocumentBytes(html);
    EXPECT_EQ(scan.error, "names more than 4096 fonts");
    EXPECT_TRUE(scan.fonts.empty());
    html.resize(html.find(", F4096"));
    EXPECT_EQ(QZScanDocumentBytes(html).fonts.size(), 4096u);
}

} // namespace
