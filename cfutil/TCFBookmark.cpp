#include "cfutil/TCFBookmark.h"

#include <bit>
#include <cerrno>
#include <cmath>
#include <cstring>
#include <iterator>
#include <pthread.h>
#include <string>
#include <string_view>
#include <sys/stat.h>
#include <vector>

#include "cfutil/CFStringUtilities.h"
#include "cfutil/CFURLResourceProperties.h"
#include "cfutil/TCFRetained.h"
#include "platform/CFDate.h"
#include "platform/CFNumber.h"

namespace {

constexpr char kMagic[4] = {'G', 'W', 'B', 'M'};
constexpr uint16_t kVersion = 1;

enum Kind : uint8_t {
    kKindString = 1,
    kKindNumber = 2,
    kKindBoolean = 3,
    kKindDate = 4,
    kKindURL = 5,
};

pthread_once_t gDefaultPropertiesOnce = PTHREAD_ONCE_INIT;
CFArrayRef gDefaultProperties = nullptr;

// ---------------------------------------------------------------------------------------------
// Writing.

class RecordWriter {
public:
    void PutU8(uint8_t value) { bytes_.push_back(value); }
    void PutU16(uint16_t value) { PutBigEndian(value, 2); }
    void PutU32(uint32_t value) { PutBigEndian(value, 4); }
    void PutU64(uint64_t value) { PutBigEndian(value, 8); }
    void PutRaw(const void* data, size_t length) {
        auto* first = static_cast<const uint8_t*>(data);
        bytes_.insert(bytes_.end(), first, first + length);
    }
    /// A u32 length and the bytes; false when they are too long for the length field.
    bool PutBytes(std::string_view text) {
        if (text.size() > UINT32_MAX)
            return false;
        PutU32(uint32_t(text.size()));
        PutRaw(text.data(), text.size());
        return true;
    }
    /// The UTF-8 bytes of `string` with their length; false when it has none.
    bool PutString(CFStringRef string) {
        std::string utf8;
        return CFString::GetUTF8(string, utf8) && PutBytes(utf8);
    }
    /// Overwrites the u32 written at `offset`.
    void PatchU32(size_t offset, uint32_t value) {
        for (int i = 0; i < 4; ++i)
            bytes_[offset + size_t(i)] = uint8_t(value >> (24 - 8 * i));
    }
    size_t Size() const { return bytes_.size(); }
    void Truncate(size_t size) { bytes_.resize(size); }
    CFDataRef CreateData() const {
        return CFDataCreate(kCFAllocatorDefault, bytes_.data(), CFIndex(bytes_.size()));
    }

private:
    void PutBigEndian(uint64_t value, int width) {
        for (int shift = (width - 1) * 8; shift >= 0; shift -= 8)
            bytes_.push_back(uint8_t(value >> shift));
    }

    std::vector<uint8_t> bytes_;
};

/// Writes the value of one property; false (nothing usable written) for a kind that the
/// record cannot hold.
bool PutValue(RecordWriter& writer, CFTypeRef value) {
    CFTypeID type = CFGetTypeID(value);
    if (type == CFStringGetTypeID()) {
        writer.PutU8(kKindString);
        return writer.PutString(static_cast<CFStringRef>(value));
    }
    if (type == CFNumberGetTypeID()) {
        auto number = static_cast<CFNumberRef>(value);
        SInt64 integer = 0;
        if (CFNumberIsFloatType(number) || !CFNumberGetValue(number, kCFNumberSInt64Type, &integer))
            return false;
        writer.PutU8(kKindNumber);
        writer.PutU64(uint64_t(integer));
        return true;
    }
    if (type == CFBooleanGetTypeID()) {
        writer.PutU8(kKindBoolean);
        writer.PutU8(CFBooleanGetValue(static_cast<CFBooleanRef>(value)) ? 1 : 0);
        return true;
    }
    if (type == CFDateGetTypeID()) {
        double time = CFDateGetAbsoluteTime(static_cast<CFDateRef>(value));
        if (!std::isfinite(time))
            return false;
        writer.PutU8(kKindDate);
        writer.PutU64(std::bit_cast<uint64_t>(time));
        return true;
    }
    if (type == CFURLGetTypeID()) {
        TCFAdopted<CFURLRef> absolute(CFURLCopyAbsoluteURL(static_cast<CFURLRef>(value)));
        writer.PutU8(kKindURL);
        return absolute && writer.PutString(CFURLGetString(absolute));
    }
    return false;
}

// ---------------------------------------------------------------------------------------------
// Reading: every read checks the bytes left first, and a failed read leaves the reader failed.

class RecordReader {
public:
    RecordReader(const uint8_t* bytes, size_t length) : next_(bytes), left_(length) {}

    bool GetU8(uint8_t& value) {
        uint64_t wide = 0;
        bool ok = GetBigEndian(wide, 1);
        value = uint8_t(wide);
        return ok;
    }
    bool GetU16(uint16_t& value) {
        uint64_t wide = 0;
        bool ok = GetBigEndian(wide, 2);
        value = uint16_t(wide);
        return ok;
    }
    bool GetU32(uint32_t& value) {
        uint64_t wide = 0;
        bool ok = GetBigEndian(wide, 4);
        value = uint32_t(wide);
        return ok;
    }
    bool GetU64(uint64_t& value) { return GetBigEndian(value, 8); }
    /// `length` bytes, not copied; valid while the record's data lives.
    bool GetRaw(size_t length, std::string_view& bytes) {
        if (length > left_)
            return false;
        bytes = std::string_view(reinterpret_cast<const char*>(next_), length);
        next_ += length;
        left_ -= length;
        return true;
    }
    /// A u32 length and that many bytes.
    bool GetBytes(std::string_view& bytes) {
        uint32_t length = 0;
        return GetU32(length) && GetRaw(length, bytes);
    }
    /// A new string of the UTF-8 bytes that follow their length; null when they are missing
    /// or not UTF-8.
    CFStringRef CreateString() {
        std::string_view bytes;
        if (!GetBytes(bytes))
            return nullptr;
        return CFStringCreateWithBytes(kCFAllocatorDefault,
                                       reinterpret_cast<const UInt8*>(bytes.data()),
                                       CFIndex(bytes.size()), kCFStringEncodingUTF8, false);
    }
    size_t Left() const { return left_; }

private:
    bool GetBigEndian(uint64_t& value, size_t width) {
        if (width > left_)
            return false;
        value = 0;
        for (size_t i = 0; i < width; ++i)
            value = (value << 8) | next_[i];
        next_ += width;
        left_ -= width;
        return true;
    }

    const uint8_t* next_;
    size_t left_;
};

/// A new value of the kind that comes next; null when it is malformed.
CFTypeRef CreateValue(RecordReader& reader) {
    uint8_t kind = 0;
    if (!reader.GetU8(kind))
        return nullptr;
    switch (kind) {
    case kKindString:
        return reader.CreateString();
    case kKindNumber: {
        uint64_t bits = 0;
        if (!reader.GetU64(bits))
            return nullptr;
        SInt64 integer = SInt64(bits);
        return CFNumberCreate(kCFAllocatorDefault, kCFNumberSInt64Type, &integer);
    }
    case kKindBoolean: {
        uint8_t flag = 0;
        if (!reader.GetU8(flag) || flag > 1)
            return nullptr;
        return CFRetain(flag ? kCFBooleanTrue : kCFBooleanFalse);
    }
    case kKindDate: {
        uint64_t bits = 0;
        if (!reader.GetU64(bits) || !std::isfinite(std::bit_cast<double>(bits)))
            return nullptr;
        return CFDateCreate(kCFAllocatorDefault, std::bit_cast<double>(bits));
    }
    case kKindURL: {
        TCFAdopted<CFStringRef> string(reader.CreateString());
        return string ? CFURLCreateWithString(kCFAllocatorDefault, string, nullptr) : nullptr;
    }
    default:
        return nullptr;
    }
}

/// One bookmark record, read back.
struct Bookmark {
    std::string path;
    uint64_t device = 0;
    uint64_t inode = 0;
    TCFRetained<CFMutableDictionaryRef> properties;
};

/// Reads the record in `data`; false for anything that breaks the format.
bool ReadBookmark(CFDataRef data, Bookmark& bookmark) {
    if (!data || CFGetTypeID(data) != CFDataGetTypeID())
        return false;
    RecordReader reader(CFDataGetBytePtr(data), size_t(CFDataGetLength(data)));
    std::string_view magic, path;
    uint16_t version = 0;
    uint32_t count = 0;
    if (!reader.GetRaw(sizeof kMagic, magic) || magic != std::string_view(kMagic, sizeof kMagic) ||
        !reader.GetU16(version) || version != kVersion || !reader.GetBytes(path) || path.empty() ||
        path[0] != '/' || path.find('\0') != std::string_view::npos ||
        !reader.GetU64(bookmark.device) || !reader.GetU64(bookmark.inode) || !reader.GetU32(count))
        return false;
    bookmark.path = path;

    bookmark.properties.Adopt(CFDictionaryCreateMutable(
        kCFAllocatorDefault, 0, &kCFTypeDictionaryKeyCallBacks, &kCFTypeDictionaryValueCallBacks));
    if (!bookmark.properties)
        return false;
    for (uint32_t i = 0; i < count; ++i) {
        TCFAdopted<CFStringRef> key(reader.CreateString());
        if (!key || CFStringGetLength(key) == 0 ||
            CFDictionaryContainsKey(bookmark.properties, key))
            return false;
        TCFAdopted<CFTypeRef> value(CreateValue(reader));
        if (!value)
            return false;
        CFDictionarySetValue(bookmark.properties, key, value);
    }
    return reader.Left() == 0;
}

void SetError(CFErrorRef* error, int code) {
    if (error)
        *error = CFErrorCreate(kCFAllocatorDefault, kCFErrorDomainPOSIX, code, nullptr);
}

} // namespace

CFArrayRef TCFBookmark::GetDefaultProperties() {
    pthread_once(&gDefaultPropertiesOnce, CreateDefaultProperties);
    return gDefaultProperties;
}

void TCFBookmark::CreateDefaultProperties() {
    const void* keys[] = {kCFURLNameKey,
                          kCFURLParentDirectoryURLKey,
                          kCFURLIsRegularFileKey,
                          kCFURLIsDirectoryKey,
                          kCFURLIsSymbolicLinkKey,
                          kCFURLCreationDateKey,
                          kCFURLContentModificationDateKey,
                          kCFURLFileSizeKey,
                          _kCFURLFileSizeOfResourceForkKey};
    gDefaultProperties =
        CFArrayCreate(kCFAllocatorDefault, keys, CFIndex(std::size(keys)), &kCFTypeArrayCallBacks);
}

CFDataRef TCFBookmark::InitBookmarkData(CFURLRef url, CFArrayRef properties,
                                        CFURLBookmarkCreationOptions options) {
    // Resolution is by path here, so the options (the file-identity preference always
    // included) change nothing in the record.
    (void)(options | kCFURLBookmarkCreationPreferFileIDResolutionMask);
    std::string path;
    struct stat status;
    if (!CFURLGetAbsoluteFileSystemPath(url, path) || path[0] != '/' ||
        lstat(path.c_str(), &status) != 0)
        return nullptr;
    TCFAdopted<CFDictionaryRef> values(
        properties ? CFURLCopyResourcePropertiesForKeys(url, properties, nullptr) : nullptr);

    RecordWriter writer;
    writer.PutRaw(kMagic, sizeof kMagic);
    writer.PutU16(kVersion);
    if (!writer.PutBytes(path))
        return nullptr;
    writer.PutU64(uint64_t(status.st_dev));
    writer.PutU64(uint64_t(status.st_ino));

    CFIndex count = values ? CFDictionaryGetCount(values) : 0;
    std::vector<const void*> keys(static_cast<size_t>(count)), objects(keys.size());
    if (count > 0)
        CFDictionaryGetKeysAndValues(values, keys.data(), objects.data());
    size_t countOffset = writer.Size();
    writer.PutU32(0); // patched below once the written entries are known
    uint32_t written = 0;
    for (CFIndex i = 0; i < count; ++i) {
        size_t entryStart = writer.Size();
        if (writer.PutString(static_cast<CFStringRef>(keys[size_t(i)])) &&
            PutValue(writer, objects[size_t(i)]))
            ++written;
        else
            writer.Truncate(entryStart); // a kind the record cannot hold: left out
    }
    writer.PatchU32(countOffset, written);
    return writer.CreateData();
}

CFURLRef TCFBookmark::CreateURLByResolvingBookmarkData(CFDataRef bookmark, Boolean* isStale,
                                                       CFArrayRef, CFURLRef,
                                                       CFURLBookmarkResolutionOptions,
                                                       CFErrorRef* error) {
    if (isStale)
        *isStale = false;
    Bookmark record;
    if (!ReadBookmark(bookmark, record)) {
        SetError(error, EINVAL);
        return nullptr;
    }
    struct stat status;
    if (lstat(record.path.c_str(), &status) != 0) {
        SetError(error, errno);
        return nullptr;
    }
    if (isStale)
        *isStale =
            uint64_t(status.st_dev) != record.device || uint64_t(status.st_ino) != record.inode;
    return CFURLCreateFromFileSystemRepresentation(
        kCFAllocatorDefault, reinterpret_cast<const UInt8*>(record.path.data()),
        CFIndex(record.path.size()), S_ISDIR(status.st_mode));
}

CFDictionaryRef TCFBookmark::CopyPropertiesFromBookmarkData(CFDataRef bookmark, CFArrayRef keys) {
    Bookmark record;
    if (!ReadBookmark(bookmark, record))
        return nullptr;
    if (!keys)
        return record.properties.Orphan();
    CFMutableDictionaryRef selected = CFDictionaryCreateMutable(
        kCFAllocatorDefault, 0, &kCFTypeDictionaryKeyCallBacks, &kCFTypeDictionaryValueCallBacks);
    for (CFIndex i = 0, count = CFArrayGetCount(keys); i < count; ++i) {
        const void* key = CFArrayGetValueAtIndex(keys, i);
        if (const void* value = key ? CFDictionaryGetValue(record.properties, key) : nullptr)
            CFDictionarySetValue(selected, key, value);
    }
    return selected;
}

CFTypeRef TCFBookmark::CopyPropertyFromBookmarkData(CFDataRef bookmark, CFStringRef key) {
    Bookmark record;
    if (!key || !ReadBookmark(bookmark, record))
        return nullptr;
    return TCFSafeRetain(CFDictionaryGetValue(record.properties, key));
}
