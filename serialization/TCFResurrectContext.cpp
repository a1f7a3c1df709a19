#include "serialization/TCFResurrectContext.h"

#include <syslog.h>

#include <algorithm>
#include <cstring>
#include <new>
#include <vector>

#include "bitmap/QZBitmapRepresentation.h"
#include "cfutil/TCFError.h"
#include "cfutil/TCFRetained.h"
#include "cfutil/TCFStringUniquer.h"
#include "cfutil/TStackBuffer.h"
#include "serialization/TCFFlattenContext.h"

namespace {

/// The element references of one container being read: 30 inline, on the heap beyond. The
/// table grows by doubling with the elements actually read, so its size follows them rather than
/// the count the stream claims. The inline storage is not cleared (clearing it cost more than
/// reading a small dictionary's pairs): every element is stored before it is read.
///
/// The table owns one count of each element added, and gives them back when it goes, so that
/// whatever stops a read (a missing element, an allocation that fails) loses nothing.
class ElementTable {
public:
    ElementTable() = default;
    ElementTable(const ElementTable&) = delete;
    ElementTable& operator=(const ElementTable&) = delete;
    ~ElementTable() { ReleaseAll(); }

    /// Adds `element` (non-null; its count is taken over) as element Count() of a container of
    /// `count` elements.
    void Add(void const* element, long count) {
        if (count_ >= capacity_)
            Grow(count);
        elements_[count_++] = element;
    }
    unsigned long Count() const { return count_; }
    void const** Data() { return elements_; }
    /// Gives back the count of every element, last first.
    void ReleaseAll() {
        while (count_ > 0)
            CFRelease(elements_[--count_]);
    }

private:
    void Grow(long count);

    static constexpr unsigned long kInlineCount = 30;
    void const* inline_[kInlineCount];
    std::vector<void const*> heap_;
    void const** elements_ = inline_;
    unsigned long capacity_ = kInlineCount;
    unsigned long count_ = 0;
};

/// Doubles the table, up to `count` elements. Only the elements below the old capacity, all
/// stored already, are moved.
void ElementTable::Grow(long count) {
    const unsigned long grown =
        std::min<unsigned long>(2 * capacity_, static_cast<unsigned long>(count));
    if (heap_.empty())
        heap_.assign(inline_, inline_ + capacity_);
    heap_.resize(grown);
    elements_ = heap_.data();
    capacity_ = grown;
}

/// Reads the `count` elements of an array or set into `table`. One missing element loses them
/// all: false (the table releases the elements read so far).
bool ResurrectElements(TCFResurrectContext& context, long count, ElementTable& table) {
    for (long i = 0; i < count; ++i) {
        void const* element = context.Resurrect(kTCFTypeAny);
        if (!element)
            return false;
        table.Add(element, count);
    }
    return true;
}

/// True when `length` is that of a bitmap representation: the BMP and up to 16 more planes.
bool IsPlausibleBitmapLength(uint32_t length) {
    return length >= 8192 && (length - 8192) % 8193 == 0 && (length - 8192) / 8193 <= 16;
}

/// Counts the containers open around the reader while it lives.
class NestingLevel {
public:
    explicit NestingLevel(unsigned& depth) : depth_(depth) { ++depth_; }
    ~NestingLevel() { --depth_; }
    NestingLevel(const NestingLevel&) = delete;
    NestingLevel& operator=(const NestingLevel&) = delete;

private:
    unsigned& depth_;
};

/// The shared empty string (CFSTR looks its text up under a lock on every use).
CFStringRef EmptyString() {
    static const CFStringRef empty = CFSTR("");
    return empty;
}

/// A string whose `length` bytes run past the end of the stream: StreamInData reads them as
/// that many zero bytes and reports "data"; the string is made from those bytes.
CFStringRef ResurrectTruncatedString(TCFResurrectContext& context, long length) {
    TStackBuffer<unsigned char, 30> text(static_cast<unsigned long>(length) + 1);
    context.StreamInData(text.GetBuffer(), 1, length);
    text[static_cast<unsigned long>(length)] = 0;
    CFStringRef unique =
        TCFStringUniquer().GetUniqueString(reinterpret_cast<const char*>(text.GetBuffer()), length);
    return TCFSafeRetain(unique);
}

} // namespace

void* ConvertToNative(void* value, long size) {
    return ConvertToBigEndian(value, size);
}

TCFResurrectContext::TCFResurrectContext(unsigned char const* bytes, unsigned long length)
    : cursor(bytes), end(bytes ? bytes + length : nullptr), corrupted(false) {}

TCFResurrectContext::TCFResurrectContext(unsigned long address, unsigned long length)
    : TCFResurrectContext(reinterpret_cast<unsigned char const*>(address), length) {}

TCFResurrectContext::~TCFResurrectContext() = default;

void TCFResurrectContext::ResurrectionError(char const* label) {
    if (corrupted)
        return;
    cursor = nullptr;
    end = nullptr;
    corrupted = true;
    glyphwell::SystemLog(LOG_ERR, "ERROR: Quzel got corrupted data. (%s)", label);
}

bool TCFResurrectContext::BytesAvailable(unsigned long count) const {
    return !corrupted && cursor && static_cast<unsigned long>(end - cursor) >= count;
}

unsigned int TCFResurrectContext::StreamIn32bitEntity() {
    uint32_t value;
    std::memcpy(&value, cursor, 4);
    cursor += 4;
    return __builtin_bswap32(value);
}

TCFType TCFResurrectContext::StreamInTCFTypeID() {
    if (!BytesAvailable(4)) {
        ResurrectionError("cftype");
        return kTCFTypeAny;
    }
    return static_cast<TCFType>(StreamIn32bitEntity());
}

long TCFResurrectContext::StreamInCFIndex() {
    if (!BytesAvailable(4)) {
        ResurrectionError("cfindex");
        return 0;
    }
    return static_cast<int32_t>(StreamIn32bitEntity());
}

void TCFResurrectContext::StreamInData(void* destination, unsigned long size, long count) {
    unsigned long total = 0;
    const bool sized =
        count >= 0 && !__builtin_mul_overflow(size, static_cast<unsigned long>(count), &total);
    if (!sized || !BytesAvailable(total)) {
        if (sized)
            std::memset(destination, 0, total);
        ResurrectionError("data");
        return;
    }
    std::memcpy(destination, cursor, total);
    cursor += total;
    if (size > 1) {
        auto* element = static_cast<unsigned char*>(destination);
        for (long i = 0; i < count; ++i, element += size)
            ConvertToNative(element, static_cast<long>(size));
    }
}

__CFString const* TCFResurrectContext::RetrieveCFString() {
    return static_cast<CFStringRef>(Resurrect(kTCFTypeString));
}
__CFNumber const* TCFResurrectContext::RetrieveCFNumber() {
    return static_cast<CFNumberRef>(Resurrect(kTCFTypeNumber));
}
__CFBoolean const* TCFResurrectContext::RetrieveCFBoolean() {
    return static_cast<CFBooleanRef>(Resurrect(kTCFTypeBoolean));
}
__CFData const* TCFResurrectContext::RetrieveCFData() {
    return static_cast<CFDataRef>(Resurrect(kTCFTypeData));
}
__CFCharacterSet const* TCFResurrectContext::RetrieveCFCharacterSet() {
    return static_cast<CFCharacterSetRef>(Resurrect(kTCFTypeCharacterSet));
}
__CFArray const* TCFResurrectContext::RetrieveCFArray() {
    return static_cast<CFArrayRef>(Resurrect(kTCFTypeArray));
}
__CFDictionary const* TCFResurrectContext::RetrieveCFDictionary() {
    return static_cast<CFDictionaryRef>(Resurrect(kTCFTypeDictionary));
}
__CFSet const* TCFResurrectContext::RetrieveCFSet() {
    return static_cast<CFSetRef>(Resurrect(kTCFTypeSet));
}
__CFURL const* TCFResurrectContext::RetrieveCFURL() {
    return static_cast<CFURLRef>(Resurrect(kTCFTypeURL));
}
__CFUUID const* TCFResurrectContext::RetrieveCFUUID() {
    return static_cast<CFUUIDRef>(Resurrect(kTCFTypeUUID));
}
__CFError* TCFResurrectContext::RetrieveCFError() {
    return static_cast<CFErrorRef>(const_cast<void*>(Resurrect(kTCFTypeError)));
}

void const* TCFResurrectContext::Resurrect(TCFType expected) {
    if (!cursor)
        return nullptr;
    // An allocation that fails anywhere below ends the read as corrupt input does; whatever was
    // read so far is owned by the frames being unwound and released by them.
    try {
        return ResurrectValue(expected);
    } catch (const std::bad_alloc&) {
        ResurrectionError("memory");
        return nullptr;
    }
}

void const* TCFResurrectContext::ResurrectValue(TCFType expected) {
    const TCFType type = StreamInTCFTypeID();
    if (expected != kTCFTypeAny && type != expected) {
        CFLog(kCFLogLevelError, "Quzel encounters an unexpected type. (%d, %d)",
              static_cast<int>(type), static_cast<int>(expected));
        return nullptr;
    }
    switch (type) {
    case kTCFTypeString:
        return ResurrectCFString();
    case kTCFTypeNumber:
        return ResurrectCFNumber();
    case kTCFTypeBoolean:
        return ResurrectCFBoolean();
    case kTCFTypeData:
        return ResurrectCFData();
    case kTCFTypeCharacterSet:
        return ResurrectCFCharacterSet();
    case kTCFTypeURL:
        return ResurrectCFURL();
    case kTCFTypeUUID:
        return ResurrectCFUUID();
    case kTCFTypeError:
        return ResurrectCFError();
    case kTCFTypeArray:
    case kTCFTypeDictionary:
    case kTCFTypeSet: {
        // Each container costs a few frames of stack to read and to release: bound the nesting.
        if (depth >= kMaxNestingDepth) {
            ResurrectionError("depth");
            return nullptr;
        }
        NestingLevel level(depth);
        if (type == kTCFTypeArray)
            return ResurrectCFArray();
        if (type == kTCFTypeDictionary)
            return ResurrectCFDictionary();
        return ResurrectCFSet();
    }
    default:
        CFLog(kCFLogLevelError, "*** don't how to resurrect type %d", static_cast<int>(type));
        return nullptr;
    }
}

__CFString const* TCFResurrectContext::ResurrectCFString() {
    const long length = StreamInCFIndex();
    if (length == 0)
        return EmptyString();
    if (length < 0 || length > kTCFMaxStringLength) {
        ResurrectionError("cfstr");
        return EmptyString();
    }
    if (!BytesAvailable(static_cast<unsigned long>(length)))
        return ResurrectTruncatedString(*this, length);
    // The uniquer reads the text in place: it reads no further than the length it is given,
    // and a text already seen makes no copy at all.
    const char* bytes = reinterpret_cast<const char*>(cursor);
    cursor += length;
    // A byte-order mark is not part of the text.
    long count = length;
    if (count >= 3 && std::memcmp(bytes, "\xEF\xBB\xBF", 3) == 0) {
        bytes += 3;
        count -= 3;
        if (count == 0)
            return EmptyString();
    }
    CFStringRef unique = TCFStringUniquer().GetUniqueString(bytes, count);
    return TCFSafeRetain(unique);
}

__CFNumber const* TCFResurrectContext::ResurrectCFNumber() {
    const long type = StreamInCFIndex();
    const long width = StreamInCFIndex();
    unsigned char value[8] = {};
    if (width < 1 || width > 8)
        ResurrectionError("cfnum");
    else
        StreamInData(value, static_cast<unsigned long>(width), 1);
    if (type >= kCFNumberSInt8Type && type <= kCFNumberMaxType)
        return CFNumberCreate(kCFAllocatorDefault, type, value);
    // An unknown type code: keep the value as a signed integer of the width read.
    int64_t integer = 0;
    if (width >= 1 && width <= 8) {
        uint64_t bits = 0;
        std::memcpy(&bits, value, 8);
        const unsigned shift = 64 - 8 * static_cast<unsigned>(width);
        integer = static_cast<int64_t>(bits << shift) >> shift;
    }
    return CFNumberCreate(kCFAllocatorDefault, kCFNumberLongType, &integer);
}

__CFBoolean const* TCFResurrectContext::ResurrectCFBoolean() {
    if (StreamInCFIndex() != 1) {
        ResurrectionError("cfbool");
        return kCFBooleanFalse;
    }
    unsigned char byte = 0;
    StreamInData(&byte, 1, 1);
    return byte ? kCFBooleanTrue : kCFBooleanFalse;
}

__CFData const* TCFResurrectContext::ResurrectCFData() {
    const long length = StreamInCFIndex();
    if (length < 0 || !BytesAvailable(static_cast<unsigned long>(length))) {
        ResurrectionError("cfdata");
        return nullptr;
    }
    CFDataRef data = CFDataCreate(kCFAllocatorDefault, cursor, length);
    cursor += length;
    return data;
}

__CFCharacterSet const* TCFResurrectContext::ResurrectCFCharacterSet() {
    const long length = StreamInCFIndex();
    if (length < 0 || !BytesAvailable(static_cast<unsigned long>(length))) {
        ResurrectionError("cfcharset");
        return nullptr;
    }
    unsigned char const* compressed = cursor;
    cursor += length;
    if (length < 8)
        return nullptr;
    uint32_t claimed;
    std::memcpy(&claimed, compressed + 4, 4); // little-endian inside the codec's header
    if (!IsPlausibleBitmapLength(claimed))
        return nullptr;
    TCFAdopted<CFDataRef> bitmap(QZCopyUncompressedBitmapRepresentation(compressed, length));
    if (!bitmap)
        return nullptr;
    return CFCharacterSetCreateWithBitmapRepresentation(kCFAllocatorDefault, bitmap);
}

long TCFResurrectContext::ContainerCount(const char* label) {
    const long count = StreamInCFIndex();
    if (count < 0 || count > kTCFMaxContainerCount) {
        ResurrectionError(label);
        return 0;
    }
    return count;
}

__CFArray const* TCFResurrectContext::ResurrectCFArray() {
    const long count = ContainerCount("cfarray");
    ElementTable table;
    if (!ResurrectElements(*this, count, table))
        return nullptr;
    return CFArrayCreate(kCFAllocatorDefault, table.Data(), count, &kCFTypeArrayCallBacks);
}

__CFSet const* TCFResurrectContext::ResurrectCFSet() {
    const long count = ContainerCount("cfarray");
    ElementTable table;
    if (!ResurrectElements(*this, count, table))
        return nullptr;
    return CFSetCreate(kCFAllocatorDefault, table.Data(), count, &kCFTypeSetCallBacks);
}

__CFDictionary const* TCFResurrectContext::ResurrectCFDictionary() {
    long count = ContainerCount("cfdict");
    ElementTable keys, values;
    for (long i = 0; i < count; ++i) {
        TCFAdopted<CFTypeRef> key(Resurrect(kTCFTypeAny));
        TCFAdopted<CFTypeRef> value(Resurrect(kTCFTypeAny));
        if (!key || !value) {
            CFLog(
                kCFLogLevelError,
                "*** ResurrectCFDictionary missing either a key or a value, truncating dictionary");
            break;
        }
        keys.Add(key.Orphan(), count);
        values.Add(value.Orphan(), count);
    }
    return CFDictionaryCreate(kCFAllocatorDefault, keys.Data(), values.Data(),
                              static_cast<CFIndex>(keys.Count()), &kCFTypeDictionaryKeyCallBacks,
                              &kCFTypeDictionaryValueCallBacks);
}

__CFURL const* TCFResurrectContext::ResurrectCFURL() {
    const long length = StreamInCFIndex();
    if (length == 0)
        return CFURLCreateWithBytes(kCFAllocatorDefault, nullptr, 0, kCFStringEncodingUTF8,
                                    nullptr);
    if (length < 0 || length > kTCFMaxStringLength) {
        ResurrectionError("cfurl");
        return CFURLCreateWithBytes(kCFAllocatorDefault, nullptr, 0, kCFStringEncodingUTF8,
                                    nullptr);
    }
    TStackBuffer<unsigned char, 30> bytes(static_cast<unsigned long>(length));
    StreamInData(bytes.GetBuffer(), 1, length);
    return CFURLCreateWithBytes(kCFAllocatorDefault, bytes.GetBuffer(), length,
                                kCFStringEncodingUTF8, nullptr);
}

__CFUUID const* TCFResurrectContext::ResurrectCFUUID() {
    const long count = StreamInCFIndex();
    if (count == 0)
        return nullptr;
    if (count != 16) {
        ResurrectionError("cfuuid");
        return nullptr;
    }
    CFUUIDBytes bytes;
    StreamInData(&bytes, 1, 16);
    return CFUUIDCreateFromUUIDBytes(kCFAllocatorDefault, bytes);
}

__CFError* TCFResurrectContext::ResurrectCFError() {
    const long code = StreamInCFIndex();
    StreamInTCFTypeID(); // the domain's type id, not checked
    TCFAdopted<CFStringRef> domain(ResurrectCFString());
    if (CFStringGetLength(domain) < 1)
        return nullptr;
    return TCFError(domain, code, nullptr).Orphan();
}
