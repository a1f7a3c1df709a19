// Modal sessions: results, nesting, and ending sessions that are not innermost.
#include <QMessageBox>
#include <QPushButton>
#include <QTimer>
#include <QWidget>
#include <string>
#include <vector>

#include "UIAgent/QZModalSession.h"
#include "tests/UIAgent/QtTestEnvironment.h"

namespace {

TEST(ModalSession, RunShowsTheWindowUntilEndedRunsAgainAndClosingCancels) {
    QWidget window;
    QZModalSession session(&window);
    session.End(kQZModalResponseStop); // outside a run: nothing
    bool visibleWhileRunning = false;
    int depthWhileRunning = 0;
    QTimer::singleShot(0, [&] {
        visibleWhileRunning = window.isVisible();
        depthWhileRunning = QZModalSession::Depth();
        EXPECT_EQ(QZModalSession::Innermost(), &session);
        session.End(1000);
    });
    EXPECT_EQ(session.Run(), 1000);
    EXPECT_TRUE(visibleWhileRunning);
    EXPECT_EQ(depthWhileRunning, 1);
    EXPECT_FALSE(window.isVisible());
    EXPECT_FALSE(session.IsRunning());
    EXPECT_EQ(QZModalSession::Depth(), 0);
    EXPECT_EQ(QZModalSession::Innermost(), nullptr);
    // Shown again, as an alert is after its Show-in-file-manager button.
    QTimer::singleShot(0, [&] {
        session.End(kQZModalResponseStop);
        session.End(1001); // the first End of a run wins
    });
    EXPECT_EQ(session.Run(), kQZModalResponseStop);
    QTimer::singleShot(0, [&] { window.close(); });
    EXPECT_EQ(session.Run(), kQZModalResponseCancel);
}

TEST(ModalSession, InnerSessionsReturnFirstAndEndingAnOuterOneHidesItAtOnce) {
    QWidget outerWindow, innerWindow;
    QZModalSession outer(&outerWindow), inner(&innerWindow);
    std::vector<std::string> order;
    int depthInside = 0;
    bool outerHiddenAtOnce = false, innerStillUp = false;
    QTimer::singleShot(0, [&] {
        QTimer::singleShot(0, [&] {
            depthInside = QZModalSession::Depth();
            EXPECT_EQ(QZModalSession::Innermost(), &inner);
            // A timeout of the outer question fires while the inner one is up.
            outer.End(kQZModalResponseAbort);
            outerHiddenAtOnce = !outerWindow.isVisible();
            QTimer::singleShot(20, [&] {
                innerStillUp = inner.IsRunning() && innerWindow.isVisible();
                order.push_back("inner answered");
                inner.End(2000);
            });
        });
        order.push_back("inner " + std::to_string(inner.Run()));
        EXPECT_EQ(QZModalSession::Innermost(), &outer);
    });
    order.push_back("outer " + std::to_string(outer.Run()));
    EXPECT_EQ(depthInside, 2);
    EXPECT_TRUE(outerHiddenAtOnce);
    EXPECT_TRUE(innerStillUp);
    EXPECT_EQ(order, (std::vector<std::string>{"inner answered", "inner 2000", "outer -1001"}));
}

TEST(ModalSession, ADialogButtonReportedAfterTheDialogHidItselfKeepsItsTag) {
    // A message box hides itself before it reports the button: the session must end with the
    // button's tag, not with the cancel code of a window that went away.
    QMessageBox box;
    QPushButton* allow = box.addButton(QStringLiteral("Allow"), QMessageBox::AcceptRole);
    QZModalSession session(&box);
    QObject::connect(&box, &QDialog::finished,
                     [&] { session.End(box.clickedButton() == allow ? 2000 : 2001); });
    QTimer::singleShot(0, [&] { allow->click(); });
    EXPECT_EQ(session.Run(), 2000);
}

} // namespace
