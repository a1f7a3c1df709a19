// The process-wide string uniquer: an open-addressing hash table of never-removed entries.
//
// Readers probe the table without a lock; writers insert and grow it under one mutex. This is
// sound because nothing is ever removed or changed once published: an entry is fully written
// before its pointer is stored (release) into a slot, and a reader loads slots with acquire. When
// the table grows, the old slot array stays allocated (chained from the new one), so a reader
// still probing it reads valid memory; it may miss a recent entry, and a miss always falls back
// to the locked path, which decides. So two threads asking for the same new text get one string.
//
// A string becomes a shared constant (immortal: retain and release no longer count) as it enters
// the table, under the lock and before the store that publishes it, so no other thread can see
// it before the flag is set; the flag never changes afterwards. The reader retains and releases
// every string it hands out, and on a shared string those are plain loads instead of atomic
// read-modify-writes. A string made by a thread that lost the race to enter the same text is
// still counted and is released normally.
//
// Every allocation stays reachable from the instance (held by a static pointer) for the life of
// the process, so leak checkers do not report the table at exit.
#include "cfutil/TCFStringUniquer.h"

#include <atomic>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <mutex>
#include <string>

#include "cfutil/TStackBuffer.h"
#include "platform/CFKind.h"
#include "platform/Log.h"

namespace {

/// The utf8Hash of the text at `text` up to its first zero byte or its first `limit` bytes,
/// whichever is shorter; stores that text's length in `*length`. One pass finds both.
uint32_t HashKey(const unsigned char* text, size_t limit, size_t* length) {
    const unsigned char* const start = text;
    uint32_t hash = 0x9E3779B9u;
    for (; limit >= 2 && text[0] && text[1]; text += 2, limit -= 2) {
        hash += text[0];
        const uint32_t mixed = (uint32_t(text[1]) << 11) ^ hash;
        hash = (hash << 16) ^ mixed;
        hash += hash >> 11;
    }
    if (limit >= 1 && text[0]) {
        hash += *text++;
        hash ^= hash << 11;
        hash += hash >> 17;
    }
    *length = size_t(text - start);
    hash ^= hash << 3;
    hash += hash >> 5;
    hash ^= hash << 2;
    hash += hash >> 15;
    hash ^= hash << 10;
    return hash != 0 ? hash : 0x80000000u;
}

/// 64-bit product of `a` and `b`, folded: the high half XOR the low half.
inline uint64_t MultiplyFold(uint64_t a, uint64_t b) {
    const unsigned __int128 product = static_cast<unsigned __int128>(a) * b;
    return uint64_t(product) ^ uint64_t(product >> 64);
}

inline uint64_t Load64(const unsigned char* p) {
    uint64_t value;
    std::memcpy(&value, p, 8);
    return value;
}

inline uint64_t Load32(const unsigned char* p) {
    uint32_t value;
    std::memcpy(&value, p, 4);
    return value;
}

/// The table's own hash of the `length` bytes at `text`: eight bytes per multiplication, so a
/// hit costs a few instructions per word instead of the utf8Hash mix's two bytes per round.
/// Never 0, so that no key is confused with an empty slot's hash. Reads only the `length` bytes.
uint32_t TableHash(const unsigned char* text, size_t length) {
    constexpr uint64_t k0 = 0xa0761d6478bd642full, k1 = 0xe7037ed1a0b428dbull,
                       k2 = 0x8ebc6af09c88c6e3ull;
    uint64_t hash = k0 ^ length;
    for (; length > 8; text += 8, length -= 8)
        hash = MultiplyFold(Load64(text) ^ k1, hash ^ k2);
    // The last 1 to 8 bytes, read without passing the end (the reads may overlap).
    uint64_t last = 0;
    if (length >= 4)
        last = Load32(text) << 32 | Load32(text + length - 4);
    else if (length > 0)
        last = uint64_t(text[0]) << 16 | uint64_t(text[length / 2]) << 8 | text[length - 1];
    hash = MultiplyFold(last ^ k1, hash ^ k2);
    const uint32_t folded = uint32_t(hash ^ (hash >> 32));
    return folded != 0 ? folded : 0x80000000u;
}

/// Whether the `length` bytes at `a` and `b` are equal. Up to 16 bytes are compared with two
/// loads from each side (overlapping when shorter), without a call to memcmp. Reads only the
/// `length` bytes of each.
inline bool SameBytes(const unsigned char* a, const unsigned char* b, size_t length) {
    if (length > 16)
        return std::memcmp(a, b, length) == 0;
    if (length >= 8)
        return ((Load64(a) ^ Load64(b)) | (Load64(a + length - 8) ^ Load64(b + length - 8))) == 0;
    if (length >= 4)
        return ((Load32(a) ^ Load32(b)) | (Load32(a + length - 4) ^ Load32(b + length - 4))) == 0;
    for (size_t i = 0; i < length; ++i)
        if (a[i] != b[i])
            return false;
    return true;
}

/// One table entry, allocated in one block with its private, zero-terminated key copy right
/// after it. Written once before it is published, never changed or freed afterwards.
struct Entry {
    CFStringRef string; ///< a shared constant once entered: never destroyed
    uint32_t hash;      ///< TableHash of the key
    size_t length;      ///< key bytes, without the terminating zero

    const char* Key() const { return reinterpret_cast<const char*>(this + 1); }
    char* Key() { return reinterpret_cast<char*>(this + 1); }
};

/// A slot array of a power-of-two size, at most half full so that every probe ends at an empty
/// slot. Replaced (never freed) when it would become fuller.
struct Table {
    explicit Table(unsigned sizeLog2, const Table* older)
        : shift(64 - sizeLog2), mask((size_t(1) << sizeLog2) - 1),
          slots(new std::atomic<Entry*>[mask + 1]()), previous(older) {}

    /// The first slot to probe for `hash`: the top bits of a multiplicative mix, so that every
    /// bit of the hash counts.
    size_t Home(uint32_t hash) const { return size_t((hash * 0x9E3779B97F4A7C15ull) >> shift); }

    const unsigned shift;
    const size_t mask;
    const std::unique_ptr<std::atomic<Entry*>[]> slots;
    const Table* const previous; ///< the array this one replaced; kept for lock-free readers
};

constexpr unsigned kInitialSizeLog2 = 10;

} // namespace

/// The process-wide table. Created once by TCFStringUniquer::CreateStringUniquer, never destroyed.
class TCFStringUniquerImp {
public:
    TCFStringUniquerImp() : table_(new Table(kInitialSizeLog2, nullptr)) {}
    TCFStringUniquerImp(const TCFStringUniquerImp&) = delete;
    TCFStringUniquerImp& operator=(const TCFStringUniquerImp&) = delete;

    CFStringRef GetUniqueString(CFStringRef string);
    CFStringRef GetUniqueString(const char* bytes, CFIndex length);

private:
    static CFStringRef Find(const Table& table, const char* key, size_t length, uint32_t hash);
    CFStringRef Enter(const char* bytes, CFIndex length, size_t keyLength, uint32_t hash);
    CFStringRef Insert(Entry* entry);

    std::atomic<const Table*> table_; ///< the current slot array; replaced under mutex_
    // The writers' state gets a cache line of its own, so that inserting does not slow down
    // lock-free readers on other cores.
    alignas(64) std::mutex mutex_; ///< serialises insertion and growth
    size_t count_ = 0;             ///< entries in the table; guarded by mutex_
};

/// The string of the entry whose key is the `length` bytes at `key`, or null when `table` has
/// none. Safe without the lock. Inlined into the hit path, which then makes no call but the
/// key comparison.
inline __attribute__((always_inline)) CFStringRef
TCFStringUniquerImp::Find(const Table& table, const char* key, size_t length, uint32_t hash) {
    for (size_t index = table.Home(hash);; index = (index + 1) & table.mask) {
        const Entry* entry = table.slots[index].load(std::memory_order_acquire);
        if (!entry)
            return nullptr;
        if (entry->hash == hash && entry->length == length &&
            SameBytes(reinterpret_cast<const unsigned char*>(entry->Key()),
                      reinterpret_cast<const unsigned char*>(key), length))
            return entry->string;
    }
}

/// Enters `entry` unless its key is already present, making its string a shared constant.
/// Returns the string now in the table for that key; when it is not `entry`'s, `entry` was not
/// entered and stays the caller's, its string still counted.
CFStringRef TCFStringUniquerImp::Insert(Entry* entry) {
    std::lock_guard<std::mutex> lock(mutex_);
    const Table* table = table_.load(std::memory_order_relaxed);
    if (CFStringRef existing = Find(*table, entry->Key(), entry->length, entry->hash))
        return existing;

    if (2 * (count_ + 1) > table->mask + 1) {
        // Grow to twice the size; readers keep probing the old array until they see the new one.
        auto* grown = new Table(64 - table->shift + 1, table);
        for (size_t index = 0; index <= table->mask; ++index) {
            Entry* moved = table->slots[index].load(std::memory_order_relaxed);
            if (!moved)
                continue;
            size_t slot = grown->Home(moved->hash);
            while (grown->slots[slot].load(std::memory_order_relaxed))
                slot = (slot + 1) & grown->mask;
            grown->slots[slot].store(moved, std::memory_order_relaxed);
        }
        table_.store(grown, std::memory_order_release);
        table = grown;
    }

    // Only this thread knows the string yet: the flag is set before the release store below.
    CFMakeShared(entry->string);
    size_t slot = table->Home(entry->hash);
    while (table->slots[slot].load(std::memory_order_relaxed))
        slot = (slot + 1) & table->mask;
    table->slots[slot].store(entry, std::memory_order_release);
    ++count_;
    return entry->string;
}

/// Null bytes or a length of 0 or less yield null. Otherwise the key is the text up to its first
/// zero byte, or all `length` bytes when they hold none (callers normally put a zero byte at
/// index `length`, but nothing beyond `length` is read).
CFStringRef TCFStringUniquerImp::GetUniqueString(const char* bytes, CFIndex length) {
    if (!bytes || length <= 0)
        return nullptr;
    const void* zero = std::memchr(bytes, 0, size_t(length));
    const size_t keyLength = zero ? size_t(static_cast<const char*>(zero) - bytes) : size_t(length);
    const uint32_t hash = TableHash(reinterpret_cast<const unsigned char*>(bytes), keyLength);
    if (CFStringRef found = Find(*table_.load(std::memory_order_acquire), bytes, keyLength, hash))
        return found;
    return Enter(bytes, length, keyLength, hash);
}

/// A miss: makes the entry for the text (whose key is its first `keyLength` bytes, hashed to
/// `hash`) outside the lock, so that the lock is held only to insert it. Kept out of the hit
/// path, whose every call would otherwise save and restore the registers this needs.
__attribute__((noinline)) CFStringRef TCFStringUniquerImp::Enter(const char* bytes, CFIndex length,
                                                                 size_t keyLength, uint32_t hash) {
    // Freed on every way out until the table takes it, an allocation failing (throwing) included.
    std::unique_ptr<Entry, decltype(&std::free)> entry(
        static_cast<Entry*>(std::malloc(sizeof(Entry) + keyLength + 1)), &std::free);
    if (!entry)
        return nullptr;
    std::memcpy(entry->Key(), bytes, keyLength);
    entry->Key()[keyLength] = '\0';
    entry->hash = hash;
    entry->length = keyLength;
    entry->string = CFStringCreateWithBytes(nullptr, reinterpret_cast<const UInt8*>(bytes), length,
                                            kCFStringEncodingUTF8, false);
    if (!entry->string) {
        CFLog(kCFLogLevelError, "string %s (length %d : %lu) could not be converted to CFString!",
              entry->Key(), int(length), static_cast<unsigned long>(keyLength));
        return nullptr;
    }

    CFStringRef unique = nullptr;
    try {
        unique = Insert(entry.get());
    } catch (...) { // the table could not grow: it is unchanged
        CFRelease(entry->string);
        throw;
    }
    if (unique != entry->string) {
        // Another thread entered the same key first; its string is the one handed out.
        CFRelease(entry->string);
        return unique;
    }
    entry.release(); // now the table's, for the life of the process
    return unique;
}

/// Uniques the UTF-8 text of `string` up to its first zero byte: the bytes it keeps when it was
/// made from 8-bit text, else its conversion in a buffer that is inline up to 128 bytes. The
/// input itself comes back when it has no UTF-8 form (a lone surrogate) or its text is empty, so
/// a non-null input never yields null.
CFStringRef TCFStringUniquerImp::GetUniqueString(CFStringRef string) {
    if (!string)
        return nullptr;
    if (const std::string_view bytes = glyphwell::UTF8Bytes(string); bytes.data()) {
        const size_t length = std::min(bytes.find('\0'), bytes.size());
        return length > 0 ? GetUniqueString(bytes.data(), CFIndex(length)) : string;
    }
    const CFIndex size =
        CFStringGetMaximumSizeForEncoding(CFStringGetLength(string), kCFStringEncodingUTF8) + 1;
    TStackBuffer<char, 128> buffer{uint64_t(size)};
    char* text = buffer.GetBuffer();
    if (!CFStringGetCString(string, text, size, kCFStringEncodingUTF8))
        return string;
    const CFIndex length = CFIndex(std::strlen(text));
    return length > 0 ? GetUniqueString(text, length) : string;
}

CFStringRef TCFStringUniquer::GetUniqueString(CFStringRef string) const {
    return imp_->GetUniqueString(string);
}

CFStringRef TCFStringUniquer::GetUniqueString(const char* bytes, CFIndex length) const {
    return imp_->GetUniqueString(bytes, length);
}

TCFStringUniquerImp* TCFStringUniquer::GetStringUniquer() {
    // A function-local static is initialised once, and concurrent first callers wait for it.
    // The pointer itself is never destroyed, so the instance outlives every other static.
    static TCFStringUniquerImp* const instance = CreateStringUniquer();
    return instance;
}

TCFStringUniquerImp* TCFStringUniquer::CreateStringUniquer() {
    return new TCFStringUniquerImp;
}

CFHashCode utf8Hash(const void* key) {
    size_t length;
    return HashKey(static_cast<const unsigned char*>(key), SIZE_MAX, &length);
}

Boolean utf8Equal(const void* a, const void* b) {
    return a == b || std::strcmp(static_cast<const char*>(a), static_cast<const char*>(b)) == 0;
}

/// Keys are UTF-8; one that is not (which the table never holds) is shown as Latin-1 rather
/// than not at all.
CFStringRef utf8CopyDescription(const void* key) {
    const std::string text = std::string("[") + static_cast<const char*>(key) + "]";
    const auto* bytes = reinterpret_cast<const UInt8*>(text.data());
    const auto length = CFIndex(text.size());
    if (CFStringRef description =
            CFStringCreateWithBytes(nullptr, bytes, length, kCFStringEncodingUTF8, false))
        return description;
    return CFStringCreateWithBytes(nullptr, bytes, length, kCFStringEncodingISOLatin1, false);
}
