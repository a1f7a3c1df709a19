// Publisher files: what is read, what is skipped, and which file of a NAME wins.
#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>

#include "desktop/QZCatalogPublishers.h"
#include "support/LogCapture.h"

namespace {

namespace fs = std::filesystem;

// A key made by minisign; its bytes matter only in being a well-formed key.
const std::string kKey = "RWQQMk609u/0O+oI9Dm4OjdLoZId8GW0JiBKhO/vyM/YN4pXXKfLkOp+";

TEST(CatalogPublishers, ReadsWellFormedFilesAndSkipsEveryOtherWithOneLine) {
    char pattern[] = "/tmp/gw-publishers-XXXXXX";
    const std::string directory = mkdtemp(pattern);
    const std::string user = directory + "/user", system = directory + "/system";
    fs::create_directories(user);
    fs::create_directories(system);
    struct Case {
        const char* name; // NAME of the user's NAME.conf
        std::string text;
        std::string problem; // empty: read
    } cases[] = {
        {"a", "# comment\n\nurl = https://a.example/c.json\npublic-key = " + kKey + "\n", ""},
        {"b", "url=http://b.example/c.json\r\npublic-key=" + kKey, ""},
        {"c", "url = https://c.example/\npublic-key = " + kKey + "\nmirror = x\n",
         "line 3: unknown key mirror"},
        {"d", "url https://d.example/\npublic-key = " + kKey, "line 1 is not `key = value`"},
        {"e", "url = ftp://e.example/c.json\npublic-key = " + kKey,
         "the url is not an http or https URL"},
        {"f", "url = https://f.example/\npublic-key = RWQnotakey", "the public-key is not"},
        {"g", "url = https://g.example/\nurl = https://h/\npublic-key = " + kKey,
         "line 2: url given twice"},
        {"h", "public-key = " + kKey, "no url"},
        {".hidden", "url = https://h/\npublic-key = " + kKey, "the name may hold only"},
    };
    for (const Case& c : cases)
        std::ofstream(user + "/" + c.name + ".conf") << c.text;
    std::ofstream(user + "/ignored.txt") << "not a .conf file";
    // A system file of a NAME the user also has is hidden; the others are read.
    std::ofstream(system + "/a.conf") << "url = https://system/\npublic-key = " << kKey;
    std::ofstream(system + "/z.conf") << "url = https://z.example/\npublic-key = " << kKey;

    glyphwell::testing::LogCapture log;
    const std::vector<QZCatalogPublisher> publishers = QZReadCatalogPublishers({user, system});
    std::vector<std::string> names;
    for (const QZCatalogPublisher& publisher : publishers)
        names.push_back(publisher.name + " " + publisher.url);
    EXPECT_EQ(names,
              (std::vector<std::string>{"a https://a.example/c.json", "b http://b.example/c.json",
                                        "z https://z.example/"}));
    std::string lines;
    for (const std::string& line : log.Texts())
        lines += line + "\n";
    for (const Case& c : cases) {
        if (c.problem.empty())
            continue;
        SCOPED_TRACE(c.name);
        const std::string start =
            "Skipping the catalog publisher file " + user + "/" + c.name + ".conf: " + c.problem;
        EXPECT_NE(lines.find(start), std::string::npos) << lines;
    }
    EXPECT_EQ(log.Texts().size(), 7u) << lines;
    fs::remove_all(directory);
}

} // namespace
