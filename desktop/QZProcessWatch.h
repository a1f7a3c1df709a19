// QZProcessWatch: tells when a given process ends. It holds a pidfd (pidfd_open(2)), which becomes
// readable when the process exits, and watches it with a QSocketNotifier on the event loop of the
// thread that created it; unlike polling /proc or listening for SIGCHLD, it sees any process of
// the user, child or not, and cannot be fooled by a later process that reuses the id.
//
// A watch is armed once, at construction: when the process does not exist any more (or the id is
// not a valid process id), nothing is watched and processExited is never emitted.
#pragma once

#include <QObject>
#include <memory>
#include <sys/types.h>

class QSocketNotifier;

class QZProcessWatch : public QObject {
    Q_OBJECT

public:
    /// Watches `pid`. An id of 0 or below watches nothing, without a log line; a failure of
    /// pidfd_open other than "no such process" is logged once on the application log.
    explicit QZProcessWatch(pid_t pid, QObject* parent = nullptr);
    /// Closes the pidfd.
    ~QZProcessWatch() override;
    QZProcessWatch(const QZProcessWatch&) = delete;
    QZProcessWatch& operator=(const QZProcessWatch&) = delete;

    /// The watched process id, as given.
    pid_t pid() const { return pid_; }
    /// True while a live process is being watched (false once it has exited).
    bool isWatching() const;
    /// True once the watched process has been seen to exit.
    bool hasExited() const { return exited_; }

signals:
    /// Emitted once, from the event loop, when the watched process has exited.
    void processExited(pid_t pid);

private:
    void pidfdReadable();

    pid_t pid_;
    int pidfd_ = -1;
    bool exited_ = false;
    std::unique_ptr<QSocketNotifier> notifier_;
};
