// `glyphwell fonts` on real documents, with a private fontconfig (DejaVu Sans installed) and a
// private catalog (Lato offered): every state of every format, and bad inputs.
#ifdef GLYPHWELL_CATALOG_TOOL
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>
#include <zip.h>

#include <QTemporaryDir>
#include <filesystem>
#include <fstream>
#include <functional>
#include <gtest/gtest.h>
#include <nlohmann/json.hpp>
#include <qpdf/QPDF.hh>
#include <qpdf/QPDFWriter.hh>

#include "support/PDFFile.h"
#include "support/PrivateFonts.h"
#include "tests/tools/ToolRun.h"

namespace {

namespace fs = std::filesystem;
using glyphwell::testing::Invoke;
using glyphwell::testing::PDFFromObjects;

std::string Fixture(const std::string& name) {
    const char* source = getenv("GLYPHWELL_SOURCE_DIR");
    return std::string(source ? source : ".") + "/tests/documents/fixtures/" + name;
}

std::string Contents(const std::string& path) {
    std::ifstream file(path, std::ios::binary);
    return std::string(std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>());
}

void Write(const std::string& path, const std::string& bytes) {
    std::ofstream(path, std::ios::binary) << bytes;
}

class FontsCommandTest : public ::testing::Test {
protected:
    void SetUp() override {
        ASSERT_TRUE(root_.isValid());
        // The installed fonts are in place before fontconfig first looks.
        const QString fonts = root_.path() + "/data/fonts";
        ASSERT_TRUE(QDir().mkpath(fonts));
        for (const char* file : {"DejaVuSans.ttf", "DejaVuSans-Bold.ttf"})
            ASSERT_TRUE(QFile::copy(glyphwell::testing::kDejaVu + file, fonts + "/" + file));
        ASSERT_EQ(glyphwell::testing::UsePrivateFonts(root_.path()), fonts);
        std::vector<std::string> assets;
        for (const char* face : {"Lato-Regular", "Lato-Bold", "Lato-Italic"})
            assets.push_back(glyphwell::testing::CatalogAsset(
                face, std::string("http://127.0.0.1:9/") + face + ".ttf", 1000,
                std::string(64, '0'), face));
        ASSERT_TRUE(glyphwell::testing::WriteCatalog(root_.path() + "/data", assets));
    }
    // The private configuration stays loaded: loading Debian's system configuration again leaks
    // inside fontconfig 2.14 (its no-bitmaps rule), which LeakSanitizer reports.
    void TearDown() override {
        for (const char* name :
             {"XDG_DATA_HOME", "XDG_DATA_DIRS", "XDG_CACHE_HOME", "FONTCONFIG_FILE"})
            unsetenv(name);
    }

    /// Each font of each file as "name/kind/style/e-or-dash/state/PostScript names".
    std::vector<std::vector<std::string>> Fonts(const std::vector<std::string>& files) {
        std::vector<std::string> arguments = {"fonts", "--json"};
        for (const std::string& file : files)
            arguments.push_back(Fixture(file));
        const auto result = Invoke(arguments);
        EXPECT_NE(result.status, 2) << result.err;
        std::vector<std::vector<std::string>> lists;
        const nlohmann::json document = nlohmann::json::parse(result.out);
        for (const auto& file : document["files"]) {
            std::vector<std::string>& list = lists.emplace_back();
            for (const auto& font : file["fonts"]) {
                std::string line = font["name"].get<std::string>() + "/" +
                                   font["kind"].get<std::string>() + "/" + font.value("style", "") +
                                   "/" + (font["embedded"].get<bool>() ? "e" : "-") + "/" +
                                   font["state"].get<std::string>() + "/";
                for (const auto& name : font.value("postScriptNames", nlohmann::json::array()))
                    line += name.get<std::string>() + " ";
                list.push_back(line);
            }
        }
        return lists;
    }

    /// `files` with their expected lists, compared in one run of the tool.
    void Check(const std::vector<std::pair<std::string, std::vector<std::string>>>& expected) {
        std::vector<std::string> files;
        for (const auto& [file, list] : expected)
            files.push_back(file);
        const auto lists = Fonts(files);
        ASSERT_EQ(lists.size(), expected.size());
        for (size_t i = 0; i < expected.size(); ++i) {
            SCOPED_TRACE(expected[i].first);
            EXPECT_EQ(lists[i], expected[i].second);
        }
    }

    QTemporaryDir root_;
};

// Every format in one run. LibreOffice's OOXML adds its own defaults to the font table and
// themes; the flat OpenDocument form keeps the embedded font as binary data inside its font face;
// a PDF Type 0 font is named by its face, without subset tag or ",Bold" suffix; generic families
// are no fonts; @font-face and attached fonts are carried by the file.
TEST_F(FontsCommandTest, EveryFormat) {
    const auto missing = [](const std::string& family) { return family + "/family//-/missing/"; };
    const std::string sans = "DejaVu Sans/family//-/installed/", serif = missing("DejaVu Serif"),
                      embeddedSerif = "DejaVu Serif/family//e/embedded/",
                      lato = "Lato/family//-/offered/Lato-Regular Lato-Bold Lato-Italic ",
                      vollkorn = missing("Vollkorn"), arial = missing("Arial"),
                      times = missing("Times New Roman"), symbol = missing("Symbol"),
                      hei = missing("WenQuanYi Micro Hei");
    const std::vector<std::string> embeddedODF = {sans, embeddedSerif, lato, vollkorn, hei};
    Check(
        {{"sample.docx", {sans, lato, vollkorn, serif, times, symbol, arial}},
         {"sample-embedded.docx", {sans, lato, vollkorn, embeddedSerif, hei, times, symbol, arial}},
         {"sample.pptx", {serif, arial, sans, lato, vollkorn}},
         {"sample.xlsx", {serif, arial, sans, lato, vollkorn}},
         {"sample.fodt", {sans, serif, lato, vollkorn}},
         {"sample-embedded.odt", embeddedODF},
         {"sample-embedded.fodt", embeddedODF},
         {"sample.fodp", {sans, lato, vollkorn}},
         {"sample.fods", {sans, lato, vollkorn}},
         {"handmade.pdf",
          {"Vollkorn-Bold/postscript//-/missing/", "DejaVuSans/family/Bold/-/installed/",
           "Lato-Italic/postscript//-/offered/Lato-Italic ", "Gelasio/postscript//e/embedded/",
           "Helvetica/postscript//-/missing/"}},
         {"sample.pdf",
          {"DejaVuSans/postscript//e/embedded/", "DejaVuSans-Bold/postscript//e/embedded/",
           "DejaVuSerif/postscript//e/embedded/"}},
         {"sample.svg", {sans, "Gelasio/family//e/embedded/", vollkorn, lato}},
         {"sample.html", {sans, lato, vollkorn, serif}},
         {"sample.epub", {serif, vollkorn, lato, sans}},
         {"sample.ass",
          {sans, "Lato/family/Bold/-/offered/Lato-Bold ", "Gelasio/family/Italic/e/embedded/",
           "Gelasio/family//e/embedded/", vollkorn, missing("Serif Display")}}});
}

TEST_F(FontsCommandTest, TextOutputAndExitStatus) {
    EXPECT_EQ(Invoke({"fonts", Fixture("sample.pdf")}),
              (glyphwell::testing::ToolResult{
                  0,
                  Fixture("sample.pdf") +
                      " (pdf)\n"
                      "  embedded  DejaVuSans (postscript)\n"
                      "  embedded  DejaVuSans-Bold (postscript)\n"
                      "  embedded  DejaVuSerif (postscript)\n"
                      "3 fonts in 1 file: 3 embedded, 0 installed, 0 offered, 0 missing\n",
                  ""}));
    const auto result = Invoke({"fonts", Fixture("sample.ass")});
    EXPECT_EQ(result.status, 1);
    EXPECT_NE(result.out.find("  offered   Lato, Bold (family): Lato-Bold\n"), std::string::npos)
        << result.out;
    // Offered fonts but no agent to ask: the question fails and the fonts stay offered.
    const auto asked = Invoke(
        {"fonts", "--ask", "--name", "org.glyphwell.test.NoSuchAgent", Fixture("sample.ass")});
    EXPECT_EQ(asked.status, 1);
    EXPECT_NE(asked.err.find("glyphwell fonts: cannot ask for the offered fonts: "),
              std::string::npos)
        << asked.err;
    EXPECT_NE(asked.out.find("  offered   Lato, Bold"), std::string::npos) << asked.out;
    // A name with a terminal escape sequence is printed escaped.
    const std::string subtitles = root_.path().toStdString() + "/escape.ass";
    Write(subtitles, "[Script Info]\n[V4+ Styles]\nStyle: A,Red\x1b[31mName,20\n");
    EXPECT_NE(Invoke({"fonts", subtitles}).out.find("  missing   Red\\x1b[31mName (family)\n"),
              std::string::npos);
    EXPECT_EQ(Invoke({"fonts"}).status, 2);
    EXPECT_EQ(Invoke({"fonts", "--bogus", Fixture("sample.ass")}).status, 2);
}

/// Writes a ZIP archive of `members` (name, text) to `path`; `encrypted` members use AES.
void MakeZip(const std::string& path,
             const std::vector<std::pair<std::string, std::string>>& members,
             const std::string& encrypted = "") {
    int error = 0;
    zip_t* archive = zip_open(path.c_str(), ZIP_CREATE | ZIP_TRUNCATE, &error);
    ASSERT_NE(archive, nullptr);
    for (const auto& [name, text] : members) {
        zip_source_t* source = zip_source_buffer(archive, text.data(), text.size(), 0);
        const zip_int64_t index = zip_file_add(archive, name.c_str(), source, ZIP_FL_OVERWRITE);
        ASSERT_GE(index, 0);
        const int set = name == encrypted ? zip_file_set_encryption(archive, zip_uint64_t(index),
                                                                    ZIP_EM_AES_256, "pw")
                                          : 0;
        ASSERT_EQ(set, 0);
    }
    ASSERT_EQ(zip_close(archive), 0);
}

TEST_F(FontsCommandTest, UnreadableFilesAreNamedAndTheOthersStillReported) {
    const std::string directory = root_.path().toStdString();
    const std::string docx = "word/document.xml";
    const std::string form = "<< /Type /XObject /Subtype /Form /BBox [0 0 1 1] /Resources << "
                             "/XObject << /X 4 0 R >> >> /Length 0 >>\nstream\n\nendstream";
    struct Case {
        const char* name;
        std::function<void(const std::string& path)> make;
        const char* reason;
    };
    const std::vector<Case> cases = {
        {"zip bomb member",
         [&](const std::string& path) {
             MakeZip(path, {{docx, std::string(65 << 20, ' ')}});
         },
         "ZIP member word/document.xml inflates to more than 64 MiB"},
        {"zip bomb archive",
         [&](const std::string& path) {
             const std::string part = "<a>" + std::string(60 << 20, ' ') + "</a>";
             MakeZip(path, {{docx, "<a/>"},
                            {"word/1.xml", part},
                            {"word/2.xml", part},
                            {"word/3.xml", part}});
         },
         "ZIP archive inflates to more than 128 MiB"},
        {"encrypted zip",
         [&](const std::string& path) {
             MakeZip(path, {{docx, "<a/>"}}, docx);
         },
         "encrypted ZIP member word/document.xml"},
        {"damaged zip",
         [&](const std::string& path) {
             std::string bytes = Contents(Fixture("sample.docx"));
             const size_t member = bytes.find(docx);
             for (size_t i = member + 40; i < member + 80; ++i)
                 bytes[i] = char(bytes[i] ^ 0x5A);
             Write(path, bytes);
         },
         "damaged ZIP member word/document.xml"},
        {"entity expansion",
         [&](const std::string& path) {
             std::string dtd = "<!DOCTYPE svg [<!ENTITY e0 \"lol\">";
             for (int i = 1; i < 12; ++i)
                 dtd += "<!ENTITY e" + std::to_string(i) + " \"" + [&] {
                     std::string refs;
                     for (int n = 0; n < 10; ++n)
                         refs += "&e" + std::to_string(i - 1) + ";";
                     return refs;
                 }() + "\">";
             Write(path, dtd + "]><svg xmlns=\"http://www.w3.org/2000/svg\">&e11;</svg>");
         },
         "amplification"},
        {"deep nesting",
         [&](const std::string& path) {
             std::string svg = "<svg xmlns=\"http://www.w3.org/2000/svg\">";
             for (int i = 0; i < 300; ++i)
                 svg += "<g>";
             Write(path, svg);
         },
         "elements nested deeper than 256"},
        {"damaged pdf",
         [&](const std::string& path) {
             std::string bytes = Contents(Fixture("handmade.pdf"));
             const size_t offset = bytes.rfind("startxref\n") + 10;
             bytes.replace(offset, bytes.find('\n', offset) - offset, "5");
             Write(path, bytes);
         },
         "damaged PDF"},
        {"encrypted pdf",
         [&](const std::string& path) {
             QPDF pdf;
             pdf.processFile(Fixture("handmade.pdf").c_str());
             QPDFWriter writer(pdf, path.c_str());
             writer.setR6EncryptionParameters("user", "owner", true, true, true, true, true, true,
                                              qpdf_r3p_full, true);
             writer.write();
         },
         "encrypted PDF: a password is needed"},
        {"pdf reference loop",
         [&](const std::string& path) {
             Write(path, PDFFromObjects({"<< /Type /Catalog /Pages 2 0 R >>",
                                         "<< /Type /Pages /Kids [3 0 R] /Count 1 >>",
                                         "<< /Type /Page /Parent 2 0 R /MediaBox [0 0 1 1] "
                                         "/Resources << /XObject << /X 4 0 R >> >> >>",
                                         form}));
         },
         "damaged PDF: reference loop at object 4"},
        {"sparse 2 GB file",
         [&](const std::string& path) {
             const int descriptor = open(path.c_str(), O_CREAT | O_WRONLY, 0600);
             ASSERT_EQ(ftruncate(descriptor, off_t(2) << 30), 0);
             close(descriptor);
         },
         "larger than 1024 MiB"},
        {"directory", [&](const std::string& path) { fs::create_directory(path); },
         "a directory, not a document"},
        {"fifo", [&](const std::string& path) { ASSERT_EQ(mkfifo(path.c_str(), 0600), 0); },
         "a FIFO, not a document"},
        {"no document", [&](const std::string& path) { Write(path, "just text\n"); },
         "not a document format glyphwell reads"},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        const std::string path = directory + "/" + c.name;
        c.make(path);
        const auto result = Invoke({"fonts", "--json", path, Fixture("sample.ass")});
        EXPECT_EQ(result.status, 2);
        const std::string line = "glyphwell fonts: " + path + ": ";
        EXPECT_EQ(result.err.substr(0, line.size()), line) << result.err;
        EXPECT_NE(result.err.find(c.reason), std::string::npos) << result.err;
        const auto files = nlohmann::json::parse(result.out)["files"];
        ASSERT_EQ(files.size(), 2u);
        EXPECT_EQ(files[0],
                  (nlohmann::json{{"file", path},
                                  {"error", result.err.substr(line.size(), result.err.size() -
                                                                               line.size() - 1)}}));
        EXPECT_EQ(files[1]["format"], "ass");
        fs::remove_all(path);
    }
}

} // namespace
#endif
