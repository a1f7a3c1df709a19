#include "UIAgent/QZTerminationRequests.h"

#include <QCoreApplication>
#include <QEvent>
#include <cerrno>
#include <csignal>
#include <fcntl.h>
#include <unistd.h>

#include "platform/Log.h"

namespace {

constexpr int kWatchedSignals[] = {SIGTERM, SIGINT, SIGHUP};
constexpr int kWatchedSignalCount = sizeof(kWatchedSignals) / sizeof(kWatchedSignals[0]);

/// The pipe's write end, for the signal handler; -1 when no instance exists.
volatile sig_atomic_t sWriteEnd = -1;

extern "C" void QZTerminationSignalHandler(int) {
    const int savedErrno = errno;
    const int descriptor = sWriteEnd;
    if (descriptor >= 0) {
        const char byte = 1;
        // A full pipe already holds a pending request: nothing is lost by dropping this byte.
        [[maybe_unused]] ssize_t written = write(descriptor, &byte, 1);
    }
    errno = savedErrno;
}

} // namespace

struct QZTerminationRequests::State {
    int pipe[2] = {-1, -1};
    std::unique_ptr<QSocketNotifier> notifier;
    struct sigaction previous[kWatchedSignalCount] = {};
    bool installed = false;
};

QZTerminationRequests::QZTerminationRequests(QObject* parent)
    : QObject(parent), state_(std::make_unique<State>()) {
    if (QCoreApplication* application = QCoreApplication::instance())
        application->installEventFilter(this);

    GW_ASSERT(sWriteEnd < 0);
    if (sWriteEnd >= 0 || pipe2(state_->pipe, O_CLOEXEC | O_NONBLOCK) != 0) {
        state_->pipe[0] = state_->pipe[1] = -1;
        return;
    }
    state_->notifier = std::make_unique<QSocketNotifier>(state_->pipe[0], QSocketNotifier::Read);
    connect(state_->notifier.get(), &QSocketNotifier::activated, this,
            &QZTerminationRequests::DrainPipe);
    sWriteEnd = state_->pipe[1];

    struct sigaction action = {};
    action.sa_handler = QZTerminationSignalHandler;
    sigemptyset(&action.sa_mask);
    action.sa_flags = SA_RESTART;
    for (int i = 0; i < kWatchedSignalCount; ++i)
        sigaction(kWatchedSignals[i], &action, &state_->previous[i]);
    state_->installed = true;
}

QZTerminationRequests::~QZTerminationRequests() {
    if (state_->installed) {
        for (int i = 0; i < kWatchedSignalCount; ++i)
            sigaction(kWatchedSignals[i], &state_->previous[i], nullptr);
        sWriteEnd = -1;
    }
    state_->notifier.reset();
    for (int descriptor : state_->pipe)
        if (descriptor >= 0)
            close(descriptor);
}

void QZTerminationRequests::DrainPipe() {
    char bytes[64];
    bool requested = false;
    while (read(state_->pipe[0], bytes, sizeof bytes) > 0)
        requested = true;
    if (requested)
        emit terminationRequested();
}

bool QZTerminationRequests::eventFilter(QObject* watched, QEvent* event) {
    if (event->type() == QEvent::Quit && watched == QCoreApplication::instance()) {
        emit terminationRequested();
        return true;
    }
    return QObject::eventFilter(watched, event);
}
