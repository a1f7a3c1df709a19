// Kinds of property value defined above the platform layer, and shared values.
//
// A library that needs a value of its own (say, a handle that can be called) registers a kind
// once: the registry hands out an id that no other kind uses, and remembers the kind's name and
// how to describe its values. A value of the kind carries a payload, the kind's own state, which
// is destroyed with the value's last reference. CFRetain, CFRelease, CFGetTypeID, CFEqual
// (identity), CFHash and CFCopyDescription work on such values like on any other; they cannot be
// flattened.
#pragma once

#include <memory>
#include <string>

#include "platform/CFBase.h"

/// The state held by one value of a registered kind. Derive from it; the value owns it.
class CFKindPayload {
public:
    virtual ~CFKindPayload() = default;
};

/// Text for logs and CFCopyDescription of `value`, whose payload is `payload`.
typedef std::string (*CFKindDescribeCallBack)(CFTypeRef value, const CFKindPayload& payload);

/// Registers a new kind named `name` (e.g. "QZCancelDownloadHandler"; the text is copied) and
/// returns its id, unique in the process and clear of the platform's own kinds. `describe` may be
/// null: values then read "<name 0x...>". Thread-safe; call it once per kind (a function-local
/// static). A null or empty name gives 0 and one assertion line.
CFTypeID CFKindRegister(const char* name, CFKindDescribeCallBack describe);

/// A new value of the registered kind `kind` owning `payload`. Returns a new reference; the
/// caller releases it. An unregistered kind or a null payload gives null and one assertion line.
CFTypeRef CFKindCreateValue(CFTypeID kind, std::unique_ptr<CFKindPayload> payload);

/// The payload of `value` when it is a value of kind `kind`; null for null, for a value of
/// another kind, or for an unregistered kind. Does not retain; valid while `value` lives.
const CFKindPayload* CFKindGetPayload(CFTypeRef value, CFTypeID kind);

/// Marks `value` shared for the life of the process: CFRetain and CFRelease no longer count and it
/// is never destroyed. Call it before the value is visible to another thread; null does nothing.
void CFMakeShared(CFTypeRef value);
