// The object model behind every property value (internal to platform/; kinds defined above
// platform/ use platform/CFKind.h). Each kind is a class
// derived from CFObject; a CFTypeRef points at the CFObject part, which sits at the start of
// every value, so the conversions below are plain pointer casts.
#pragma once

#include <atomic>
#include <string>

#include "platform/CFBase.h"

namespace glyphwell::runtime {

/// The run-time kind ids of this implementation (not the numbers of the flattened value format).
enum KindID : CFTypeID {
    kNullKind = 1,
    kBooleanKind,
    kNumberKind,
    kStringKind,
    kDataKind,
    kCharacterSetKind,
    kArrayKind,
    kSetKind,
    kDictionaryKind,
    kURLKind,
    kUUIDKind,
    kErrorKind,
    kDateKind,
    kMessagePortKind,
    kRunLoopSourceKind,
    kKindCount
};

class CFObject {
public:
    explicit constexpr CFObject(CFTypeID kind) noexcept : kind_(kind) {}
    /// For shared constants defined as static objects: `immortal` true means never destroyed.
    constexpr CFObject(CFTypeID kind, bool immortal) noexcept : kind_(kind), immortal_(immortal) {}
    CFObject(const CFObject&) = delete;
    CFObject& operator=(const CFObject&) = delete;
    virtual ~CFObject() = default;

    CFTypeID Kind() const noexcept { return kind_; }

    /// Value equality with `other`, which is of the same kind (checked by the caller).
    virtual bool Equals(const CFObject& other) const = 0;
    /// Consistent with Equals.
    virtual CFHashCode Hash() const = 0;
    /// Text for logs and CFShow; the plain text for strings.
    virtual std::string Description() const = 0;

    void Retain() const noexcept;
    /// Returns true when this was the last count and the object must be destroyed.
    bool ReleaseShouldDestroy() const noexcept;
    CFIndex RetainCount() const noexcept;
    /// Shared constants are never destroyed: retain and release no longer count.
    void MakeImmortal() noexcept { immortal_ = true; }
    bool IsImmortal() const noexcept { return immortal_; }

private:
    CFTypeID kind_;
    bool immortal_ = false;
    mutable std::atomic<CFIndex> refCount_{1};
};

inline const CFObject* AsObject(CFTypeRef value) {
    return static_cast<const CFObject*>(value);
}

/// The object behind `value` as kind T, or null when `value` is null or of another kind.
template <class T> const T* As(CFTypeRef value, CFTypeID kind) {
    const CFObject* object = AsObject(value);
    return object && object->Kind() == kind ? static_cast<const T*>(object) : nullptr;
}
template <class T> T* AsMutable(const void* value, CFTypeID kind) {
    return const_cast<T*>(As<T>(value, kind));
}

/// The same mixing for every kind's hash.
inline CFHashCode MixHash(CFHashCode h, CFHashCode v) {
    return h ^ (v + 0x9e3779b97f4a7c15ULL + (h << 6) + (h >> 2));
}

/// Reference to an object kept for the life of the process (the booleans, constant strings).
template <class T, class... Args> T* MakeImmortal(Args&&... args) {
    T* object = new T(std::forward<Args>(args)...);
    object->MakeImmortal();
    return object;
}

/// "<CFKind 0x...>" prefix used by the descriptions.
std::string DescriptionPrefix(const CFObject* object, const char* kindName);

/// Calls the container callbacks with null meaning "no callback".
const void* CallRetain(CFRetainCallBack retain, const void* value);
void CallRelease(CFReleaseCallBack release, const void* value);
bool CallEqual(CFEqualCallBack equal, const void* a, const void* b);
CFHashCode CallHash(CFHashCallBack hash, const void* value);
std::string CallDescribe(CFCopyDescriptionCallBack describe, const void* value);

/// The name of a kind registered through CFKindRegister; empty when `kind` is none.
std::string RegisteredKindName(CFTypeID kind);

} // namespace glyphwell::runtime
