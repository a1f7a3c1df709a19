// The auto-activation alert, driven by clicking its real buttons on the offscreen platform: the
// answers, the file-manager loop on a private session bus, the help, the timeout and its restart,
// withdrawal, and the names, volume and font sample it shows.
#include <QCheckBox>
#include <QDirIterator>
#include <QLabel>
#include <QMessageBox>
#include <QPushButton>
#include <QTemporaryDir>
#include <QTest>
#include <QTextBrowser>
#include <sys/stat.h>

#include "UIAgent/QZAutoActivationConfirmation.h"
#include "UIAgent/QZUIProperties.h"
#include "tests/UIAgent/AlertTestSupport.h"
#include "tests/UIAgent/QtTestEnvironment.h"
#include "tests/support/PrivateSessionBus.h"

namespace {

using namespace std::chrono_literals;
using namespace glyphwell::testing;
using Confirmation = QZAutoActivationConfirmation;

class AutoActivationTest : public ::testing::Test {
protected:
    /// A request from "Example Writer" for the font "Example Sans" found in `candidates`.
    static Ref Request(const Ref& candidates) {
        return Dict({{kQZUIPropertyApplicationName, Str("Example Writer").get()},
                     {kQZUIPropertyFontName, Str("Example Sans").get()},
                     {kQZUIPropertyCandidateFontURLs, candidates.get()}});
    }
    Ref OneCandidate() {
        candidate_ = FileURL(WriteFile(directory_.filePath("ExampleSans.ttf")));
        return Array({candidate_.get()});
    }
    static UiScript::Step When(std::function<bool()> when, std::function<void()> action) {
        return {std::move(when), std::move(action)};
    }
    static std::function<bool()> Showing(const Confirmation& alert) {
        return [&alert] { return alert.alert()->isVisible(); };
    }
    static std::function<void()> Click(const Confirmation& alert, int tag) {
        return [&alert, tag] { alert.buttonWithTag(tag)->click(); };
    }

    EnglishTexts english_;
    QTemporaryDir directory_;
    Ref candidate_;
};

TEST_F(AutoActivationTest, SetsUpTextsButtonsInOrderAndTheCheckbox) {
    Confirmation confirmation(Request(OneCandidate()).as<CFDictionaryRef>());
    QMessageBox* alert = confirmation.alert();
    EXPECT_EQ(alert->text(), "Example Writer wants to use the font “Example Sans”, which is not "
                             "installed.");
    EXPECT_EQ(alert->informativeText(),
              "The font is not installed, but a font file that contains it was found. If you "
              "allow it, the application can use the font.");
    EXPECT_EQ(confirmation.buttonWithTag(2000)->text(), "Allow");
    EXPECT_EQ(confirmation.buttonWithTag(2001)->text(), "Don’t Allow");
    EXPECT_EQ(confirmation.buttonWithTag(2002)->text(), "Show in File Manager");
    EXPECT_EQ(static_cast<QAbstractButton*>(alert->defaultButton()),
              confirmation.buttonWithTag(2000));
    EXPECT_EQ(confirmation.suppressionCheckBox()->text(), "Don’t ask again for Example Writer");
    EXPECT_FALSE(confirmation.suppressionCheckBox()->isChecked());
    EXPECT_EQ(confirmation.countdownLabel()->text(),
              "This question closes without an answer in 2:00.");
    EXPECT_EQ(confirmation.countdownLabel()->accessibleName(),
              confirmation.countdownLabel()->text());
}

TEST_F(AutoActivationTest, ShowInFileManagerTwiceThenAllowRevealsTwiceAndActivates) {
    PrivateSessionBus bus;
    ASSERT_FALSE(bus.address().isEmpty()) << "dbus-daemon did not start";
    FileManagerStandIn fileManager(bus.address());
    ASSERT_TRUE(fileManager.registered());
    const QString second = WriteFile(directory_.filePath("Example Sans Bold.otf"));
    Ref notAFile(CFURLCreateWithString(nullptr, CFSTR("https://fonts.example/x.ttf"), nullptr));
    OneCandidate();
    Ref candidates = Array({candidate_.get(), notAFile.get(), FileURL(second).get()});
    Confirmation confirmation(Request(candidates).as<CFDictionaryRef>());

    auto received = [&](size_t count) {
        return [&, count] { return fileManager.calls().size() == count; };
    };
    UiScript script({When(Showing(confirmation), Click(confirmation, 2002)),
                     When([&] { return confirmation.alert()->isVisible() && received(2)(); },
                          Click(confirmation, 2002)),
                     When([&] { return confirmation.alert()->isVisible() && received(4)(); },
                          Click(confirmation, 2000))},
                    [&] { confirmation.withdraw(); });
    confirmation.showAlert();

    EXPECT_TRUE(confirmation.shouldActivate());
    EXPECT_FALSE(confirmation.suppressFurtherAlerts());
    const QStringList uris{
        "file://" + directory_.filePath("ExampleSans.ttf"),
        "file://" + QString(directory_.filePath("Example Sans Bold.otf")).replace(" ", "%20")};
    const auto& calls = fileManager.calls();
    ASSERT_EQ(calls.size(), 4u);
    for (size_t i : {0u, 2u}) {
        EXPECT_EQ(calls[i].member, "Introspect");
        EXPECT_EQ(calls[i + 1].member, "ShowItems");
        EXPECT_EQ(calls[i + 1].uris, uris);
    }
    EXPECT_TRUE(CFEqual(confirmation.candidateFonts(), candidates.get()));
}

TEST_F(AutoActivationTest, TickedCheckboxAndDisallowSuppressWithoutActivating) {
    Confirmation confirmation(Request(OneCandidate()).as<CFDictionaryRef>());
    UiScript script(
        {When(Showing(confirmation),
              [&] { QTest::mouseClick(confirmation.suppressionCheckBox(), Qt::LeftButton); }),
         When(Showing(confirmation), Click(confirmation, 2001))},
        [&] { confirmation.withdraw(); });
    confirmation.showAlert();
    EXPECT_FALSE(confirmation.shouldActivate());
    EXPECT_TRUE(confirmation.suppressFurtherAlerts());
}

TEST_F(AutoActivationTest, TimeoutAnswersNoWithTheCheckboxAsItIs) {
    Confirmation confirmation(Request(OneCandidate()).as<CFDictionaryRef>());
    confirmation.setTimeout(300ms);
    UiScript script({When(Showing(confirmation),
                          [&] { confirmation.suppressionCheckBox()->setChecked(true); })},
                    [] {});
    confirmation.showAlert();
    EXPECT_FALSE(confirmation.shouldActivate());
    EXPECT_TRUE(confirmation.suppressFurtherAlerts());
}

TEST_F(AutoActivationTest, KeyboardInputRestartsTheTimeout) {
    Confirmation confirmation(Request(OneCandidate()).as<CFDictionaryRef>());
    confirmation.setTimeout(500ms);
    bool upAfterFirstDeadline = false;
    QTimer::singleShot(300ms, confirmation.alert(),
                       [&] { QTest::keyClick(confirmation.alert(), Qt::Key_Shift); });
    QTimer::singleShot(700ms, confirmation.alert(),
                       [&] { upAfterFirstDeadline = confirmation.alert()->isVisible(); });
    confirmation.showAlert();
    EXPECT_TRUE(upAfterFirstDeadline);
    EXPECT_FALSE(confirmation.shouldActivate());
}

TEST_F(AutoActivationTest, RegressionTimeoutOfAnAnsweredAlertNeverEndsALaterOne) {
    PrivateSessionBus bus; // the reveal goes to a bus of our own
    Confirmation first(Request(OneCandidate()).as<CFDictionaryRef>());
    first.setTimeout(300ms);
    UiScript firstScript(
        {When(Showing(first), Click(first, 2002)), When(Showing(first), Click(first, 2000))},
        [&] { first.withdraw(); });
    first.showAlert();
    ASSERT_TRUE(first.shouldActivate());

    Confirmation later(Request(OneCandidate()).as<CFDictionaryRef>());
    bool laterUpAfterEarlierDeadlines = false;
    QTimer::singleShot(800ms, later.alert(), [&] {
        laterUpAfterEarlierDeadlines = later.alert()->isVisible();
        later.buttonWithTag(2000)->click();
    });
    later.showAlert();
    EXPECT_TRUE(laterUpAfterEarlierDeadlines);
    EXPECT_TRUE(later.shouldActivate());
}

TEST_F(AutoActivationTest, WithdrawEndsItsOwnAlertEvenBelowANestedOne) {
    Confirmation outer(Request(OneCandidate()).as<CFDictionaryRef>());
    Confirmation inner(Request(OneCandidate()).as<CFDictionaryRef>());
    std::vector<std::string> returned;
    bool innerUp = false, outerHidden = false;
    QTimer::singleShot(100ms, outer.alert(), [&] {
        inner.showAlert();
        returned.push_back("inner");
    });
    QTimer::singleShot(300ms, outer.alert(), [&] {
        outer.withdraw();
        outerHidden = !outer.alert()->isVisible();
        innerUp = inner.alert()->isVisible();
        inner.buttonWithTag(2000)->click();
    });
    outer.showAlert();
    returned.push_back("outer");

    EXPECT_EQ(returned, (std::vector<std::string>{"inner", "outer"}));
    EXPECT_TRUE(outerHidden);
    EXPECT_TRUE(innerUp);
    EXPECT_TRUE(inner.shouldActivate());
    EXPECT_FALSE(outer.shouldActivate());
}

TEST_F(AutoActivationTest, HelpOpensTheBundledPageAtTheAnchorAndKeepsTheQuestion) {
    Confirmation confirmation(Request(OneCandidate()).as<CFDictionaryRef>());
    bool alertStayed = false;
    UiScript script(
        {When(Showing(confirmation), [&] { confirmation.helpButton()->click(); }),
         When([&] { return confirmation.helpWindow() && confirmation.helpWindow()->isVisible(); },
              [&] {
                  alertStayed = confirmation.alert()->isVisible();
                  confirmation.buttonWithTag(2000)->click();
              })},
        [&] { confirmation.withdraw(); });
    confirmation.showAlert();

    EXPECT_TRUE(alertStayed);
    EXPECT_TRUE(confirmation.shouldActivate());
    ASSERT_TRUE(confirmation.helpWindow());
    EXPECT_EQ(confirmation.helpWindow()->source(), QUrl("qrc:/help/index.html#auto-activation"));
    EXPECT_TRUE(confirmation.helpWindow()->toHtml().contains("name=\"auto-activation\""));
    EXPECT_FALSE(confirmation.helpWindow()->isVisible());
}

TEST_F(AutoActivationTest, NamesFallBackToTheBundleThenTheCandidateFile) {
    const QString entry = WriteFile(directory_.filePath("writer.desktop"),
                                    "[Desktop Entry]\nName=Writer\nName[de]=Schreiber\n");
    const QString tool = WriteFile(directory_.filePath("Tool.bin"));
    const QString font = WriteFile(directory_.filePath("Font File.ttf"));
    Ref candidates = Array({FileURL(font).get()});
    Ref familyOnly = Dict({{NSFontFamilyAttribute, Str("Family Name").get()}});

    Confirmation fromEntry(Dict({{kQZUIPropertyBundleURL, FileURL(entry).get()},
                                 {kQZUIPropertyRequestDictionary, familyOnly.get()},
                                 {kQZUIPropertyCandidateFontURLs, candidates.get()}})
                               .as<CFDictionaryRef>());
    EXPECT_EQ(fromEntry.applicationName(), "Writer");
    EXPECT_EQ(fromEntry.fontName(), "Family Name");

    Confirmation fromFile(Dict({{kQZUIPropertyBundleURL, FileURL(tool).get()},
                                {kQZUIPropertyCandidateFontURLs, candidates.get()}})
                              .as<CFDictionaryRef>());
    EXPECT_EQ(fromFile.applicationName(), "Tool.bin");
    EXPECT_EQ(fromFile.fontName(), "Font File.ttf");

    Confirmation fromNothing(nullptr);
    EXPECT_EQ(fromNothing.applicationName(), "The current application");
    EXPECT_FALSE(fromNothing.candidateFonts());
}

/// st_dev of `path`, the test's own view of which file system holds it.
dev_t DeviceOf(const QString& path) {
    struct stat status {};
    return stat(path.toUtf8().constData(), &status) == 0 ? status.st_dev : dev_t(-1);
}

TEST_F(AutoActivationTest, NamesTheVolumeOnlyWhenTheFontIsOffTheRootVolume) {
    if (DeviceOf(directory_.path()) != DeviceOf("/"))
        GTEST_SKIP() << "the temporary directory is not on the root file system here";
    Confirmation onRoot(Request(OneCandidate()).as<CFDictionaryRef>());
    EXPECT_TRUE(onRoot.volumeName().isNull());
    EXPECT_EQ(onRoot.alert()->text(),
              "Example Writer wants to use the font “Example Sans”, which is not installed.");

    QTemporaryDir elsewhere(QStringLiteral("/dev/shm/glyphwell-test-XXXXXX"));
    if (!elsewhere.isValid() || DeviceOf(elsewhere.path()) == DeviceOf("/"))
        GTEST_SKIP() << "/dev/shm is not a file system of its own here";
    Ref offRoot = Array({FileURL(WriteFile(elsewhere.filePath("A.ttf"))).get()});
    Confirmation onOther(Request(offRoot).as<CFDictionaryRef>());
    EXPECT_EQ(onOther.volumeName(), "shm");
    EXPECT_EQ(onOther.alert()->text(), "Example Writer wants to use the font “Example Sans”, which "
                                       "is not installed but was found on the volume “shm”.");
}

TEST_F(AutoActivationTest, ShowsTheFontNameInItsOwnFaceAndCountsDown) {
    QString dejaVu;
    for (QDirIterator it("/usr/share/fonts", {"DejaVuSans.ttf"}, QDir::Files,
                         QDirIterator::Subdirectories);
         it.hasNext();)
        dejaVu = it.next();
    if (dejaVu.isEmpty())
        GTEST_SKIP() << "DejaVuSans.ttf is not installed";
    Confirmation confirmation(Request(Array({FileURL(dejaVu).get()})).as<CFDictionaryRef>());
    confirmation.setTimeout(3s);
    ASSERT_TRUE(confirmation.fontSampleLabel());
    EXPECT_EQ(confirmation.fontSampleLabel()->text(), "Example Sans");
    EXPECT_EQ(confirmation.fontSampleLabel()->font().family(), "DejaVu Sans");

    QString countdownAtStart, countdownLater;
    bool visible = false;
    QLabel* countdown = confirmation.countdownLabel();
    UiScript script({When(Showing(confirmation),
                          [&] {
                              countdownAtStart = countdown->text();
                              visible = countdown->isVisible() &&
                                        confirmation.fontSampleLabel()->isVisible();
                          }),
                     When([&] { return countdown->text() != countdownAtStart; },
                          [&] {
                              countdownLater = countdown->accessibleName();
                              confirmation.buttonWithTag(2001)->click();
                          })},
                    [&] { confirmation.withdraw(); });
    confirmation.showAlert();
    EXPECT_TRUE(visible);
    EXPECT_EQ(countdownAtStart, "This question closes without an answer in 0:03.");
    EXPECT_EQ(countdownLater, "This question closes without an answer in 0:02.");
}

} // namespace
