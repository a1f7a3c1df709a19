#include "serialization/TCFFlattenContext.h"

#include <syslog.h>

#include <bit>
#include <cstring>

#include "bitmap/QZBitmapRepresentation.h"
#include "cfutil/TCFRetained.h"
#include "cfutil/TStackBuffer.h"

static_assert(std::endian::native == std::endian::little, "the writer swaps on a little-endian host");

namespace {

CFIndex LengthOf(CFDataRef data) { return data ? CFDataGetLength(data) : 0; }

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

TCFFlattenContext::~TCFFlattenContext() { TCFSafeRelease(stream); }

__CFData* TCFFlattenContext::GetStream() const { return stream; }

const UInt8* TCFFlattenContext::GetBytePtr() const {
    return stream ? CFDataGetBytePtr(stream) : nullptr;
}

CFIndex TCFFlattenContext::GetLength() const { return LengthOf(stream); }

void TCFFlattenContext::Flatten(void const* value) {
    if (!value || !valid)
        return;
    const CFTypeID kind = CFGetTypeID(value);
    if (kind == CFStringGetTypeID())
        FlattenCFString(static_cast<CFStringRef>(value));
    else if (kind == CFNumberGetTypeID())
        FlattenCFNumber(static_cast<CFNumberRef>(value));
    else if (kind == CFBooleanGetTypeID())
        FlattenCFBoolean(static_cast<CFBooleanRef>(value));
    else if (kind == CFDictionaryGetTypeID())
        FlattenCFDictionary(static_cast<CFDictionaryRef>(value));
    else if (kind == CFArrayGetTypeID())
        FlattenCFArray(static_cast<CFArrayRef>(value));
    else if (kind == CFDataGetTypeID())
        FlattenCFData(static_cast<CFDataRef>(value));
    else if (kind == CFCharacterSetGetTypeID())
        FlattenCFCharacterSet(static_cast<CFCharacterSetRef>(value));
    else if (kind == CFSetGetTypeID())
        FlattenCFSet(static_cast<CFSetRef>(value));
    else if (kind == CFURLGetTypeID())
        FlattenCFURL(static_cast<CFURLRef>(value));
    else if (kind == CFUUIDGetTypeID())
        FlattenCFUUID(static_cast<CFUUIDRef>(value));
    else if (kind == CFErrorGetTypeID())
        FlattenCFError(static_cast<CFErrorRef>(const_cast<void*>(value)));
    else {
        CFLog(kCFLogLevelError, "*** don't know how to flatten type %lu (object %@)", kind, value);
        valid = false;
        // The job failed as a whole: take back everything it wrote, but nothing from before.
        CFDataSetLength(stream, startLength);
    }
}

void TCFFlattenContext::FlattenCFString(__CFString const* string) {
    StreamOutTCFTypeID(kTCFTypeString);
    const CFIndex length = CFStringGetLength(string);
    if (length <= kTCFMaxStringLength) {
        CFIndex byteCount = 0;
        const CFRange whole = CFRangeMake(0, length);
        // The reader takes at most kTCFMaxStringLength bytes of text: a longer text would make
        // the whole stream unreadable, so it fails here like an overlong one.
        if (CFStringGetBytes(string, whole, kCFStringEncodingUTF8, 0, true, nullptr, 0,
                             &byteCount) == length &&
            byteCount <= kTCFMaxStringLength) {
            TStackBuffer<unsigned char, 30> utf8(byteCount);
            CFStringGetBytes(string, whole, kCFStringEncodingUTF8, 0, true, utf8.GetBuffer(),
                             byteCount, &byteCount);
            StreamOutCFIndex(byteCount);
            StreamOut(utf8.GetBuffer(), 1, byteCount);
            return;
        }
    }
    glyphwell::SystemLog(LOG_ERR, "ERROR: Quzel::TCFFlattenContext::FlattenCFString failed.");
    StreamOutCFIndex(0);
}

void TCFFlattenContext::FlattenCFNumber(__CFNumber const* number) {
    StreamOutTCFTypeID(kTCFTypeNumber);
    const CFNumberType type = CFNumberGetType(number);
    CFIndex width = CFNumberGetByteSize(number);
    StreamOutCFIndex(type);
    // The value model has no number wider than 8 bytes; should one appear, its width is written
    // as 0 rather than reading past the value buffer (the reader rejects it either way).
    if (width < 0 || width > 8)
        width = 0;
    StreamOutCFIndex(width);
    UInt8 value[8] = {};
    if (width > 0)
        CFNumberGetValue(number, type, value);
    StreamOut(value, static_cast<unsigned long>(width), 1);
}

void TCFFlattenContext::FlattenCFBoolean(__CFBoolean const* boolean) {
    StreamOutTCFTypeID(kTCFTypeBoolean);
    StreamOutCFIndex(1);
    const UInt8 byte = CFBooleanGetValue(boolean) ? 1 : 0;
    StreamOut(&byte, 1, 1);
}

void TCFFlattenContext::FlattenCFData(__CFData const* data) {
    StreamOutTCFTypeID(kTCFTypeData);
    const CFIndex length = CFDataGetLength(data);
    StreamOutCFIndex(length);
    if (length > 0)
        StreamOut(CFDataGetBytePtr(data), 1, length);
}

void TCFFlattenContext::FlattenCFCharacterSet(__CFCharacterSet const* set) {
    StreamOutTCFTypeID(kTCFTypeCharacterSet);
    TCFAdopted<CFDataRef> bitmap(CFCharacterSetCreateBitmapRepresentation(kCFAllocatorDefault, set));
    TCFAdopted<CFDataRef> compressed(
        bitmap ? QZCreateCompressedBitmapRepresentation(CFDataGetBytePtr(bitmap),
                                                        CFDataGetLength(bitmap))
               : nullptr);
    const CFIndex length = compressed ? CFDataGetLength(compressed) : 0;
    StreamOutCFIndex(length);
    if (length > 0)
        StreamOut(CFDataGetBytePtr(compressed), 1, length);
}

void TCFFlattenContext::FlattenCFArray(__CFArray const* array) {
    StreamOutTCFTypeID(kTCFTypeArray);
    const CFIndex count = CFArrayGetCount(array);
    StreamOutCFIndex(count);
    if (count != 0)
        CFArrayApplyFunction(array, CFRangeMake(0, count), FlattenArrayElement, this);
}

void TCFFlattenContext::FlattenCFDictionary(__CFDictionary const* dictionary) {
    StreamOutTCFTypeID(kTCFTypeDictionary);
    const CFIndex count = CFDictionaryGetCount(dictionary);
    StreamOutCFIndex(count);
    if (count != 0)
        CFDictionaryApplyFunction(dictionary, FlattenDictionaryElement, this);
}

void TCFFlattenContext::FlattenCFSet(__CFSet const* set) {
    StreamOutTCFTypeID(kTCFTypeSet);
    const CFIndex count = CFSetGetCount(set);
    StreamOutCFIndex(count);
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

void TCFFlattenContext::StreamOutTCFTypeID(TCFType type) { StreamOut32bitEntity(type); }

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

CFIndex TCFFlattenContext::EstimateCFBooleanSize(__CFBoolean const*) { return 9; }

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

CFIndex TCFFlattenContext::EstimateCFUUIDSize(__CFUUID const*) { return 24; }

CFIndex TCFFlattenContext::EstimateCFErrorSize(__CFError* error) {
    return EstimateCFStringSize(CFErrorGetDomain(error)) + 8;
}
