// QZInputGuard: keeps a question window from being answered by input meant for another window.
// For a short time after the window is shown (1 s, or shown again), its buttons are disabled,
// visibly, and every key press to it is dropped, so that typing that was going on elsewhere
// when the question came up cannot answer it. After that time, key events still count only
// when their press began while the window was shown: an auto-repeated key (a key held down as
// the question appeared) and the release of a key pressed before never reach the window.
//
// The duration is GLYPHWELL_INPUT_GUARD_MS (milliseconds, 0 to 10000) when the environment sets
// it, read once; else 1000. 0 turns the guard time off (tests that press buttons at once); the
// auto-repeat rule holds whatever the duration.
//
// Main thread only. Attached to one window, which it does not own.
#pragma once

#include <QObject>
#include <QPointer>
#include <QSet>
#include <QTimer>
#include <chrono>
#include <vector>

class QAbstractButton;
class QWidget;

class QZInputGuard : public QObject {
    Q_OBJECT

public:
    static constexpr std::chrono::milliseconds kDefaultDuration{1000};

    /// Guards `window` from now on, each time it is shown.
    explicit QZInputGuard(QWidget* window);
    ~QZInputGuard() override;

    /// True while the window's buttons are held disabled.
    bool isGuarding() const { return timer_.isActive(); }

    /// The guard time of the windows shown from now on: the test override when set
    /// (UIAgent/AgentTesting.h), else the environment's value, else kDefaultDuration.
    static std::chrono::milliseconds Duration();

protected:
    bool eventFilter(QObject* watched, QEvent* event) override;

private:
    /// Starts a showing: forgets earlier presses, disables the buttons and starts the timer.
    void Begin();
    /// Ends the guard time: the buttons are enabled again and the focus given back.
    void Finish();
    /// Whether `event` on `watched` is key input to the guarded window that must not arrive.
    bool DropsKeyEvent(QObject* watched, QEvent* event);

    QPointer<QWidget> window_;
    QTimer timer_;
    std::vector<QPointer<QAbstractButton>> disabled_;
    QPointer<QWidget> focusBefore_; ///< the focus as the guard began
    bool clickedDuringGuard_ = false;
    QSet<int> pressedKeys_; ///< keys pressed while shown, after the guard time
};
