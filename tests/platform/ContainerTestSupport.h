// Test helpers for the container suites: owning references and short ways to make elements.
#pragma once

#include <cstdint>
#include <memory>
#include <type_traits>
#include <vector>

#include "platform/PropertyValues.h"

namespace glyphwell::testing {

struct ReleaseDeleter {
    void operator()(const void* value) const { CFRelease(value); }
};

/// One reference, released when the holder goes.
template <class Ref> using Owned = std::unique_ptr<std::remove_pointer_t<Ref>, ReleaseDeleter>;

template <class Ref> Owned<Ref> Own(Ref value) {
    return Owned<Ref>(value);
}

using Counts = std::vector<CFIndex>;

/// The retain counts of `values`, in order, for one-line checks.
inline Counts RetainCounts(std::initializer_list<CFTypeRef> values) {
    Counts counts;
    for (CFTypeRef value : values)
        counts.push_back(CFGetRetainCount(value));
    return counts;
}

/// A small integer stored as a pointer, for containers with null callbacks.
inline const void* Token(intptr_t number) {
    return reinterpret_cast<const void*>(number);
}
inline intptr_t TokenValue(const void* token) {
    return reinterpret_cast<intptr_t>(token);
}

} // namespace glyphwell::testing
