// Publisher files: what is read, what is skipped (one line per file), and which file wins.
#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>

#include "desktop/QZCatalogPublishers.h"
#include "support/LogCapture.h"

namespace {

// A key made by minisign; its bytes matter only in being a well-formed key.
const std::string kKey = "RWQQMk609u/0O+oI9Dm4OjdLoZId8GW0JiBKhO/vyM/YN4pXXKfLkOp+";

TEST(CatalogPublishers, ReadsWellFormedFilesAndSkipsEveryOtherWithOneLine) {
    char pattern[] = "/tmp/gw-publishers-XXXXXX";
    const std::string user = mkdtemp(pattern), system = user + "/system";
    std::filesystem::create_directories(system);
    const std::string key = "public-key = " + kKey + "\n";
    const std::pair<std::string, std::string> files[] = {
        {"a", "# comment\n\nurl = https://a.example/c.json\n" + key},
        {"b", "url=http://b.example/c.json\r\npublic-key=" + kKey},
        {"c", "url = https://c/\n" + key + "mirror = x\n"},
        {"d", "url https://d/\n" + key},
        {"e", "url = ftp://e/c.json\n" + key},
        {"f", "url = https://f/\npublic-key = RWQnotakey"},
        {"g", "url = https://g/\nurl = https://h/\n" + key},
        {".h", "url = https://h/\n" + key},
    };
    for (const auto& [name, text] : files)
        std::ofstream(user + "/" + name + ".conf") << text;
    std::ofstream(user + "/ignored.txt") << "not a .conf file";
    // A system file of a NAME the user also has is hidden; the others are read.
    std::ofstream(system + "/a.conf") << "url = https://system/\n" << key;
    std::ofstream(system + "/z.conf") << "url = https://z.example/\n" << key;

    glyphwell::testing::LogCapture log;
    std::vector<std::string> read;
    for (int round = 0; round < 2; ++round) // the second round logs nothing again
        for (const QZCatalogPublisher& publisher : QZReadCatalogPublishers({user, system}))
            read.push_back(publisher.name + " " + publisher.url);
    EXPECT_EQ(read,
              (std::vector<std::string>{"a https://a.example/c.json", "b http://b.example/c.json",
                                        "z https://z.example/", "a https://a.example/c.json",
                                        "b http://b.example/c.json", "z https://z.example/"}));
    const std::string skipping = "Skipping the catalog publisher file " + user + "/";
    EXPECT_EQ(log.Texts(),
              (std::vector<std::string>{
                  skipping + ".h.conf: the name may hold only letters, digits, '-', '_' and '.'",
                  skipping + "c.conf: line 3: unknown key mirror",
                  skipping + "d.conf: line 1 is not `key = value`",
                  skipping + "e.conf: the url is not an http or https URL",
                  skipping + "f.conf: the public-key is not a minisign public key",
                  skipping + "g.conf: line 2: url given twice"}));
    std::filesystem::remove_all(user);
}

} // namespace
