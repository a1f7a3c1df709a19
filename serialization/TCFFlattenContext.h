// TCFFlattenContext appends the flattened form of one property value to a growable byte buffer:
// depth-first, each value a big-endian type id followed by its body, with no header, padding or
// checksum. TCFResurrectContext reads it back.
//
// The per-kind writers are virtual, and containers reach their elements through the virtual
// Flatten, so a subclass that overrides Flatten or FlattenCFString sees every nested value.
//
// The writers fill the room after the buffer's end in place and add what they wrote to the
// buffer's length once, when the outermost public call returns: one value of any size costs one
// commit, not one append per string, number and container head. Between public calls the buffer
// is a plain data object that its other holders may change. Subclasses write through StreamOut
// and the per-kind writers, never to `stream` directly.
//
// Byte layout of each kind (all integers big-endian, counts 32 bits):
//   string 7, n, n UTF-8 bytes        number 22, type code, width w, w value bytes
//   boolean 259, 1, one byte           data 18, n, n bytes
//   character set 27, n, n bytes of compressed bitmap representation (little-endian inside)
//   array 17 / set 256, n, n values    dictionary 16, n, n × (key value, value value)
//   URL 257, n, n bytes of the absolute URL    UUID 258, 16, 16 bytes
//   error 260, code (low 32 bits), the domain as a complete string value
#pragma once

#include <string_view>
#include <vector>

#include "platform/PropertyValues.h"
#include "serialization/TCFType.h"

class TCFFlattenContext {
public:
    /// Writes into `stream`. With `adopt` the context takes over the caller's reference;
    /// otherwise it retains the buffer. A null or immutable buffer is reported when first written
    /// to; the job then fails (HasFailed) and nothing is written.
    TCFFlattenContext(__CFData* stream, bool adopt);
    /// Releases the buffer; its bytes stay for whoever else holds it.
    virtual ~TCFFlattenContext();

    TCFFlattenContext(const TCFFlattenContext&) = delete;
    TCFFlattenContext& operator=(const TCFFlattenContext&) = delete;

    /// The buffer, without a new reference.
    virtual __CFData* GetStream() const;
    /// Appends the flattened form of `value`. Nothing for null, or once the context met a value
    /// it cannot write: then the buffer was cut back to the length it had when the context was
    /// made, and every later call does nothing.
    virtual void Flatten(void const* value);
    /// The buffer's bytes. NOTE: valid until the buffer next grows.
    virtual const UInt8* GetBytePtr() const;
    virtual CFIndex GetLength() const;
    /// True once the context met a value it could not write as given: a kind the stream cannot
    /// carry (the job was then cut back, see Flatten), or a text or URL written empty because it
    /// has no UTF-8 form or is longer than a reader takes. Callers that must not send a changed
    /// value ask this instead of watching the log.
    bool HasFailed() const { return failed; }

    // One value of each kind, type id first. They do not check `valid`; Flatten does.
    virtual void FlattenCFString(__CFString const* string);
    virtual void FlattenCFNumber(__CFNumber const* number);
    virtual void FlattenCFBoolean(__CFBoolean const* boolean);
    virtual void FlattenCFData(__CFData const* data);
    virtual void FlattenCFCharacterSet(__CFCharacterSet const* set);
    virtual void FlattenCFArray(__CFArray const* array);
    virtual void FlattenCFDictionary(__CFDictionary const* dictionary);
    virtual void FlattenCFSet(__CFSet const* set);
    virtual void FlattenCFURL(__CFURL const* url);
    virtual void FlattenCFUUID(__CFUUID const* uuid);
    virtual void FlattenCFError(__CFError* error);

    /// Appends `count` elements of `size` bytes from `bytes`, each turned big-endian in the
    /// buffer when `size` is 2, 4 or 8. The caller's memory is not changed.
    void StreamOut(void const* bytes, unsigned long size, long count);
    /// Appends 4 bytes, big-endian.
    void StreamOut32bitEntity(unsigned int value);
    void StreamOutTCFTypeID(TCFType type);
    /// Appends the low 32 bits of `index`, big-endian.
    void StreamOutCFIndex(long index);

    /// The expected flattened size of `value` in bytes, for sizing a buffer in advance; 0 for
    /// null or a kind that cannot be written. Exact for every kind but strings (an upper bound)
    /// and character sets (the uncompressed size, which the compressed bytes may exceed).
    static CFIndex EstimateSize(void const* value);
    static CFIndex EstimateCFStringSize(__CFString const* string);
    static CFIndex EstimateCFNumberSize(__CFNumber const* number);
    static CFIndex EstimateCFBooleanSize(__CFBoolean const* boolean);
    static CFIndex EstimateCFDataSize(__CFData const* data);
    static CFIndex EstimateCFCharacterSetSize(__CFCharacterSet const* set);
    static CFIndex EstimateCFArraySize(__CFArray const* array);
    static CFIndex EstimateCFDictionarySize(__CFDictionary const* dictionary);
    static CFIndex EstimateCFSetSize(__CFSet const* set);
    static CFIndex EstimateCFURLSize(__CFURL const* url);
    static CFIndex EstimateCFUUIDSize(__CFUUID const* uuid);
    static CFIndex EstimateCFErrorSize(__CFError* error);

    /// Applier callbacks: `context` is the TCFFlattenContext; they call its Flatten on the
    /// element, or on the key and then on the value.
    static void FlattenArrayElement(void const* value, void* context);
    static void FlattenSetElement(void const* value, void* context);
    static void FlattenDictionaryElement(void const* key, void const* value, void* context);

protected:
    __CFData* stream;
    bool valid;
    /// Set by every writer that gives up on a value; see HasFailed.
    bool failed = false;

private:
    class Scope;

    /// Calls the per-kind writer for `value`'s kind; an unknown kind fails the job.
    void Dispatch(void const* value);
    /// Writes one element of a container when `direct`: an 8-bit text in place, anything else
    /// through Dispatch.
    void WriteElement(void const* value);
    static void WriteDirectElement(void const* value, void* context);
    static void WriteDirectPair(void const* key, void const* value, void* context);

    /// Appends `count` bytes from `bytes` to the pending bytes.
    void Put(const void* bytes, CFIndex count);
    /// Appends a type id and the low 32 bits of `index` after it: the head of most values.
    void PutHead(TCFType type, long index);
    /// Appends a string value of the UTF-8 bytes `text`, head and text with one check for room.
    void PutText(std::string_view text);
    /// Where the next `count` bytes go; the caller writes them and moves `cursor` past them.
    UInt8* Room(CFIndex count) { return limit - cursor >= count ? cursor : Grow(count); }
    /// Commits the pending bytes and reserves room for at least `count` more.
    UInt8* Grow(CFIndex count);
    /// Adds the pending bytes to the buffer's length; the room after them stays.
    void Commit() const;

    /// The buffer's length when the context was made: a failed job cuts back to it, so that bytes
    /// a caller wrote before are kept.
    CFIndex startLength;
    /// Room after the buffer's end: bytes from `pending` to `cursor` are written but not yet
    /// committed, `limit` ends the room. All null outside a public call.
    mutable UInt8* pending = nullptr;
    UInt8* cursor = nullptr;
    UInt8* limit = nullptr;
    /// Public writer calls in progress; the outermost one commits.
    int depth = 0;
    /// Whether the outermost call enlarged the buffer's block: it then gives back the room left.
    bool grown = false;
    /// Set when the buffer cannot take bytes (null or not mutable): the room is `scratch`.
    bool discarding = false;
    std::vector<UInt8> scratch;
    /// Set by the outermost Flatten when the context is of this class itself, so that no
    /// subclass's Flatten or FlattenCFString needs to see the elements of containers.
    bool direct = false;
};

/// Reverses the bytes of a 2-, 4- or 8-byte value in place (the host is little-endian); any other
/// size is left alone. Returns `value`.
void* ConvertToBigEndian(void* value, long size);
