// Iterators that let the standard algorithms run directly over array values, without copying the
// elements out: CFArray_sequence<T> makes a [begin, end) range over an array, CFArray_iterator<T>
// walks it by index, CFMutableArray_back_insert_iterator<T> appends what an algorithm writes, and
// TCFComparatorFunctor<R> turns a three-way comparison into the predicate the sorted-range
// algorithms expect.
//
//   CFArray_sequence<CFStringRef> names(array);
//   auto [first, last] = std::equal_range(names.begin(), names.end(), key,
//                                         TCFComparatorFunctor<-1>(compare, context));
//
// CFArray_iterator is a random-access iterator whose dereference yields the element by value (a
// reference type such as CFStringRef), like std::vector<bool>::iterator yields a proxy: every
// algorithm that reads elements (lower_bound, equal_range, merge, copy, find, distance) runs
// unchanged in logarithmic or linear time; algorithms that write through the iterator (sort,
// reverse) do not compile. Nothing here retains the array or its elements.
//
// NOTE: a sequence takes the array's count once, when it is made. Elements appended afterwards
// are outside [begin, end); removing elements invalidates the iterators past the new count.
#pragma once

#include <compare>
#include <cstddef>
#include <iterator>

#include "cfutil/TNoncopyable.h"
#include "platform/CFArray.h"

/// A position in an array value: the array (not retained) and a signed index. Two iterators
/// compare by index alone, so only iterators over the same array may be compared or subtracted.
template <class T> class CFArray_iterator {
public:
    using iterator_concept = std::random_access_iterator_tag;
    using iterator_category = std::random_access_iterator_tag;
    using value_type = T;
    using difference_type = std::ptrdiff_t;
    using reference = T; ///< elements are handed out by value
    using pointer = void;

    /// An iterator over no array at index 0; only assignable and comparable.
    CFArray_iterator() = default;
    /// The position `index` of `array`; does not retain.
    CFArray_iterator(CFArrayRef array, CFIndex index) : array_(array), index_(index) {}

    /// The element at the index as T; does not retain. The index must be below the count.
    T operator*() const {
        return static_cast<T>(const_cast<void*>(CFArrayGetValueAtIndex(array_, index_)));
    }
    T operator[](difference_type offset) const { return *(*this + offset); }

    CFArray_iterator& operator++() {
        ++index_;
        return *this;
    }
    CFArray_iterator operator++(int) {
        CFArray_iterator previous = *this;
        ++index_;
        return previous;
    }
    CFArray_iterator& operator--() {
        --index_;
        return *this;
    }
    CFArray_iterator operator--(int) {
        CFArray_iterator previous = *this;
        --index_;
        return previous;
    }
    CFArray_iterator& operator+=(difference_type offset) {
        index_ += offset;
        return *this;
    }
    CFArray_iterator& operator-=(difference_type offset) {
        index_ -= offset;
        return *this;
    }
    friend CFArray_iterator operator+(CFArray_iterator it, difference_type offset) {
        return it += offset;
    }
    friend CFArray_iterator operator+(difference_type offset, CFArray_iterator it) {
        return it += offset;
    }
    friend CFArray_iterator operator-(CFArray_iterator it, difference_type offset) {
        return it -= offset;
    }
    /// The difference of the two indexes.
    friend difference_type operator-(const CFArray_iterator& a, const CFArray_iterator& b) {
        return a.index_ - b.index_;
    }

    /// Compare the indexes only.
    friend bool operator==(const CFArray_iterator& a, const CFArray_iterator& b) {
        return a.index_ == b.index_;
    }
    friend std::strong_ordering operator<=>(const CFArray_iterator& a, const CFArray_iterator& b) {
        return a.index_ <=> b.index_;
    }

    /// The index of this position in the array.
    CFIndex GetIndex() const { return index_; }

private:
    CFArrayRef array_ = nullptr;
    CFIndex index_ = 0;
};

/// The range [0, count) of an array value, count read once at construction. Does not retain the
/// array, which must outlive the sequence and its iterators. A null array gives an empty range.
template <class T> class CFArray_sequence : TNoncopyable {
public:
    using iterator = CFArray_iterator<T>;

    /// Stores `array` (not retained) and its current count (0 for null).
    explicit CFArray_sequence(CFArrayRef array)
        : array_(array), count_(array ? CFArrayGetCount(array) : 0) {}

    iterator begin() const { return iterator(array_, 0); }
    iterator end() const { return iterator(array_, count_); }
    /// The count taken at construction.
    CFIndex size() const { return count_; }

private:
    CFArrayRef array_;
    CFIndex count_;
};

/// An output iterator that appends every value assigned through it to a mutable array, which
/// retains it as its callbacks say. Does not retain the array.
template <class T> class CFMutableArray_back_insert_iterator {
public:
    using iterator_category = std::output_iterator_tag;
    using value_type = void;
    using difference_type = std::ptrdiff_t;
    using reference = void;
    using pointer = void;

    /// Appends to `array` (non-null; not retained).
    explicit CFMutableArray_back_insert_iterator(CFMutableArrayRef array) : array_(array) {}

    /// Appends `value` to the array.
    CFMutableArray_back_insert_iterator& operator=(T value) {
        CFArrayAppendValue(array_, value);
        return *this;
    }
    CFMutableArray_back_insert_iterator& operator*() { return *this; }
    CFMutableArray_back_insert_iterator& operator++() { return *this; }
    CFMutableArray_back_insert_iterator& operator++(int) { return *this; }

private:
    CFMutableArrayRef array_;
};

/// An output iterator that appends to `array` (non-null; not retained).
template <class T = const void*>
CFMutableArray_back_insert_iterator<T> CFMutableArray_back_inserter(CFMutableArrayRef array) {
    return CFMutableArray_back_insert_iterator<T>(array);
}

/// A predicate over a three-way comparison function and its context: applied to (a, b) it calls
/// comparator(a, b, context) and yields true exactly when the result equals R. With R = -1
/// (kCFCompareLessThan) it is the strict less-than of std::lower_bound, std::merge and the like.
/// The context is not retained.
template <CFIndex R> class TCFComparatorFunctor {
public:
    TCFComparatorFunctor(CFComparatorFunction comparator, void* context)
        : comparator_(comparator), context_(context) {}

    bool operator()(const void* a, const void* b) const { return comparator_(a, b, context_) == R; }

private:
    CFComparatorFunction comparator_;
    void* context_;
};

static_assert(std::random_access_iterator<CFArray_iterator<const void*>>);
static_assert(std::output_iterator<CFMutableArray_back_insert_iterator<const void*>, const void*>);
