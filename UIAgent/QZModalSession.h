// Modal runs on the Qt event loop: every alert and the progress window run through this helper,
// which keeps a stack of modal sessions.
//
// Running a session shows its window and spins a nested QEventLoop until the session is ended;
// the result is the button tag, or kQZModalResponseStop (-1000) / kQZModalResponseAbort (-1001).
// Ending the innermost session returns its run at once; ending a session that is not innermost
// hides its window at once, and its run returns that code as soon as the sessions above it have
// returned (a nested loop cannot be left before the loops it contains). Timers that end a session
// (a timeout, a withdrawal) name their session, never "whatever is innermost".
//
// A session of a question (kQuestion) guards its window's buttons against input meant for other
// windows (QZInputGuard) each time it is shown.
#pragma once

#include <QPointer>
#include <QWidget>
#include <memory>

inline constexpr int kQZModalResponseStop = -1000;
inline constexpr int kQZModalResponseAbort = -1001;
/// The window was closed by the window manager or Escape without a button.
inline constexpr int kQZModalResponseCancel = -2;

class QZInputGuard;

class QZModalSession {
public:
    enum Kind {
        kWindow,   ///< a window that shows progress: its buttons work at once
        kQuestion, ///< a question: its buttons are guarded after each showing
    };

    /// A session for `window`; the window is not owned.
    explicit QZModalSession(QWidget* window, Kind kind = kWindow);
    ~QZModalSession();
    QZModalSession(const QZModalSession&) = delete;
    QZModalSession& operator=(const QZModalSession&) = delete;

    /// Shows the window application-modal, raises and activates it, and runs a nested event loop
    /// until End; returns the code given to End. Runs once per call; may be called again after it
    /// returned (the alert shown again).
    int Run();
    /// Ends this session with `code` (see the header comment for sessions that are not innermost).
    /// Does nothing when the session is not running.
    void End(int code);
    bool IsRunning() const;

    /// The innermost running session, or null.
    static QZModalSession* Innermost();
    /// Number of sessions running.
    static int Depth();

    /// The guard of a question's window; null for kWindow.
    QZInputGuard* inputGuard() const;

private:
    struct State;
    std::unique_ptr<State> state_;
};
