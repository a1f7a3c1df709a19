#include "UIAgent/QZQtRunLoopDriver.h"

#include <QObject>
#include <QSocketNotifier>
#include <memory>

using Callback = std::function<void(bool readable, bool writable)>;

namespace {

/// How many notifier callbacks are running on this thread (nested ones included).
thread_local int sCallbacksRunning = 0;

} // namespace

/// One watched descriptor. The callback is shared so that a callback that replaces or removes its
/// own registration keeps running on its own copy.
struct QZQtRunLoopDriver::Entry {
    std::shared_ptr<Callback> callback;
    QSocketNotifier* reader = nullptr;
    QSocketNotifier* writer = nullptr;

    ~Entry() {
        Retire(reader);
        Retire(writer);
    }

    /// Inside a callback the notifier may be the one whose signal is being delivered, so it is
    /// disabled at once and deleted later, by the event loop; outside, it is deleted at once.
    static void Retire(QSocketNotifier*& notifier) {
        if (!notifier)
            return;
        notifier->setEnabled(false);
        notifier->disconnect();
        if (sCallbacksRunning > 0)
            notifier->deleteLater();
        else
            delete notifier;
        notifier = nullptr;
    }
};

QZQtRunLoopDriver::QZQtRunLoopDriver() = default;

QZQtRunLoopDriver::~QZQtRunLoopDriver() {
    for (auto& [descriptor, entry] : entries_) {
        Entry::Retire(entry->reader);
        Entry::Retire(entry->writer);
    }
}

void QZQtRunLoopDriver::Watch(int descriptor, bool read, bool write, Callback onEvent) {
    std::shared_ptr<Entry>& slot = entries_[descriptor];
    if (!slot)
        slot = std::make_shared<Entry>();
    Entry& entry = *slot;
    entry.callback = std::make_shared<Callback>(std::move(onEvent));

    // The notifiers call through the entry's current callback, taken when they fire.
    std::weak_ptr<Entry> weak = slot;
    auto make = [&](QSocketNotifier::Type type, bool readable) {
        auto* notifier = new QSocketNotifier(descriptor, type);
        QObject::connect(notifier, &QSocketNotifier::activated, notifier, [weak, readable] {
            std::shared_ptr<Callback> callback;
            if (std::shared_ptr<Entry> alive = weak.lock())
                callback = alive->callback;
            if (!callback)
                return;
            ++sCallbacksRunning;
            (*callback)(readable, !readable);
            --sCallbacksRunning;
        });
        return notifier;
    };
    if (read && !entry.reader)
        entry.reader = make(QSocketNotifier::Read, true);
    else if (!read)
        Entry::Retire(entry.reader);
    if (write && !entry.writer)
        entry.writer = make(QSocketNotifier::Write, false);
    else if (!write)
        Entry::Retire(entry.writer);
}

void QZQtRunLoopDriver::Unwatch(int descriptor) {
    auto found = entries_.find(descriptor);
    if (found == entries_.end())
        return;
    // The notifiers go now, even when a callback of this descriptor is still running (a request
    // waiting for the user holds its connection's entry): the descriptor is about to be closed,
    // and a notifier left on it would be polled closed.
    Entry::Retire(found->second->reader);
    Entry::Retire(found->second->writer);
    entries_.erase(found);
}
