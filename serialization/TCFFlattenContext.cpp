#include "serialization/TCFFlattenContext.h"

#include <syslog.h>

#include <algorithm>
#include <bit>
#include <cstring>
#include <functional>
#include <new>
#include <typeinfo>
#include <vector>

#include "bitmap/QZBitmapRepresentation.h"
#include "cfutil/TCFRetained.h"

static_assert(std::endian::native == std::endian::little,
              "the writer swaps on a little-endian host");

namespace {

CFIndex LengthOf(CFDataRef data) {
    return data ? CFDataGetLength(data) : 0;
}

/// Stores `value` big-endian at `bytes`.
void Put32(UInt8* bytes, uint32_t value) {
    value = __builtin_bswap32(value);
    std::memcpy(bytes, &value, 4);
}

/// Copies `count` bytes, `size` <= `count` <= 2 × `size`, as two blocks of `size` bytes that meet
/// or overlap in the middle: no loop and no call.
template <size_t size> void CopyEnds(UInt8* to, const char* from, size_t count) {
    struct Block {
        unsigned char bytes[size];
    } head, tail;
    std::memcpy(&head, from, size);
    std::memcpy(&tail, from + count - size, size);
    std::memcpy(to, &head, size);
    std::memcpy(to + count - size, &tail, size);
}

/// memcpy for the short texts most values have: up to 32 bytes without a call.
void CopyShort(UInt8* to, const char* from, size_t count) {
    if (count > 32) {
        std::memcpy(to, from, count);
    } else if (count >= 16) {
        CopyEnds<16>(to, from, count);
    } else if (count >= 8) {
        CopyEnds<8>(to, from, count);
    } else if (count >= 4) {
        CopyEnds<4>(to, from, count);
    } else if (count > 0) {
        to[0] = UInt8(from[0]);
        to[count / 2] = UInt8(from[count / 2]);
        to[count - 1] = UInt8(from[count - 1]);
    }
}

/// The room asked for when a call first writes: enough for a reply. A call that needs more asks
/// for kLargeRoom more, enough for most requests, so that their block is copied at most once,
/// while it is small. A block grown for a call gives back the room left when that is more than
/// kRoomKept; shrinking costs no copy.
constexpr CFIndex kFirstRoom = 1024;
constexpr CFIndex kLargeRoom = 32 * 1024;
constexpr CFIndex kRoomKept = 4096;

/// The platform's kind ids, fetched once: Flatten compares each value's kind with them in turn.
struct KindIDs {
    CFTypeID string = CFStringGetTypeID();
    CFTypeID number = CFNumberGetTypeID();
    CFTypeID boolean = CFBooleanGetTypeID();
    CFTypeID dictionary = CFDictionaryGetTypeID();
    CFTypeID array = CFArrayGetTypeID();
    CFTypeID data = CFDataGetTypeID();
    CFTypeID characterSet = CFCharacterSetGetTypeID();
    CFTypeID set = CFSetGetTypeID();
    CFTypeID url = CFURLGetTypeID();
    CFTypeID uuid = CFUUIDGetTypeID();
    CFTypeID error = CFErrorGetTypeID();
};

const KindIDs& Kinds() {
    static const KindIDs ids;
    return ids;
}

} // namespace

void* ConvertToBigEndian(void* value, long size) {
    auto* bytes = static_cast<UInt8*>(value);
    switch (size) {
    case 2: {
        UInt16 v;
        std::memcpy(&v, bytes, 2);
        v = __builtin_bswap16(v);
        std::memcpy(bytes, &v, 2);
        break;
    }
    case 4: {
        UInt32 v;
        std::memcpy(&v, bytes, 4);
        v = __builtin_bswap32(v);
        std::memcpy(bytes, &v, 4);
        break;
    }
    case 8: {
        UInt64 v;
        std::memcpy(&v, bytes, 8);
        v = __builtin_bswap64(v);
        std::memcpy(bytes, &v, 8);
        break;
    }
    default:
        break;
    }
    return value;
}

TCFFlattenContext::TCFFlattenContext(__CFData* buffer, bool adopt)
    : stream(buffer), valid(true), startLength(LengthOf(buffer)) {
    if (stream && !adopt)
        CFRetain(stream);
}

TCFFlattenContext::~TCFFlattenContext() {
    TCFSafeRelease(stream);
}

/// Marks one public writer call: the outermost one commits what the call wrote and forgets the
/// room, since the buffer's other holders may change it before the next call.
class TCFFlattenContext::Scope {
public:
    explicit Scope(TCFFlattenContext& context) : context(context) { ++context.depth; }
    ~Scope() {
        if (--context.depth == 0) {
            context.Commit();
            if (context.grown && context.limit - context.cursor > kRoomKept)
                glyphwell::DataTrimRoom(context.stream);
            context.pending = context.cursor = context.limit = nullptr;
            context.grown = context.discarding = false;
        }
    }
    Scope(const Scope&) = delete;
    Scope& operator=(const Scope&) = delete;

private:
    TCFFlattenContext& context;
};

UInt8* TCFFlattenContext::Grow(CFIndex count) {
    Commit();
    const glyphwell::DataTail tail =
        glyphwell::DataReserveTail(stream, std::max(count, limit ? kLargeRoom : kFirstRoom));
    if (!tail.bytes || tail.size < count) {
        // Not a mutable data object (reported by the platform): the job fails, and what the
        // writers still write goes to a scratch block that is never committed.
        valid = false;
        failed = true;
        discarding = true;
        scratch.resize(std::max(scratch.size(), size_t(count)));
        pending = cursor = scratch.data();
        limit = scratch.data() + scratch.size();
        return cursor;
    }
    pending = cursor = tail.bytes;
    limit = tail.bytes + tail.size;
    grown = grown || tail.grown;
    return cursor;
}

void TCFFlattenContext::Commit() const {
    if (cursor != pending) {
        if (!discarding)
            glyphwell::DataCommitTail(stream, cursor - pending);
        pending = cursor;
    }
}

/// Appends `count` bytes from `bytes` to the pending bytes.
inline void TCFFlattenContext::Put(const void* bytes, CFIndex count) {
    UInt8* const at = Room(count);
    std::memcpy(at, bytes, size_t(count));
    cursor = at + count;
}
/// Appends a type id and the low 32 bits of `index` after it: the head of most values.
inline void TCFFlattenContext::PutHead(TCFType type, long index) {
    UInt8* const at = Room(8);
    Put32(at, type);
    Put32(at + 4, static_cast<uint32_t>(index));
    cursor = at + 8;
}
/// Appends a string value of the UTF-8 bytes `text`, head and text with one check for room.
inline void TCFFlattenContext::PutText(std::string_view text) {
    const CFIndex count = CFIndex(text.size());
    UInt8* const at = Room(8 + count);
    Put32(at, kTCFTypeString);
    Put32(at + 4, static_cast<uint32_t>(count));
    CopyShort(at + 8, text.data(), text.size());
    cursor = at + 8 + count;
}

__CFData* TCFFlattenContext::GetStream() const {
    Commit();
    return stream;
}

const UInt8* TCFFlattenContext::GetBytePtr() const {
    Commit();
    return stream ? CFDataGetBytePtr(stream) : nullptr;
}

CFIndex TCFFlattenContext::GetLength() const {
    Commit();
    return LengthOf(stream);
}

void TCFFlattenContext::Flatten(void const* value) {
    if (!value || !valid)
        return;
    const Scope scope(*this);
    // A context of this very class has no overrides to honour: its containers may then write
    // their elements without going through the virtual writers.
    if (depth == 1)
        direct = typeid(*this) == typeid(TCFFlattenContext);
    Dispatch(value);
}

void TCFFlattenContext::Dispatch(void const* value) {
    const CFTypeID kind = CFGetTypeID(value);
    const KindIDs& kinds = Kinds();
    // Most common first: texts, then the containers that hold them.
    if (kind == kinds.string)
        FlattenCFString(static_cast<CFStringRef>(value));
    else if (kind == kinds.dictionary)
        FlattenCFDictionary(static_cast<CFDictionaryRef>(value));
    else if (kind == kinds.array)
        FlattenCFArray(static_cast<CFArrayRef>(value));
    else if (kind == kinds.number)
        FlattenCFNumber(static_cast<CFNumberRef>(value));
    else if (kind == kinds.boolean)
        FlattenCFBoolean(static_cast<CFBooleanRef>(value));
    else if (kind == kinds.data)
        FlattenCFData(static_cast<CFDataRef>(value));
    else if (kind == kinds.characterSet)
        FlattenCFCharacterSet(static_cast<CFCharacterSetRef>(value));
    else if (kind == kinds.set)
        FlattenCFSet(static_cast<CFSetRef>(value));
    else if (kind == kinds.url)
        FlattenCFURL(static_cast<CFURLRef>(value));
    else if (kind == kinds.uuid)
        FlattenCFUUID(static_cast<CFUUIDRef>(value));
    else if (kind == kinds.error)
        FlattenCFError(static_cast<CFErrorRef>(const_cast<void*>(value)));
    else {
        CFLog(kCFLogLevelError, "*** don't know how to flatten type %lu (object %@)", kind, value);
        valid = false;
        failed = true;
        // The job failed as a whole: take back everything it wrote, but nothing from before.
        cursor = pending;
        CFDataSetLength(stream, startLength);
        pending = cursor = limit = nullptr;
    }
}

void TCFFlattenContext::WriteElement(void const* value) {
    if (!value || !valid)
        return;
    // Most elements are texts kept as UTF-8: copied here without a call per value.
    if (const std::string_view bytes = glyphwell::UTF8Bytes(static_cast<CFStringRef>(value));
        bytes.data() && CFIndex(bytes.size()) <= kTCFMaxStringLength) {
        PutText(bytes);
        return;
    }
    Dispatch(value);
}

namespace {

/// The most UTF-8 bytes one UTF-16 unit can need (a surrogate pair needs 4 for its 2 units).
constexpr CFIndex kUTF8BytesPerUnit = 3;

/// Converts the whole of `string` (`length` units) to UTF-8 at `text`, which has room for
/// kUTF8BytesPerUnit bytes per unit, and stores the byte count in `*byteCount`. False when the
/// text cannot be written: a unit without a UTF-8 form, or more bytes than a reader takes.
bool ConvertText(CFStringRef string, CFIndex length, UInt8* text, CFIndex* byteCount) {
    const CFIndex converted =
        CFStringGetBytes(string, CFRangeMake(0, length), kCFStringEncodingUTF8, 0, true, text,
                         kUTF8BytesPerUnit * length, byteCount);
    // The reader takes at most kTCFMaxStringLength bytes of text: a longer text would make the
    // whole stream unreadable, so it fails here like an overlong one.
    return converted == length && *byteCount <= kTCFMaxStringLength;
}

} // namespace

void TCFFlattenContext::FlattenCFString(__CFString const* string) {
    const Scope scope(*this);
    // A string that keeps UTF-8 bytes is copied as it is.
    if (const std::string_view bytes = glyphwell::UTF8Bytes(string);
        bytes.data() && CFIndex(bytes.size()) <= kTCFMaxStringLength) {
        PutText(bytes);
        return;
    }
    // Otherwise the text is converted once, straight into the room behind its head, which is
    // made for its longest UTF-8 form.
    const CFIndex length = CFStringGetLength(string);
    if (length <= kTCFMaxStringLength) {
        UInt8* const value = Room(8 + kUTF8BytesPerUnit * length);
        CFIndex byteCount = 0;
        if (ConvertText(string, length, value + 8, &byteCount)) {
            Put32(value, kTCFTypeString);
            Put32(value + 4, static_cast<uint32_t>(byteCount));
            cursor = value + 8 + byteCount;
            return;
        }
    }
    glyphwell::SystemLog(LOG_ERR, "ERROR: Quzel::TCFFlattenContext::FlattenCFString failed.");
    failed = true;
    PutHead(kTCFTypeString, 0);
}

void TCFFlattenContext::FlattenCFNumber(__CFNumber const* number) {
    const Scope scope(*this);
    const CFNumberType type = CFNumberGetType(number);
    CFIndex width = CFNumberGetByteSize(number);
    // The value model has no number wider than 8 bytes; should one appear, its width is written
    // as 0 rather than reading past the value buffer (the reader rejects it either way).
    if (width < 0 || width > 8)
        width = 0;
    // Type id, type code, width and the value, big-endian.
    UInt8* const bytes = Room(20);
    Put32(bytes, kTCFTypeNumber);
    Put32(bytes + 4, static_cast<uint32_t>(type));
    Put32(bytes + 8, static_cast<uint32_t>(width));
    if (width > 0) {
        UInt8 value[8] = {};
        CFNumberGetValue(number, type, value);
        ConvertToBigEndian(value, width);
        std::memcpy(bytes + 12, value, static_cast<size_t>(width));
    }
    cursor = bytes + 12 + width;
}

void TCFFlattenContext::FlattenCFBoolean(__CFBoolean const* boolean) {
    const Scope scope(*this);
    UInt8* const bytes = Room(9);
    Put32(bytes, kTCFTypeBoolean);
    Put32(bytes + 4, 1);
    bytes[8] = CFBooleanGetValue(boolean) ? 1 : 0;
    cursor = bytes + 9;
}

void TCFFlattenContext::FlattenCFData(__CFData const* data) {
    const Scope scope(*this);
    // The buffer itself may be among the values: it is written with every byte before its head.
    if (data == stream)
        Commit();
    const CFIndex length = CFDataGetLength(data);
    UInt8* const bytes = Room(8 + length);
    Put32(bytes, kTCFTypeData);
    Put32(bytes + 4, static_cast<uint32_t>(length));
    // Read after making room, which may move the buffer's block.
    if (length > 0)
        std::memcpy(bytes + 8, CFDataGetBytePtr(data), size_t(length));
    cursor = bytes + 8 + length;
}

void TCFFlattenContext::FlattenCFCharacterSet(__CFCharacterSet const* set) {
    const Scope scope(*this);
    TCFAdopted<CFDataRef> bitmap(
        CFCharacterSetCreateBitmapRepresentation(kCFAllocatorDefault, set));
    TCFAdopted<CFDataRef> compressed(bitmap ? QZCreateCompressedBitmapRepresentation(
                                                  CFDataGetBytePtr(bitmap), CFDataGetLength(bitmap))
                                            : nullptr);
    const CFIndex length = compressed ? CFDataGetLength(compressed) : 0;
    PutHead(kTCFTypeCharacterSet, length);
    if (length > 0)
        Put(CFDataGetBytePtr(compressed), length);
}

void TCFFlattenContext::FlattenCFArray(__CFArray const* array) {
    const Scope scope(*this);
    const CFIndex count = CFArrayGetCount(array);
    PutHead(kTCFTypeArray, count);
    if (count != 0)
        CFArrayApplyFunction(array, CFRangeMake(0, count),
                             direct ? WriteDirectElement : FlattenArrayElement, this);
}

void TCFFlattenContext::FlattenCFDictionary(__CFDictionary const* dictionary) {
    const Scope scope(*this);
    const CFIndex count = CFDictionaryGetCount(dictionary);
    PutHead(kTCFTypeDictionary, count);
    if (count != 0)
        CFDictionaryApplyFunction(dictionary, direct ? WriteDirectPair : FlattenDictionaryElement,
                                  this);
}

void TCFFlattenContext::FlattenCFSet(__CFSet const* set) {
    const Scope scope(*this);
    const CFIndex count = CFSetGetCount(set);
    PutHead(kTCFTypeSet, count);
    if (count != 0)
        CFSetApplyFunction(set, direct ? WriteDirectElement : FlattenSetElement, this);
}

void TCFFlattenContext::FlattenCFURL(__CFURL const* url) {
    const Scope scope(*this);
    TCFAdopted<CFURLRef> absolute(CFURLCopyAbsoluteURL(url));
    const CFIndex length = absolute ? CFURLGetBytes(absolute, nullptr, 0) : 0;
    if (length > kTCFMaxStringLength) {
        // The reader rejects longer URLs and with them the rest of the stream: write none.
        glyphwell::SystemLog(LOG_ERR, "ERROR: Quzel::TCFFlattenContext::FlattenCFURL failed.");
        failed = true;
        PutHead(kTCFTypeURL, 0);
        return;
    }
    if (length < 1) {
        PutHead(kTCFTypeURL, 0);
        return;
    }
    UInt8* const bytes = Room(8 + length);
    Put32(bytes, kTCFTypeURL);
    Put32(bytes + 4, static_cast<uint32_t>(length));
    CFURLGetBytes(absolute, bytes + 8, length);
    cursor = bytes + 8 + length;
}

void TCFFlattenContext::FlattenCFUUID(__CFUUID const* uuid) {
    const Scope scope(*this);
    if (!uuid) {
        PutHead(kTCFTypeUUID, 0);
        return;
    }
    const CFUUIDBytes bytes = CFUUIDGetUUIDBytes(uuid);
    PutHead(kTCFTypeUUID, 16);
    Put(&bytes, 16);
}

void TCFFlattenContext::FlattenCFError(__CFError* error) {
    const Scope scope(*this);
    StreamOutTCFTypeID(kTCFTypeError);
    if (!error)
        return;
    StreamOutCFIndex(CFErrorGetCode(error));
    FlattenCFString(CFErrorGetDomain(error));
}

void TCFFlattenContext::StreamOut(void const* bytes, unsigned long size, long count) {
    if (count <= 0 || size == 0)
        return;
    const Scope scope(*this);
    // Bytes from the buffer itself are copied first: making room may move its block.
    std::vector<UInt8> own;
    const UInt8* const begin = CFDataGetBytePtr(stream);
    const std::less<const void*> before;
    if (begin && !before(bytes, begin) && before(bytes, limit ? limit : begin + LengthOf(stream))) {
        own.assign(static_cast<const UInt8*>(bytes),
                   static_cast<const UInt8*>(bytes) + size * count);
        bytes = own.data();
    }
    UInt8* const start = Room(CFIndex(size * count));
    std::memcpy(start, bytes, size * count);
    cursor = start + size * count;
    if (size > 1)
        for (UInt8* element = start; element != cursor; element += size)
            ConvertToBigEndian(element, long(size));
}

void TCFFlattenContext::StreamOut32bitEntity(unsigned int value) {
    const Scope scope(*this);
    const UInt32 bigEndian = __builtin_bswap32(value);
    Put(&bigEndian, 4);
}

void TCFFlattenContext::StreamOutTCFTypeID(TCFType type) {
    StreamOut32bitEntity(type);
}

void TCFFlattenContext::StreamOutCFIndex(long index) {
    StreamOut32bitEntity(static_cast<unsigned int>(index));
}

void TCFFlattenContext::WriteDirectElement(void const* value, void* context) {
    static_cast<TCFFlattenContext*>(context)->WriteElement(value);
}

void TCFFlattenContext::WriteDirectPair(void const* key, void const* value, void* context) {
    auto* self = static_cast<TCFFlattenContext*>(context);
    self->WriteElement(key);
    self->WriteElement(value);
}

void TCFFlattenContext::FlattenArrayElement(void const* value, void* context) {
    static_cast<TCFFlattenContext*>(context)->Flatten(value);
}

void TCFFlattenContext::FlattenSetElement(void const* value, void* context) {
    static_cast<TCFFlattenContext*>(context)->Flatten(value);
}

void TCFFlattenContext::FlattenDictionaryElement(void const* key, void const* value,
                                                 void* context) {
    auto* self = static_cast<TCFFlattenContext*>(context);
    self->Flatten(key);
    self->Flatten(value);
}

CFIndex TCFFlattenContext::EstimateSize(void const* value) {
    if (!value)
        return 0;
    const CFTypeID kind = CFGetTypeID(value);
    if (kind == CFStringGetTypeID())
        return EstimateCFStringSize(static_cast<CFStringRef>(value));
    if (kind == CFNumberGetTypeID())
        return EstimateCFNumberSize(static_cast<CFNumberRef>(value));
    if (kind == CFBooleanGetTypeID())
        return EstimateCFBooleanSize(static_cast<CFBooleanRef>(value));
    if (kind == CFDictionaryGetTypeID())
        return EstimateCFDictionarySize(static_cast<CFDictionaryRef>(value));
    if (kind == CFArrayGetTypeID())
        return EstimateCFArraySize(static_cast<CFArrayRef>(value));
    if (kind == CFDataGetTypeID())
        return EstimateCFDataSize(static_cast<CFDataRef>(value));
    if (kind == CFCharacterSetGetTypeID())
        return EstimateCFCharacterSetSize(static_cast<CFCharacterSetRef>(value));
    if (kind == CFSetGetTypeID())
        return EstimateCFSetSize(static_cast<CFSetRef>(value));
    if (kind == CFURLGetTypeID())
        return EstimateCFURLSize(static_cast<CFURLRef>(value));
    if (kind == CFUUIDGetTypeID())
        return EstimateCFUUIDSize(static_cast<CFUUIDRef>(value));
    if (kind == CFErrorGetTypeID())
        return EstimateCFErrorSize(static_cast<CFErrorRef>(const_cast<void*>(value)));
    return 0;
}

CFIndex TCFFlattenContext::EstimateCFStringSize(__CFString const* string) {
    return CFStringGetMaximumSizeForEncoding(CFStringGetLength(string), kCFStringEncodingUTF8) + 8;
}

CFIndex TCFFlattenContext::EstimateCFNumberSize(__CFNumber const* number) {
    return CFNumberGetByteSize(number) + 12;
}

CFIndex TCFFlattenContext::EstimateCFBooleanSize(__CFBoolean const*) {
    return 9;
}

CFIndex TCFFlattenContext::EstimateCFDataSize(__CFData const* data) {
    return CFDataGetLength(data) + 8;
}

CFIndex TCFFlattenContext::EstimateCFCharacterSetSize(__CFCharacterSet const* set) {
    CFIndex size = 8192 + 8;
    for (CFIndex plane = 1; plane <= 16; ++plane)
        if (CFCharacterSetHasMemberInPlane(set, plane))
            size += 8193;
    return size;
}

namespace {

void AddEstimate(void const* value, void* total) {
    *static_cast<CFIndex*>(total) += TCFFlattenContext::EstimateSize(value);
}

void AddPairEstimate(void const* key, void const* value, void* total) {
    *static_cast<CFIndex*>(total) +=
        TCFFlattenContext::EstimateSize(key) + TCFFlattenContext::EstimateSize(value);
}

} // namespace

CFIndex TCFFlattenContext::EstimateCFArraySize(__CFArray const* array) {
    CFIndex total = 8;
    CFArrayApplyFunction(array, CFRangeMake(0, CFArrayGetCount(array)), AddEstimate, &total);
    return total;
}

CFIndex TCFFlattenContext::EstimateCFDictionarySize(__CFDictionary const* dictionary) {
    CFIndex total = 8;
    CFDictionaryApplyFunction(dictionary, AddPairEstimate, &total);
    return total;
}

CFIndex TCFFlattenContext::EstimateCFSetSize(__CFSet const* set) {
    CFIndex total = 8;
    CFSetApplyFunction(set, AddEstimate, &total);
    return total;
}

CFIndex TCFFlattenContext::EstimateCFURLSize(__CFURL const* url) {
    TCFAdopted<CFURLRef> absolute(CFURLCopyAbsoluteURL(url));
    const CFIndex length = absolute ? CFURLGetBytes(absolute, nullptr, 0) : 0;
    return 8 + (length > 0 ? length : 0);
}

CFIndex TCFFlattenContext::EstimateCFUUIDSize(__CFUUID const*) {
    return 24;
}

CFIndex TCFFlattenContext::EstimateCFErrorSize(__CFError* error) {
    return EstimateCFStringSize(CFErrorGetDomain(error)) + 8;
}
