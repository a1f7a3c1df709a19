// `glyphwell catalog refresh` against a real nginx and keys made with the real minisign.
#ifdef GLYPHWELL_CATALOG_TOOL
#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <sys/stat.h>
#include <utime.h>

#include "desktop/QZCatalogPublishers.h"
#include "support/LoopbackHTTPServer.h"
#include "support/Minisign.h"
#include "support/NginxServer.h"
#include "support/ScopedEnvironment.h"
#include "tests/tools/ToolRun.h"

namespace {

namespace fs = std::filesystem;
using glyphwell::testing::MinisignKey;

std::string Contents(const std::string& path) {
    std::ifstream file(path, std::ios::binary);
    return std::string(std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>());
}

/// A catalog of one asset whose bytes differ with `tag`.
std::string Catalog(const std::string& tag) {
    return R"({"tag": ")" + tag + R"(", "assets": [{"LocalID": "A", "url": "http://h/a.ttf",
        "size": 3, "sha256": ")" +
           std::string(64, 'a') + R"(", "fonts": [{"postScriptName": "A"}]}]})";
}

enum class Damage { None, Catalog, Comment, Huge, NoSignature, HugeSignature };

TEST(CatalogRefresh, KeepsTheLastGoodCatalogAndRefusesEveryBadOne) {
    char pattern[] = "/tmp/gw-refresh-XXXXXX";
    const std::string directory = mkdtemp(pattern);
    const std::string www = directory + "/www", conf = directory + "/config/glyphwell/publishers.d";
    fs::create_directories(www);
    fs::create_directories(conf);
    MinisignKey key(directory, "a"), other(directory, "b");
    glyphwell::testing::NginxServer nginx(www, directory + "/nginx");
    if (!key.IsValid() || !nginx.IsRunning())
        GTEST_SKIP() << "minisign or nginx-light is not installed";
    glyphwell::testing::LoopbackHTTPServer stalled;
    stalled.Serve("/catalog.json", {.neverAnswer = true});
    glyphwell::testing::ScopedEnvironment environment;
    environment.Set("XDG_CONFIG_HOME", (directory + "/config").c_str());
    environment.Set("XDG_CACHE_HOME", (directory + "/cache").c_str());
    const QZCatalogFetchLimits saved = QZCurrentCatalogFetchLimits();
    QZSetCatalogFetchLimits({std::chrono::milliseconds(1000), std::chrono::milliseconds(1000), 1,
                             std::chrono::milliseconds(2000)});
    const std::string kept = directory + "/cache/glyphwell/publishers/acme/catalog.json";
    const std::string now = std::to_string(time(nullptr));
    const std::string ahead = std::to_string(time(nullptr) + 2 * 86400);
    const std::string past = std::to_string(time(nullptr) - 60);

    struct Case {
        const char* what;
        std::string tag; // empty: the files stay as they are
        const MinisignKey* signer;
        std::string comment;
        Damage damage;
        std::string line; // the start of the line printed
        bool stall = false;
    } cases[] = {
        {"ED", "1", &key, "timestamp:1000", Damage::None, "acme: updated (version 1000, 1 asset)"},
        {"unchanged", "", nullptr, "", Damage::None, "acme: not modified (version 1000)"},
        {"Ed", "2", &key, "timestamp:2000", Damage::None, "acme: updated (version 2000, 1 asset)"},
        {"changed catalog", "3", &key, "timestamp:3000", Damage::Catalog,
         "acme: refused: bad signature; kept version 2000"},
        {"changed trusted comment", "3", &key, "timestamp:3000", Damage::Comment,
         "acme: refused: bad signature of the trusted comment; kept version 2000"},
        {"another key", "3", &other, "timestamp:3000", Damage::None,
         "acme: refused: signed with another key ("},
        {"no version", "3", &key, "file:catalog.json", Damage::None,
         "acme: refused: no timestamp in the trusted comment; kept version 2000"},
        {"older version", "3", &key, "timestamp:1500", Damage::None,
         "acme: refused: version 1500 is older than the kept 2000 (rollback); kept version 2000"},
        {"expired", "3", &key, "timestamp:3000 expires:" + past, Damage::None,
         "acme: refused: expired at " + past + "; kept version 2000"},
        {"a day ahead", "3", &key, "timestamp:" + ahead, Damage::None,
         "acme: refused: version " + ahead + " is more than one day ahead of this machine's clock"},
        {"1 GiB body", "3", &key, "timestamp:3000", Damage::Huge,
         "acme: refused: the catalog: larger than 67108864 bytes; kept version 2000"},
        {"no signature", "3", &key, "timestamp:3000", Damage::NoSignature,
         "acme: refused: the signature: HTTP status 404; kept version 2000"},
        {"5 KiB signature", "3", &key, "timestamp:3000", Damage::HugeSignature,
         "acme: refused: the signature: larger than 4096 bytes; kept version 2000"},
        {"no answer", "", nullptr, "", Damage::None, "acme: refused: the catalog: ", true},
        {"current", "4", &key, "timestamp:" + now + "\tfile:catalog.json\thashed", Damage::None,
         "acme: updated (version " + now + ", 1 asset)"},
    };
    std::string accepted;
    time_t modified = 1000000000;
    for (const Case& c : cases) {
        SCOPED_TRACE(c.what);
        std::ofstream(conf + "/acme.conf")
            << "# test publisher\nurl = "
            << (c.stall ? stalled.URL("/catalog.json") : nginx.URL("/catalog.json"))
            << "\npublic-key = " << key.PublicKey() << "\n";
        const std::string file = www + "/catalog.json", signature = file + ".minisig";
        if (!c.tag.empty()) {
            std::ofstream(file, std::ios::binary) << Catalog(c.tag);
            ASSERT_TRUE(c.signer->Sign(file, c.comment, c.what == std::string("Ed")));
            std::string damaged = Contents(c.damage == Damage::Catalog ? file : signature);
            if (c.damage == Damage::Catalog)
                damaged[5] ^= 1;
            else if (c.damage == Damage::Comment)
                damaged[damaged.find("timestamp:") + 10] ^= 1;
            else if (c.damage == Damage::HugeSignature)
                damaged += std::string(5000, '#');
            std::ofstream(c.damage == Damage::Catalog ? file : signature, std::ios::binary)
                << damaged;
            if (c.damage == Damage::Huge)
                fs::resize_file(file, uint64_t(1) << 30); // sparse: no disk used
            if (c.damage == Damage::NoSignature)
                fs::remove(signature);
            // nginx's ETag is the modification time and size: every version gets its own.
            const utimbuf times{++modified, modified};
            utime(file.c_str(), &times);
        }
        const auto result = glyphwell::testing::Invoke({"catalog", "refresh"});
        EXPECT_EQ(result.out.substr(0, c.line.size()), c.line) << result.out << result.err;
        EXPECT_EQ(result.status, c.line.find(": refused: ") == std::string::npos ? 0 : 1);
        if (c.line.find(": updated ") != std::string::npos)
            accepted = Catalog(c.tag);
        EXPECT_EQ(Contents(kept), accepted);
    }
    QZSetCatalogFetchLimits(saved);
    fs::remove_all(directory);
}

} // namespace

#endif // GLYPHWELL_CATALOG_TOOL
