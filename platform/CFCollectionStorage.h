// Storage shared by the container kinds (internal to platform/): the element releaser that keeps
// the destruction of nested containers flat, and the hashed table behind sets and dictionaries.
//
// The hashed table differs from std::unordered_map in two ways the containers need: entries are
// kept in insertion order (a dense vector, enumerated front to back), and keys are hashed and
// compared through the container's callbacks. An open-addressing index maps hashes to entry
// positions; removal marks the entry and compacts once marked entries outnumber live ones. A
// small table (up to 8 entries, the common case for the values of a request) has no index and
// is searched by comparing the stored hashes, which saves the index's allocation and upkeep; up
// to 4 entries live inside the table itself.
#pragma once

#include <cstddef>
#include <string>
#include <vector>

#include "platform/ArgumentChecks.h"
#include "platform/CFRuntime.h"

namespace glyphwell::runtime {

/// Gives back a destroyed container's counts on its elements. The first releaser on a thread
/// calls the release callbacks at once; releasers created while it lives (by the destructors of
/// the elements it releases) queue their elements instead, and the first one drains the queue
/// before it goes. Destroying a value nested N levels deep therefore takes constant stack.
class ElementReleaser {
public:
    ElementReleaser() noexcept;
    ~ElementReleaser();
    ElementReleaser(const ElementReleaser&) = delete;
    ElementReleaser& operator=(const ElementReleaser&) = delete;

    /// Calls `release` for `value` now or later; a null callback does nothing. With the standard
    /// callback the count is given back at once, and only the destruction may wait.
    void Release(CFReleaseCallBack release, const void* value) {
        // The standard callback has nothing to do for a shared constant (most elements of a
        // request read back): skip the call.
        if (release == kCFTypeArrayCallBacks.release && value && AsObject(value)->IsImmortal())
            return;
        ReleaseCounted(release, value);
    }

private:
    void ReleaseCounted(CFReleaseCallBack release, const void* value);

    bool outermost_;
};

/// What storing a key does when the table holds an equal key already, or does not.
enum class PutMode {
    AddOnly,      ///< add an absent key; leave a present one alone
    AddOrReplace, ///< add an absent key; replace a present one's value (a set's member)
    ReplaceOnly   ///< replace a present one; ignore an absent key
};

/// One entry of a hashed table. Sets leave `value` null.
struct HashedEntry {
    const void* key;
    const void* value;
    CFHashCode hash; ///< the key's hash, kept so that growing never calls the callback again
};

/// The entries of a hashed table, in order: up to kInlineCount inside the object itself (the
/// dictionaries of a request have three or four pairs, which then need no allocation of their
/// own), on the heap beyond. Like a std::vector of trivially copyable entries otherwise.
class EntryVector {
public:
    static constexpr size_t kInlineCount = 4;

    EntryVector() noexcept = default;
    EntryVector(EntryVector&& other) noexcept;
    EntryVector& operator=(EntryVector&&) = delete;
    EntryVector(const EntryVector&) = delete;
    ~EntryVector();

    size_t size() const noexcept { return size_; }
    HashedEntry& operator[](size_t index) noexcept { return data_[index]; }
    const HashedEntry& operator[](size_t index) const noexcept { return data_[index]; }
    const HashedEntry* begin() const noexcept { return data_; }
    const HashedEntry* end() const noexcept { return data_ + size_; }

    void push_back(const HashedEntry& entry) {
        if (size_ == capacity_)
            Grow(size_ + 1);
        data_[size_++] = entry;
    }
    /// Makes room for `count` entries.
    void reserve(size_t count) {
        if (count > capacity_)
            Grow(count);
    }
    /// Removes the entries for which `test` is true, keeping the order of the others.
    template <class Test> void erase_if(Test&& test) {
        size_t kept = 0;
        for (size_t i = 0; i < size_; ++i)
            if (!test(data_[i]))
                data_[kept++] = data_[i];
        size_ = kept;
    }

private:
    /// Moves the entries to a heap block of at least `count` (and twice the old capacity).
    void Grow(size_t count);

    HashedEntry* data_ = inline_;
    size_t size_ = 0;
    size_t capacity_ = kInlineCount;
    HashedEntry inline_[kInlineCount];
};

class HashedTable {
public:
    /// Keys are hashed with `hash` and compared with `equal`; null means pointer identity.
    HashedTable(CFHashCallBack hash, CFEqualCallBack equal) noexcept
        : hashCallBack_(hash), equalCallBack_(equal) {}

    /// The number of live entries.
    CFIndex Count() const noexcept { return liveCount_; }
    CFHashCode HashOf(const void* key) const { return CallHash(hashCallBack_, key); }

    /// The position of the live entry whose key equals `key` (whose hash is `hash`), or -1.
    CFIndex Find(const void* key, CFHashCode hash) const;
    /// The entry at a position returned by Find. NOTE: invalidated by Append and Remove.
    HashedEntry& EntryAt(CFIndex position) noexcept { return entries_[size_t(position)]; }
    const HashedEntry& EntryAt(CFIndex position) const noexcept {
        return entries_[size_t(position)];
    }

    /// Adds an entry whose key is not present (checked by the caller). Takes no counts.
    void Append(const void* key, const void* value, CFHashCode hash);
    /// Takes out the entry at a position returned by Find and returns it for the caller to
    /// release. Later positions may move.
    HashedEntry Remove(CFIndex position);
    /// Takes out every entry, in insertion order, for the caller to release.
    EntryVector TakeAll() noexcept;
    /// Makes room for `count` live entries without regrowing the index.
    void Reserve(CFIndex count);

    /// Calls `visit(const HashedEntry&)` for each live entry in insertion order. The entry is a
    /// copy, and the bounds are checked on every step, so a visitor that changes the table
    /// (a caller error) cannot make the walk leave the storage.
    template <class Visit> void ForEach(Visit&& visit) const {
        for (size_t i = 0; i < entries_.size(); ++i) {
            HashedEntry entry = entries_[i];
            if (entry.key != RemovedKey())
                visit(entry);
        }
    }
    /// Like ForEach, stopping at the first entry for which `test` returns true; returns whether
    /// one did.
    template <class Test> bool Any(Test&& test) const {
        for (size_t i = 0; i < entries_.size(); ++i) {
            HashedEntry entry = entries_[i];
            if (entry.key != RemovedKey() && test(entry))
                return true;
        }
        return false;
    }

private:
    /// The most entries (removed ones included) a table keeps without an index.
    static constexpr size_t kLargestUnindexed = 8;

    /// Marks a removed entry; its address cannot be a caller's key.
    static const void* RemovedKey() noexcept;
    /// Drops removed entries and rebuilds the index with room for `count` live entries.
    void Rebuild(size_t count);
    size_t HomeSlot(CFHashCode hash) const noexcept;
    void PlaceInIndex(CFHashCode hash, size_t position);

    CFHashCallBack hashCallBack_;
    CFEqualCallBack equalCallBack_;
    EntryVector entries_;       ///< insertion order, removed entries included
    std::vector<size_t> slots_; ///< entry position + 1, 0 for an empty slot; power of two;
                                ///< empty while the table is small
    unsigned slotShift_ = 64;   ///< 64 - log2(slots_.size())
    CFIndex liveCount_ = 0;
    size_t removedCount_ = 0;
};

/// What sets and dictionaries share: a hashed table whose keys (a set's members) and values each
/// hold the count their retain callback took, with insertion, copying, equality, description and
/// destruction written once. A set has no value callbacks and leaves every value null.
class HashedCollection : public CFObject {
public:
    HashedCollection(CFTypeID kind, const char* kindName,
                     const CFDictionaryKeyCallBacks* keyCallBacks,
                     const CFDictionaryValueCallBacks* valueCallBacks, bool isMutable);
    ~HashedCollection() override;

    /// Same count, and every key of this one is in `other` with an equal value.
    bool Equals(const CFObject& other) const override;
    CFHashCode Hash() const override { return CFHashCode(table.Count()); }
    std::string Description() const override;

    /// The position of the entry whose key equals `key`, or -1.
    CFIndex Find(const void* key) const { return table.Find(key, table.HashOf(key)); }
    /// Stores `key` (and `value`, for a dictionary) as `mode` says. Replacing in a dictionary
    /// changes the value and keeps the key; in a set it changes the member.
    void Put(const void* key, const void* value, PutMode mode);
    /// Gives back the counts of a removed entry.
    void ReleaseEntry(const HashedEntry& entry) const;

    const CFDictionaryKeyCallBacks keyCallBacks;
    const CFDictionaryValueCallBacks valueCallBacks;
    const bool isMutable;
    HashedTable table;

protected:
    /// Appends every entry of this collection to the empty `copy`, each retained again.
    void CopyEntriesTo(HashedCollection& copy) const;

private:
    const char* kindName_;
};

} // namespace glyphwell::runtime
