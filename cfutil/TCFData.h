// Wrappers over data (byte buffer) values: TCFBlob, a view that never owns its reference, and
// TCFData, which owns one count. Both read a null data reference as zero bytes.
#pragma once

#include "platform/CFData.h"

/// A view of a data value: does not retain, does not release.
class TCFBlob {
public:
    /// Stores `data` (may be null); does not retain.
    explicit TCFBlob(CFDataRef data) : data_(data) {}

    /// The held data; does not retain.
    operator CFDataRef() const { return data_; }
    /// The first byte, or null for null data; valid while the data lives unchanged.
    const UInt8* GetPtr() const { return GetDataPtr(data_); }
    /// The byte count; 0 for null data.
    CFIndex GetLength() const { return data_ ? CFDataGetLength(data_) : 0; }
    /// The first byte of `data`, or null for null data.
    static const UInt8* GetDataPtr(CFDataRef data) {
        return data ? CFDataGetBytePtr(data) : nullptr;
    }

protected:
    CFDataRef data_;
};

/// Owns one count of a data value and releases it when destroyed. Cannot be copied.
class TCFData : public TCFBlob {
public:
    /// Retains `data` (null-safe).
    explicit TCFData(CFDataRef data);
    TCFData(const TCFData&) = delete;
    TCFData& operator=(const TCFData&) = delete;
    /// Releases the held data (null-safe).
    ~TCFData();

    /// Returns the held data with its count and leaves this wrapper null; the caller releases
    /// the result.
    CFDataRef Orphan();
};
