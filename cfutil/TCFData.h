// Wrappers over data (byte buffer) values: TCFBlob, a view that never owns its reference, and
// TCFData, which owns one count. Both read a null data reference as zero bytes. A TCFData can
// also be read from a whole file, and a TCFBlob written to one.
#pragma once

#include <cstddef>

#include "cfutil/TCFRetained.h"
#include "platform/CFData.h"
#include "platform/CFURL.h"

/// A view of a data value: does not retain, does not release.
class TCFBlob : public TCFReferenceSlot<CFDataRef> {
public:
    /// Stores `data` (may be null); does not retain.
    explicit TCFBlob(CFDataRef data) : TCFReferenceSlot(data) {}

    /// The first byte, or null for null data; valid while the data lives unchanged.
    const UInt8* GetPtr() const { return GetDataPtr(ref_); }
    /// The byte count; 0 for null data.
    CFIndex GetLength() const { return ref_ ? CFDataGetLength(ref_) : 0; }
    /// The first byte of `data`, or null for null data.
    static const UInt8* GetDataPtr(CFDataRef data) {
        return data ? CFDataGetBytePtr(data) : nullptr;
    }
    /// Writes the bytes to the file of `url` (its absolute POSIX path), created with mode 0644
    /// (before the process's file-creation mask) or truncated. All bytes are written (a short
    /// write is continued, an interrupted one retried). Returns 0 on success, else the errno
    /// value of the failing open, write or close; EINVAL for a null URL or one without a POSIX
    /// path.
    int WriteToURL(CFURLRef url) const;
};

/// Owns one count of a data value and releases it when destroyed. Cannot be copied.
class TCFData : public TCFReferenceHolder<CFDataRef, TCFBlob> {
public:
    /// Retains `data` (null-safe), or adopts it with kAdopted (no retain; may be null).
    using TCFReferenceHolder::TCFReferenceHolder;
    /// Holds null.
    explicit TCFData(std::nullptr_t) : TCFReferenceHolder(nullptr, kAdopted) {}
    /// Reads the whole file of `url` (its absolute POSIX path) into a new data value. Holds null
    /// when the URL is null, the item is not a regular file (its size property is absent, see
    /// kCFURLFileSizeKey), the file is empty or cannot be opened or read, or its size cannot be
    /// held in memory. The size is taken before reading: a file that shrank meanwhile gives the
    /// bytes it still has, one that grew gives its first size's worth of bytes.
    explicit TCFData(CFURLRef url);
};
