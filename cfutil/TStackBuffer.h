// TStackBuffer<T, N>: an array of trivial elements whose count is chosen at run time. Up to N
// elements live inside the object itself (usually a function's local variable), so the common
// small case makes no heap allocation; beyond N the elements move to a std::vector.
//
// Unlike llvm::SmallVector, the buffer is resized, never appended to: SetCount() keeps the
// elements below the new count and zero-fills the ones it adds on the heap. The inline storage
// is zeroed once at construction and never again, so shrinking and growing again within the
// inline storage leaves the elements in between as they were.
//
// NOTE: the pointer returned by GetBuffer() (and references from operator[]) stay valid only
// until the next SetCount() or the buffer's destruction: SetCount() may move the elements
// between the inline storage and the heap, or reallocate the heap storage.
#pragma once

#include <algorithm>
#include <cstdint>
#include <type_traits>
#include <vector>

template <class T, uint64_t N> class TStackBuffer {
    static_assert(std::is_trivial_v<T>, "elements are copied and zeroed, never constructed");

public:
    /// A buffer of `count` zero elements: inline (all N inline elements zeroed) when `count` is
    /// at most N, else on the heap with an allocation of exactly `count` elements.
    explicit TStackBuffer(uint64_t count);
    /// Frees the heap storage.
    ~TStackBuffer() = default;
    TStackBuffer(const TStackBuffer&) = delete;
    TStackBuffer& operator=(const TStackBuffer&) = delete;

    /// The number of elements the buffer currently offers.
    uint64_t GetCount() const { return count_; }

    /// The first element: on the heap when the heap storage is in use, else inline.
    T* GetBuffer() { return heap_.empty() ? inline_ : heap_.data(); }
    const T* GetBuffer() const { return heap_.empty() ? inline_ : heap_.data(); }

    /// The element at `index` of GetBuffer(); no bounds check, the caller keeps `index` below
    /// GetCount().
    T& operator[](uint64_t index) { return GetBuffer()[index]; }
    const T& operator[](uint64_t index) const { return GetBuffer()[index]; }

    /// Offers `count` elements. The elements below both the old and the new count are kept.
    /// Growing on the heap adds zero elements; growing within the inline storage exposes what
    /// the inline elements held. Shrinking to N or less moves the elements back inline and frees
    /// the heap allocation.
    void SetCount(uint64_t count);

private:
    void MoveToInline(uint64_t count);
    void MoveToHeap();

    uint64_t count_;
    alignas(16) T inline_[N];
    std::vector<T> heap_; ///< empty, with no allocation, while the inline storage is in use
};

template <class T, uint64_t N> TStackBuffer<T, N>::TStackBuffer(uint64_t count) : count_(count) {
    if (count <= N)
        std::fill_n(inline_, N, T());
    else
        heap_.resize(count);
}

template <class T, uint64_t N> void TStackBuffer<T, N>::SetCount(uint64_t count) {
    if (count <= N) {
        if (!heap_.empty())
            MoveToInline(count);
    } else {
        if (heap_.empty())
            MoveToHeap();
        // Grows past the capacity to max(2 * capacity, count), as std::vector always does.
        heap_.resize(count);
    }
    count_ = count;
}

/// Copies the first `count` heap elements inline and frees the heap allocation (clear() alone
/// would keep it).
template <class T, uint64_t N> void TStackBuffer<T, N>::MoveToInline(uint64_t count) {
    std::copy_n(heap_.data(), count, inline_);
    std::vector<T>().swap(heap_);
}

/// Copies the current inline elements to the heap, allocating exactly their count.
template <class T, uint64_t N> void TStackBuffer<T, N>::MoveToHeap() {
    heap_.assign(inline_, inline_ + count_);
}
