// The font download confirmation, driven by its real buttons on the offscreen platform: the
// answers, withdrawal when the requesting process dies, display names by preferred language, the
// download size counted once per asset, and validity.
#include <QDir>
#include <QLabel>
#include <QMessageBox>
#include <QPushButton>
#include <QTemporaryDir>
#include <QTest>
#include <functional>
#include <tuple>

#include "UIAgent/QZFontDownloadConfirmation.h"
#include "UIAgent/QZLocalizedString.h"
#include "protocol/QZUIProtocol.h"
#include "tests/UIAgent/AlertTestSupport.h"
#include "tests/UIAgent/DownloadTestSupport.h"
#include "tests/UIAgent/QtTestEnvironment.h"

namespace {

using namespace std::chrono_literals;
using namespace glyphwell::testing;
using Confirmation = QZFontDownloadConfirmation;

constexpr char kHash[] = "0123456789abcdef0123456789abcdef0123456789abcdef0123456789abcdef";

class DownloadConfirmationTest : public ::testing::Test {
protected:
    void SetUp() override {
        qputenv("XDG_DATA_HOME", data_.path().toUtf8());
        qputenv("XDG_DATA_DIRS", data_.filePath("none").toUtf8());
        // Sans-Regular and Sans-Bold share asset A; Sans-Italic is in B; Mono in C.
        QDir().mkpath(data_.filePath("glyphwell"));
        WriteFile(data_.filePath("glyphwell/downloadable-fonts.json"),
                  QStringLiteral(R"({"assets": [
                    {"LocalID": "A", "url": "https://f/A", "size": 1234567, "sha256": "%1",
                     "fonts": [{"postScriptName": "Sans-Regular"}, {"postScriptName": "Sans-Bold"}]},
                    {"LocalID": "B", "url": "https://f/B", "size": 2000000, "sha256": "%1",
                     "fonts": [{"postScriptName": "Sans-Italic"}]},
                    {"LocalID": "C", "url": "https://f/C", "size": 0, "sha256": "%1",
                     "fonts": [{"postScriptName": "Mono"}]}]})")
                      .arg(kHash)
                      .toUtf8());
        QZSetPreferredLanguagesForTesting({"en-US"});
    }
    void TearDown() override {
        QZSetPreferredLanguagesForTesting({});
        qunsetenv("XDG_DATA_HOME");
        qunsetenv("XDG_DATA_DIRS");
    }

    /// Font attributes: PostScript name, family (may be null), localised family names.
    static Ref Font(const char* postScriptName, const char* family,
                    std::initializer_list<std::pair<const char*, const char*>> localized = {}) {
        Ref names(CFDictionaryCreateMutable(nullptr, 0, &kCFTypeDictionaryKeyCallBacks,
                                            &kCFTypeDictionaryValueCallBacks));
        for (const auto& [language, name] : localized)
            CFDictionarySetValue((CFMutableDictionaryRef)names.get(), Str(language).get(),
                                 Str(name).get());
        Ref attributes(CFDictionaryCreateMutable(nullptr, 0, &kCFTypeDictionaryKeyCallBacks,
                                                 &kCFTypeDictionaryValueCallBacks));
        auto mutableAttributes = (CFMutableDictionaryRef)attributes.get();
        CFDictionarySetValue(mutableAttributes, NSFontNameAttribute, Str(postScriptName).get());
        if (family)
            CFDictionarySetValue(mutableAttributes, NSFontFamilyAttribute, Str(family).get());
        if (localized.size())
            CFDictionarySetValue(mutableAttributes, NSCTFontLocalizedFamilyNameAttribute,
                                 names.get());
        return attributes;
    }
    static std::string NameFor(const Confirmation& confirmation, const char* postScriptName) {
        auto name = static_cast<CFStringRef>(
            CFDictionaryGetValue(confirmation.localizedFontNamesDict(), Str(postScriptName).get()));
        char buffer[128] = {};
        return name && CFStringGetCString(name, buffer, sizeof buffer, kCFStringEncodingUTF8)
                   ? buffer
                   : "(none)";
    }

    EnglishTexts english_;
    QTemporaryDir data_;
    Ref regular_ = Font("Sans-Regular", "Example Sans");
};

TEST_F(DownloadConfirmationTest, DownloadAnswersYesAndReturnOrEscapePressesTheDefaultSkip) {
    const std::tuple<const char*, std::function<void(Confirmation&)>, int> cases[] = {
        {"Download", [](Confirmation& alert) { alert.buttonWithTag(2000)->click(); }, 2000},
        {"Return", [](Confirmation& alert) { QTest::keyClick(&alert, Qt::Key_Return); }, 2001},
        {"Escape", [](Confirmation& alert) { QTest::keyClick(&alert, Qt::Key_Escape); }, 2001},
    };
    for (const auto& [how, answer, tag] : cases) {
        Confirmation alert(DownloadRequest({regular_.get()}).as<CFDictionaryRef>());
        EXPECT_EQ(alert.buttons().size(), 2);
        EXPECT_EQ(alert.defaultButton(), alert.buttonWithTag(2001));
        UiScript script({{[&] { return alert.isVisible(); }, [&] { answer(alert); }}},
                        [&] { alert.withdraw(); });
        alert.showAlert();
        EXPECT_EQ(alert.clickedButton(), alert.buttonWithTag(tag)) << how;
        EXPECT_EQ(alert.shouldDownload(), tag == 2000) << how;
        EXPECT_FALSE(alert.suppressFurtherAlerts());
    }
}

TEST_F(DownloadConfirmationTest, ExitOfTheRequestingProcessWithdrawsTheAlertAndNoOtherDoes) {
    PausedChild requester, bystander;
    Confirmation confirmation(
        DownloadRequest({regular_.get()}, requester.pid()).as<CFDictionaryRef>());
    // Watches the bystander, to know when its exit has been noticed.
    Confirmation witness(DownloadRequest({}, bystander.pid()).as<CFDictionaryRef>());
    int terminations = 0, bystanderNoticed = 0;
    QObject::connect(&confirmation, &Confirmation::requestingApplicationTerminated,
                     [&] { ++terminations; });
    QObject::connect(&witness, &Confirmation::requestingApplicationTerminated,
                     [&] { ++bystanderNoticed; });
    bool upAfterBystanderExit = false;
    UiScript script({{[&] { return confirmation.isVisible(); }, [&] { bystander.Kill(); }},
                     {[&] { return bystanderNoticed == 1; },
                      [&] {
                          upAfterBystanderExit = confirmation.isVisible();
                          requester.Kill();
                      }}},
                    [&] { confirmation.buttonWithTag(2000)->click(); });
    confirmation.showAlert();

    EXPECT_TRUE(script.done());
    EXPECT_TRUE(upAfterBystanderExit);
    EXPECT_FALSE(confirmation.shouldDownload());
    EXPECT_FALSE(confirmation.suppressFurtherAlerts());
    EXPECT_EQ(terminations, 1);
}

TEST_F(DownloadConfirmationTest, RegressionProcessExitEndsItsOwnAlertNotTheNestedOne) {
    PausedChild requester;
    Confirmation outer(DownloadRequest({regular_.get()}, requester.pid()).as<CFDictionaryRef>());
    Confirmation inner(DownloadRequest({regular_.get()}).as<CFDictionaryRef>());
    bool innerUp = false;
    UiScript script({{[&] { return outer.isVisible(); },
                      [&] { QTimer::singleShot(0, &inner, [&] { inner.showAlert(); }); }},
                     {[&] { return inner.isVisible(); }, [&] { requester.Kill(); }},
                     {[&] { return !outer.isVisible(); },
                      [&] {
                          innerUp = inner.isVisible();
                          inner.buttonWithTag(2000)->click();
                      }}},
                    EndEveryModalRun);
    outer.showAlert();
    EXPECT_TRUE(script.done());
    EXPECT_TRUE(innerUp);
    EXPECT_TRUE(inner.shouldDownload());
    EXPECT_FALSE(outer.shouldDownload());
}

TEST_F(DownloadConfirmationTest, OneDisplayNameIsNamedAndEachAssetIsCountedOnce) {
    Ref bold = Font("Sans-Bold", "Example Sans");
    Ref italic = Font("Sans-Italic", "Example Sans");
    Confirmation one(
        DownloadRequest({regular_.get(), bold.get(), italic.get()}).as<CFDictionaryRef>());
    EXPECT_TRUE(one.valid());
    EXPECT_EQ(one.text(), "Example Writer needs to download the font “Example Sans”.");
    EXPECT_EQ(one.informativeText(),
              "The font “Example Sans” is 3.2 MB. Do you want to download it?");
    EXPECT_EQ(CFDictionaryGetCount(one.localizedFontNamesDict()), 3);
    EXPECT_EQ(NameFor(one, "Sans-Italic"), "Example Sans");

    Ref otherFamily = Font("Sans-Italic", "Example Sans Italic");
    Confirmation several(
        DownloadRequest({regular_.get(), otherFamily.get()}).as<CFDictionaryRef>());
    EXPECT_EQ(several.text(), "Example Writer needs to download fonts.");
    EXPECT_EQ(several.informativeText(),
              "The download is 3.2 MB in total. Do you want to download the fonts?");
}

TEST_F(DownloadConfirmationTest, NothingToDownloadIsNotValid) {
    Ref mono = Font("Mono", "Mono");
    Ref unknown = Font("Unknown", nullptr);
    EXPECT_FALSE(
        Confirmation(DownloadRequest({mono.get(), unknown.get()}).as<CFDictionaryRef>()).valid());
    EXPECT_FALSE(Confirmation(DownloadRequest({}).as<CFDictionaryRef>()).valid());
    Confirmation empty(nullptr);
    EXPECT_FALSE(empty.valid());
    EXPECT_EQ(empty.applicationName(), "The current application");
    EXPECT_EQ(CFDictionaryGetCount(empty.localizedFontNamesDict()), 0);
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
        Ref font = Font("Sans-Regular", "Example Sans", *order);
        for (const Case& c : cases)
            EXPECT_EQ(Confirmation::DisplayName(font.as<CFDictionaryRef>(), c.languages),
                      c.expected)
                << c.languages.join(',').toStdString()
                << (order == &longestFirst ? " longest" : "");
    }
    Ref noFamily = Font("Sans-Regular", nullptr, {{"en", "en name"}});
    EXPECT_EQ(Confirmation::DisplayName(noFamily.as<CFDictionaryRef>(), {"fr"}), "Sans-Regular");
}

TEST_F(DownloadConfirmationTest, TheCatalogsNamesStandInForThoseTheRequestLacks) {
    WriteFile(data_.filePath("glyphwell/downloadable-fonts.json"),
              QStringLiteral(R"({"assets": [{"LocalID": "A", "url": "https://f/A", "size": 757000,
                 "sha256": "%1", "fonts": [{"postScriptName": "Sans-Regular",
                 "family": "Catalog Sans", "localizedFamilyNames": {"ja": "カタログ"}}]}]})")
                  .arg(kHash)
                  .toUtf8());
    Ref bare = Font("Sans-Regular", nullptr);
    Ref english = Font("Sans-Regular", nullptr, {{"en", "English name"}});
    // The first language the request or the catalog has a name for decides.
    QZSetPreferredLanguagesForTesting({"ja-JP", "en"});
    Confirmation japanese(DownloadRequest({english.get()}).as<CFDictionaryRef>());
    EXPECT_EQ(NameFor(japanese, "Sans-Regular"), "カタログ");
    QZSetPreferredLanguagesForTesting({"fr", "en"});
    Confirmation fallback(DownloadRequest({english.get()}).as<CFDictionaryRef>());
    EXPECT_EQ(NameFor(fallback, "Sans-Regular"), "English name");
    // The request's own family beats the catalog's; sizes read as the progress window writes them.
    QZSetPreferredLanguagesForTesting({"fr"});
    Confirmation french(DownloadRequest({regular_.get()}).as<CFDictionaryRef>());
    EXPECT_EQ(NameFor(french, "Sans-Regular"), "Example Sans");
    EXPECT_EQ(french.informativeText(),
              "The font “Example Sans” is 757 kB. Do you want to download it?");
    Confirmation catalogFamily(DownloadRequest({bare.get()}).as<CFDictionaryRef>());
    EXPECT_EQ(NameFor(catalogFamily, "Sans-Regular"), "Catalog Sans");
}

TEST_F(DownloadConfirmationTest, VeryLongNamesAreElidedWithTheFullTextsInTheTooltips) {
    const std::string longName(100, 'W'), longApplication = "Writer" + std::string(200, 'X');
    const std::pair<std::string, std::string> cases[] = {{longName, "Example Writer"},
                                                         {"Example Sans", longApplication}};
    for (const auto& [fontName, application] : cases) {
        SCOPED_TRACE(application);
        Ref font = Font("Sans-Regular", fontName.c_str());
        Ref pid = Num(kCFNumberSInt32Type, 0);
        Ref request = Dict({{kQZUIPropertyApplicationName, Str(application).get()},
                            {kQZUIPropertyProcessID, pid.get()},
                            {kQZUIPropertyFontProperties, Array({font.get()}).get()}});
        Confirmation confirmation(request.as<CFDictionaryRef>());
        EXPECT_EQ(NameFor(confirmation, "Sans-Regular"), fontName);
        const QString longPart =
            QString::fromStdString(fontName == longName ? longName : longApplication);
        EXPECT_FALSE(confirmation.text().contains(longPart));
        EXPECT_TRUE(confirmation.text().contains(u'…'));
        auto* label = confirmation.findChild<QLabel*>("qt_msgbox_label");
        ASSERT_NE(label, nullptr);
        EXPECT_TRUE(label->toolTip().contains(longPart));
        EXPECT_EQ(label->accessibleDescription(), label->toolTip());
        confirmation.show();
        EXPECT_LT(confirmation.width(), 800);
        confirmation.hide();
    }
}

TEST_F(DownloadConfirmationTest, ApplicationNameFallsBackToTheLocalizedDesktopEntry) {
    const QString entry = WriteFile(data_.filePath("writer.desktop"),
                                    "[Desktop Entry]\nName=Writer\nName[de]=Schreiber\n");
    QZSetPreferredLanguagesForTesting({"de-DE"});
    Confirmation confirmation(
        Dict({{kQZUIPropertyBundleURL, FileURL(entry).get()}}).as<CFDictionaryRef>());
    EXPECT_EQ(confirmation.applicationName(), "Schreiber");
}

} // namespace
