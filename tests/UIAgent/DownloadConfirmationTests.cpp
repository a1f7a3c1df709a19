// The font download confirmation: answers, withdrawal when the requester dies, display names by
// preferred language, the download size counted once per asset, and validity.
#include <QTest>

#include "UIAgent/QZFontDownloadConfirmation.h"
#include "tests/UIAgent/AgentTestSupport.h"

namespace {

using namespace glyphwell::testing;
using Confirmation = QZFontDownloadConfirmation;

class DownloadConfirmationTest : public ::testing::Test {
protected:
    void SetUp() override {
        // Sans-Regular and Sans-Bold share asset A; Sans-Italic is in B; Mono in C.
        data_.WriteCatalog(R"({"assets": [
            {"LocalID": "A", "url": "https://f/A", "size": 1234567, "sha256": "%1",
             "fonts": [{"postScriptName": "Sans-Regular"}, {"postScriptName": "Sans-Bold"}]},
            {"LocalID": "B", "url": "https://f/B", "size": 2000000, "sha256": "%1",
             "fonts": [{"postScriptName": "Sans-Italic"}]},
            {"LocalID": "C", "url": "https://f/C", "size": 0, "sha256": "%1",
             "fonts": [{"postScriptName": "Mono"}]}]})");
        QZSetPreferredLanguagesForTesting({"en-US"});
    }
    void TearDown() override { QZSetPreferredLanguagesForTesting({}); }

    static std::string NameFor(const Confirmation& confirmation, const char* postScriptName) {
        return TextOf(
            CFDictionaryGetValue(confirmation.localizedFontNamesDict(), Str(postScriptName).get()));
    }

    EnglishTexts english_;
    PrivateDataHome data_;
    Ref regular_ = RequestedFont("Sans-Regular", "Example Sans");
};

TEST_F(DownloadConfirmationTest, DownloadAnswersYesAndReturnOrEscapePressesTheDefaultSkip) {
    const std::tuple<const char*, std::function<void(Confirmation&)>, int> cases[] = {
        {"Download", [](Confirmation& alert) { alert.buttonWithTag(2000)->click(); }, 2000},
        {"Return", [](Confirmation& alert) { QTest::keyClick(&alert, Qt::Key_Return); }, 2001},
        {"Escape", [](Confirmation& alert) { QTest::keyClick(&alert, Qt::Key_Escape); }, 2001},
    };
    for (const auto& [how, answer, tag] : cases) {
        SCOPED_TRACE(how);
        Confirmation alert(DownloadRequest({regular_.get()}).as<CFDictionaryRef>());
        EXPECT_EQ(alert.buttons().size(), 2);
        EXPECT_EQ(alert.defaultButton(), alert.buttonWithTag(2001));
        UiScript script({{[&] { return alert.isVisible(); }, [&] { answer(alert); }}});
        alert.showAlert();
        EXPECT_EQ(alert.clickedButton(), alert.buttonWithTag(tag));
        EXPECT_EQ(alert.shouldDownload(), tag == 2000);
        EXPECT_FALSE(alert.suppressFurtherAlerts());
    }
}

TEST_F(DownloadConfirmationTest, RegressionOnlyTheRequestersExitEndsItsAlertEvenBelowANestedOne) {
    PausedChild requester, bystander;
    Confirmation outer(DownloadRequest({regular_.get()}, requester.pid()).as<CFDictionaryRef>());
    Confirmation inner(DownloadRequest({regular_.get()}).as<CFDictionaryRef>());
    // Watches the bystander, to know when its exit has been noticed.
    Confirmation witness(DownloadRequest({}, bystander.pid()).as<CFDictionaryRef>());
    int terminations = 0, bystanderNoticed = 0;
    QObject::connect(&outer, &Confirmation::requestingApplicationTerminated,
                     [&] { ++terminations; });
    QObject::connect(&witness, &Confirmation::requestingApplicationTerminated,
                     [&] { ++bystanderNoticed; });
    bool upAfterBystanderExit = false, innerUp = false;
    UiScript script({{[&] { return outer.isVisible(); }, [&] { bystander.Kill(); }},
                     {[&] { return bystanderNoticed == 1; },
                      [&] {
                          upAfterBystanderExit = outer.isVisible();
                          QTimer::singleShot(0, &inner, [&] { inner.showAlert(); });
                      }},
                     {[&] { return inner.isVisible(); }, [&] { requester.Kill(); }},
                     {[&] { return !outer.isVisible(); },
                      [&] {
                          innerUp = inner.isVisible();
                          inner.buttonWithTag(2000)->click();
                      }}});
    outer.showAlert();

    EXPECT_TRUE(script.done());
    EXPECT_TRUE(upAfterBystanderExit);
    EXPECT_TRUE(innerUp);
    EXPECT_TRUE(inner.shouldDownload());
    EXPECT_FALSE(outer.shouldDownload());
    EXPECT_FALSE(outer.suppressFurtherAlerts());
    EXPECT_EQ(terminations, 1);
}

TEST_F(DownloadConfirmationTest, OneDisplayNameIsNamedAndEachAssetIsCountedOnce) {
    Ref bold = RequestedFont("Sans-Bold", "Example Sans");
    Ref italic = RequestedFont("Sans-Italic", "Example Sans");
    Confirmation one(
        DownloadRequest({regular_.get(), bold.get(), italic.get()}).as<CFDictionaryRef>());
    EXPECT_TRUE(one.valid());
    EXPECT_EQ(one.text(), "Example Writer needs to download the font “Example Sans”.");
    EXPECT_EQ(one.informativeText(),
              "The font “Example Sans” is 3.2 MB. Do you want to download it?");
    EXPECT_EQ(CFDictionaryGetCount(one.localizedFontNamesDict()), 3);
    EXPECT_EQ(NameFor(one, "Sans-Italic"), "Example Sans");

    Ref otherFamily = RequestedFont("Sans-Italic", "Example Sans Italic");
    Confirmation several(
        DownloadRequest({regular_.get(), otherFamily.get()}).as<CFDictionaryRef>());
    EXPECT_EQ(several.text(), "Example Writer needs to download fonts.");
    EXPECT_EQ(several.informativeText(),
              "The download is 3.2 MB in total. Do you want to download the fonts?");
}

TEST_F(DownloadConfirmationTest, NothingToDownloadIsNotValidAndTheApplicationNameFallsBack) {
    Ref mono = RequestedFont("Mono", "Mono");
    Ref unknown = RequestedFont("Unknown");
    EXPECT_FALSE(
        Confirmation(DownloadRequest({mono.get(), unknown.get()}).as<CFDictionaryRef>()).valid());
    EXPECT_FALSE(Confirmation(DownloadRequest({}).as<CFDictionaryRef>()).valid());
    Confirmation empty(nullptr);
    EXPECT_FALSE(empty.valid());
    EXPECT_EQ(empty.applicationName(), "The current application");
    EXPECT_EQ(CFDictionaryGetCount(empty.localizedFontNamesDict()), 0);
    // Without a name in the request: the desktop entry's, in the user's language.
    const QString entry = WriteFile(data_.FilePath("writer.desktop"),
                                    "[Desktop Entry]\nName=Writer\nName[de]=Schreiber\n");
    QZSetPreferredLanguagesForTesting({"de-DE"});
    EXPECT_EQ(
        Confirmation(Dict({{kQZUIPropertyBundleURL, FileURL(entry).get()}}).as<CFDictionaryRef>())
            .applicationName(),
        "Schreiber");
}

TEST_F(DownloadConfirmationTest, TheUsersLanguagesInTurnPickTheLongestMatchingKey) {
    using Names = std::initializer_list<std::pair<const char*, const char*>>;
    const Names shortestFirst = {{"zh", "zh"},
                                 {"zh-Hans", "zh-Hans"},
                                 {"zh-Hant", "zh-Hant"},
                                 {"en", "en"},
                                 {"en-GB", "en-GB"}};
    const Names longestFirst = {{"en-GB", "en-GB"},
                                {"zh-Hant", "zh-Hant"},
                                {"zh-Hans", "zh-Hans"},
                                {"en", "en"},
                                {"zh", "zh"}};
    struct Case {
        QStringList languages;
        const char* expected;
    } cases[] = {
        {{"zh-Hans-CN"}, "zh-Hans"},
        {{"zh-CN"}, "zh-Hans"},
        {{"zh-TW"}, "zh-Hant"},
        {{"zh-HK"}, "zh-Hant"},
        {{"zh_MO"}, "zh-Hant"},
        {{"en-GB"}, "en-GB"},
        {{"en-US"}, "en"},
        // No key serves the first language: the next one decides.
        {{"fr-FR", "de", "zh-TW", "en"}, "zh-Hant"},
        {{"fr"}, "Example Sans"},
        {{}, "Example Sans"},
    };
    for (const Names* order : {&shortestFirst, &longestFirst}) {
        Ref font = RequestedFont("Sans-Regular", "Example Sans", *order);
        for (const Case& c : cases)
            EXPECT_EQ(Confirmation::DisplayName(font.as<CFDictionaryRef>(), c.languages),
                      c.expected)
                << c.languages.join(',').toStdString()
                << (order == &longestFirst ? " longest" : "");
    }
    Ref noFamily = RequestedFont("Sans-Regular", nullptr, {{"en", "en name"}});
    EXPECT_EQ(Confirmation::DisplayName(noFamily.as<CFDictionaryRef>(), {"fr"}), "Sans-Regular");
}

TEST_F(DownloadConfirmationTest, TheCatalogsNamesStandInForThoseTheRequestLacks) {
    data_.WriteCatalog(R"({"assets": [{"LocalID": "A", "url": "https://f/A", "size": 757000,
        "sha256": "%1", "fonts": [{"postScriptName": "Sans-Regular", "family": "Catalog Sans",
        "localizedFamilyNames": {"ja": "カタログ"}}]}]})");
    Ref bare = RequestedFont("Sans-Regular");
    Ref english = RequestedFont("Sans-Regular", nullptr, {{"en", "English name"}});
    struct Case {
        QStringList languages;
        CFTypeRef font;
        const char* name;
    } cases[] = {
        // The first language the request or the catalog has a name for decides.
        {{"ja-JP", "en"}, english.get(), "カタログ"},
        {{"fr", "en"}, english.get(), "English name"},
        // The request's own family beats the catalog's.
        {{"fr"}, regular_.get(), "Example Sans"},
        {{"fr"}, bare.get(), "Catalog Sans"},
    };
    for (const Case& c : cases) {
        QZSetPreferredLanguagesForTesting(c.languages);
        Confirmation confirmation(DownloadRequest({c.font}).as<CFDictionaryRef>());
        EXPECT_EQ(NameFor(confirmation, "Sans-Regular"), c.name);
    }
    // Sizes read as the progress window writes them.
    Confirmation french(DownloadRequest({regular_.get()}).as<CFDictionaryRef>());
    EXPECT_EQ(french.informativeText(),
              "The font “Example Sans” is 757 kB. Do you want to download it?");
}

} // namespace
