// Modal sessions over nested QEventLoops. The sessions that are running form a stack in the order
// their runs began; a run can only return once every run above it has returned, because each run
// is a C++ frame inside the one before it. Ending a session therefore only marks it and quits its
// loop: QEventLoop::exit on a loop that contains a running inner loop takes effect when the inner
// loop has returned, which gives the "returns as soon as the sessions above it have returned"
// rule without any bookkeeping of our own.
#include "UIAgent/QZModalSession.h"

#include <QAbstractButton>
#include <QCheckBox>
#include <QDialogButtonBox>
#include <QEvent>
#include <QEventLoop>
#include <QLabel>
#include <QLayout>
#include <QMessageBox>
#include <QObject>
#include <QTimer>
#include <algorithm>
#include <vector>

#include "UIAgent/QZInputGuard.h"
#include "UIAgent/QZWindowActivation.h"
#include "platform/Log.h"

namespace {

/// The running sessions, innermost last. Main thread only.
std::vector<QZModalSession*>& RunningSessions() {
    static std::vector<QZModalSession*> sessions;
    return sessions;
}

/// Lets keyboard and screen-reader users read a message box's texts with Tab, in reading order:
/// the texts, the checkbox, then the buttons in their order. Other windows are left as they are.
void ArrangeForKeyboard(QWidget* window) {
    auto* box = qobject_cast<QMessageBox*>(window);
    if (!box)
        return;
    std::vector<QWidget*> order;
    for (const char* name : {"qt_msgbox_label", "qt_msgbox_informativelabel"}) {
        auto* label = box->findChild<QLabel*>(QLatin1String(name));
        if (label && !label->text().isEmpty()) {
            label->setTextInteractionFlags(label->textInteractionFlags() |
                                           Qt::TextSelectableByKeyboard);
            label->setFocusPolicy(Qt::StrongFocus);
            order.push_back(label);
        }
    }
    if (QCheckBox* checkBox = box->checkBox())
        order.push_back(checkBox);
    // The buttons in the order they are laid out.
    if (auto* buttons = box->findChild<QDialogButtonBox*>(); buttons && buttons->layout()) {
        QLayout* layout = buttons->layout();
        for (int i = 0; i < layout->count(); ++i)
            if (auto* button = qobject_cast<QAbstractButton*>(layout->itemAt(i)->widget()))
                order.push_back(button);
    }
    for (size_t i = 1; i < order.size(); ++i)
        QWidget::setTabOrder(order[i - 1], order[i]);
}

} // namespace

/// Besides the run's state, the watch on the session's window: when the window is hidden or
/// destroyed by anything but End (the window manager's close button, Escape on a dialog), the
/// session ends with kQZModalResponseCancel. The check after a hide is queued, because a dialog
/// hides itself before it reports which button ended it, and whoever listens for that report ends
/// the session with the button's tag first.
struct QZModalSession::State : QObject {
    QZModalSession* session;
    QPointer<QWidget> window;
    QEventLoop* loop = nullptr; ///< the loop of the current run; null when not running
    bool running = false;
    bool ended = false; ///< End was called during the current run
    int code = 0;
    QMetaObject::Connection destroyedConnection;
    std::unique_ptr<QZInputGuard> guard;

    State(QZModalSession* owner, QWidget* w) : session(owner), window(w) {}

    bool eventFilter(QObject* watched, QEvent* event) override {
        if (event->type() == QEvent::Hide)
            QTimer::singleShot(0, this, [this] { EndIfHidden(); });
        return QObject::eventFilter(watched, event);
    }

    void EndIfHidden() {
        if (running && !ended && (!window || !window->isVisible()))
            session->End(kQZModalResponseCancel);
    }
};

QZModalSession::QZModalSession(QWidget* window, Kind kind)
    : state_(std::make_unique<State>(this, window)) {
    if (kind == kQuestion)
        state_->guard = std::make_unique<QZInputGuard>(window);
}

QZModalSession::~QZModalSession() {
    // A session is destroyed by the code that ran it, after its run returned; a session destroyed
    // while its run is still on the stack would leave that run with nothing to return to.
    GW_ASSERT(!state_->running);
    if (state_->running) {
        auto& sessions = RunningSessions();
        sessions.erase(std::remove(sessions.begin(), sessions.end(), this), sessions.end());
        if (state_->loop)
            state_->loop->exit(kQZModalResponseAbort);
    }
    if (state_->window)
        state_->window->removeEventFilter(state_.get());
    QObject::disconnect(state_->destroyedConnection);
}

int QZModalSession::Run() {
    GW_ASSERT(!state_->running);
    if (state_->running)
        return kQZModalResponseAbort;
    QWidget* window = state_->window;
    if (!window)
        return kQZModalResponseAbort;

    state_->running = true;
    state_->ended = false;
    state_->code = kQZModalResponseAbort;
    RunningSessions().push_back(this);

    window->installEventFilter(state_.get());
    state_->destroyedConnection =
        QObject::connect(window, &QObject::destroyed, state_.get(), [this] {
            if (IsRunning() && !state_->ended)
                End(kQZModalResponseCancel);
        });

    // Modality is taken into account when a window is shown, so a window that is still visible
    // from an earlier run is shown afresh.
    if (window->isVisible() && window->windowModality() != Qt::ApplicationModal)
        window->hide();
    window->setWindowModality(Qt::ApplicationModal);
    window->show();
    // After showing: a message box sets its texts' interaction up as it is shown.
    if (state_->guard)
        ArrangeForKeyboard(window);
    QZBringToFront(window);

    QEventLoop loop;
    state_->loop = &loop;
    // End may already have been called while the window was being shown.
    if (!state_->ended)
        loop.exec(QEventLoop::DialogExec);
    state_->loop = nullptr;

    auto& sessions = RunningSessions();
    sessions.erase(std::remove(sessions.begin(), sessions.end(), this), sessions.end());
    QObject::disconnect(state_->destroyedConnection);
    if (QWidget* stillThere = state_->window) {
        stillThere->removeEventFilter(state_.get());
        stillThere->hide();
    }
    state_->running = false;
    return state_->code;
}

void QZModalSession::End(int code) {
    if (!state_->running || state_->ended)
        return;
    state_->ended = true;
    state_->code = code;
    // Hidden at once even when sessions above this one still run: the question is over.
    if (QWidget* window = state_->window; window && window->isVisible()) {
        window->removeEventFilter(state_.get());
        window->hide();
    }
    // For a session that is not innermost, the loop returns after the loops it contains.
    if (state_->loop)
        state_->loop->exit(code);
}

bool QZModalSession::IsRunning() const {
    return state_->running;
}

QZModalSession* QZModalSession::Innermost() {
    auto& sessions = RunningSessions();
    return sessions.empty() ? nullptr : sessions.back();
}

QZInputGuard* QZModalSession::inputGuard() const {
    return state_->guard.get();
}

int QZModalSession::Depth() {
    return static_cast<int>(RunningSessions().size());
}
