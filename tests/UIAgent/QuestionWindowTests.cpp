// What every question window shares: the input guard after each showing, the window's properties,
// long names elided, and what assistive technologies are told. Driven on the offscreen platform.
#include <QAccessible>
#include <QCheckBox>
#include <QDialog>
#include <QElapsedTimer>
#include <QLabel>
#include <QMessageBox>
#include <QProgressBar>
#include <QPushButton>
#include <QRegularExpression>
#include <QTest>
#include <QTextBrowser>

#include "UIAgent/FontDownloadWindowController.h"
#include "UIAgent/QZAutoActivationConfirmation.h"
#include "UIAgent/QZFontDownloadConfirmation.h"
#include "UIAgent/QZInputGuard.h"
#include "UIAgent/QZModalSession.h"
#include "UIAgent/QZNetworkCheck.h"
#include "UIAgent/QZWindowActivation.h"
#include "protocol/QZUIProtocol.h"
#include "tests/UIAgent/AgentTestSupport.h"

namespace {

using namespace std::chrono_literals;
using namespace glyphwell::testing;

/// The guard at `duration` while it lives (the suite runs with it off).
struct GuardDuration {
    explicit GuardDuration(std::chrono::milliseconds duration) {
        QZSetInputGuardDurationForTesting(duration);
    }
    ~GuardDuration() { QZSetInputGuardDurationForTesting(-1ms); }
};

TEST(InputGuard, DropsButtonInputForASecondAfterEachShowingAndAutoRepeatAlways) {
    GuardDuration guard(1000ms);
    QMessageBox box;
    QPushButton* allow = box.addButton(QStringLiteral("Allow"), QMessageBox::AcceptRole);
    QPushButton* deny = box.addButton(QStringLiteral("Deny"), QMessageBox::RejectRole);
    box.setDefaultButton(allow);
    QZModalSession session(&box, QZModalSession::kQuestion);
    int answer = 0;
    QObject::connect(&box, &QMessageBox::buttonClicked, [&](QAbstractButton* clicked) {
        answer = clicked == allow ? 1 : 2;
        session.End(answer);
    });
    auto keyTarget = [&] { return box.focusWidget() ? box.focusWidget() : &box; };
    struct Row {
        int atMs;
        std::function<void()> input;
        bool answers;
    };
    const Row rows[] = {{100, [&] { QTest::keyClick(keyTarget(), Qt::Key_Return); }, false},
                        {150, [&] { QTest::mouseClick(allow, Qt::LeftButton); }, false},
                        // What a key held down since before the window appeared delivers.
                        {1200,
                         [&] {
                             for (QEvent::Type type : {QEvent::KeyPress, QEvent::KeyRelease}) {
                                 QKeyEvent event(type, Qt::Key_Return, Qt::NoModifier,
                                                 QStringLiteral("\r"), true);
                                 QApplication::sendEvent(keyTarget(), &event);
                             }
                         },
                         false},
                        {1250, [&] { QTest::keyClick(keyTarget(), Qt::Key_Return); }, true}};
    // Twice: the guard starts again when the question is shown again.
    for (int showing = 1; showing <= 2; ++showing) {
        answer = 0;
        QElapsedTimer shown;
        std::vector<UiScript::Step> steps{{[&] { return box.isVisible(); },
                                           [&] {
                                               shown.start();
                                               EXPECT_FALSE(allow->isEnabled());
                                               EXPECT_FALSE(deny->isEnabled());
                                           }}};
        for (const Row& row : rows)
            steps.push_back({[&shown, row] { return shown.hasExpired(row.atMs); },
                             [&, row] {
                                 SCOPED_TRACE(::testing::Message() << "showing " << showing << ", "
                                                                   << row.atMs << " ms");
                                 EXPECT_EQ(allow->isEnabled(), row.atMs > 1000);
                                 row.input();
                                 EXPECT_EQ(answer != 0, row.answers);
                             }});
        UiScript script(std::move(steps), [&] { session.End(kQZModalResponseStop); });
        EXPECT_EQ(session.Run(), 1);
        EXPECT_TRUE(allow->isEnabled() && deny->isEnabled());
    }
}

TEST(WindowActivation, TakesTheTokenOnceFromEitherVariable) {
    struct Row {
        const char* xdg;
        const char* startup;
        const char* token;
    };
    const Row rows[] = {{"xdg-1", "startup-1", "xdg-1"},
                        {nullptr, "startup-2", "startup-2"},
                        {"", "startup-3", "startup-3"},
                        {nullptr, nullptr, nullptr}};
    for (const Row& row : rows) {
        for (auto [name, value] : {std::pair{"XDG_ACTIVATION_TOKEN", row.xdg},
                                   std::pair{"DESKTOP_STARTUP_ID", row.startup}})
            value ? setenv(name, value, 1) : unsetenv(name);
        EXPECT_EQ(QZTakeActivationToken(), row.token ? QString(row.token) : QString());
        EXPECT_TRUE(QZTakeActivationToken().isNull()) << "a token is used once";
        EXPECT_FALSE(getenv("XDG_ACTIVATION_TOKEN") || getenv("DESKTOP_STARTUP_ID"));
    }
}

bool InjectOffline(QZNetworkReachabilityFlags* flags) {
    *flags = 0;
    return true;
}

/// Shows each question window (with over-long names where it names anything), checks it while it
/// is up, and ends it; then the progress window.
TEST(AgentWindows, HaveATitleAFixedSizeTheDialogTypeGuardedButtonsAndElidedNamesToldInFull) {
    EnglishTexts english;
    GuardDuration guard(60s);
    PrivateDataHome data;
    data.WriteCatalog(R"({"assets": [{"LocalID": "A", "url": "https://f/A", "size": 1000,
        "sha256": "%1", "fonts": [{"postScriptName": "Sans-Regular"}]}]})");
    const QString font(100, u'W'), application = "Writer" + QString(200, u'X');
    Ref fonts = Array({RequestedFont("Sans-Regular", font.toUtf8().constData()).get()});
    Ref request = Dict({{kQZUIPropertyApplicationName, Str(application.toStdString()).get()},
                        {kQZUIPropertyFontName, Str(font.toStdString()).get()},
                        {kQZUIPropertyFontProperties, fonts.get()}});
    QZAutoActivationConfirmation activation(request.as<CFDictionaryRef>());
    QZFontDownloadConfirmation download(request.as<CFDictionaryRef>());
    download.setTargetAppPID(0);
    QZSetNetworkFlagsSourceForTesting(&InjectOffline);
    QZNetworkCheck network;

    struct Row {
        const char* title;
        std::function<QMessageBox*()> window;
        std::function<void()> run, end;
    };
    const Row rows[] = {
        {"Use Font?", [&] { return activation.alert(); }, [&] { activation.showAlert(); },
         [&] { activation.withdraw(); }},
        {"Download Fonts?", [&] { return &download; }, [&] { download.showAlert(); },
         [&] { download.withdraw(); }},
        {"No Network Connection", [&] { return network.alert(); },
         [&] { network.continueDownload(); }, [&] { network.withdraw(); }},
    };
    for (const Row& row : rows) {
        SCOPED_TRACE(row.title);
        bool seen = false;
        UiScript script({{[&] { return row.window() && row.window()->isVisible(); },
                          [&] {
                              QMessageBox* box = row.window();
                              seen = true;
                              EXPECT_EQ(box->windowTitle(), row.title);
                              EXPECT_EQ(box->windowType(), Qt::Dialog);
                              EXPECT_EQ(box->minimumSize(), box->maximumSize());
                              EXPECT_LT(box->width(), 800);
                              for (QAbstractButton* button : box->buttons())
                                  EXPECT_FALSE(button->isEnabled()) << button->text().toStdString();
                              auto* headline = box->findChild<QLabel*>("qt_msgbox_label");
                              if (box != network.alert()) {
                                  EXPECT_FALSE(box->text().contains(font) ||
                                               box->text().contains(application));
                                  EXPECT_TRUE(box->text().contains(u'…'));
                                  EXPECT_TRUE(headline->toolTip().contains(font) &&
                                              headline->toolTip().contains(application));
                                  EXPECT_EQ(headline->accessibleDescription(), headline->toolTip());
                              }
                              row.end();
                          }}},
                        row.end);
        row.run();
        EXPECT_TRUE(seen);
    }
    QZSetNetworkFlagsSourceForTesting(nullptr);
    EXPECT_FALSE(activation.suppressionCheckBox()->text().contains(application));
    EXPECT_TRUE(activation.suppressionCheckBox()->toolTip().contains(application));

    FontDownloadWindowController progress(Array({}).as<CFArrayRef>());
    QDialog* window = progress.window();
    EXPECT_EQ(window->windowTitle(), "Font Download");
    EXPECT_EQ(window->windowType(), Qt::Dialog);
    EXPECT_EQ(window->minimumSize(), window->maximumSize());
    EXPECT_GE(window->width(), 440);
    EXPECT_EQ(progress.progressIndicator()->accessibleName(), "Download progress");
}

TEST(AutoActivationAccessibility, CountdownIsAStatusAnnouncedAtMarksAndActionsRestartTheTimeout) {
    EnglishTexts english;
    Ref request = Dict({{kQZUIPropertyApplicationName, Str("Example Writer").get()}});
    QZAutoActivationConfirmation confirmation(request.as<CFDictionaryRef>());
    confirmation.setTimeout(11s);
    QLabel* countdown = confirmation.countdownLabel();
    QAccessibleInterface* status = QAccessible::queryAccessibleInterface(countdown);
    ASSERT_TRUE(status);
    EXPECT_EQ(status->role(), QAccessible::StatusBar);

    // The steps wait on the count shown, not on the clock, and compare the time left just before
    // and after an action: a tick that a loaded machine delivers late changes nothing checked.
    auto seconds = [](const QString& text) {
        static const QRegularExpression count(
            QStringLiteral("^This question closes without an answer in 0:(\\d\\d)\\.$"));
        const QRegularExpressionMatch match = count.match(text);
        return match.hasMatch() ? match.captured(1).toInt() : -1;
    };
    auto shown = [&] { return seconds(countdown->text()); };
    auto told = [&] { return seconds(status->text(QAccessible::Name)); };
    auto restartsThrough = [&](QWidget* widget, const QString& action) {
        QAccessibleInterface* accessible = QAccessible::queryAccessibleInterface(widget);
        ASSERT_TRUE(accessible && accessible->actionInterface());
        const std::chrono::milliseconds before = confirmation.remainingTime();
        accessible->actionInterface()->doAction(action);
        EXPECT_GT(confirmation.remainingTime(), before) << action.toStdString();
    };
    int announced = -1;
    UiScript script(
        {// The first count below 0:11 passes the 10 s mark: told, with the count as it passed.
         {[&] { return shown() >= 0 && shown() < 11; },
          [&] {
              announced = told();
              EXPECT_TRUE(announced >= shown() && announced <= 10) << announced;
          }},
         // A tick between marks tells nothing new; a restart tells the new count at once.
         {[&] { return shown() < announced; },
          [&] {
              EXPECT_EQ(told(), announced);
              restartsThrough(confirmation.suppressionCheckBox(),
                              QAccessibleActionInterface::toggleAction());
              EXPECT_TRUE(confirmation.suppressionCheckBox()->isChecked());
              EXPECT_EQ(told(), 11);
          }},
         // Once a tick has passed, so that a second restart can show.
         {[&] { return shown() < 11; },
          [&] {
              restartsThrough(confirmation.helpButton(), QAccessibleActionInterface::pressAction());
          }},
         {[&] { return confirmation.helpWindow() && confirmation.helpWindow()->isVisible(); },
          [&] {
              // The bundled page at its anchor, and the question stays.
              QTextBrowser* help = confirmation.helpWindow();
              EXPECT_TRUE(confirmation.alert()->isVisible());
              EXPECT_EQ(help->source(), QUrl("qrc:/help/index.html#auto-activation"));
              EXPECT_TRUE(help->toHtml().contains("name=\"auto-activation\""));
              EXPECT_EQ(help->windowType(), Qt::Dialog);
              EXPECT_EQ(help->minimumSize(), help->maximumSize());
              EXPECT_EQ(QAccessible::queryAccessibleInterface(help)->role(), QAccessible::Document);
              confirmation.withdraw();
          }}});
    confirmation.showAlert();
    EXPECT_TRUE(script.done());
    EXPECT_TRUE(confirmation.suppressFurtherAlerts());
}

} // namespace
