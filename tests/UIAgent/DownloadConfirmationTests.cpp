// The font download confirmation, driven by its real buttons on the offscreen platform: the
// answers, withdrawal when the requesting process dies, display names by preferred language, the
// download size counted once per asset, and validity.
#include <QDir>
#include <QMessageBox>
#include <QPushButton>
#include <QTemporaryDir>
#include <QTest>
#include <csignal>
#include <sys/wait.h>
#include <unistd.h>

#include "UIAgent/QZFontDownloadConfirmation.h"
#include "protocol/QZUIProtocol.h"
#include "tests/UIAgent/AlertTestSupport.h"
#include "tests/UIAgent/QtTestEnvironment.h"

namespace {

using namespace std::chrono_literals;
using namespace glyphwell::testing;
using Confirmation = QZFontDownloadConfirmation;

constexpr char kHash[] = "0123456789abcdef0123456789abcdef0123456789abcdef0123456789abcdef";

/// A child that waits until it is killed; reaped when this goes.
class PausedChild {
public:
    PausedChild() : pid_(fork()) {
        if (pid_ == 0) {
            for (;;)
                pause();
        }
    }
    ~PausedChild() {
        Kill();
        waitpid(pid_, nullptr, 0);
    }
    pid_t pid() const { return pid_; }
    void Kill() const { kill(pid_, SIGKILL); }

private:
    pid_t pid_;
};

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
        Confirmation::SetPreferredLanguageForTesting("en-US");
    }
    void TearDown() override {
        Confirmation::SetPreferredLanguageForTesting(QString());
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
    /// A request from "Example Writer" (process `pid`) for `fonts`.
    static Ref Request(std::initializer_list<CFTypeRef> fonts, SInt32 pid = 0) {
        Ref pidNumber = Num(kCFNumberSInt32Type, pid);
        return Dict({{kQZUIPropertyApplicationName, Str("Example Writer").get()},
                     {kQZUIPropertyProcessID, pidNumber.get()},
                     {kQZUIPropertyFontProperties, Array(fonts).get()}});
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

TEST_F(DownloadConfirmationTest, DownloadAnswersYesAndReturnPressesTheDefaultSkip) {
    Confirmation yes(Request({regular_.get()}).as<CFDictionaryRef>());
    EXPECT_EQ(yes.buttons().size(), 2);
    QTimer::singleShot(100ms, &yes, [&] { yes.buttonWithTag(2000)->click(); });
    yes.showAlert();
    EXPECT_TRUE(yes.shouldDownload());
    EXPECT_FALSE(yes.suppressFurtherAlerts());

    Confirmation no(Request({regular_.get()}).as<CFDictionaryRef>());
    EXPECT_EQ(no.defaultButton()->text(), "Skip");
    QTimer::singleShot(100ms, &no, [&] { QTest::keyClick(&no, Qt::Key_Return); });
    QTimer::singleShot(5s, &no, [&] { no.withdraw(); }); // in case Return did nothing
    no.showAlert();
    EXPECT_FALSE(no.shouldDownload());
    EXPECT_EQ(no.clickedButton(), no.buttonWithTag(2001));
}

TEST_F(DownloadConfirmationTest, ExitOfTheRequestingProcessWithdrawsTheAlertAndNoOtherDoes) {
    PausedChild requester, bystander;
    Confirmation confirmation(Request({regular_.get()}, requester.pid()).as<CFDictionaryRef>());
    int terminations = 0;
    QObject::connect(&confirmation, &Confirmation::requestingApplicationTerminated,
                     [&] { ++terminations; });
    bool upAfterBystanderExit = false;
    QTimer::singleShot(100ms, &confirmation, [&] { bystander.Kill(); });
    QTimer::singleShot(500ms, &confirmation, [&] {
        upAfterBystanderExit = confirmation.isVisible();
        requester.Kill();
    });
    QTimer::singleShot(10s, &confirmation,
                       [&] { confirmation.buttonWithTag(2000)->click(); }); // failsafe
    confirmation.showAlert();

    EXPECT_TRUE(upAfterBystanderExit);
    EXPECT_FALSE(confirmation.shouldDownload());
    EXPECT_FALSE(confirmation.suppressFurtherAlerts());
    EXPECT_EQ(terminations, 1);
}

TEST_F(DownloadConfirmationTest, RegressionProcessExitEndsItsOwnAlertNotTheNestedOne) {
    PausedChild requester;
    Confirmation outer(Request({regular_.get()}, requester.pid()).as<CFDictionaryRef>());
    Confirmation inner(Request({regular_.get()}).as<CFDictionaryRef>());
    bool innerUp = false, outerHidden = false;
    QTimer::singleShot(100ms, &outer, [&] { inner.showAlert(); });
    QTimer::singleShot(300ms, &outer, [&] { requester.Kill(); });
    QTimer::singleShot(800ms, &outer, [&] {
        innerUp = inner.isVisible();
        outerHidden = !outer.isVisible();
        inner.buttonWithTag(2000)->click();
    });
    outer.showAlert();
    EXPECT_TRUE(innerUp);
    EXPECT_TRUE(outerHidden);
    EXPECT_TRUE(inner.shouldDownload());
    EXPECT_FALSE(outer.shouldDownload());
}

TEST_F(DownloadConfirmationTest, OneDisplayNameIsNamedAndEachAssetIsCountedOnce) {
    Ref bold = Font("Sans-Bold", "Example Sans");
    Ref italic = Font("Sans-Italic", "Example Sans");
    Confirmation one(Request({regular_.get(), bold.get(), italic.get()}).as<CFDictionaryRef>());
    EXPECT_TRUE(one.valid());
    EXPECT_EQ(one.text(), "Example Writer needs to download the font “Example Sans”.");
    EXPECT_EQ(one.informativeText(),
              "The font “Example Sans” is 3.23 MB. Do you want to download it?");
    EXPECT_EQ(CFDictionaryGetCount(one.localizedFontNamesDict()), 3);
    EXPECT_EQ(NameFor(one, "Sans-Italic"), "Example Sans");

    Ref otherFamily = Font("Sans-Italic", "Example Sans Italic");
    Confirmation several(Request({regular_.get(), otherFamily.get()}).as<CFDictionaryRef>());
    EXPECT_EQ(several.text(), "Example Writer needs to download fonts.");
    EXPECT_EQ(several.informativeText(),
              "The download is 3.23 MB in total. Do you want to download the fonts?");
}

TEST_F(DownloadConfirmationTest, NothingToDownloadIsNotValid) {
    Ref mono = Font("Mono", "Mono");
    Ref unknown = Font("Unknown", nullptr);
    EXPECT_FALSE(Confirmation(Request({mono.get(), unknown.get()}).as<CFDictionaryRef>()).valid());
    EXPECT_FALSE(Confirmation(Request({}).as<CFDictionaryRef>()).valid());
    Confirmation empty(nullptr);
    EXPECT_FALSE(empty.valid());
    EXPECT_EQ(empty.applicationName(), "The current application");
    EXPECT_EQ(CFDictionaryGetCount(empty.localizedFontNamesDict()), 0);
}

TEST_F(DownloadConfirmationTest, TheLongestLanguageKeyThatPrefixesThePreferredLanguageWins) {
    Ref font = Font("Sans-Regular", "Example Sans",
                    {{"zh", "zh name"}, {"zh-Hans", "zh-Hans name"}, {"en", "en name"}});
    auto attributes = font.as<CFDictionaryRef>();
    EXPECT_EQ(Confirmation::DisplayName(attributes, "zh-Hans-CN"), "zh-Hans name");
    EXPECT_EQ(Confirmation::DisplayName(attributes, "zh-Hans"), "zh-Hans name");
    EXPECT_EQ(Confirmation::DisplayName(attributes, "zh-Hant-TW"), "zh name");
    EXPECT_EQ(Confirmation::DisplayName(attributes, "en-GB"), "en name");

    Ref noFrench = Font("Sans-Regular", "Example Sans", {{"en", "en name"}, {"ja", "ja name"}});
    Ref noFamily = Font("Sans-Regular", nullptr, {{"en", "en name"}});
    EXPECT_EQ(Confirmation::DisplayName(noFrench.as<CFDictionaryRef>(), "fr"), "Example Sans");
    EXPECT_EQ(Confirmation::DisplayName(noFamily.as<CFDictionaryRef>(), "fr"), "Sans-Regular");

    Confirmation::SetPreferredLanguageForTesting("zh-Hans-CN");
    Confirmation confirmation(Request({font.get()}).as<CFDictionaryRef>());
    EXPECT_EQ(NameFor(confirmation, "Sans-Regular"), "zh-Hans name");
}

TEST_F(DownloadConfirmationTest, ApplicationNameFallsBackToTheLocalizedDesktopEntry) {
    const QString entry = WriteFile(data_.filePath("writer.desktop"),
                                    "[Desktop Entry]\nName=Writer\nName[de]=Schreiber\n");
    Confirmation::SetPreferredLanguageForTesting("de-DE");
    Confirmation confirmation(
        Dict({{kQZUIPropertyBundleURL, FileURL(entry).get()}}).as<CFDictionaryRef>());
    EXPECT_EQ(confirmation.applicationName(), "Schreiber");
}

} // namespace
