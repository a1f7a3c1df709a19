// Run-loop sources and run loops from the inside (internal to platform/). A source is a property
// value whose kind tells the run loop nothing: each kind of source derives from
// __CFRunLoopSource and watches its own descriptors through the driver it is scheduled on.
#pragma once

#include <vector>

#include "platform/CFRunLoop.h"
#include "platform/CFRuntime.h"

struct __CFRunLoopSource : glyphwell::runtime::CFObject {
    explicit __CFRunLoopSource(CFIndex sourceOrder)
        : CFObject(glyphwell::runtime::kRunLoopSourceKind), order(sourceOrder) {}

    bool Equals(const CFObject& other) const override { return this == &other; }
    CFHashCode Hash() const override { return CFHashCode(reinterpret_cast<uintptr_t>(this) >> 4); }

    /// Starts watching through `driver` (called on the run loop's thread).
    virtual void Schedule(glyphwell::RunLoopDriver* driver) = 0;
    /// Stops watching through the driver it was scheduled on. With null, the driver is gone (its
    /// thread ended): forget it without calling it.
    virtual void Cancel(glyphwell::RunLoopDriver* driver) = 0;

    CFIndex order;
    bool valid = true;
    CFRunLoopRef loop = nullptr; ///< the run loop holding this source, if any (not retained)
};

struct __CFRunLoop {
    __CFRunLoop() = default;
    __CFRunLoop(const __CFRunLoop&) = delete;
    __CFRunLoop& operator=(const __CFRunLoop&) = delete;
    ~__CFRunLoop();

    glyphwell::RunLoopDriver* driver = nullptr;
    std::vector<__CFRunLoopSource*> sources; ///< retained, by increasing order
};
