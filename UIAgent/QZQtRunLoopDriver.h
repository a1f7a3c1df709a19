// QZQtRunLoopDriver: the run-loop driver of the agent's main thread, over the Qt event loop. The
// local message port's source watches its descriptors through it, so requests are served by
// whatever Qt loop runs: the application's, and every nested loop of a modal session.
//
// Each watched descriptor gets a QSocketNotifier per interest (read, write). Callbacks may run
// nested inside one another (a callback that shows a modal alert lets further callbacks run), and
// may watch or unwatch any descriptor, their own included, while they run.
#pragma once

#include <unordered_map>

#include "platform/CFRunLoop.h"

class QSocketNotifier;

class QZQtRunLoopDriver final : public glyphwell::RunLoopDriver {
public:
    QZQtRunLoopDriver();
    /// Stops watching everything.
    ~QZQtRunLoopDriver() override;
    QZQtRunLoopDriver(const QZQtRunLoopDriver&) = delete;
    QZQtRunLoopDriver& operator=(const QZQtRunLoopDriver&) = delete;

    void Watch(int descriptor, bool read, bool write,
               std::function<void(bool readable, bool writable)> onEvent) override;
    void Unwatch(int descriptor) override;

    /// The number of descriptors watched (for tests).
    size_t WatchedCount() const { return entries_.size(); }

private:
    struct Entry;
    std::unordered_map<int, std::shared_ptr<Entry>> entries_;
};
