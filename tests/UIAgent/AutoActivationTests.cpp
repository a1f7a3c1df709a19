// The auto-activation alert, driven by clicking its real buttons on the offscreen platform.
#include <QCheckBox>
#include <QLabel>
#include <QMessageBox>
#include <QPushButton>
#include <QTemporaryDir>
#include <QTest>
#include <QTextBrowser>
#include <sys/stat.h>

#include "UIAgent/QZAutoActivationConfirmation.h"
#include "protocol/QZUIProtocol.h"
#include "tests/UIAgent/AgentTestSupport.h"
#include "tests/support/PrivateSessionBus.h"

namespace {

using namespace std::chrono_literals;
using namespace glyphwell::testing;
using Confirmation = QZAutoActivationConfirmation;

class AutoActivationTest : public ::testing::Test {
protected:
    /// A request from "Example Writer" for "Example Sans", found in `candidates` (default: one
    /// file in the test's directory).
    Ref Request(CFTypeRef candidates = nullptr) {
        Ref own = Array({FileURL(WriteFile(directory_.filePath("ExampleSans.ttf"))).get()});
        return Dict({{kQZUIPropertyApplicationName, Str("Example Writer").get()},
                     {kQZUIPropertyFontName, Str("Example Sans").get()},
                     {kQZUIPropertyCandidateFontURLs, candidates ? candidates : own.get()}});
    }
    static UiScript::Step Click(
        const Confirmation& alert, int tag, std::function<bool()> also = [] { return true; }) {
        return {[&alert, also] { return alert.alert()->isVisible() && also(); },
                [&alert, tag] { alert.buttonWithTag(tag)->click(); }};
    }

    EnglishTexts english_;
    QTemporaryDir directory_;
};

TEST_F(AutoActivationTest, SetsUpTextsTheFontSampleButtonsAndTheCheckboxInTabOrder) {
    Ref dejaVu = Array({FileURL("/usr/share/fonts/truetype/dejavu/DejaVuSans.ttf").get()});
    Confirmation confirmation(Request(dejaVu.get()).as<CFDictionaryRef>());
    EXPECT_TRUE(confirmation.volumeName().isNull()); // the font is on the root volume
    ASSERT_TRUE(confirmation.fontSampleLabel());
    EXPECT_EQ(confirmation.fontSampleLabel()->text(), "Example Sans");
    EXPECT_EQ(confirmation.fontSampleLabel()->font().family(), "DejaVu Sans");
    EXPECT_EQ(confirmation.alert()->text(),
              "Example Writer wants to use the font “Example Sans”, which is not installed.");
    QStringList buttons, order;
    for (QAbstractButton* button : confirmation.alert()->buttons())
        buttons << button->text();
    EXPECT_EQ(buttons, QStringList({"Allow", "Don’t Allow", "Show in File Manager", "Help"}));
    EXPECT_TRUE(static_cast<QPushButton*>(confirmation.buttonWithTag(2000))->isDefault());
    UiScript script({{[&] { return confirmation.alert()->isVisible(); },
                      [&] {
                          QWidget* start = confirmation.alert();
                          for (QWidget* w = start->nextInFocusChain(); w != start;
                               w = w->nextInFocusChain())
                              if (w->isVisible() && (w->focusPolicy() & Qt::TabFocus))
                                  order << (qobject_cast<QAbstractButton*>(w)
                                                ? static_cast<QAbstractButton*>(w)->text()
                                                : w->objectName());
                          confirmation.withdraw();
                      }}});
    confirmation.showAlert();
    EXPECT_EQ(order, QStringList({"qt_msgbox_label", "qt_msgbox_informativelabel",
                                  "Don’t ask again for Example Writer", "Allow",
                                  "Show in File Manager", "Don’t Allow", "Help"}))
        << order.join(" | ").toStdString();
}

TEST_F(AutoActivationTest, ShowInFileManagerRevealsEachTimeAndTheTickedCheckboxSuppresses) {
    PrivateSessionBus bus;
    ASSERT_FALSE(bus.address().isEmpty()) << "dbus-daemon did not start";
    FileManagerStandIn fileManager(bus.address());
    ASSERT_TRUE(fileManager.registered());
    const QString first = WriteFile(directory_.filePath("A.ttf"));
    const QString second = WriteFile(directory_.filePath("B Bold.otf"));
    Ref web(CFURLCreateWithString(nullptr, CFSTR("https://fonts.example/x.ttf"), nullptr));
    Ref candidates = Array({FileURL(first).get(), web.get(), FileURL(second).get()});
    Confirmation confirmation(Request(candidates.get()).as<CFDictionaryRef>());

    auto received = [&](size_t count) {
        return [&, count] { return fileManager.calls().size() == count; };
    };
    UiScript script(
        {Click(confirmation, 2002),
         Click(confirmation, 2002, received(2)),
         {received(4),
          [&] { QTest::mouseClick(confirmation.suppressionCheckBox(), Qt::LeftButton); }},
         Click(confirmation, 2001)});
    confirmation.showAlert();

    EXPECT_FALSE(confirmation.shouldActivate());
    EXPECT_TRUE(confirmation.suppressFurtherAlerts());
    const auto& calls = fileManager.calls();
    ASSERT_EQ(calls.size(), 4u);
    for (size_t i : {0u, 2u}) {
        EXPECT_EQ(calls[i].member, "Introspect");
        EXPECT_EQ(calls[i + 1].member, "ShowItems");
        // The web URL is no file to show.
        EXPECT_EQ(calls[i + 1].uris, QStringList({"file://" + first, "file://" + directory_.path() +
                                                                         "/B%20Bold.otf"}));
    }
    EXPECT_TRUE(CFEqual(confirmation.candidateFonts(), candidates.get()));
}

TEST_F(AutoActivationTest, InputRestartsTheTimeoutWhichAnswersNoWithTheCheckboxAsItIs) {
    Confirmation confirmation(Request().as<CFDictionaryRef>());
    confirmation.setTimeout(2s);
    confirmation.suppressionCheckBox()->setChecked(true);
    std::chrono::milliseconds before{0}, after{0};
    UiScript script({{[&] { return confirmation.remainingTime() < 1800ms; },
                      [&] {
                          before = confirmation.remainingTime();
                          QTest::keyClick(confirmation.alert(), Qt::Key_Shift);
                          after = confirmation.remainingTime();
                      }}});
    confirmation.showAlert();
    EXPECT_GT(after, before);
    EXPECT_FALSE(confirmation.shouldActivate());
    EXPECT_TRUE(confirmation.suppressFurtherAlerts());
}

TEST_F(AutoActivationTest, RegressionTimeoutOfAnAnsweredAlertNeverEndsALaterOne) {
    PrivateSessionBus bus; // the reveal goes to a bus of our own
    Confirmation first(Request().as<CFDictionaryRef>());
    first.setTimeout(300ms);
    // Shown again after the reveal, the alert still answers with its button.
    UiScript script({Click(first, 2002), Click(first, 2000)});
    first.showAlert();
    ASSERT_TRUE(first.shouldActivate());

    Confirmation later(Request().as<CFDictionaryRef>());
    bool laterUpAfterEarlierDeadlines = false;
    QTimer::singleShot(800ms, later.alert(), [&] {
        laterUpAfterEarlierDeadlines = later.alert()->isVisible();
        later.buttonWithTag(2000)->click();
    });
    later.showAlert();
    EXPECT_TRUE(laterUpAfterEarlierDeadlines);
}

TEST_F(AutoActivationTest, NamesFallBackToTheBundleThenTheCandidateFile) {
    const QString entry = WriteFile(directory_.filePath("writer.desktop"),
                                    "[Desktop Entry]\nName=Writer\nName[de]=Schreiber\n");
    Ref candidates = Array({FileURL(WriteFile(directory_.filePath("Font File.ttf"))).get()});
    Ref familyOnly = Dict({{NSFontFamilyAttribute, Str("Family Name").get()}});
    Confirmation fromEntry(Dict({{kQZUIPropertyBundleURL, FileURL(entry).get()},
                                 {kQZUIPropertyRequestDictionary, familyOnly.get()},
                                 {kQZUIPropertyCandidateFontURLs, candidates.get()}})
                               .as<CFDictionaryRef>());
    EXPECT_EQ(fromEntry.applicationName(), "Writer");
    EXPECT_EQ(fromEntry.fontName(), "Family Name");

    Confirmation fromFile(Dict({{kQZUIPropertyBundleURL, FileURL(directory_.path()).get()},
                                {kQZUIPropertyCandidateFontURLs, candidates.get()}})
                              .as<CFDictionaryRef>());
    EXPECT_EQ(fromFile.applicationName(), QFileInfo(directory_.path()).fileName());
    EXPECT_EQ(fromFile.fontName(), "Font File.ttf");

    EXPECT_EQ(Confirmation(nullptr).applicationName(), "The current application");
}

/// st_dev of `path`: the test's own view of which file system holds it.
dev_t DeviceOf(const QString& path) {
    struct stat status {};
    return stat(path.toUtf8().constData(), &status) == 0 ? status.st_dev : dev_t(-1);
}

TEST_F(AutoActivationTest, NamesTheVolumeWhenTheFontIsOffTheRootVolume) {
    QTemporaryDir elsewhere(QStringLiteral("/dev/shm/glyphwell-test-XXXXXX"));
    if (!elsewhere.isValid() || DeviceOf(elsewhere.path()) == DeviceOf("/"))
        GTEST_SKIP() << "/dev/shm is not a file system of its own here";
    Ref offRoot = Array({FileURL(WriteFile(elsewhere.filePath("A.ttf"))).get()});
    Confirmation onOther(Request(offRoot.get()).as<CFDictionaryRef>());
    EXPECT_EQ(onOther.alert()->text(), "Example Writer wants to use the font “Example Sans”, which "
                                       "is not installed but was found on the volume “shm”.");
}

} // namespace
