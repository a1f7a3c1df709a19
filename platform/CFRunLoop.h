// The run loop that serves local message ports, on Linux: whatever event loop the program runs
// (the agent's Qt loop, a test's poll loop) installs a RunLoopDriver for its thread, and sources
// added to that thread's run loop watch their descriptors through it.
//
// A driver calls back on its own thread, from inside its loop, also from loops nested inside a
// callback (a modal alert): sources must be re-entrant, and they are.
#pragma once

#include <functional>
#include <memory>

#include "platform/CFBase.h"

typedef struct __CFRunLoop* CFRunLoopRef;
typedef struct __CFRunLoopSource* CFRunLoopSourceRef;

/// The only mode there is: sources are served in every loop of their thread, nested ones too.
extern const CFStringRef kCFRunLoopCommonModes;
extern const CFStringRef kCFRunLoopDefaultMode;

namespace glyphwell {

/// What a run loop needs of the event loop that drives it.
class RunLoopDriver {
public:
    virtual ~RunLoopDriver() = default;
    /// Calls `onEvent(readable, writable)` whenever `descriptor` is readable (when `read`) or
    /// writable (when `write`), until Unwatch. Watching a watched descriptor again replaces its
    /// interests and callback.
    virtual void Watch(int descriptor, bool read, bool write,
                       std::function<void(bool readable, bool writable)> onEvent) = 0;
    virtual void Unwatch(int descriptor) = 0;
};

/// Installs `driver` for the calling thread's run loop (null removes it). The driver must outlive
/// every source added while it is installed.
void SetRunLoopDriver(RunLoopDriver* driver);

/// A minimal driver over poll(2), for tools and tests: RunOnce waits up to `timeoutMs`
/// (-1: no limit) and dispatches what is ready.
class PollRunLoopDriver final : public RunLoopDriver {
public:
    PollRunLoopDriver();
    ~PollRunLoopDriver() override;
    void Watch(int descriptor, bool read, bool write,
               std::function<void(bool readable, bool writable)> onEvent) override;
    void Unwatch(int descriptor) override;
    /// Returns false when nothing is watched.
    bool RunOnce(int timeoutMs);

private:
    struct State;
    std::unique_ptr<State> state_;
};

} // namespace glyphwell

/// The calling thread's run loop (never null; not a property value, nothing to release).
CFRunLoopRef CFRunLoopGetCurrent();
/// Starts serving `source` on `runLoop` through its driver. The run loop retains the source.
void CFRunLoopAddSource(CFRunLoopRef runLoop, CFRunLoopSourceRef source, CFStringRef mode);
void CFRunLoopRemoveSource(CFRunLoopRef runLoop, CFRunLoopSourceRef source, CFStringRef mode);
