// Replaces operator new/delete so that the Nth allocation of the calling thread fails (bad_alloc,
// or null when nothrow). Include it in exactly ONE file of a test program.
#pragma once

#include <cstdlib>
#include <new>

namespace glyphwell::testing {

/// Allocations on this thread before the one that fails (negative: none); -1 once it failed.
inline thread_local long gAllocationsBeforeFailure = -1;

/// True when the next allocation of this thread is to fail (and arms no further failure).
inline bool AllocationFailsNow() {
    if (gAllocationsBeforeFailure == 0) {
        gAllocationsBeforeFailure = -1;
        return true;
    }
    if (gAllocationsBeforeFailure > 0)
        --gAllocationsBeforeFailure;
    return false;
}

} // namespace glyphwell::testing

void* operator new(std::size_t size) {
    if (glyphwell::testing::AllocationFailsNow())
        throw std::bad_alloc();
    if (void* memory = std::malloc(size ? size : 1))
        return memory;
    throw std::bad_alloc();
}
void* operator new(std::size_t size, const std::nothrow_t&) noexcept {
    return glyphwell::testing::AllocationFailsNow() ? nullptr : std::malloc(size ? size : 1);
}
void operator delete(void* memory) noexcept {
    std::free(memory);
}
void operator delete(void* memory, std::size_t) noexcept {
    std::free(memory);
}
/// Frees what a nothrow new gave when the constructor that followed it threw.
void operator delete(void* memory, const std::nothrow_t&) noexcept {
    std::free(memory);
}
