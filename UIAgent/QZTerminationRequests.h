// QZTerminationRequests: the requests to end the agent that come from outside it — SIGTERM (the
// user session ending, systemd stopping the service), SIGINT, SIGHUP — and the application's own
// quit requests (QEvent::Quit, as a session manager sends them), turned into one Qt signal on the
// main thread. The agent connects it to QZUIController::terminate, which defers the end while
// requests are pending.
//
// Signals reach the event loop through a self-pipe: the handler only writes one byte, and a
// QSocketNotifier on the other end emits terminationRequested. At most one instance exists at a
// time; it restores the previous signal handlers when destroyed.
#pragma once

#include <QObject>
#include <QSocketNotifier>
#include <memory>

class QZTerminationRequests : public QObject {
    Q_OBJECT

public:
    /// Installs the signal handlers and filters the application's quit events.
    explicit QZTerminationRequests(QObject* parent = nullptr);
    /// Restores the previous signal handlers and closes the pipe.
    ~QZTerminationRequests() override;
    QZTerminationRequests(const QZTerminationRequests&) = delete;
    QZTerminationRequests& operator=(const QZTerminationRequests&) = delete;

signals:
    /// Something outside the agent asked it to end.
    void terminationRequested();

protected:
    /// Swallows the application's QEvent::Quit and emits terminationRequested instead, so that a
    /// quit cannot bypass the controller (closing the alerts of pending requests).
    bool eventFilter(QObject* watched, QEvent* event) override;

private:
    void DrainPipe();

    struct State;
    std::unique_ptr<State> state_;
};
