// The run loop that serves local message ports, on Linux: whatever event loop the program runs
// (the agent's Qt loop, a test's poll loop) installs a RunLoopDriver for its thread, and sources
// added to that thread's run loop watch their descriptors through it.
//
// A driver calls back on its own thread, from inside its loop, also from loops nested inside a
// callback (a modal alert): sources must be re-entrant, and they are.
//
// A run loop and its sources are used on the run loop's own thread only (add, remove, and
// invalidate a port served there); other threads talk to it through its sockets.
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
    /// interests and callback. A hang-up or error counts as readable (and writable when watched
    /// for writing). Events may be spurious: a callback reads and writes without blocking.
    virtual void Watch(int descriptor, bool read, bool write,
                       std::function<void(bool readable, bool writable)> onEvent) = 0;
    virtual void Unwatch(int descriptor) = 0;
};

/// Installs `driver` for the calling thread's run loop (null removes it). The driver must outlive
/// every source added while it is installed, or be replaced (null too) before it goes: the
/// sources already added move from the old driver to the new one.
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
    /// Returns false at once when nothing is watched. A callback may call RunOnce again (a
    /// nested loop); a callback never runs for a descriptor that was unwatched, or watched anew
    /// after an unwatch, since the wait began.
    bool RunOnce(int timeoutMs);
    /// Makes the RunOnce that waits now, or the next one, return without waiting. The only
    /// member that may be called from any thread.
    void Wake();

private:
    struct State;
    std::unique_ptr<State> state_;
};

} // namespace glyphwell

/// The calling thread's run loop (never null; not a property value, nothing to release). It ends
/// with its thread and then releases its sources.
CFRunLoopRef CFRunLoopGetCurrent();
/// Starts serving `source` on `runLoop` through its driver (at once, or when a driver is
/// installed). The run loop retains the source. Adding a source twice, or an invalidated
/// source, does nothing; a source serves one run loop at a time.
void CFRunLoopAddSource(CFRunLoopRef runLoop, CFRunLoopSourceRef source, CFStringRef mode);
/// Stops serving `source` and releases it; nothing when `runLoop` does not hold it.
void CFRunLoopRemoveSource(CFRunLoopRef runLoop, CFRunLoopSourceRef source, CFStringRef mode);
Boolean CFRunLoopContainsSource(CFRunLoopRef runLoop, CFRunLoopSourceRef source, CFStringRef mode);

/// Run-loop sources are property values: CFRetain, CFRelease and CFGetTypeID work on them.
CFTypeID CFRunLoopSourceGetTypeID();
/// False once the source's owner (its message port) has been invalidated.
Boolean CFRunLoopSourceIsValid(CFRunLoopSourceRef source);
