// Naming the asking application from its desktop entry, and remembering declined languages.
#include <filesystem>
#include <fstream>
#include <gtest/gtest.h>
#include <tuple>

#include "bridge/QZApplicationName.h"
#include "bridge/QZDeclinedLanguages.h"
#include "support/ScopedEnvironment.h"

namespace {

namespace fs = std::filesystem;

class BridgeFilesTest : public ::testing::Test {
protected:
    void SetUp() override {
        directory_ = fs::temp_directory_path() / ("glyphwell-bridge-" + std::to_string(getpid()));
        fs::create_directories(directory_ / "applications");
        environment_.Set("XDG_DATA_HOME", directory_.c_str());
        environment_.Set("XDG_DATA_DIRS", "/nonexistent");
    }
    void TearDown() override { fs::remove_all(directory_); }
    void Write(const fs::path& path, const std::string& text) { std::ofstream(path) << text; }

    fs::path directory_;
    glyphwell::testing::ScopedEnvironment environment_;
};

TEST_F(BridgeFilesTest, NamesTheApplicationInTheUsersLanguage) {
    Write(directory_ / "applications/org.example.App.desktop",
          "[Desktop Action New]\nName=Wrong\n[Desktop Entry]\nName[de]=Anwendung\n"
          "Name[pt_BR]=Aplicativo\nName = Application\nName[fr_FR@euro]=Appli\n"
          "[Other]\nName=Later\n");
    const std::string path = QZDesktopEntryPath("org.example.App");
    ASSERT_EQ(path, (directory_ / "applications/org.example.App.desktop").string());
    // LANGUAGE, LC_ALL, the name read.
    const std::tuple<const char*, const char*, std::string> cases[] = {
        {nullptr, "C.UTF-8", "Application"},
        {nullptr, "de_AT.UTF-8", "Anwendung"},
        {nullptr, "pt_BR.UTF-8", "Aplicativo"},
        {nullptr, "pt_PT.UTF-8", "Application"},
        {"it:de", "C", "Anwendung"},
        {nullptr, "fr_FR.ISO-8859-15@euro", "Appli"},
    };
    for (const auto& [language, locale, name] : cases) {
        SCOPED_TRACE(locale);
        environment_.Set("LANGUAGE", language);
        environment_.Set("LC_ALL", locale);
        EXPECT_EQ(QZDesktopEntryName(path), name);
    }
    for (const char* id : {"", "../x.desktop", ".hidden", "missing.desktop"})
        EXPECT_EQ(QZDesktopEntryPath(id), "") << id;
}

TEST_F(BridgeFilesTest, RemembersDeclinedLanguagesForADay) {
    const std::string path = (directory_ / "state/glyphwell/declined-languages").string();
    QZDeclinedLanguages declined(path);
    const time_t now = 1800000000;
    ASSERT_TRUE(declined.Record("org.example.App.desktop", {"ja", "ko"}, now));
    ASSERT_TRUE(declined.Record("tab\there", {"th"}, now - QZDeclinedLanguages::kRemembered + 1));
    EXPECT_TRUE(declined.IsDeclined("org.example.App.desktop", "ko", now + 10));
    EXPECT_FALSE(declined.IsDeclined("org.example.App.desktop", "th", now));
    EXPECT_TRUE(declined.IsDeclined("tab\there", "th", now));
    EXPECT_FALSE(declined.IsDeclined("tab\there", "th", now + 1));
    EXPECT_FALSE(declined.IsDeclined("org.example.App.desktop", "ja",
                                     now + QZDeclinedLanguages::kRemembered));
    // A damaged file counts for what it holds whole; a new choice replaces it with good lines.
    Write(path, "garbage\n1800000000\tzh\tapp\nx\ty\tz\n1800000000\tko\tcut");
    EXPECT_TRUE(declined.IsDeclined("app", "zh", now));
    EXPECT_FALSE(declined.IsDeclined("cut", "ko", now));
    ASSERT_TRUE(declined.Record("app", {"ja"}, now));
    std::ifstream file(path);
    const std::string text((std::istreambuf_iterator<char>(file)), {});
    EXPECT_EQ(text, "1800000000\tzh\tapp\n1800000000\tja\tapp\n");
}

} // namespace
