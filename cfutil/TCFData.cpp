#include "cfutil/TCFData.h"

#include <cerrno>
#include <fcntl.h>
#include <limits>
#include <new>
#include <stdexcept>
#include <unistd.h>

#include "cfutil/CFURLResourceProperties.h"
#include "cfutil/TCFNumber.h"
#include "cfutil/TCFRetained.h"
#include "cfutil/TCFString.h"
#include "cfutil/TCFURL.h"
#include "cfutil/TStackBuffer.h"
#include "cfutil/TUTF8Buffer.h"

namespace {

/// Reads up to `size` bytes of `descriptor` into `buffer`, continuing after short reads until
/// the end of the file. Returns the bytes read, or -1 when a read fails.
ssize_t ReadFully(int descriptor, unsigned char* buffer, size_t size) {
    size_t done = 0;
    while (done < size) {
        ssize_t got = read(descriptor, buffer + done, size - done);
        if (got < 0) {
            if (errno == EINTR)
                continue;
            return -1;
        }
        if (got == 0)
            break;
        done += size_t(got);
    }
    return ssize_t(done);
}

/// A new data value with the contents of the file of `url`, or null (see TCFData(CFURLRef)).
CFDataRef CreateDataFromFile(CFURLRef url) {
    TCFURL file(url);
    TCFAdopted<CFTypeRef> sizeProperty(file.CopyProperty(kCFURLFileSizeKey, nullptr));
    unsigned long size = 0;
    TCFNumber::GetCFNumberValueSafely(sizeProperty, size);
    if (size == 0 || size > uint64_t(std::numeric_limits<CFIndex>::max()))
        return nullptr;

    TCFString path(file.CopyAbsoluteFilePath());
    TUTF8Buffer representation(path);
    if (representation.GetCount() == 0)
        return nullptr;
    int descriptor = open(representation.GetBuffer(), O_RDONLY | O_CLOEXEC);
    if (descriptor < 0)
        return nullptr;

    CFDataRef data = nullptr;
    try {
        TStackBuffer<unsigned char, 256> bytes(size);
        ssize_t length = ReadFully(descriptor, bytes.GetBuffer(), size);
        if (length >= 0)
            data = CFDataCreate(kCFAllocatorDefault, bytes.GetBuffer(), CFIndex(length));
    } catch (const std::bad_alloc&) {
        // A file larger than the memory we can get: no data, as for any unreadable file.
    } catch (const std::length_error&) {
    }
    close(descriptor);
    return data;
}

/// Writes all `length` bytes at `bytes`, continuing short writes. Returns 0 or the errno value.
int WriteFully(int descriptor, const UInt8* bytes, size_t length) {
    while (length > 0) {
        ssize_t written = write(descriptor, bytes, length);
        if (written < 0) {
            if (errno == EINTR)
                continue;
            return errno;
        }
        bytes += written;
        length -= size_t(written);
    }
    return 0;
}

} // namespace

int TCFBlob::WriteToURL(CFURLRef url) const {
    TCFString path(TCFURL(url).CopyAbsoluteFilePath());
    TUTF8Buffer representation(path);
    if (representation.GetCount() == 0)
        return EINVAL;
    int descriptor =
        open(representation.GetBuffer(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0644);
    if (descriptor < 0)
        return errno;
    int error = WriteFully(descriptor, GetPtr(), size_t(GetLength()));
    // close() reports write-back failures of some file systems: they lose data too.
    if (close(descriptor) != 0 && error == 0 && errno != EINTR)
        error = errno;
    return error;
}

TCFData::TCFData(CFURLRef url) : TCFReferenceHolder(CreateDataFromFile(url), kAdopted) {}
