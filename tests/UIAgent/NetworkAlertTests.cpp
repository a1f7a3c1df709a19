// The network check before a download: which (injected) reachability flags go on without a word,
// the offline alert's texts, buttons and answers, and what the dispatcher makes of them.
#include <QTest>
#include <algorithm>

#include "UIAgent/FontDownloadWindowController.h"
#include "UIAgent/QZNetworkCheck.h"
#include "tests/UIAgent/AgentTestSupport.h"

namespace {

using namespace std::chrono_literals;
using namespace glyphwell::testing;

const QString kOfflineHeadline = QStringLiteral("Network is not connected.");

QZNetworkReachabilityFlags gFlags = 0;
bool gFlagsReadable = true;

bool InjectedFlags(QZNetworkReachabilityFlags* flags) {
    *flags = gFlagsReadable ? gFlags : 0;
    return gFlagsReadable;
}

/// A step that presses the offline alert's button `key`.
UiScript::Step AnswerOfflineAlert(const char* key) {
    return {[] { return AlertWithText(kOfflineHeadline); },
            [key] { ClickButton(AlertOnScreen(), key); }};
}

class NetworkCheckTest : public ::testing::Test {
protected:
    void SetUp() override {
        gFlags = 0;
        gFlagsReadable = true;
        QZSetNetworkFlagsSourceForTesting(&InjectedFlags);
    }
    void TearDown() override {
        EXPECT_TRUE(
            SpinUntil([] { return FontDownloadWindowController::MatchingRunsInProgress() == 0; }));
        QZSetNetworkFlagsSourceForTesting(nullptr);
    }

    EnglishTexts english_;
};

TEST_F(NetworkCheckTest, OnlyReachableWithoutConnectionRequiredGoesOnWithoutAnAlert) {
    struct Case {
        QZNetworkReachabilityFlags flags;
        bool readable;
        bool alert;
    };
    // The flags' rule itself is the desktop services' test; here, that the check follows it.
    const Case cases[] = {
        {kQZNetworkReachabilityFlagsReachable, true, false},
        {kQZNetworkReachabilityFlagsReachable | kQZNetworkReachabilityFlagsConnectionRequired, true,
         true},
        {0, true, true},
        {kQZNetworkReachabilityFlagsReachable, false, true}, // flags that cannot be read
    };
    for (const Case& c : cases) {
        gFlags = c.flags;
        gFlagsReadable = c.readable;
        WindowWatch shown;
        UiScript script({AnswerOfflineAlert("Continue Download")}, EndEveryModalRun, 10s);
        EXPECT_TRUE(QZNetworkCheck().continueDownload());
        EXPECT_EQ(shown.windowsShown, c.alert ? 1 : 0)
            << "flags " << c.flags << " readable " << c.readable;
    }
}

TEST_F(NetworkCheckTest, TheCriticalOfflineAlertStopsOnlyOnCancelOrCloseAndRaisesOnlyItself) {
    struct Case {
        const char* how;
        std::function<void(QZNetworkCheck&)> answer;
        bool goOn;
    } cases[] = {
        {"default button", [](QZNetworkCheck& check) { check.alert()->defaultButton()->click(); },
         false},
        {"Continue Download",
         [](QZNetworkCheck& check) { ClickButton(check.alert(), "Continue Download"); }, true},
        {"withdrawn", [](QZNetworkCheck& check) { check.withdraw(); }, true},
        {"close button", [](QZNetworkCheck& check) { check.alert()->close(); }, false},
        {"Escape", [](QZNetworkCheck& check) { QTest::keyClick(check.alert(), Qt::Key_Escape); },
         false},
    };
    // Another window of the agent, up before the question: the question raises only itself.
    QDialog other;
    other.show();
    for (const Case& c : cases) {
        SCOPED_TRACE(c.how);
        other.activateWindow();
        ASSERT_TRUE(SpinUntil([&] { return other.isActiveWindow(); }));
        QZNetworkCheck check;
        WindowWatch watch;
        int activationsWhileAsked = -1;
        std::string look;
        UiScript script({{[] {
                              QMessageBox* alert = AlertWithText(kOfflineHeadline);
                              return alert && alert->isActiveWindow();
                          },
                          [&] {
                              QMessageBox* alert = check.alert();
                              ASSERT_EQ(alert, AlertOnScreen());
                              look = (alert->informativeText() + " | default " +
                                      alert->defaultButton()->text() + " | escape " +
                                      alert->escapeButton()->text())
                                         .toStdString();
                              EXPECT_EQ(alert->icon(), QMessageBox::Critical);
                              activationsWhileAsked = int(std::count(
                                  watch.activated.begin(), watch.activated.end(), &other));
                              c.answer(check);
                          }}});
        EXPECT_EQ(check.continueDownload(), c.goOn);
        EXPECT_TRUE(script.done());
        EXPECT_EQ(look, "You are not connected to the Internet. Do you want to cancel "
                        "downloading? | default Cancel | escape Cancel");
        EXPECT_FALSE(check.alert()->isVisible());
        EXPECT_EQ(activationsWhileAsked, 0);
    }
    // The class operation of the download window asks the same question.
    UiScript again({AnswerOfflineAlert("Cancel")});
    EXPECT_FALSE(FontDownloadWindowController::continueDownloadWithNetworkReachabilityCheck());
}

TEST_F(NetworkCheckTest, OfflineCancelAnswersNoAndContinueRunsTheDownloadWindow) {
    // DejaVu Sans is installed: a download that goes on matches it without downloading (there
    // is no catalog), and the unasked window still names the font.
    Ref font = RequestedFont("DejaVuSans");
    for (const bool goOn : {false, true}) {
        WindowWatch shown;
        UiScript script({AnswerOfflineAlert(goOn ? "Continue Download" : "Cancel")});
        EXPECT_EQ(HandleDownloadRequest(DownloadRequest({font.get()}, 0, true).get()),
                  Reply(goOn, true));
        EXPECT_TRUE(script.done());
        EXPECT_EQ(shown.progressWindowsShown, goOn ? 1 : 0);
        EXPECT_EQ(shown.statusWhenHidden, goOn ? "Preparing to download “DejaVuSans”…" : "");
    }
}

TEST_F(NetworkCheckTest, TheRequestingApplicationQuittingEndsTheOfflineAlertAndNoWindowOpens) {
    // A font that can be downloaded, so that the confirmation asks.
    PrivateDataHome data;
    data.WriteCatalog(R"({"assets": [{"LocalID": "A", "url": "https://fonts.example/A",
        "size": 5000, "sha256": "%1", "fonts": [{"postScriptName": "Example-Regular"}]}]})");
    PausedChild requester;
    WindowWatch shown;
    Ref font = RequestedFont("Example-Regular");
    UiScript script({PressWhenUp("Download"),
                     {[] { return AlertWithText(kOfflineHeadline); }, [&] { requester.Kill(); }}});
    EXPECT_EQ(HandleDownloadRequest(DownloadRequest({font.get()}, requester.pid()).get()),
              Reply(false, false));
    EXPECT_TRUE(script.done());
    EXPECT_EQ(shown.progressWindowsShown, 0);
}

} // namespace
