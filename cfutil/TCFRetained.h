// The ownership vocabulary of the utility library: tag constants that select a constructor
// overload, null-safe retain/release/equality helpers, the reference slot and the
// release-and-orphan mix-in that every wrapper is built on, and TCFRetained<T>, the generic
// holder of one reference to a property value.
//
// A reference from a Create or Copy call carries one count that its receiver gives back; a
// wrapper *adopts* such a count (no retain), or *retains* a reference it was merely lent. Unlike
// a std::shared_ptr, the count lives in the value itself, so wrappers and raw references mix
// freely.
#pragma once

#include <utility>

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

/// The reference slot of every wrapper: one reference of type Ref, possibly null, that the slot
/// itself never retains or releases. Views derive from it directly; owners through
/// TCFReferenceHolder.
template <class Ref> class TCFReferenceSlot {
public:
    /// Stores `ref` (may be null); does not retain.
    explicit TCFReferenceSlot(Ref ref) : ref_(ref) {}

    /// The held reference; does not retain.
    operator Ref() const { return ref_; }
    Ref Get() const { return ref_; }
    /// True when a reference is held.
    explicit operator bool() const { return ref_ != nullptr; }

protected:
    Ref ref_;
};

/// The release-and-orphan mix-in of every owning wrapper: owns one count of the reference in the
/// slot of View (a view class over Ref, or the bare slot) and gives it back when destroyed.
/// Cannot be copied; a wrapper that may be reassigned makes the protected operations public.
template <class Ref, class View = TCFReferenceSlot<Ref>> class TCFReferenceHolder : public View {
public:
    /// Retains `ref` (null-safe).
    explicit TCFReferenceHolder(Ref ref) : View(TCFSafeRetain(ref)) {}
    /// Holds `ref` without retaining: adopts the caller's count (may be null).
    TCFReferenceHolder(Ref ref, adopted_t) : View(ref) {}
    TCFReferenceHolder(const TCFReferenceHolder&) = delete;
    TCFReferenceHolder& operator=(const TCFReferenceHolder&) = delete;
    /// Releases the held reference (null-safe).
    ~TCFReferenceHolder() { Release(); }

    /// Returns the held reference with its count and leaves this wrapper null; the caller
    /// releases the result.
    Ref Orphan() { return std::exchange(this->ref_, nullptr); }

protected:
    /// Holds `ref` without retaining it, then releases the previous reference (null-safe).
    void Adopt(Ref ref) { TCFSafeRelease(std::exchange(this->ref_, ref)); }
    /// Retains `ref` before releasing the previous reference, so `ref` may be the held one.
    void Retain(Ref ref) { Adopt(TCFSafeRetain(ref)); }
    /// Releases the held reference (null-safe) and holds null.
    void Release() { Adopt(nullptr); }
    /// Exchanges the references of this wrapper and `other` without counting.
    void Swap(TCFReferenceHolder& other) { std::swap(this->ref_, other.ref_); }
};

/// Holds one reference of type T (a property-value reference type such as CFStringRef), possibly
/// null, and gives its count back when destroyed. Copying retains, so each copy owns one count.
template <class T> class TCFRetained : public TCFReferenceHolder<T> {
    using Holder = TCFReferenceHolder<T>;

public:
    /// Retains `ref` (null-safe).
    explicit TCFRetained(T ref = nullptr) : Holder(ref) {}
    /// Holds `ref` without retaining: adopts the caller's count.
    TCFRetained(T ref, adopted_t) : Holder(ref, kAdopted) {}
    /// Retains the other holder's reference (null-safe).
    TCFRetained(const TCFRetained& other) : Holder(other.Get()) {}
    TCFRetained& operator=(const TCFRetained& other) {
        this->Retain(other.Get());
        return *this;
    }

    /// Releases the held reference (null-safe), then holds `ref` without retaining it.
    using Holder::Adopt;
    /// Exchanges the references of the two holders without counting.
    using Holder::Swap;
};

/// Takes ownership of the result of a Create or Copy call in one line:
/// `TCFAdopted<CFStringRef> name(CFCopyDescription(value));`. Cannot be copied.
template <class T> class TCFAdopted : public TCFRetained<T>, TNoncopyable {
public:
    /// Adopts `ref` (no retain) as T.
    explicit TCFAdopted(CFTypeRef ref)
        : TCFRetained<T>(static_cast<T>(const_cast<void*>(ref)), kAdopted) {}
};
