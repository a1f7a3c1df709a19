// Helpers of the download tests (the confirmation, the offline alert and the progress window):
// message id 2 requests and their reply bytes, a child process to stand for the requesting
// application, a watch on the windows shown, and a way out of modal runs when a script stalls.
#pragma once

#include <QApplication>
#include <QDialog>
#include <QLabel>
#include <QMessageBox>
#include <QProgressBar>
#include <QTimer>
#include <csignal>
#include <string>
#include <sys/wait.h>
#include <unistd.h>
#include <vector>

#include "UIAgent/QZModalSession.h"
#include "UIAgent/QZUIAgentHandleMessage.h"
#include "protocol/QZUIProtocol.h"
#include "tests/UIAgent/AgentTestSupport.h"
#include "tests/support/Values.h"

namespace glyphwell::testing {

/// A child process that waits until it is killed; killed and reaped when this goes.
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
    PausedChild(const PausedChild&) = delete;
    PausedChild& operator=(const PausedChild&) = delete;
    pid_t pid() const { return pid_; }
    void Kill() const { kill(pid_, SIGKILL); }

private:
    pid_t pid_;
};

/// One requested font: {"NSFontNameAttribute": postScriptName, "NSFontFamilyAttribute": family}
/// (no family when null).
inline Ref RequestedFont(const char* postScriptName, const char* family = nullptr) {
    if (!family)
        return Dict({{NSFontNameAttribute, Str(postScriptName).get()}});
    return Dict({{NSFontNameAttribute, Str(postScriptName).get()},
                 {NSFontFamilyAttribute, Str(family).get()}});
}

/// A message id 2 request from "Example Writer" (process `pid`) for `fonts`; with `suppress`,
/// the request says not to ask.
inline Ref DownloadRequest(std::initializer_list<CFTypeRef> fonts, SInt32 pid = 0,
                           bool suppress = false) {
    Ref pidNumber = Num(kCFNumberSInt32Type, pid);
    return Dict({{kQZUIPropertyApplicationName, Str("Example Writer").get()},
                 {kQZUIPropertyProcessID, pidNumber.get()},
                 {kQZUIPropertyFontProperties, Array(fonts).get()},
                 {kQZUIPropertySuppress, suppress ? kCFBooleanTrue : kCFBooleanFalse}});
}

/// Sends `request` to the dispatcher as message id 2, flattened as a client sends it; returns
/// the reply bytes in hex.
inline std::string HandleDownloadRequest(CFTypeRef request) {
    Ref bytes = Flattened(request);
    Ref reply(QZUIAgentHandleMessage(nullptr, 2, bytes.as<CFDataRef>(), nullptr));
    return ToHex(reply.as<CFDataRef>());
}

/// The reply of message id 2, as the clients read it: {Result, Suppress}, numbers of type 7.
inline std::string DownloadReply(bool result, bool suppress) {
    return ToHex(Join({Hex("00 00 00 10  00 00 00 02  00 00 00 07  00 00 00 12"),
                       Ascii("QZUIPropertyResult"),
                       Hex(result ? "00 00 00 16  00 00 00 07  00 00 00 01  01"
                                  : "00 00 00 16  00 00 00 07  00 00 00 01  00"),
                       Hex("00 00 00 07  00 00 00 14"), Ascii("QZUIPropertySuppress"),
                       Hex(suppress ? "00 00 00 16  00 00 00 07  00 00 00 01  01"
                                    : "00 00 00 16  00 00 00 07  00 00 00 01  00")}));
}

/// The progress window while it is shown, else null.
inline QDialog* ProgressWindowOnScreen() {
    for (QWidget* widget : QApplication::topLevelWidgets())
        if (widget->objectName() == QLatin1String("FontDownloadWindow") && widget->isVisible())
            return qobject_cast<QDialog*>(widget);
    return nullptr;
}

/// The alert up and innermost whose headline is `text`, else null.
inline QMessageBox* AlertWithText(const QString& text) {
    QMessageBox* alert = AlertOnScreen();
    return alert && alert->isVisible() && alert->text() == text ? alert : nullptr;
}

/// Watches the agent's windows from the event loop while it lives: how many were shown (and how
/// many progress windows), which were activated, the progress bar after each change of its value,
/// and the progress window when it was first hidden.
class WindowWatch : public QObject {
public:
    WindowWatch() { QCoreApplication::instance()->installEventFilter(this); }
    ~WindowWatch() override { QCoreApplication::instance()->removeEventFilter(this); }
    int windowsShown = 0;
    int progressWindowsShown = 0;
    std::vector<std::string> bar; ///< "value/maximum" after each value change
    bool hidden = false;
    std::string statusWhenHidden;
    bool timerRunningWhenHidden = false;
    std::vector<QObject*> activated; ///< windows in the order they were activated

protected:
    bool eventFilter(QObject* watched, QEvent* event) override {
        if (!watched->isWidgetType() || !static_cast<QWidget*>(watched)->isWindow())
            return false;
        auto* window = static_cast<QWidget*>(watched);
        if (event->type() == QEvent::WindowActivate)
            activated.push_back(watched);
        const bool progress = window->objectName() == QLatin1String("FontDownloadWindow");
        if (event->type() == QEvent::Show) {
            ++windowsShown;
            if (!progress)
                return false;
            ++progressWindowsShown;
            auto* bar = window->findChild<QProgressBar*>("progressIndicator");
            connect(bar, &QProgressBar::valueChanged, this, [this, bar](int value) {
                this->bar.push_back(std::to_string(value) + "/" + std::to_string(bar->maximum()));
            });
        } else if (event->type() == QEvent::Hide && progress && !hidden) {
            hidden = true;
            statusWhenHidden =
                window->findChild<QLabel*>("mainStatusTextField")->text().toStdString();
            auto* timer = window->findChild<QTimer*>("refreshTimer");
            timerRunningWhenHidden = timer && timer->isActive();
        }
        return false;
    }
};

/// For a script's give-up: ends the innermost modal run every 50 ms from now on, until the
/// application goes, so that a stalled test fails instead of hanging.
inline void EndEveryModalRun() {
    auto* timer = new QTimer(QCoreApplication::instance());
    QObject::connect(timer, &QTimer::timeout, [] {
        if (QZModalSession* session = QZModalSession::Innermost())
            session->End(kQZModalResponseAbort);
    });
    timer->start(50);
}

} // namespace glyphwell::testing
