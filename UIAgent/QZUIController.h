// QZUIController: the agent's one controller. It owns the local message port through which every
// request arrives (handled by QZUIAgentHandleMessage), counts the requests being handled, and
// decides when the agent ends: it asks to terminate once it has been idle for the idle delay
// (10 s) after its last request, and never before its first request has been answered.
//
// Qt has no application delegate: main creates the controller, calls
// applicationWillFinishLaunching before it runs the event loop, and routes every request to end
// the process (the idle timer, SIGTERM, the session's quit) through terminate(), which asks
// applicationShouldTerminate and, when the answer is "now", calls applicationWillTerminate and
// emits terminationAccepted, on which main leaves its loop. A request to end while requests are
// pending is deferred and carried out once the count returns to 0.
//
// Main thread only.
#pragma once

#include <QObject>
#include <QTimer>
#include <chrono>
#include <cstdint>

#include "platform/CFMessagePort.h"

class QZUIController : public QObject {
    Q_OBJECT

public:
    /// The answers of applicationShouldTerminate.
    enum TerminateReply { kTerminateCancel = 0, kTerminateNow = 1, kTerminateLater = 2 };

    /// How long the agent stays after the last request was answered.
    static constexpr std::chrono::milliseconds kIdleDelay{10000};

    /// No port, count 0, no timer.
    QZUIController();
    /// Invalidates and releases the port and clears the shared pointer (see the .cpp).
    ~QZUIController() override;
    QZUIController(const QZUIController&) = delete;
    QZUIController& operator=(const QZUIController&) = delete;

    /// The controller that launched, or null; not owned.
    static QZUIController* sharedController();

    /// Makes this the shared controller, creates the agent's local port and serves it on the
    /// calling thread's run loop. When the port cannot be created (the name is taken by a live
    /// agent), logs "CFMessagePortCreateLocal returned nil" and runs on without a port.
    void applicationWillFinishLaunching();
    /// kTerminateNow when no request is pending, else kTerminateLater.
    TerminateReply applicationShouldTerminate();
    /// Invalidates the port when it is still valid.
    void applicationWillTerminate();

    /// The number of requests being handled, nested ones included.
    int64_t alertCount() const { return alertCount_; }
    /// Stores the count; a count other than 0 cancels the idle timer, 0 arms a fresh one (and
    /// carries out a termination deferred while requests were pending).
    void setAlertCount(int64_t count);

    /// The armed idle timer, or null; owned by the controller.
    QTimer* terminateTimer() const { return terminateTimer_; }
    /// Takes ownership of `timer` (may be null) and deletes the previous one.
    void setTerminateTimer(QTimer* timer);
    /// The idle timer's action: asks to terminate.
    void terminateTimerFired();

    /// Asks to terminate: now when no request is pending (the port is invalidated and
    /// terminationAccepted emitted, once), otherwise as soon as the count returns to 0.
    void terminate();
    /// True once a termination has been accepted.
    bool isTerminating() const { return terminated_; }
    /// True while a termination waits for the pending requests.
    bool isTerminationDeferred() const { return terminationDeferred_; }

    /// The port; null before launching and when its creation failed. Not retained.
    CFMessagePortRef messagePort() const { return messagePort_; }

    /// The delay of the idle timers armed from now on (tests shorten it).
    void setIdleDelay(std::chrono::milliseconds delay) { idleDelay_ = delay; }
    std::chrono::milliseconds idleDelay() const { return idleDelay_; }

signals:
    /// Emitted by setAlertCount with the new count.
    void alertCountChanged(qint64 count);
    /// The termination was accepted and the port invalidated: the event loop may end.
    void terminationAccepted();

private:
    CFMessagePortRef messagePort_ = nullptr; ///< one reference, owned
    int64_t alertCount_ = 0;
    QTimer* terminateTimer_ = nullptr; ///< owned
    std::chrono::milliseconds idleDelay_ = kIdleDelay;
    bool terminationDeferred_ = false;
    bool terminated_ = false;
};
