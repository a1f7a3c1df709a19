// Helpers shared by the fuzz targets.
#pragma once

#include "platform/CFBase.h"
#include "platform/Log.h"

namespace fuzz {

/// Sends the log lines nowhere from the first call on: hostile inputs log at every turn.
inline void Quiet() {
    [[maybe_unused]] static const bool once =
        (glyphwell::SetLogSink([](const glyphwell::LogRecord&) {}), true);
}

/// Crashes, which libFuzzer records as a finding, when `condition` does not hold.
inline void Check(bool condition) {
    if (!condition)
        __builtin_trap();
}

/// Releases the reference it holds (null-safe) at the end of the scope.
template <class T> struct Owned {
    T ref;
    ~Owned() {
        if (ref)
            CFRelease(ref);
    }
    operator T() const { return ref; }
};

} // namespace fuzz
