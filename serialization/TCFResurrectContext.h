// TCFResurrectContext reads one flattened value stream (see TCFFlattenContext.h for the byte
// layout) from a byte range and rebuilds the property value it holds.
//
// Every byte may come from a peer, so the reader bounds each read by the bytes that remain, caps
// every count, and once it finds the stream corrupt stops reading for good: it reports that once
// to the system log ("ERROR: Quzel got corrupted data. (<label>)") and hands back null or
// shortened values. It never reads outside the range and never writes to it.
//
// Beyond the format's own rules the reader also:
//  - bounds nesting to kMaxNestingDepth containers; deeper input is corrupt ("depth"), so neither
//    reading nor releasing the result can exhaust the stack;
//  - grows a container's element table with the elements actually read, so a large count in a
//    short stream costs no more memory than the stream holds;
//  - decompresses a character set only when its header claims a plausible bitmap representation
//    length (8192 + k × 8193 bytes, k from 0 to 16);
//  - reads text with or without a leading UTF-8 byte-order mark;
//  - turns a number type code outside 1-16 into a number of type 10 (long) holding the value read
//    as a signed integer of the given width;
//  - treats an allocation that fails (std::bad_alloc) as corrupt input ("memory"): null, nothing
//    leaked.
//
// Results: every Resurrect or Retrieve result is a new reference the caller releases, except the
// shared true, false and empty string, whose release has no effect. Strings come from the
// process-wide string uniquer, so equal texts yield the same string object.
//
// NOTE: the bytes must stay valid and unchanged while a read is in progress.
#pragma once

#include "platform/PropertyValues.h"
#include "serialization/TCFType.h"

class TCFResurrectContext {
public:
    /// The deepest nesting of containers the reader accepts.
    static constexpr unsigned kMaxNestingDepth = 512;

    /// Reads `length` bytes at `bytes`; null bytes mean nothing is read.
    TCFResurrectContext(unsigned char const* bytes, unsigned long length);
    /// The same with the address of the bytes given as an integer.
    TCFResurrectContext(unsigned long address, unsigned long length);
    virtual ~TCFResurrectContext();

    TCFResurrectContext(const TCFResurrectContext&) = delete;
    TCFResurrectContext& operator=(const TCFResurrectContext&) = delete;

    /// Marks the stream corrupt (once): logs the label of the field that failed and stops every
    /// later read.
    virtual void ResurrectionError(char const* label);

    // The top-level value, which must be of the named kind: null (and an "unexpected type" line)
    // when it is not.
    virtual __CFString const* RetrieveCFString();
    virtual __CFNumber const* RetrieveCFNumber();
    virtual __CFBoolean const* RetrieveCFBoolean();
    virtual __CFData const* RetrieveCFData();
    virtual __CFCharacterSet const* RetrieveCFCharacterSet();
    virtual __CFArray const* RetrieveCFArray();
    virtual __CFDictionary const* RetrieveCFDictionary();
    virtual __CFSet const* RetrieveCFSet();
    virtual __CFURL const* RetrieveCFURL();
    virtual __CFUUID const* RetrieveCFUUID();
    virtual __CFError* RetrieveCFError();

    /// Reads one complete value of type `expected` (kTCFTypeAny: of any type), or null.
    virtual void const* Resurrect(TCFType expected);

    // The body of one value of each kind; the type id has been read.
    virtual __CFString const* ResurrectCFString();
    virtual __CFNumber const* ResurrectCFNumber();
    virtual __CFBoolean const* ResurrectCFBoolean();
    virtual __CFData const* ResurrectCFData();
    virtual __CFCharacterSet const* ResurrectCFCharacterSet();
    virtual __CFArray const* ResurrectCFArray();
    virtual __CFDictionary const* ResurrectCFDictionary();
    virtual __CFSet const* ResurrectCFSet();
    virtual __CFURL const* ResurrectCFURL();
    virtual __CFUUID const* ResurrectCFUUID();
    virtual __CFError* ResurrectCFError();

    /// True when the stream is not corrupt and at least `count` bytes remain.
    bool BytesAvailable(unsigned long count) const;
    /// The next 4 bytes, big-endian. Unchecked: call BytesAvailable(4) first.
    unsigned int StreamIn32bitEntity();
    /// The next type id; kTCFTypeAny (and "cftype" reported) when fewer than 4 bytes remain.
    TCFType StreamInTCFTypeID();
    /// The next index field, sign-extended; 0 (and "cfindex" reported) when fewer than 4 remain.
    long StreamInCFIndex();
    /// Copies `count` elements of `size` bytes to `destination`, converting each from big-endian
    /// when `size` is 2, 4 or 8. When they are not all there, fills the destination with zeros
    /// and reports "data".
    void StreamInData(void* destination, unsigned long size, long count);

    /// True once the stream was found corrupt.
    bool IsCorrupted() const { return corrupted; }

protected:
    unsigned char const* cursor;
    unsigned char const* end;
    bool corrupted;

private:
    /// Containers open around the value being read.
    unsigned depth = 0;

    /// The element count of an array or set, or 0 with "cfarray" reported when out of range.
    long ContainerCount(const char* label);
    /// Resurrect without the guard against failed allocations.
    void const* ResurrectValue(TCFType expected);
};

/// Reverses the bytes of a 2-, 4- or 8-byte value in place; any other size is left alone.
void* ConvertToNative(void* value, long size);
