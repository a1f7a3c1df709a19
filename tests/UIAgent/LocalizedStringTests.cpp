// The "Localized" table: lookup, placeholders, the choice of language and of layout direction,
// script subtags, and the five tables' completeness.
#include <QFontMetrics>
#include <QRegularExpression>
#include <set>

#include "tests/UIAgent/AgentTestSupport.h"

namespace {

using glyphwell::testing::InstalledTable;

// Every key the alerts, the download window and the network check show (the countdown and the
// help window's title are the alert's own additions), by the number of arguments of its format.
const std::pair<int, std::vector<const char*>> kKeys[] = {
    {0,
     {"QZ_DETAIL_FONT_NOT_INSTALLED", "QZ_BUTTON_ALLOW", "QZ_BUTTON_DISALLOW",
      "QZ_BUTTON_SHOW_IN_FINDER", "QZ_AUTO_ACTIVATION_HELP_ANCHOR", "QZ_CURRENT_APPLICATION",
      "Skip", "Download", "QZ_PREPARING_TO_DOWNLOAD", "QZ_DOWNLOADING_FONTS"}},
    {0,
     {"QZ_DOWNLOAD_WINDOW_TITLE", "QZ_DOWNLOAD_PROGRESS_NAME", "QZ_AUTO_ACTIVATION_TITLE",
      "QZ_DOWNLOAD_CONFIRMATION_TITLE", "QZ_NETWORK_ALERT_TITLE", "QZ_DOWNLOAD_ERROR_TITLE",
      "Continue Download", "Cancel", "Network is not connected.", "Help"}},
    {0, {"You are not connected to the Internet. Do you want to cancel downloading?"}},
    {1,
     {"QZ_DO_NOT_WARN_APPLICATION", "QZ_HEADLINE_NEEDS_TO_DOWNLOAD", "QZ_DETAIL_DOWNLOAD_SIZE",
      "QZ_PREPARING_TO_DOWNLOAD_FONT", "QZ_DOWNLOADING_FONT",
      "This question closes without an answer in %@."}},
    {2,
     {"QZ_HEADLINE_FONT", "QZ_HEADLINE_NEEDS_TO_DOWNLOAD_FONT_NAME", "QZ_DETAIL_FONT_SIZE",
      "QZ_ERROR_DOMAIN_CODE", "%1$@ of %2$@"}},
    {3, {"QZ_HEADLINE_FONT_VOLUME"}},
};

// The download failure alert's texts, made by the font service in contexts of their own; their
// placeholders are those of the source text.
const std::pair<const char*, std::vector<const char*>> kFailureTexts[] = {
    {"QZFontService",
     {"The font “%1” cannot be downloaded.", "No downloadable font has this name.",
      "The downloaded font file does not hold this font."}},
    {"QZFontDownloader",
     {"The server offers %1 bytes, but the font should have %2 bytes.",
      "The server sent more than the %1 bytes of the font.", "The font file cannot be written: %1",
      "The server answered with the HTTP status %1.",
      "Fonts are downloaded only from https, http and file addresses, and redirected only to "
      "https and http ones.",
      "The connection ended after %1 of %2 bytes.", "The download failed: %1",
      "The font folder cannot be created: %1",
      "The download holds %1 bytes, but the font should have %2 bytes.",
      "The downloaded file is damaged: its SHA-256 checksum is not the expected one.",
      "The downloaded file is not a font.", "The server did not answer within %1 seconds.",
      "The downloaded file does not hold the font “%1”.",
      "The download was given up: the server sent less than %1 bytes per second over %2 "
      "seconds."}},
};

std::set<int> Placeholders(const QString& text) {
    static const QRegularExpression placeholder(QStringLiteral("%(\\d)"));
    std::set<int> numbers;
    for (const auto& match : placeholder.globalMatch(text))
        numbers.insert(match.captured(1).toInt());
    return numbers;
}

TEST(LocalizedString, KeysWithoutTranslationShowAsThemselvesAndFormatsFillEveryPlaceholder) {
    struct Case {
        const char* table; ///< the language whose table is installed; null: none
        const char* format;
        std::initializer_list<QString> arguments;
        const char* expected;
    } cases[] = {
        {nullptr, "%@ wants %@", {"Editor", "Serif"}, "Editor wants Serif"},
        {nullptr, "%2$@ before %1$@", {"one", "two"}, "two before one"},
        {nullptr, "%2 then %1", {"one", "two"}, "two then one"},
        {nullptr, "100%% of %1", {"it"}, "100% of it"},
        // An argument is inserted as it is, placeholders and all.
        {nullptr, "%1 and %2", {"%2", "x"}, "%2 and x"},
        {nullptr, "%@ and %@", {"%@"}, "%@ and %@"},
        // A placeholder without an argument is kept; a text without placeholders stays as is.
        {nullptr, "%1 of %3", {"a", "b"}, "a of %3"},
        {nullptr, "Skip", {"ignored"}, "Skip"},
        {nullptr, "50%", {}, "50%"},
        // A key that no table holds shows as itself.
        {nullptr, "QZ_NO_SUCH_KEY", {}, "QZ_NO_SUCH_KEY"},
        {"de", "QZ_NO_SUCH_KEY", {}, "QZ_NO_SUCH_KEY"},
        {"de", "Skip", {}, "Überspringen"},
        // Translated formats take their arguments by number.
        {"de", "%1$@ of %2$@", {"1 MB", "2 MB"}, "1 MB von 2 MB"},
        {"ja", "%1$@ of %2$@", {"1 MB", "2 MB"}, "2 MB 中 1 MB"},
        {"en",
         "QZ_HEADLINE_FONT",
         {"Editor", "Serif"},
         "Editor wants to use the font “Serif”, which is not installed."},
    };
    for (const Case& c : cases) {
        InstalledTable table(QString::fromLatin1(c.table ? c.table : "none"));
        ASSERT_EQ(table.loaded, c.table != nullptr) << c.format;
        EXPECT_EQ(QZLocalizedFormat(c.format, c.arguments), QString::fromUtf8(c.expected))
            << c.format;
    }
}

TEST(LocalizedString, TheTableFollowsTheUsersLanguageAndFallsBackToEnglish) {
    const std::pair<const char*, const char*> cases[] = {
        {"de_DE", "de"},    {"fr_CA", "fr"}, {"ja_JP", "ja"},
        {"zh_CN", "zh_CN"}, {"en_GB", "en"}, {"it_IT", "en"},
    };
    for (const auto& [locale, table] : cases)
        EXPECT_EQ(QZTranslationFileFor(QLocale(QString::fromLatin1(locale))),
                  QStringLiteral(":/translations/Localized_%1.qm").arg(table))
            << locale;
}

TEST(LocalizedString, LanguagesGainTheirLikelyScriptAndItsDirection) {
    struct Case {
        const char* tag;
        const char* withScript;
        Qt::LayoutDirection direction;
    } cases[] = {
        {"zh-CN", "zh-Hans-CN", Qt::LeftToRight},
        {"zh-TW", "zh-Hant-TW", Qt::LeftToRight},
        {"zh-HK", "zh-Hant-HK", Qt::LeftToRight},
        {"zh_MO", "zh-Hant-MO", Qt::LeftToRight},
        {"zh-Hant-CN", "zh-Hant-CN", Qt::LeftToRight},
        {"ja", "ja-Jpan", Qt::LeftToRight},
        {"ar", "ar-Arab", Qt::RightToLeft},
        {"ar-EG", "ar-Arab-EG", Qt::RightToLeft},
        {"he-IL", "he-Hebr-IL", Qt::RightToLeft},
        {"fa", "fa-Arab", Qt::RightToLeft},
        {"en-US", "en-Latn-US", Qt::LeftToRight},
        {"x-unknown", "x-unknown", Qt::LeftToRight},
    };
    for (const Case& c : cases) {
        EXPECT_EQ(QZLanguageWithScript(QString::fromLatin1(c.tag)).toStdString(), c.withScript);
        EXPECT_EQ(QZLayoutDirectionFor({QString::fromLatin1(c.tag), "en"}), c.direction) << c.tag;
    }
    EXPECT_EQ(QZLayoutDirectionFor({}), Qt::LeftToRight);
    // Only the first language counts.
    EXPECT_EQ(QZLayoutDirectionFor({"en", "ar"}), Qt::LeftToRight);
}

TEST(LocalizedString, RightToLeftLanguagesLayWindowsOutRightToLeftWithoutATable) {
    QZSetPreferredLanguagesForTesting({"ar-EG", "en"});
    QZApplyLayoutDirection();
    // A language change (a table installed) must not undo it.
    QEvent change(QEvent::LanguageChange);
    QCoreApplication::sendEvent(QCoreApplication::instance(), &change);
    QDialog window;
    EXPECT_EQ(window.layoutDirection(), Qt::RightToLeft);
    QZSetPreferredLanguagesForTesting({"de-DE"});
    QZApplyLayoutDirection();
    EXPECT_EQ(QDialog().layoutDirection(), Qt::LeftToRight);
    QZSetPreferredLanguagesForTesting({});
}

TEST(LocalizedString, ElidesOnlyPiecesTooLongToWrapInEveryScript) {
    const QFontMetrics metrics(QApplication::font());
    const QString sentence = QString::fromUtf8("フォントをダウンロードする必要があります。");
    const int maxWidth = metrics.horizontalAdvance(sentence) / 2;
    const QString longName(4 * sentence.size(), u'W');
    struct Case {
        QString text;
        bool elided;
        QString kept; ///< what stays around the elided name
    } cases[] = {
        // A sentence without spaces wraps between its characters: nothing is too long.
        {sentence, false, sentence},
        {QString::fromUtf8("フォント「") + longName + QString::fromUtf8("」をダウンロード"), true,
         QString::fromUtf8("をダウンロード")},
        {"Download " + longName + " now", true, " now"},
        {"Download Example Sans now", false, "Download Example Sans now"},
    };
    for (const Case& c : cases) {
        const QString shown = QZElideLongWords(c.text, metrics, maxWidth);
        EXPECT_EQ(shown == c.text, !c.elided) << shown.toStdString();
        EXPECT_TRUE(shown.contains(c.kept)) << shown.toStdString();
        EXPECT_EQ(shown.contains(u'…'), c.elided) << shown.toStdString();
    }
}

TEST(LocalizedString, EveryTableTranslatesEveryKeyWithItsPlaceholders) {
    for (const char* language : {"en", "de", "fr", "ja", "zh_CN"}) {
        SCOPED_TRACE(language);
        InstalledTable table(QString::fromLatin1(language));
        ASSERT_TRUE(table.loaded);
        for (const auto& [arguments, keys] : kKeys) {
            std::set<int> expected;
            for (int i = 1; i <= arguments; ++i)
                expected.insert(i);
            for (const char* key : keys) {
                const QString text = QZLocalizedString(key);
                EXPECT_FALSE(text.isEmpty()) << key;
                EXPECT_EQ(Placeholders(text), expected) << key << ": " << text.toStdString();
                // Every QZ_ key has a text of its own (the help anchor is no text: it names a
                // place).
                const std::string name = key;
                if (name.rfind("QZ_", 0) == 0 && name != "QZ_AUTO_ACTIVATION_HELP_ANCHOR") {
                    EXPECT_NE(text, QString::fromLatin1(key)) << key;
                }
            }
        }
        for (const auto& [context, sources] : kFailureTexts)
            for (const char* source : sources) {
                const QString text = QCoreApplication::translate(context, source);
                EXPECT_EQ(Placeholders(text), Placeholders(QString::fromUtf8(source)))
                    << text.toStdString();
                if (std::string(language) != "en") {
                    EXPECT_NE(text, QString::fromUtf8(source)) << source;
                }
            }
    }
}

} // namespace
