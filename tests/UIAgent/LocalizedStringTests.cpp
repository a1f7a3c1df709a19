// The "Localized" table: lookup, placeholders, the choice of language, and the five tables'
// completeness.
#include <QCoreApplication>
#include <QRegularExpression>
#include <QTranslator>
#include <set>

#include "UIAgent/QZLocalizedString.h"
#include "tests/UIAgent/QtTestEnvironment.h"

namespace {

/// Installs the embedded table of `language` while it lives.
class InstalledTable {
public:
    explicit InstalledTable(const QString& language) {
        loaded = translator_.load(QStringLiteral(":/translations/Localized_%1.qm").arg(language));
        if (loaded)
            QCoreApplication::installTranslator(&translator_);
    }
    ~InstalledTable() { QCoreApplication::removeTranslator(&translator_); }
    bool loaded = false;

private:
    QTranslator translator_;
};

struct Key {
    const char* key;
    int arguments;
};

// Every key the alerts, the download window and the network check show (the countdown and the
// help window's title are the alert's own additions), with the number of arguments of its
// format.
const Key kKeys[] = {
    {"QZ_HEADLINE_FONT", 2},
    {"QZ_HEADLINE_FONT_VOLUME", 3},
    {"QZ_DETAIL_FONT_NOT_INSTALLED", 0},
    {"QZ_BUTTON_ALLOW", 0},
    {"QZ_BUTTON_DISALLOW", 0},
    {"QZ_BUTTON_SHOW_IN_FINDER", 0},
    {"QZ_DO_NOT_WARN_APPLICATION", 1},
    {"QZ_AUTO_ACTIVATION_HELP_ANCHOR", 0},
    {"QZ_CURRENT_APPLICATION", 0},
    {"QZ_HEADLINE_NEEDS_TO_DOWNLOAD_FONT_NAME", 2},
    {"QZ_HEADLINE_NEEDS_TO_DOWNLOAD", 1},
    {"QZ_DETAIL_FONT_SIZE", 2},
    {"QZ_DETAIL_DOWNLOAD_SIZE", 1},
    {"Skip", 0},
    {"Download", 0},
    {"QZ_PREPARING_TO_DOWNLOAD", 0},
    {"QZ_PREPARING_TO_DOWNLOAD_FONT", 1},
    {"QZ_DOWNLOADING_FONT", 1},
    {"QZ_DOWNLOADING_FONTS", 0},
    {"QZ_DOWNLOAD_WINDOW_TITLE", 0},
    {"%1$@ of %2$@", 2},
    {"Continue Download", 0},
    {"Cancel", 0},
    {"Network is not connected.", 0},
    {"You are not connected to the Internet. Do you want to cancel downloading?", 0},
    {"This question closes without an answer in %@.", 1},
    {"Help", 0},
};

TEST(LocalizedString, AKeyWithoutTranslationShowsAsItself) {
    EXPECT_EQ(QZLocalizedString("QZ_NO_SUCH_KEY"), QStringLiteral("QZ_NO_SUCH_KEY"));
    InstalledTable german(QStringLiteral("de"));
    ASSERT_TRUE(german.loaded);
    EXPECT_EQ(QZLocalizedString("QZ_NO_SUCH_KEY"), QStringLiteral("QZ_NO_SUCH_KEY"));
    EXPECT_EQ(QZLocalizedString("Skip"), QStringLiteral("Überspringen"));
}

TEST(LocalizedString, FormatsFillEveryPlaceholderStyleInOnePass) {
    // Keys without a translation are their own format.
    EXPECT_EQ(QZLocalizedFormat("%@ wants %@", {"Editor", "Serif"}), "Editor wants Serif");
    EXPECT_EQ(QZLocalizedFormat("%2$@ before %1$@", {"one", "two"}), "two before one");
    EXPECT_EQ(QZLocalizedFormat("%2 then %1", {"one", "two"}), "two then one");
    EXPECT_EQ(QZLocalizedFormat("100%% of %1", {"it"}), "100% of it");
    // An argument is inserted as it is, placeholders and all.
    EXPECT_EQ(QZLocalizedFormat("%1 and %2", {"%2", "x"}), "%2 and x");
    EXPECT_EQ(QZLocalizedFormat("%@ and %@", {"%@"}), "%@ and %@");
    // A placeholder without an argument is kept; a text without placeholders is returned as is.
    EXPECT_EQ(QZLocalizedFormat("%1 of %3", {"a", "b"}), "a of %3");
    EXPECT_EQ(QZLocalizedFormat("Skip", {"ignored"}), "Skip");
    EXPECT_EQ(QZLocalizedFormat("50%", {}), "50%");
}

TEST(LocalizedString, TheTableFollowsTheUsersLanguageAndFallsBackToEnglish) {
    auto file = [](const char* name) {
        return QZTranslationFileFor(QLocale(QString::fromLatin1(name)));
    };
    EXPECT_EQ(file("de_DE"), ":/translations/Localized_de.qm");
    EXPECT_EQ(file("fr_CA"), ":/translations/Localized_fr.qm");
    EXPECT_EQ(file("ja_JP"), ":/translations/Localized_ja.qm");
    EXPECT_EQ(file("zh_CN"), ":/translations/Localized_zh_CN.qm");
    EXPECT_EQ(file("en_GB"), ":/translations/Localized_en.qm");
    EXPECT_EQ(file("it_IT"), ":/translations/Localized_en.qm");
}

TEST(LocalizedString, EveryTableTranslatesEveryKeyWithItsPlaceholders) {
    const QRegularExpression placeholder(QStringLiteral("%(\\d)"));
    for (const char* language : {"en", "de", "fr", "ja", "zh_CN"}) {
        InstalledTable table(QString::fromLatin1(language));
        ASSERT_TRUE(table.loaded) << language;
        for (const Key& key : kKeys) {
            const QString text = QZLocalizedString(key.key);
            EXPECT_FALSE(text.isEmpty()) << language << " " << key.key;
            // Every QZ_ key has a text of its own (the help anchor is no text: it names a place).
            const std::string name = key.key;
            if (name.rfind("QZ_", 0) == 0 && name != "QZ_AUTO_ACTIVATION_HELP_ANCHOR") {
                EXPECT_NE(text, QString::fromLatin1(key.key)) << language << " " << key.key;
            }
            std::set<int> numbers;
            for (const auto& match : placeholder.globalMatch(text))
                numbers.insert(match.captured(1).toInt());
            std::set<int> expected;
            for (int i = 1; i <= key.arguments; ++i)
                expected.insert(i);
            EXPECT_EQ(numbers, expected)
                << language << " " << key.key << ": " << text.toStdString();
        }
    }
}

TEST(LocalizedString, TranslatedFormatsTakeTheirArgumentsByNumber) {
    {
        InstalledTable german(QStringLiteral("de"));
        EXPECT_EQ(QZLocalizedFormat("%1$@ of %2$@", {"1 MB", "2 MB"}), "1 MB von 2 MB");
    }
    {
        InstalledTable japanese(QStringLiteral("ja"));
        EXPECT_EQ(QZLocalizedFormat("%1$@ of %2$@", {"1 MB", "2 MB"}), "2 MB 中 1 MB");
    }
    InstalledTable english(QStringLiteral("en"));
    EXPECT_EQ(QZLocalizedFormat("QZ_HEADLINE_FONT", {"Editor", "Serif"}),
              "Editor wants to use the font “Serif”, which is not installed.");
}

} // namespace
