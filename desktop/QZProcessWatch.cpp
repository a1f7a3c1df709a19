#include "desktop/QZProcessWatch.h"

#include <QSocketNotifier>
#include <cerrno>
#include <cstring>
#include <sys/syscall.h>
#include <unistd.h>

#include "platform/Log.h"

QZProcessWatch::QZProcessWatch(pid_t pid, QObject* parent) : QObject(parent), pid_(pid) {
    if (pid <= 0)
        return;
    // Through syscall(2): the C library's header for it lacks C++ linkage on some systems.
    pidfd_ = int(syscall(SYS_pidfd_open, pid, 0));
    if (pidfd_ < 0) {
        // ESRCH: the process is gone already, which is not a fault of ours.
        if (errno != ESRCH)
            glyphwell::AppLog("Cannot watch process %d: %s", int(pid), std::strerror(errno));
        return;
    }
    notifier_ = std::make_unique<QSocketNotifier>(pidfd_, QSocketNotifier::Read);
    connect(notifier_.get(), &QSocketNotifier::activated, this, &QZProcessWatch::pidfdReadable);
}

QZProcessWatch::~QZProcessWatch() {
    notifier_.reset();
    if (pidfd_ >= 0)
        close(pidfd_);
}

bool QZProcessWatch::isWatching() const {
    return notifier_ && !exited_;
}

void QZProcessWatch::pidfdReadable() {
    // A pidfd stays readable once the process has exited: stop listening so that the signal
    // comes once.
    notifier_->setEnabled(false);
    if (exited_)
        return;
    exited_ = true;
    emit processExited(pid_);
}
