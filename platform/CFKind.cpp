#include "platform/CFKind.h"

#include <deque>
#include <mutex>

#include "platform/CFRuntime.h"
#include "platform/Log.h"

namespace {

/// One registered kind; entries never move or change once added.
struct RegisteredKind {
    CFTypeID id;
    std::string name;
    CFKindDescribeCallBack describe;
};

/// Registered kinds are numbered from here up, clear of the platform's own.
constexpr CFTypeID kFirstRegisteredKind = 256;

std::mutex& RegistryLock() {
    static std::mutex lock;
    return lock;
}

/// The kinds in id order; a deque keeps entries in place as it grows.
std::deque<RegisteredKind>& Registry() {
    static auto* kinds = new std::deque<RegisteredKind>; // reachable for the life of the process
    return *kinds;
}

/// The registered kind `kind`, or null when there is none.
const RegisteredKind* FindKind(CFTypeID kind) {
    std::lock_guard<std::mutex> guard(RegistryLock());
    const std::deque<RegisteredKind>& kinds = Registry();
    if (kind < kFirstRegisteredKind || kind - kFirstRegisteredKind >= kinds.size())
        return nullptr;
    return &kinds[kind - kFirstRegisteredKind];
}

/// A value of a registered kind: identity equality, its payload owned.
class RegisteredValue final : public glyphwell::runtime::CFObject {
public:
    RegisteredValue(const RegisteredKind& kind, std::unique_ptr<CFKindPayload> payload)
        : CFObject(kind.id), kind_(kind), payload_(std::move(payload)) {}

    bool Equals(const CFObject& other) const override { return this == &other; }
    CFHashCode Hash() const override { return CFHashCode(reinterpret_cast<uintptr_t>(this) >> 4); }
    std::string Description() const override {
        if (kind_.describe)
            return kind_.describe(this, *payload_);
        return glyphwell::runtime::DescriptionPrefix(this, kind_.name.c_str());
    }

    const CFKindPayload& Payload() const { return *payload_; }

private:
    const RegisteredKind& kind_;
    const std::unique_ptr<CFKindPayload> payload_;
};

} // namespace

namespace glyphwell::runtime {

std::string RegisteredKindName(CFTypeID kind) {
    const RegisteredKind* registered = FindKind(kind);
    return registered ? registered->name : std::string();
}

} // namespace glyphwell::runtime

CFTypeID CFKindRegister(const char* name, CFKindDescribeCallBack describe) {
    if (!name || !*name) {
        glyphwell::AssertionFailure("name != NULL && *name", __func__, __FILE__, __LINE__);
        return 0;
    }
    std::lock_guard<std::mutex> guard(RegistryLock());
    std::deque<RegisteredKind>& kinds = Registry();
    kinds.push_back({kFirstRegisteredKind + kinds.size(), name, describe});
    return kinds.back().id;
}

CFTypeRef CFKindCreateValue(CFTypeID kind, std::unique_ptr<CFKindPayload> payload) {
    const RegisteredKind* registered = FindKind(kind);
    if (!registered || !payload) {
        glyphwell::AssertionFailure(registered ? "payload != NULL" : "kind is registered", __func__,
                                    __FILE__, __LINE__);
        return nullptr;
    }
    return new RegisteredValue(*registered, std::move(payload));
}

const CFKindPayload* CFKindGetPayload(CFTypeRef value, CFTypeID kind) {
    if (kind < kFirstRegisteredKind)
        return nullptr;
    const auto* object = glyphwell::runtime::As<RegisteredValue>(value, kind);
    return object ? &object->Payload() : nullptr;
}

void CFMakeShared(CFTypeRef value) {
    if (value)
        const_cast<glyphwell::runtime::CFObject*>(glyphwell::runtime::AsObject(value))
            ->MakeImmortal();
}
