// `glyphwell catalog` on installed fonts, offline and against a loopback HTTP server (the verb
// exists when the tool is built with the agent's libraries).
#ifdef GLYPHWELL_CATALOG_TOOL
#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <nlohmann/json.hpp>
#include <sys/stat.h>

#include "support/LoopbackHTTPServer.h"
#include "support/SHA256.h"
#include "tests/tools/ToolRun.h"

namespace {

namespace fs = std::filesystem;
using Json = nlohmann::ordered_json;
using glyphwell::testing::SHA256Of;
using Result = glyphwell::testing::ToolResult;

const std::string kDejaVu = "/usr/share/fonts/truetype/dejavu/";
const std::string kCollection = "/usr/share/fonts/truetype/wqy/wqy-microhei.ttc";

std::string Contents(const std::string& path) {
    std::ifstream file(path, std::ios::binary);
    return std::string(std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>());
}

class CatalogCommandTest : public ::testing::Test {
protected:
    void SetUp() override {
        char pattern[] = "/tmp/gw-catalog-XXXXXX";
        directory_ = mkdtemp(pattern);
        catalog_ = directory_ + "/fonts.json";
    }
    void TearDown() override { fs::remove_all(directory_); }

    Result Run(std::vector<std::string> arguments) {
        arguments.insert(arguments.begin(), "catalog");
        return glyphwell::testing::Invoke(arguments);
    }
    Result Add(const std::vector<std::string>& files, const std::string& prefix) {
        std::vector<std::string> arguments = {"add"};
        arguments.insert(arguments.end(), files.begin(), files.end());
        arguments.insert(arguments.end(), {"--url-prefix", prefix, "--catalog", catalog_});
        return Run(arguments);
    }
    void Write(const std::string& text) { std::ofstream(catalog_, std::ios::binary) << text; }

    std::string directory_;
    std::string catalog_;
};

} // namespace

TEST_F(CatalogCommandTest, AddsEveryFaceAndKeepsWhatItDidNotTouch) {
    if (!fs::exists(kCollection))
        GTEST_SKIP() << kCollection << " is not installed (fonts-wqy-microhei)";
    Write(R"({"publisher": "kept", "assets": [{"LocalID": "Other", "url": "http://o/x.ttf",
              "size": 1, "sha256": "00", "fonts": [{"postScriptName": "X"}], "note": 1}]})");
    Result result = Add({kDejaVu + "DejaVuSans-Bold.ttf", kCollection}, "http://h/fonts");
    ASSERT_EQ(result.status, 0) << result.err;
    const std::string bold = Contents(kDejaVu + "DejaVuSans-Bold.ttf");
    EXPECT_EQ(result.out, "added DejaVuSans-Bold (1 font, " + std::to_string(bold.size()) +
                              " bytes) http://h/fonts/DejaVuSans-Bold.ttf\n"
                              "added WenQuanYiMicroHei+WenQuanYiMicroHeiMono (2 fonts, " +
                              std::to_string(fs::file_size(kCollection)) +
                              " bytes) http://h/fonts/wqy-microhei.ttc\n" + catalog_ +
                              ": 3 assets\n");
    Json document = Json::parse(Contents(catalog_));
    EXPECT_EQ(document["publisher"], "kept");
    ASSERT_EQ(document["assets"].size(), 3u);
    EXPECT_EQ(document["assets"][0]["note"], 1);
    // The languages are fontconfig's coverage of each face: compared apart, by sample.
    Json boldAsset = document["assets"][1];
    const Json languages = boldAsset["fonts"][0]["languages"];
    boldAsset["fonts"][0].erase("languages");
    const auto covers = [](const Json& tags, const char* tag) {
        return std::find(tags.begin(), tags.end(), tag) != tags.end();
    };
    EXPECT_TRUE(covers(languages, "en") && covers(languages, "ru") && !covers(languages, "ja"))
        << languages;
    EXPECT_EQ(boldAsset,
              Json::parse(R"({"LocalID": "DejaVuSans-Bold",
        "url": "http://h/fonts/DejaVuSans-Bold.ttf", "size": )" +
                          std::to_string(bold.size()) + R"(, "sha256": ")" + SHA256Of(bold) + R"(",
        "fonts": [{"postScriptName": "DejaVuSans-Bold", "family": "DejaVu Sans"}]})"));
    const Json& collection = document["assets"][2];
    ASSERT_EQ(collection["fonts"].size(), 2u);
    EXPECT_EQ(collection["fonts"][1]["postScriptName"], "WenQuanYiMicroHeiMono");
    EXPECT_EQ(collection["fonts"][0]["localizedFamilyNames"]["zh-Hans"], "文泉驿微米黑");
    EXPECT_TRUE(covers(collection["fonts"][0]["languages"], "zh-cn"));

    // Adding a file again updates its entry in place.
    result = Add({kDejaVu + "DejaVuSans-Bold.ttf"}, "https://mirror/f/");
    ASSERT_EQ(result.status, 0) << result.err;
    EXPECT_EQ(result.out.substr(0, 24), "updated DejaVuSans-Bold ");
    document = Json::parse(Contents(catalog_));
    ASSERT_EQ(document["assets"].size(), 3u);
    EXPECT_EQ(document["assets"][1]["url"], "https://mirror/f/DejaVuSans-Bold.ttf");
    EXPECT_EQ(Run({"check", catalog_}).status, 1); // "Other" has no proper SHA-256
}

TEST_F(CatalogCommandTest, RefusesBadInputAndLeavesTheCatalogAlone) {
    const std::string notAFont = directory_ + "/notes.ttf";
    std::ofstream(notAFont) << "not a font";
    const std::string fifo = directory_ + "/pipe.ttf";
    ASSERT_EQ(mkfifo(fifo.c_str(), 0600), 0);
    const std::string sans = kDejaVu + "DejaVuSans.ttf";
    struct Case {
        const char* catalog;
        std::vector<std::string> arguments;
        int status;
        std::string message;
    } cases[] = {
        {"{\"assets\": []}",
         {"add", sans, notAFont, "--url-prefix", "http://h/"},
         1,
         notAFont + ": not a font file fontconfig can read"},
        {"{}",
         {"add", directory_ + "/absent.ttf", "--url-prefix", "http://h/"},
         1,
         directory_ + "/absent.ttf: no such file"},
        {"{}",
         {"add", directory_, "--url-prefix", "http://h/"},
         1,
         directory_ + ": not a regular file"},
        {"{}", {"add", fifo, "--url-prefix", "http://h/"}, 1, fifo + ": not a regular file"},
        {"{}",
         {"add", sans, "--url-prefix", "javascript:alert(1)"},
         2,
         "--url-prefix must be an http:// or https:// URL, not javascript:alert(1)"},
        {"{}", {"add", sans, "--url-prefix", "file:///srv/fonts"}, 2, "not file:///srv/fonts"},
        {"{}", {"add", sans, "--url-prefix", "https:///nohost"}, 2, "not https:///nohost"},
        {"[1, 2]",
         {"add", sans, "--url-prefix", "HTTPS://h"},
         1,
         ": no \"assets\" array; fix or remove it first"},
        {"{", {"add", sans, "--url-prefix", "http://h/"}, 1, ": not JSON"},
        {"{}", {"add", sans}, 2, "give the font files and --url-prefix"},
        {"{}", {"check", "--bogus"}, 2, "unknown option --bogus"},
        {"{}", {"list", "a", "b"}, 2, "more than one catalog given"},
        {"{}", {"remove"}, 2, "give add, check, list or refresh"},
    };
    for (const Case& c : cases) {
        Write(c.catalog);
        std::vector<std::string> arguments = c.arguments;
        if (arguments[0] == "add")
            arguments.insert(arguments.end(), {"--catalog", catalog_});
        const Result result = Run(arguments);
        EXPECT_EQ(result.status, c.status) << c.message;
        EXPECT_NE(result.err.find(c.message), std::string::npos) << result.err;
        EXPECT_EQ(Contents(catalog_), c.catalog);
    }
}

// The reader's own lines are checked with the reader; the verb prints each and counts them.
TEST_F(CatalogCommandTest, ReportsADamagedEntryWithItsPlace) {
    const std::string good = R"({"LocalID": "A", "url": "http://h/a.ttf", "size": 3,
        "sha256": ")" + std::string(64, 'a') +
                             R"(", "fonts": [{"postScriptName": "A"}]})";
    Write(R"({"assets": [)" + good + "," + good + "]}");
    EXPECT_EQ(
        Run({"check", catalog_}),
        (Result{1,
                "Skipping asset 1 of the downloadable font catalog " + catalog_ +
                    ": duplicate \"LocalID\" A\n" + catalog_ + ": 1 assets, 1 fonts; 1 problem\n",
                ""}));
    Write(R"({"assets": [)" + good + "]}");
    EXPECT_EQ(Run({"check", catalog_}).out, catalog_ + ": 1 assets, 1 fonts; 0 problems\n");
}

TEST_F(CatalogCommandTest, FetchComparesEveryAssetWithTheCatalog) {
    glyphwell::testing::LoopbackHTTPServer server;
    ASSERT_TRUE(server.IsListening());
    const std::string sans = Contents(kDejaVu + "DejaVuSans-Bold.ttf");
    const std::string serif = Contents(kDejaVu + "DejaVuSerif.ttf");
    ASSERT_EQ(
        Add({kDejaVu + "DejaVuSans-Bold.ttf", kDejaVu + "DejaVuSerif.ttf"}, server.URL("/fonts"))
            .status,
        0);
    EXPECT_EQ(Run({"check", catalog_}).status, 0);
    server.Serve("/fonts/DejaVuSans-Bold.ttf", {.body = sans});

    std::string changed = serif;
    changed[1000] ^= 1;
    struct Case {
        const char* what;
        bool serve;
        std::string body;
        std::string problem; // empty: clean
    } cases[] = {
        {"intact", true, serif, ""},
        {"one byte changed", true, changed,
         "asset DejaVuSerif: " + server.URL("/fonts/DejaVuSerif.ttf") + " has the SHA-256 " +
             SHA256Of(changed) + ", the catalog says " + SHA256Of(serif) + "\n"},
        {"shorter", true, serif.substr(0, 100),
         "asset DejaVuSerif: " + server.URL("/fonts/DejaVuSerif.ttf") +
             " has 100 bytes, the catalog says " + std::to_string(serif.size()) + "\n"},
        {"longer", true, serif + "x",
         "asset DejaVuSerif: " + server.URL("/fonts/DejaVuSerif.ttf") + " has more than " +
             std::to_string(serif.size()) + " bytes, the catalog says " +
             std::to_string(serif.size()) + "\n"},
        {"missing", false, "", "asset DejaVuSerif: cannot download "},
    };
    for (const Case& c : cases) {
        server.Serve("/fonts/DejaVuSerif.ttf",
                     {.body = c.body, .redirectTo = c.serve ? "" : "/gone"});
        const Result result = Run({"check", catalog_, "--fetch"});
        EXPECT_EQ(result.status, c.problem.empty() ? 0 : 1) << c.what;
        const std::string summary = catalog_ + ": 2 assets, 2 fonts, downloaded; " +
                                    (c.problem.empty() ? "0 problems\n" : "1 problem\n");
        if (c.serve)
            EXPECT_EQ(result.out, c.problem + summary) << c.what;
        else
            EXPECT_EQ(result.out.find(c.problem), 0u) << result.out;
    }
}

TEST_F(CatalogCommandTest, ListsWhatIsOfferedAndWhatIsInstalled) {
    Write(R"({"assets": [{"LocalID": "S", "url": "http://h/s", "size": 7, "sha256": ")" +
          std::string(64, '0') + R"(", "fonts": [{"postScriptName": "DejaVuSans-Bold",
          "family": "DejaVu Sans"}, {"postScriptName": "Nobody-Regular"}]}]})");
    const Result result = Run({"list", catalog_});
    EXPECT_EQ(result.status, 0) << result.err;
    EXPECT_EQ(result.out, "installed\tDejaVuSans-Bold\tDejaVu Sans\tS\t7\t" + catalog_ +
                              "\n"
                              "offered\tNobody-Regular\t\tS\t7\t" +
                              catalog_ + "\n");
}

#endif // GLYPHWELL_CATALOG_TOOL
