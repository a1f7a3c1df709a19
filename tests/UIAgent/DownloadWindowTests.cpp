// The progress window on the whole message id 2 road with real parts: the dispatcher, the
// confirmation's button, DejaVu copies from a loopback server listed in a temporary catalog, a
// private fontconfig. A tap on the matching's callbacks records the states and can hold the worker
// at one, so that the window is looked at, cancelled or withdrawn mid-transfer at a known point.
#include <QPointer>
#include <climits>
#include <condition_variable>
#include <cstring>
#include <limits>
#include <mutex>

#include "UIAgent/FontDownloadWindowController.h"
#include "UIAgent/QZNetworkCheck.h"
#include "desktop/QZFontDownloader.h"
#include "desktop/QZFontMatching.h"
#include "tests/UIAgent/AgentTestSupport.h"
#include "tests/support/LoopbackHTTPServer.h"
#include "tests/support/PrivateFonts.h"

namespace {

using namespace std::chrono_literals;
using namespace glyphwell::testing;
using Controller = FontDownloadWindowController;

// DejaVuSansMono.ttf has 343140 bytes, DejaVuSansMono-Bold.ttf 334268.

/// The matching's states as the tap sees them, and a gate holding the worker at one state.
class Callbacks {
public:
    QZDownloadProgressTap Tap() {
        return [this](QZFontDescriptorMatchingState state, CFDictionaryRef) {
            std::unique_lock<std::mutex> lock(mutex_);
            states_.push_back(state);
            if (int(state) != holdAt_ || released_)
                return;
            holding = true;
            changed_.wait_for(lock, 20s, [this] { return released_; });
            released_ = true; // held once, also when nobody came
            holding = false;
        };
    }
    /// Forgets the states seen; holds the worker at the first callback of `holdAt` (-1: nowhere).
    void Restart(int holdAt = -1) {
        std::lock_guard<std::mutex> lock(mutex_);
        states_.clear();
        holdAt_ = holdAt;
        released_ = false;
    }
    void Release() {
        std::lock_guard<std::mutex> lock(mutex_);
        released_ = true;
        changed_.notify_all();
    }
    /// The states in order, runs of state 5 folded into one.
    std::vector<uint32_t> States() const {
        std::lock_guard<std::mutex> lock(mutex_);
        std::vector<uint32_t> folded;
        for (uint32_t state : states_)
            if (folded.empty() || state != 5 || folded.back() != 5)
                folded.push_back(state);
        return folded;
    }

private:
    mutable std::mutex mutex_;
    std::condition_variable changed_;
    std::vector<uint32_t> states_;
    int holdAt_ = -1;
    bool released_ = false;

public:
    std::atomic<bool> holding{false}; ///< the worker waits at the held state
};

/// What the progress window shows: "status | size line | value/maximum | timer | on top".
std::string Look(QDialog* window) {
    if (!window)
        return "no window";
    auto* bar = window->findChild<QProgressBar*>("progressIndicator");
    return window->findChild<QLabel*>("mainStatusTextField")->text().toStdString() + " | " +
           window->findChild<QLabel*>("minorStatusTextField")->text().toStdString() + " | " +
           std::to_string(bar->value()) + "/" + std::to_string(bar->maximum()) +
           (window->findChild<QTimer*>("refreshTimer")->isActive() ? " | timer" : " | no timer") +
           (window->windowFlags().testFlag(Qt::WindowStaysOnTopHint) ? " | on top" : "");
}

class DownloadRoadTest : public ::testing::Test {
protected:
    void SetUp() override {
        ASSERT_TRUE(root_.isValid());
        ASSERT_TRUE(server_.IsListening());
        fonts_ = UsePrivateFonts(root_.path());
        ASSERT_FALSE(fonts_.isEmpty());
        ASSERT_FALSE(QZIsFontInstalled("DejaVuSansMono"));
        QZSetNetworkFlagsSourceForTesting([](QZNetworkReachabilityFlags* flags) {
            *flags = kQZNetworkReachabilityFlagsReachable;
            return true;
        });
        QZSetPreferredLanguagesForTesting({"en-US"});
        QZSetDownloadProgressTapForTesting(callbacks_.Tap());
        // A dropped connection is resumed after a pause; the tests need not wait for it.
        QZDownloadLimits limits;
        limits.resumePause = std::chrono::milliseconds(10);
        QZSetDownloadLimits(limits);
    }
    void TearDown() override {
        // A matching whose window has gone ends at its next callback; wait for its thread.
        callbacks_.Release();
        EXPECT_TRUE(WaitForTheMatchingToEnd());
        QZSetDownloadLimits({});
        QZSetDownloadProgressTapForTesting({});
        QZSetNetworkFlagsSourceForTesting(nullptr);
        QZSetPreferredLanguagesForTesting({});
        StopUsingPrivateFonts();
    }

    /// Serves the DejaVu file `file` at "/<file>" with `resource`'s delivery settings and
    /// returns its catalog entry holding `postScriptName`; `sha256` replaces the file's own.
    std::string ServeFont(const QString& file, const std::string& localID,
                          const std::string& postScriptName,
                          LoopbackHTTPServer::Resource resource = {}, std::string sha256 = {}) {
        resource.body = ReadFile(kDejaVu + file);
        EXPECT_FALSE(resource.body.empty()) << file.toStdString();
        if (sha256.empty())
            sha256 = SHA256Of(resource.body);
        const std::string path = "/" + file.toStdString();
        server_.Serve(path, resource);
        return CatalogAsset(localID, server_.URL(path), resource.body.size(), sha256,
                            postScriptName);
    }
    void WriteCatalog(const std::vector<std::string>& assets) {
        ASSERT_TRUE(glyphwell::testing::WriteCatalog(root_.path() + "/data", assets));
    }
    void ServeMono() {
        WriteCatalog({ServeFont("DejaVuSansMono.ttf", "org.test.Mono", "DejaVuSansMono")});
    }
    /// Every entry of the download folder, hidden ones included.
    QStringList DownloadFolder() const {
        return QDir(fonts_ + "/glyphwell")
            .entryList(QDir::Files | QDir::Hidden | QDir::NoDotAndDotDot, QDir::Name);
    }
    static bool WaitForTheMatchingToEnd() {
        return SpinUntil([] { return Controller::MatchingRunsInProgress() == 0; });
    }

    EnglishTexts english_;
    QTemporaryDir root_;
    QString fonts_;
    LoopbackHTTPServer server_;
    Callbacks callbacks_;
    WindowWatch watch_;
    Ref mono_ = RequestedFont("DejaVuSansMono", "DejaVu Sans Mono");
};

TEST_F(DownloadRoadTest, AnAgreedDownloadIsInstalledAndAnsweredYesCancelStopsAndLeavesNothing) {
    ServeMono();
    struct Case {
        bool cancel; ///< Cancel in the progress window while the transfer is held
        std::vector<uint32_t> states;
        QStringList folder;
    } cases[] = {
        // The callback held at the first bytes answers stop: nothing comes after it.
        {true, {0, 2, 4, 5}, {}},
        {false, {0, 2, 4, 5, 6, 7, 1}, {"org.test.Mono.ttf"}},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.cancel ? "cancelled" : "agreed");
        callbacks_.Restart(kCTFontDescriptorMatchingDownloading);
        WindowWatch watch;
        std::string whileDownloading, afterCancel;
        UiScript script({PressWhenUp("Download"),
                         {[this] { return callbacks_.holding.load(); },
                          [&] {
                              QDialog* window = ProgressWindowOnScreen();
                              whileDownloading = Look(window);
                              if (c.cancel) {
                                  window->findChild<QPushButton*>("cancelButton")->click();
                                  afterCancel = Look(window);
                              }
                              callbacks_.Release();
                          }}});

        EXPECT_EQ(HandleDownloadRequest(DownloadRequest({mono_.get()}).get()),
                  Reply(!c.cancel, false));
        EXPECT_TRUE(script.done());
        // Once the total is known: the bar in bytes and the first size line at once.
        EXPECT_EQ(
            whileDownloading,
            "Downloading “DejaVu Sans Mono”… | 0 bytes of 343 kB | 0/343140 | timer | on top");
        EXPECT_TRUE(!c.cancel || afterCancel.find("| timer") == std::string::npos) << afterCancel;
        EXPECT_TRUE(watch.hidden);
        EXPECT_FALSE(watch.timerRunningWhenHidden);
        EXPECT_EQ(watch.progressWindowsShown, 1);
        ASSERT_TRUE(WaitForTheMatchingToEnd());
        EXPECT_EQ(callbacks_.States(), c.states);
        EXPECT_EQ(DownloadFolder(), c.folder);
        EXPECT_EQ(QZIsFontInstalled("DejaVuSansMono"), !c.cancel);
        if (c.cancel)
            continue;
        // The bar follows the bytes up to the whole file.
        ASSERT_FALSE(watch.bar.empty());
        EXPECT_EQ(watch.bar.back(), "343140/343140");
        for (const std::string& value : watch.bar)
            EXPECT_TRUE(value.size() > 7 && value.compare(value.size() - 7, 7, "/343140") == 0)
                << value;
    }
    EXPECT_EQ(server_.RequestCount("/DejaVuSansMono.ttf"), 2);
    EXPECT_TRUE(ReadFile(fonts_ + "/glyphwell/org.test.Mono.ttf") ==
                ReadFile(kDejaVu + "DejaVuSansMono.ttf"));
}

TEST_F(DownloadRoadTest, AFailureGoesOnToTheNextFontOrEndsWithNoWhenCancelledOrClosed) {
    struct Case {
        const char* button; ///< the error alert's button pressed; null: its close button
        bool damaged;       ///< the bold file's checksum is wrong; else its connection drops
        std::vector<uint32_t> states;
        QStringList folder;
    } cases[] = {
        {"Cancel", false, {0, 2, 4, 5, 8}, {}},
        {nullptr, false, {0, 2, 4, 5, 8}, {}},
        {"Continue Download", true, {0, 2, 4, 5, 8, 2, 4, 5, 6, 7, 1}, {"org.test.Mono.ttf"}},
    };
    Ref bold = RequestedFont("DejaVuSansMono-Bold");
    Ref mono = RequestedFont("DejaVuSansMono");
    for (const Case& c : cases) {
        SCOPED_TRACE(c.button ? c.button : "close button");
        LoopbackHTTPServer::Resource resource;
        resource.dropAfter = c.damaged ? std::string::npos : 100000;
        // Another identifier for the damaged file, so that the catalog changes size and is reread.
        WriteCatalog(
            {ServeFont("DejaVuSansMono-Bold.ttf",
                       c.damaged ? "org.test.DamagedBold" : "org.test.MonoBold",
                       "DejaVuSansMono-Bold", resource, c.damaged ? std::string(64, '0') : ""),
             ServeFont("DejaVuSansMono.ttf", "org.test.Mono", "DejaVuSansMono")});
        callbacks_.Restart();
        QString look; // the reason, the default and the escape button
        UiScript script(
            {{[] { return AlertWithText("The font “DejaVuSansMono-Bold” cannot be downloaded."); },
              [&] {
                  QMessageBox* alert = AlertOnScreen();
                  look = alert->informativeText() + " | " + alert->defaultButton()->text() + " | " +
                         alert->escapeButton()->text();
                  c.button ? ClickButton(alert, c.button) : void(alert->close());
              }}});

        EXPECT_EQ(HandleDownloadRequest(DownloadRequest({bold.get(), mono.get()}, 0, true).get()),
                  Reply(c.button && !strcmp(c.button, "Continue Download"), true));
        EXPECT_TRUE(script.done());
        EXPECT_EQ(look.toStdString(),
                  (c.damaged ? "The downloaded file is damaged: its SHA-256 checksum is not the "
                               "expected one."
                             : "The connection ended after 100000 of 334268 bytes.") +
                      std::string(" | Continue Download | Cancel"));
        ASSERT_TRUE(WaitForTheMatchingToEnd());
        EXPECT_EQ(callbacks_.States(), c.states);
        EXPECT_EQ(DownloadFolder(), c.folder);
    }
    // Only the run that went on fetched the second font.
    EXPECT_EQ(server_.RequestCount("/DejaVuSansMono.ttf"), 1);
    EXPECT_FALSE(QZIsFontInstalled("DejaVuSansMono-Bold"));
    EXPECT_FALSE(watch_.timerRunningWhenHidden);
}

TEST_F(DownloadRoadTest, RegressionTheRequestingProcessExitEndsTheWindowsOwnRunNotTheInnermost) {
    ServeMono();
    PausedChild requester;
    callbacks_.Restart(kCTFontDescriptorMatchingDownloading);
    // Another question comes up above the progress window while the download runs.
    QPointer<QMessageBox> other;
    QZModalSession* otherSession = nullptr;
    bool otherUpWhenWindowWent = false;
    UiScript script({PressWhenUp("Download"),
                     {[this] { return callbacks_.holding.load() && ProgressWindowOnScreen(); },
                      [&] {
                          QTimer::singleShot(0, [&] {
                              QMessageBox box;
                              box.setText(QStringLiteral("Another question"));
                              QZModalSession session(&box);
                              other = &box;
                              otherSession = &session;
                              session.Run();
                              otherSession = nullptr;
                          });
                      }},
                     {[&] { return other && other->isVisible(); }, [&] { requester.Kill(); }},
                     {[&] { return !ProgressWindowOnScreen(); },
                      [&] {
                          otherUpWhenWindowWent = other && other->isVisible();
                          otherSession->End(kQZModalResponseStop);
                          callbacks_.Release();
                      }}});

    EXPECT_EQ(HandleDownloadRequest(DownloadRequest({mono_.get()}, requester.pid()).get()),
              Reply(false, false));
    EXPECT_TRUE(script.done());
    EXPECT_TRUE(otherUpWhenWindowWent);
    EXPECT_FALSE(watch_.timerRunningWhenHidden);
    ASSERT_TRUE(WaitForTheMatchingToEnd());
    EXPECT_EQ(callbacks_.States(), (std::vector<uint32_t>{0, 2, 4, 5}));
    EXPECT_TRUE(DownloadFolder().isEmpty());
}

TEST_F(DownloadRoadTest, TheErrorAlertAndTheProgressWindowElideALongFontNameAndTellTheFullTexts) {
    // A file that does not hold the font: the name is in the headline and in the reason.
    const QString name = "Long" + QString(200, u'X');
    WriteCatalog({ServeFont("DejaVuSansMono.ttf", "org.test.Long", name.toStdString())});
    Ref font = RequestedFont(name.toUtf8().constData());
    UiScript script(
        {{[] { return AlertOnScreen() && AlertOnScreen()->isVisible(); },
          [&] {
              for (auto [window, labelName] :
                   {std::pair<QWidget*, const char*>{AlertOnScreen(), "qt_msgbox_label"},
                    {AlertOnScreen(), "qt_msgbox_informativelabel"},
                    {ProgressWindowOnScreen(), "mainStatusTextField"}}) {
                  SCOPED_TRACE(labelName);
                  auto* label = window->findChild<QLabel*>(labelName);
                  ASSERT_TRUE(label);
                  EXPECT_FALSE(label->text().contains(name));
                  EXPECT_TRUE(label->toolTip().contains(name));
              }
              ClickButton(AlertOnScreen(), "Cancel");
          }}});
    EXPECT_EQ(HandleDownloadRequest(DownloadRequest({font.get()}, 0, true).get()),
              Reply(false, true));
    EXPECT_TRUE(script.done());
}

TEST(DownloadWindow, ByteCountsUseDecimalUnitsWithPrecisionGrowingWithTheUnit) {
    EnglishTexts english;
    const std::pair<qint64, const char*> cases[] = {
        {0, "0 bytes"},        {999, "999 bytes"},      {343140, "343 kB"}, {1500000, "1.5 MB"},
        {50000000, "50.0 MB"}, {2250000000, "2.25 GB"}, {-5, "0 bytes"},
    };
    for (const auto& [bytes, text] : cases)
        EXPECT_EQ(QZFormattedByteCount(bytes).toStdString(), text) << bytes;
}

TEST(DownloadWindow, TheBarScalesTotalsBeyondItsIntRangeAndClampsTheRest) {
    const double nan = std::numeric_limits<double>::quiet_NaN();
    struct Case {
        double downloaded, total;
        int value, maximum;
    } cases[] = {
        {100, 200, 100, 200},
        {0, 0, 0, 1},
        {nan, nan, 0, 1},
        {-5, 200, 0, 200},
        {300, 200, 200, 200},
        {2147483647.0, 2147483647.0, INT_MAX, INT_MAX},
        // Above 2^31 both sizes are scaled alike: half stays half.
        {3e9, 6e9, 1073741823, INT_MAX},
        {4294967296.0, 4294967296.0, INT_MAX, INT_MAX},
        {1e12, 1e15, 2147483, INT_MAX},
    };
    Controller controller(nullptr);
    controller.window();
    QProgressBar* bar = controller.progressIndicator();
    for (const Case& c : cases) {
        controller.setProgress(c.downloaded, c.total);
        EXPECT_EQ(bar->value(), c.value) << c.downloaded << "/" << c.total;
        EXPECT_EQ(bar->maximum(), c.maximum) << c.downloaded << "/" << c.total;
    }
}

} // namespace
