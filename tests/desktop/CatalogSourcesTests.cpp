// The merged view of the user's, the publishers' and the system catalogs.
#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>

#include "desktop/QZCatalogPaths.h"
#include "desktop/QZCatalogSources.h"
#include "support/LogCapture.h"
#include "support/Minisign.h"
#include "support/ScopedEnvironment.h"

namespace {

namespace fs = std::filesystem;

std::string Catalog(const std::string& id, std::initializer_list<const char*> fonts) {
    std::string list;
    for (const char* font : fonts)
        list += std::string(list.empty() ? "" : ", ") + R"({"postScriptName": ")" + font + "\"}";
    return R"({"assets": [{"LocalID": ")" + id + R"(", "url": "https://h/)" + id +
           R"(", "size": 1, "sha256": ")" + std::string(64, 'a') + R"(", "fonts": [)" + list +
           "]}]}";
}

void Write(const std::string& path, const std::string& text) {
    fs::create_directories(fs::path(path).parent_path());
    std::ofstream(path, std::ios::binary) << text;
}

/// "LocalID:font,font@source" for each asset of the current merged view.
std::vector<std::string> View() {
    const auto merged = QZCurrentMergedDownloadableFontCatalog();
    std::vector<std::string> lines;
    for (size_t i = 0; i < merged->catalog.assets.size(); ++i) {
        const QZDownloadableFontAsset& asset = merged->catalog.assets[i];
        std::string line = std::string(asset.localID) + ":";
        for (const QZDownloadableFont& font : asset.fonts)
            line += std::string(font.postScriptName) + (&font == &asset.fonts.back() ? "" : ",");
        lines.push_back(line + "@" + merged->sources[merged->assetSources[i]].label);
    }
    return lines;
}

TEST(CatalogSources, TheFirstSourceOfANameWinsAndOnlyVerifiedCurrentPublishersCount) {
    char pattern[] = "/tmp/gw-sources-XXXXXX";
    const std::string root = mkdtemp(pattern);
    glyphwell::testing::MinisignKey key(root, "k"), other(root, "o");
    if (!key.IsValid())
        GTEST_SKIP() << "minisign is not installed";
    glyphwell::testing::ScopedEnvironment environment;
    for (const char* name : {"XDG_DATA_HOME", "XDG_CONFIG_HOME", "XDG_CACHE_HOME"})
        environment.Set(name, (root + "/" + name).c_str());
    environment.Set("XDG_DATA_DIRS", (root + "/system").c_str());
    const std::string system = root + "/system/glyphwell/downloadable-fonts.json";
    Write(root + "/XDG_DATA_HOME/glyphwell/downloadable-fonts.json", Catalog("U", {"F1"}));
    Write(system, Catalog("S", {"F3", "F4"}));
    const auto publish = [&](const std::string& name, const std::string& catalog,
                             const std::string& state, const std::string& publicKey) {
        const std::string kept = root + "/XDG_CACHE_HOME/glyphwell/publishers/" + name;
        Write(kept + "/catalog.json", catalog);
        ASSERT_TRUE(key.Sign(kept + "/catalog.json", "timestamp:10"));
        Write(kept + "/state", state);
        Write(root + "/XDG_CONFIG_HOME/glyphwell/publishers.d/" + name + ".conf",
              "url = https://p/" + name + "\npublic-key = " + publicKey + "\n");
    };
    publish("a", Catalog("A", {"F1", "F2"}), "version: 10\n", key.PublicKey());

    const std::string expired = std::to_string(time(nullptr) - 1);
    const std::string later = std::to_string(time(nullptr) + 3600);
    struct Case {
        const char* what;
        std::string state;
        bool otherKey;
        bool tamper;
        std::string view3; // the asset that offers F3
        std::string log;   // the start of the one line logged, if any
    } cases[] = {
        {"verified", "version: 10\nexpires: " + later + "\n", false, false, "B:F3@publisher/b", ""},
        {"expired", "version: 10\nexpires: " + expired + "\n", false, false, "S:F3,F4@" + system,
         "Not offering the catalog of the publisher b: it expired at " + expired},
        {"another key", "version: 10\n", true, false, "S:F3,F4@" + system,
         "Not offering the catalog of publisher/b: signed with another key"},
        {"tampered", "version: 10\n", false, true, "S:F3,F4@" + system,
         "Not offering the catalog of publisher/b: bad signature"},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.what);
        publish("b", Catalog("B", {"F2", "F3"}), c.state,
                c.otherKey ? other.PublicKey() : key.PublicKey());
        if (c.tamper)
            Write(root + "/XDG_CACHE_HOME/glyphwell/publishers/b/catalog.json",
                  Catalog("B", {"F2", "F5"}));
        glyphwell::testing::LogCapture log;
        std::vector<std::string> expected = {"U:F1@user", "A:F2@publisher/a", c.view3};
        if (c.view3[0] == 'B')
            expected.push_back("S:F4@" + system);
        EXPECT_EQ(View(), expected);
        const std::vector<std::string> lines = log.Texts();
        ASSERT_EQ(lines.size(), c.log.empty() ? 0u : 1u);
        EXPECT_EQ(lines.empty() ? "" : lines[0].substr(0, c.log.size()), c.log);
        EXPECT_EQ(View(), expected); // read once: nothing logged again
        // A question finds the same assets through the indexes alone.
        const auto asked = QZCurrentDownloadableFontCatalogFor({"F4", "F2", "F3", "F1", "F9"});
        std::vector<std::string> found;
        for (const QZDownloadableFontAsset& asset : asked->assets)
            for (const QZDownloadableFont& font : asset.fonts)
                found.push_back(std::string(asset.localID) + ":" +
                                std::string(font.postScriptName));
        std::vector<std::string> all;
        for (const std::string& line : expected)
            for (size_t at = 2; at < line.find('@'); at = line.find_first_of(",@", at) + 1)
                all.push_back(line.substr(0, 2) + line.substr(at, 2));
        EXPECT_EQ(found, all);
        EXPECT_EQ(log.Texts().size(), lines.size());
    }
    fs::remove_all(root);
}

// Each user directory is its XDG variable when that is absolute, else its default in the home.
TEST(CatalogPaths, XDGVariableWhenAbsoluteElseItsDefaultInTheHome) {
    const struct {
        const char* variable;
        const char* inHome;
        std::string (*path)();
        const char* below;
    } rows[] = {
        {"XDG_CACHE_HOME", "/home/u/.cache", QZGlyphwellCacheDirectory, "/glyphwell"},
        {"XDG_DATA_HOME", "/home/u/.local/share", QZUserCatalogPath,
         "/glyphwell/downloadable-fonts.json"},
        {"XDG_CONFIG_HOME", "/home/u/.config",
         [] { return QZCatalogPublisherDirectories().front(); }, "/glyphwell/publishers.d"},
    };
    glyphwell::testing::ScopedEnvironment environment;
    environment.Set("HOME", "/home/u");
    for (const auto& row : rows) {
        SCOPED_TRACE(row.variable);
        for (const char* value : {static_cast<const char*>(nullptr), "", "relative/dir"}) {
            environment.Set(row.variable, value);
            EXPECT_EQ(row.path(), std::string(row.inHome) + row.below);
        }
        environment.Set(row.variable, "/x/y");
        EXPECT_EQ(row.path(), std::string("/x/y") + row.below);
    }
    environment.Set("XDG_DATA_DIRS", "/a/:relative:/b");
    EXPECT_EQ(QZSystemCatalogPaths(),
              (std::vector<std::string>{"/a/glyphwell/downloadable-fonts.json",
                                        "/b/glyphwell/downloadable-fonts.json"}));
}

} // namespace
