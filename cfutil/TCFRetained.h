// The ownership vocabulary of the utility library: tag constants that select a constructor
// overload, null-safe retain/release/equality helpers, and TCFRetained<T>, the generic holder of
// one reference to a property value.
//
// A reference from a Create or Copy call carries one count that its receiver gives back; a
// wrapper *adopts* such a count (no retain), or *retains* a reference it was merely lent. Unlike
// a std::shared_ptr, the count lives in the value itself, so wrappers and raw references mix
// freely.
#pragma once

#include "cfutil/TNoncopyable.h"
#include "platform/CFBase.h"

/// Selects the constructor overload that takes over the caller's count instead of retaining.
struct adopted_t {};
/// Selects the constructor overload that makes a file (never a directory) URL from a path.
struct is_file_t {};

inline constexpr adopted_t kAdopted{};
inline constexpr is_file_t kIsFile{};

/// Retains `ref` when it is non-null and returns it unchanged; null yields null.
template <class T> inline T TCFSafeRetain(T ref) {
    if (ref)
        CFRetain(ref);
    return ref;
}

/// Retains and returns `ref`, which the caller guarantees to be non-null.
template <class T> inline T TCFRetain(T ref) {
    CFRetain(ref);
    return ref;
}

/// Releases `ref` when it is non-null.
inline void TCFSafeRelease(CFTypeRef ref) {
    if (ref)
        CFRelease(ref);
}

/// True when `a` and `b` are the same reference (two nulls included), false when exactly one is
/// null, otherwise the value equality of the two (CFEqual).
inline bool TCFSafeEqual(CFTypeRef a, CFTypeRef b) {
    if (a == b)
        return true;
    if (!a || !b)
        return false;
    return CFEqual(a, b);
}

/// Holds one reference of type T (a property-value reference type such as CFStringRef), possibly
/// null, and gives its count back when destroyed. Copying retains, so each copy owns one count.
template <class T> class TCFRetained {
public:
    /// Retains `ref` (null-safe).
    explicit TCFRetained(T ref = nullptr) : ref_(TCFSafeRetain(ref)) {}
    /// Holds `ref` without retaining: adopts the caller's count.
    TCFRetained(T ref, adopted_t) : ref_(ref) {}
    /// Retains the other holder's reference (null-safe).
    TCFRetained(const TCFRetained& other) : ref_(TCFSafeRetain(other.ref_)) {}
    TCFRetained& operator=(const TCFRetained& other) {
        if (this != &other)
            Adopt(TCFSafeRetain(other.ref_));
        return *this;
    }
    ~TCFRetained() { Release(); }

    /// Releases the held reference (null-safe), then holds `ref` without retaining it.
    void Adopt(T ref) {
        T previous = ref_;
        ref_ = ref;
        TCFSafeRelease(previous);
    }
    /// Returns the held reference with its count and leaves this holder null; the caller
    /// releases the result.
    T Orphan() {
        T ref = ref_;
        ref_ = nullptr;
        return ref;
    }
    /// The held reference; does not retain.
    operator T() const { return ref_; }

private:
    /// Gives back the held count (null-safe); only the destructor calls it.
    void Release() { TCFSafeRelease(ref_); }

    T ref_;
};

/// Takes ownership of the result of a Create or Copy call in one line:
/// `TCFAdopted<CFStringRef> name(CFCopyDescription(value));`. Cannot be copied.
template <class T> class TCFAdopted : public TCFRetained<T>, TNoncopyable {
public:
    /// Adopts `ref` (no retain) as T.
    explicit TCFAdopted(CFTypeRef ref)
        : TCFRetained<T>(static_cast<T>(const_cast<void*>(ref)), kAdopted) {}
};
