#include "cfutil/CFURLResourceProperties.h"

#include <cerrno>
#include <fcntl.h>
#include <sys/stat.h>
#include <vector>

#include "cfutil/CFTypeIdentifiers.h"
#include "cfutil/TCFRetained.h"
#include "platform/CFDate.h"
#include "platform/CFNumber.h"

const CFStringRef kCFURLNameKey = CFSTR("kCFURLNameKey");
const CFStringRef kCFURLParentDirectoryURLKey = CFSTR("kCFURLParentDirectoryURLKey");
const CFStringRef kCFURLIsRegularFileKey = CFSTR("kCFURLIsRegularFileKey");
const CFStringRef kCFURLIsDirectoryKey = CFSTR("kCFURLIsDirectoryKey");
const CFStringRef kCFURLIsSymbolicLinkKey = CFSTR("kCFURLIsSymbolicLinkKey");
const CFStringRef kCFURLCreationDateKey = CFSTR("kCFURLCreationDateKey");
const CFStringRef kCFURLContentModificationDateKey = CFSTR("kCFURLContentModificationDateKey");
const CFStringRef kCFURLFileSizeKey = CFSTR("kCFURLFileSizeKey");
const CFStringRef _kCFURLFileSizeOfResourceForkKey = CFSTR("_kCFURLFileSizeOfResourceForkKey");
const CFStringRef kCFURLTypeIdentifierKey = CFSTR("kCFURLTypeIdentifierKey");

namespace {

/// Seconds from 1970-01-01 to 2001-01-01, the origin of absolute times.
constexpr double kUnixEpochToAbsoluteTime = 978307200.0;

/// What the file system says of one item, without following a final symbolic link.
struct ItemStatus {
    mode_t mode = 0;
    int64_t size = 0;
    bool hasBirthTime = false;
    struct timespec birthTime {};
    struct timespec modificationTime {};
};

/// Examines `path` with statx (birth time included when the file system records it), or lstat
/// where statx is not available. Returns 0 or the errno value.
int StatItem(const std::string& path, ItemStatus& status) {
    struct statx extended {};
    if (statx(AT_FDCWD, path.c_str(), AT_SYMLINK_NOFOLLOW, STATX_BASIC_STATS | STATX_BTIME,
              &extended) == 0) {
        status.mode = extended.stx_mode;
        status.size = int64_t(extended.stx_size);
        status.hasBirthTime = (extended.stx_mask & STATX_BTIME) != 0;
        status.birthTime = {extended.stx_btime.tv_sec, long(extended.stx_btime.tv_nsec)};
        status.modificationTime = {extended.stx_mtime.tv_sec, long(extended.stx_mtime.tv_nsec)};
        return 0;
    }
    if (errno != ENOSYS)
        return errno;
    struct stat plain {};
    if (lstat(path.c_str(), &plain) != 0)
        return errno;
    status.mode = plain.st_mode;
    status.size = int64_t(plain.st_size);
    status.modificationTime = plain.st_mtim;
    return 0;
}

CFDateRef CreateDate(const struct timespec& time) {
    return CFDateCreate(kCFAllocatorDefault, double(time.tv_sec) + double(time.tv_nsec) * 1e-9 -
                                                 kUnixEpochToAbsoluteTime);
}

CFBooleanRef BooleanValue(bool value) {
    return value ? kCFBooleanTrue : kCFBooleanFalse;
}

std::string_view LastComponent(std::string_view path) {
    if (path == "/")
        return path;
    size_t slash = path.rfind('/');
    return slash == std::string_view::npos ? path : path.substr(slash + 1);
}

CFStringRef CreateTypeIdentifier(const std::string& path, mode_t mode) {
    const char* type = nullptr;
    switch (mode & S_IFMT) {
    case S_IFDIR:
        type = "inode/directory";
        break;
    case S_IFLNK:
        type = "inode/symlink";
        break;
    case S_IFIFO:
        type = "inode/fifo";
        break;
    case S_IFSOCK:
        type = "inode/socket";
        break;
    case S_IFCHR:
        type = "inode/chardevice";
        break;
    case S_IFBLK:
        type = "inode/blockdevice";
        break;
    default:
        if (CFStringRef matched = CFCopyTypeIdentifierForFileName(LastComponent(path)))
            return matched;
        type = "application/octet-stream";
        break;
    }
    return CFStringCreateWithCString(kCFAllocatorDefault, type, kCFStringEncodingUTF8);
}

/// A new reference to the value of `key` for the item at `path`, or null when it has none.
CFTypeRef CopyValue(CFStringRef key, const std::string& path, const ItemStatus& status) {
    auto is = [key](CFStringRef name) { return CFEqual(key, name); };
    if (is(kCFURLNameKey))
        return CFStringCreateWithFileSystemRepresentation(kCFAllocatorDefault,
                                                          std::string(LastComponent(path)).c_str());
    if (is(kCFURLParentDirectoryURLKey)) {
        size_t slash = path.rfind('/');
        if (path == "/" || slash == std::string::npos)
            return nullptr;
        std::string parent = slash == 0 ? "/" : path.substr(0, slash);
        return CFURLCreateFromFileSystemRepresentation(
            kCFAllocatorDefault, reinterpret_cast<const UInt8*>(parent.data()),
            CFIndex(parent.size()), true);
    }
    if (is(kCFURLIsRegularFileKey))
        return BooleanValue(S_ISREG(status.mode));
    if (is(kCFURLIsDirectoryKey))
        return BooleanValue(S_ISDIR(status.mode));
    if (is(kCFURLIsSymbolicLinkKey))
        return BooleanValue(S_ISLNK(status.mode));
    if (is(kCFURLCreationDateKey))
        return status.hasBirthTime ? CreateDate(status.birthTime) : nullptr;
    if (is(kCFURLContentModificationDateKey))
        return CreateDate(status.modificationTime);
    if (is(kCFURLFileSizeKey)) {
        if (!S_ISREG(status.mode))
            return nullptr;
        SInt64 size = status.size;
        return CFNumberCreate(kCFAllocatorDefault, kCFNumberSInt64Type, &size);
    }
    if (is(kCFURLTypeIdentifierKey))
        return CreateTypeIdentifier(path, status.mode);
    return nullptr; // the resource fork size, and keys this platform does not know
}

void SetError(CFErrorRef* error, int code) {
    if (error)
        *error = CFErrorCreate(kCFAllocatorDefault, kCFErrorDomainPOSIX, code, nullptr);
}

/// Finds the path of `url` and examines the item; fills `error` on failure.
bool Examine(CFURLRef url, std::string& path, ItemStatus& status, CFErrorRef* error) {
    if (!CFURLGetAbsoluteFileSystemPath(url, path)) {
        SetError(error, EINVAL);
        return false;
    }
    if (int code = StatItem(path, status)) {
        SetError(error, code);
        return false;
    }
    return true;
}

bool IsString(CFTypeRef value) {
    return value && CFGetTypeID(value) == CFStringGetTypeID();
}

} // namespace

bool CFURLGetAbsoluteFileSystemPath(CFURLRef url, std::string& path) {
    path.clear();
    if (!url)
        return false;
    TCFAdopted<CFURLRef> absolute(CFURLCopyAbsoluteURL(url));
    CFIndex length = absolute ? CFURLGetBytes(absolute, nullptr, 0) : -1;
    if (length < 0)
        return false;
    // Decoding escapes only shortens the text, so the path fits in the URL's length.
    std::vector<UInt8> buffer(size_t(length) + 1);
    if (!CFURLGetFileSystemRepresentation(absolute, true, buffer.data(), CFIndex(buffer.size())))
        return false;
    path.assign(reinterpret_cast<const char*>(buffer.data()));
    return !path.empty();
}

Boolean CFURLCopyResourcePropertyForKey(CFURLRef url, CFStringRef key, CFTypeRef* value,
                                        CFErrorRef* error) {
    *value = nullptr;
    if (!IsString(key)) {
        SetError(error, EINVAL);
        return false;
    }
    std::string path;
    ItemStatus status;
    if (!Examine(url, path, status, error))
        return false;
    *value = CopyValue(key, path, status);
    return true;
}

CFDictionaryRef CFURLCopyResourcePropertiesForKeys(CFURLRef url, CFArrayRef keys,
                                                   CFErrorRef* error) {
    std::string path;
    ItemStatus status;
    if (!Examine(url, path, status, error))
        return nullptr;
    CFMutableDictionaryRef properties = CFDictionaryCreateMutable(
        kCFAllocatorDefault, 0, &kCFTypeDictionaryKeyCallBacks, &kCFTypeDictionaryValueCallBacks);
    CFIndex count = keys ? CFArrayGetCount(keys) : 0;
    for (CFIndex i = 0; i < count; ++i) {
        auto key = static_cast<CFStringRef>(CFArrayGetValueAtIndex(keys, i));
        if (!IsString(key))
            continue;
        TCFAdopted<CFTypeRef> value(CopyValue(key, path, status));
        if (value)
            CFDictionarySetValue(properties, key, value);
    }
    return properties;
}
