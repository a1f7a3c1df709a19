#include "serialization/TCFFlattenContext.h"

#include <syslog.h>

#include <bit>
#include <cstring>

#include "bitmap/QZBitmapRepresentation.h"
#include "cfutil/TCFRetained.h"
#include "cfutil/TStackBuffer.h"

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

/// Appends a type id and the index field after it (the low 32 bits of `index`) in one append:
/// the head of every value but the error's.
void StreamOutHead(CFMutableDataRef stream, TCFType type, long index) {
    UInt8 head[8];
    Put32(head, type);
    Put32(head + 4, static_cast<uint32_t>(index));
    CFDataAppendBytes(stream, head, 8);
}

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

__CFData* TCFFlattenContext::GetStream() const {
    return stream;
}

const UInt8* TCFFlattenContext::GetBytePtr() const {
    return stream ? CFDataGetBytePtr(stream) : nullptr;
}

CFIndex TCFFlattenContext::GetLength() const {
    return LengthOf(stream);
}

void TCFFlattenContext::Flatten(void const* value) {
    if (!value || !valid)
        return;
    const CFTypeID kind = CFGetTypeID(value);
    const KindIDs& kinds = Kinds();
    if (kind == kinds.string)
        FlattenCFString(static_cast<CFStringRef>(value));
    else if (kind == kinds.number)
        FlattenCFNumber(static_cast<CFNumberRef>(value));
    else if (kind == kinds.boolean)
        FlattenCFBoolean(static_cast<CFBooleanRef>(value));
    else if (kind == kinds.dictionary)
        FlattenCFDictionary(static_cast<CFDictionaryRef>(value));
    else if (kind == kinds.array)
        FlattenCFArray(static_cast<CFArrayRef>(value));
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
        CFDataSetLength(stream, startLength);
    }
}

namespace {

/// The most UTF-8 bytes one UTF-16 unit can need (a surrogate pair needs 4 for its 2 units).
constexpr CFIndex kUTF8BytesPerUnit = 3;
/// Texts whose head and longest UTF-8 form fit in this many bytes are converted on the stack.
constexpr CFIndex kShortStringRoom = 128;

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
    // A string that keeps UTF-8 bytes is copied as it is, head and text in one append when short.
    if (const std::optional<std::string_view> bytes = glyphwell::UTF8Bytes(string)) {
        const CFIndex byteCount = CFIndex(bytes->size());
        if (byteCount <= kTCFMaxStringLength) {
            if (8 + byteCount <= kShortStringRoom) {
                UInt8 value[kShortStringRoom];
                Put32(value, kTCFTypeString);
                Put32(value + 4, static_cast<uint32_t>(byteCount));
                std::memcpy(value + 8, bytes->data(), bytes->size());
                CFDataAppendBytes(stream, value, 8 + byteCount);
            } else {
                StreamOutHead(stream, kTCFTypeString, byteCount);
                CFDataAppendBytes(stream, reinterpret_cast<const UInt8*>(bytes->data()), byteCount);
            }
            return;
        }
    }
    const CFIndex length = CFStringGetLength(string);
    // Each text is converted once. A short one is converted on the stack behind its head and
    // appended in one call; a longer one straight into the buffer, after room is made for its
    // longest UTF-8 form, which is then cut back to what was written.
    if (length <= kTCFMaxStringLength) {
        const CFIndex room = 8 + kUTF8BytesPerUnit * length;
        CFIndex byteCount = 0;
        if (room <= kShortStringRoom) {
            UInt8 value[kShortStringRoom];
            if (ConvertText(string, length, value + 8, &byteCount)) {
                Put32(value, kTCFTypeString);
                Put32(value + 4, static_cast<uint32_t>(byteCount));
                CFDataAppendBytes(stream, value, 8 + byteCount);
                return;
            }
        } else {
            const CFIndex start = CFDataGetLength(stream);
            CFDataIncreaseLength(stream, room);
            UInt8* const value = CFDataGetMutableBytePtr(stream) + start;
            const bool converted = ConvertText(string, length, value + 8, &byteCount);
            if (converted) {
                Put32(value, kTCFTypeString);
                Put32(value + 4, static_cast<uint32_t>(byteCount));
            }
            CFDataSetLength(stream, converted ? start + 8 + byteCount : start);
            if (converted)
                return;
        }
    }
    glyphwell::SystemLog(LOG_ERR, "ERROR: Quzel::TCFFlattenContext::FlattenCFString failed.");
    failed = true;
    StreamOutHead(stream, kTCFTypeString, 0);
}

void TCFFlattenContext::FlattenCFNumber(__CFNumber const* number) {
    const CFNumberType type = CFNumberGetType(number);
    CFIndex width = CFNumberGetByteSize(number);
    // The value model has no number wider than 8 bytes; should one appear, its width is written
    // as 0 rather than reading past the value buffer (the reader rejects it either way).
    if (width < 0 || width > 8)
        width = 0;
    // Type id, type code, width and the value, big-endian, in one append.
    UInt8 bytes[20] = {};
    Put32(bytes, kTCFTypeNumber);
    Put32(bytes + 4, static_cast<uint32_t>(type));
    Put32(bytes + 8, static_cast<uint32_t>(width));
    if (width > 0) {
        UInt8 value[8] = {};
        CFNumberGetValue(number, type, value);
        ConvertToBigEndian(value, width);
        std::memcpy(bytes + 12, value, static_cast<size_t>(width));
    }
    CFDataAppendBytes(stream, bytes, 12 + width);
}

void TCFFlattenContext::FlattenCFBoolean(__CFBoolean const* boolean) {
    UInt8 bytes[9];
    Put32(bytes, kTCFTypeBoolean);
    Put32(bytes + 4, 1);
    bytes[8] = CFBooleanGetValue(boolean) ? 1 : 0;
    CFDataAppendBytes(stream, bytes, 9);
}

void TCFFlattenContext::FlattenCFData(__CFData const* data) {
    const CFIndex length = CFDataGetLength(data);
    StreamOutHead(stream, kTCFTypeData, length);
    if (length > 0)
        StreamOut(CFDataGetBytePtr(data), 1, length);
}

void TCFFlattenContext::FlattenCFCharacterSet(__CFCharacterSet const* set) {
    StreamOutTCFTypeID(kTCFTypeCharacterSet);
    TCFAdopted<CFDataRef> bitmap(
        CFCharacterSetCreateBitmapRepresentation(kCFAllocatorDefault, set));
    TCFAdopted<CFDataRef> compressed(bitmap ? QZCreateCompressedBitmapRepresentation(
                                                  CFDataGetBytePtr(bitmap), CFDataGetLength(bitmap))
                                            : nullptr);
    const CFIndex length = compressed ? CFDataGetLength(compressed) : 0;
    StreamOutCFIndex(length);
    if (length > 0)
        StreamOut(CFDataGetBytePtr(compressed), 1, length);
}

void TCFFlattenContext::FlattenCFArray(__CFArray const* array) {
    const CFIndex count = CFArrayGetCount(array);
    StreamOutHead(stream, kTCFTypeArray, count);
    if (count != 0)
        CFArrayApplyFunction(array, CFRangeMake(0, count), FlattenArrayElement, this);
}

void TCFFlattenContext::FlattenCFDictionary(__CFDictionary const* dictionary) {
    const CFIndex count = CFDictionaryGetCount(dictionary);
    StreamOutHead(stream, kTCFTypeDictionary, count);
    if (count != 0)
        CFDictionaryApplyFunction(dictionary, FlattenDictionaryElement, this);
}

void TCFFlattenContext::FlattenCFSet(__CFSet const* set) {
    const CFIndex count = CFSetGetCount(set);
    StreamOutHead(stream, kTCFTypeSet, count);
    if (count != 0)
        CFSetApplyFunction(set, FlattenSetElement, this);
}

void TCFFlattenContext::FlattenCFURL(__CFURL const* url) {
    StreamOutTCFTypeID(kTCFTypeURL);
    TCFAdopted<CFURLRef> absolute(CFURLCopyAbsoluteURL(url));
    const CFIndex length = absolute ? CFURLGetBytes(absolute, nullptr, 0) : 0;
    if (length > kTCFMaxStringLength) {
        // The reader rejects longer URLs and with them the rest of the stream: write none.
        glyphwell::SystemLog(LOG_ERR, "ERROR: Quzel::TCFFlattenContext::FlattenCFURL failed.");
        failed = true;
        StreamOutCFIndex(0);
        return;
    }
    if (length < 1) {
        StreamOutCFIndex(0);
        return;
    }
    TStackBuffer<unsigned char, 30> bytes(length);
    CFURLGetBytes(absolute, bytes.GetBuffer(), length);
    StreamOutCFIndex(length);
    StreamOut(bytes.GetBuffer(), 1, length);
}

void TCFFlattenContext::FlattenCFUUID(__CFUUID const* uuid) {
    StreamOutTCFTypeID(kTCFTypeUUID);
    if (!uuid) {
        StreamOutCFIndex(0);
        return;
    }
    const CFUUIDBytes bytes = CFUUIDGetUUIDBytes(uuid);
    StreamOutCFIndex(16);
    StreamOut(&bytes, 1, 16);
}

void TCFFlattenContext::FlattenCFError(__CFError* error) {
    StreamOutTCFTypeID(kTCFTypeError);
    if (!error)
        return;
    StreamOutCFIndex(CFErrorGetCode(error));
    FlattenCFString(CFErrorGetDomain(error));
}

void TCFFlattenContext::StreamOut(void const* bytes, unsigned long size, long count) {
    if (count <= 0 || size == 0)
        return;
    const CFIndex start = CFDataGetLength(stream);
    CFDataAppendBytes(stream, static_cast<const UInt8*>(bytes), CFIndex(size * count));
    if (size > 1) {
        UInt8* element = CFDataGetMutableBytePtr(stream) + start;
        for (long i = 0; i < count; ++i, element += size)
            ConvertToBigEndian(element, long(size));
    }
}

void TCFFlattenContext::StreamOut32bitEntity(unsigned int value) {
    const UInt32 bigEndian = __builtin_bswap32(value);
    CFDataAppendBytes(stream, reinterpret_cast<const UInt8*>(&bigEndian), 4);
}

void TCFFlattenContext::StreamOutTCFTypeID(TCFType type) {
    StreamOut32bitEntity(type);
}

void TCFFlattenContext::StreamOutCFIndex(long index) {
    StreamOut32bitEntity(static_cast<unsigned int>(index));
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
