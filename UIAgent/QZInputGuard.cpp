#include "UIAgent/QZInputGuard.h"

#include <QAbstractButton>
#include <QApplication>
#include <QKeyEvent>
#include <QWidget>
#include <atomic>
#include <cstdlib>

#include "UIAgent/AgentTesting.h"
#include "platform/Log.h"

namespace {

constexpr long kMaximumDurationMs = 10000;

/// -1 while no test override is set.
std::atomic<long long> gDurationOverrideMs{-1};

/// GLYPHWELL_INPUT_GUARD_MS when it holds a whole number of milliseconds in range, else the
/// default (with one log line when it is set but unusable).
std::chrono::milliseconds DurationFromEnvironment() {
    const char* text = std::getenv("GLYPHWELL_INPUT_GUARD_MS");
    if (!text || !*text)
        return QZInputGuard::kDefaultDuration;
    char* end = nullptr;
    const long value = std::strtol(text, &end, 10);
    if (*end != '\0' || value < 0 || value > kMaximumDurationMs) {
        glyphwell::AppLog("GLYPHWELL_INPUT_GUARD_MS is not a number of milliseconds from 0 to "
                          "%ld; the input guard lasts %lld ms",
                          kMaximumDurationMs,
                          static_cast<long long>(QZInputGuard::kDefaultDuration.count()));
        return QZInputGuard::kDefaultDuration;
    }
    return std::chrono::milliseconds(value);
}

} // namespace

QZInputGuard::QZInputGuard(QWidget* window) : window_(window) {
    timer_.setSingleShot(true);
    connect(&timer_, &QTimer::timeout, this, &QZInputGuard::Finish);
    // Application-wide: key events go to the focused widget, not to the window.
    if (qApp)
        qApp->installEventFilter(this);
}

QZInputGuard::~QZInputGuard() {
    if (qApp)
        qApp->removeEventFilter(this);
}

std::chrono::milliseconds QZInputGuard::Duration() {
    static const std::chrono::milliseconds fromEnvironment = DurationFromEnvironment();
    const long long override = gDurationOverrideMs.load();
    return override >= 0 ? std::chrono::milliseconds(override) : fromEnvironment;
}

void QZSetInputGuardDurationForTesting(std::chrono::milliseconds duration) {
    gDurationOverrideMs.store(duration.count() >= 0 ? duration.count() : -1);
}

void QZInputGuard::Begin() {
    pressedKeys_.clear();
    const std::chrono::milliseconds duration = Duration();
    if (duration.count() == 0 || timer_.isActive()) {
        if (duration.count() > 0)
            timer_.start(duration);
        return;
    }
    focusBefore_ = window_->focusWidget();
    // Checkable buttons (the "don't ask again" box) answer nothing: they stay usable.
    for (QAbstractButton* button : window_->findChildren<QAbstractButton*>()) {
        if (button->window() != window_ || button->isCheckable() || !button->isEnabled())
            continue;
        button->setEnabled(false);
        disabled_.emplace_back(button);
    }
    clickedDuringGuard_ = false;
    timer_.start(duration);
}

void QZInputGuard::Finish() {
    timer_.stop();
    for (const QPointer<QAbstractButton>& button : disabled_)
        if (button)
            button->setEnabled(true);
    disabled_.clear();
    // Disabling the focused button moved the focus on; it goes back unless the user clicked
    // elsewhere in the window meanwhile (keys could not move it: they were dropped).
    if (window_ && window_->isVisible() && focusBefore_ && !clickedDuringGuard_)
        focusBefore_->setFocus(Qt::OtherFocusReason);
    focusBefore_ = nullptr;
}

bool QZInputGuard::DropsKeyEvent(QObject* watched, QEvent* event) {
    auto* widget = qobject_cast<QWidget*>(watched);
    if (!widget || !window_ || widget->window() != window_)
        return false;
    const auto* key = static_cast<QKeyEvent*>(event);
    switch (event->type()) {
    case QEvent::ShortcutOverride:
        // Taken here, so that no shortcut or mnemonic acts on it: the key press follows, and is
        // judged below.
        if (isGuarding() || key->isAutoRepeat()) {
            event->accept();
            return true;
        }
        return false;
    case QEvent::KeyPress:
        if (isGuarding() || key->isAutoRepeat())
            return true;
        pressedKeys_.insert(key->key());
        return false;
    case QEvent::KeyRelease:
        // Kept in the set: the release also reaches the parents of a widget that ignores it.
        return key->isAutoRepeat() || !pressedKeys_.contains(key->key());
    default:
        return false;
    }
}

bool QZInputGuard::eventFilter(QObject* watched, QEvent* event) {
    switch (event->type()) {
    case QEvent::Show:
        if (watched == window_ && window_)
            Begin();
        return false;
    case QEvent::Hide:
        if (watched == window_ && window_) {
            Finish();
            pressedKeys_.clear();
        }
        return false;
    case QEvent::MouseButtonPress:
        if (isGuarding() && qobject_cast<QWidget*>(watched) &&
            static_cast<QWidget*>(watched)->window() == window_)
            clickedDuringGuard_ = true;
        return false;
    case QEvent::ShortcutOverride:
    case QEvent::KeyPress:
    case QEvent::KeyRelease:
        return DropsKeyEvent(watched, event);
    default:
        return false;
    }
}
