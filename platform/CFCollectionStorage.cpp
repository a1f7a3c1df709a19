#include "platform/CFCollectionStorage.h"

#include <algorithm>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <new>

#include "platform/Log.h"

namespace glyphwell::runtime {

// ---------------------------------------------------------------------------------------------
// ElementReleaser

namespace {

struct PendingRelease {
    CFReleaseCallBack release;
    const void* value;
};

// Trivially destructible on purpose: containers may be destroyed while the thread's (or the
// process's) destructors run, after a std::vector here would be gone. The outermost releaser
// frees the storage when it has drained the queue.
struct ReleaseQueue {
    PendingRelease* items;
    size_t count;
    size_t capacity;
    bool active;
};
thread_local ReleaseQueue releaseQueue{};

/// Destroys an object whose last count was already given back.
void DestroyObject(CFAllocatorRef, const void* value) {
    delete AsObject(value);
}

} // namespace

ElementReleaser::ElementReleaser() noexcept : outermost_(!releaseQueue.active) {
    releaseQueue.active = true;
}

ElementReleaser::~ElementReleaser() {
    if (!outermost_)
        return;
    // Releasing an item may destroy a container, whose releaser appends to the queue.
    while (releaseQueue.count > 0) {
        PendingRelease item = releaseQueue.items[--releaseQueue.count];
        item.release(kCFAllocatorDefault, item.value);
    }
    std::free(releaseQueue.items);
    releaseQueue = ReleaseQueue{};
}

void ElementReleaser::ReleaseCounted(CFReleaseCallBack release, const void* value) {
    if (!release)
        return;
    // The standard callback (CFRelease, shared by every kCFType... callbacks record): give the
    // count back now. Only destroying the value, which may release a container's elements in
    // turn, has to wait its turn; a value still held elsewhere never enters the queue.
    if (release == kCFTypeArrayCallBacks.release && value) {
        if (!AsObject(value)->ReleaseShouldDestroy())
            return;
        release = DestroyObject;
    }
    if (!outermost_) {
        ReleaseQueue& queue = releaseQueue;
        if (queue.count == queue.capacity) {
            size_t capacity = queue.capacity ? queue.capacity * 2 : 64;
            void* grown = std::realloc(queue.items, capacity * sizeof(PendingRelease));
            if (grown) {
                queue.items = static_cast<PendingRelease*>(grown);
                queue.capacity = capacity;
            }
        }
        if (queue.count < queue.capacity) {
            queue.items[queue.count++] = PendingRelease{release, value};
            return;
        }
        // Out of memory for the queue: release at once, spending stack instead.
    }
    release(kCFAllocatorDefault, value);
}

// ---------------------------------------------------------------------------------------------
// EntryVector

EntryVector::EntryVector(EntryVector&& other) noexcept : size_(other.size_) {
    if (other.data_ == other.inline_) {
        std::copy_n(other.inline_, other.size_, inline_);
    } else {
        data_ = other.data_;
        capacity_ = other.capacity_;
        other.data_ = other.inline_;
        other.capacity_ = kInlineCount;
    }
    other.size_ = 0;
}

EntryVector::~EntryVector() {
    if (data_ != inline_)
        std::free(data_);
}

void EntryVector::Grow(size_t count) {
    const size_t capacity = std::max(count, 2 * capacity_);
    if (capacity > SIZE_MAX / sizeof(HashedEntry))
        throw std::bad_alloc();
    void* block = data_ == inline_ ? std::malloc(capacity * sizeof(HashedEntry))
                                   : std::realloc(data_, capacity * sizeof(HashedEntry));
    if (!block)
        throw std::bad_alloc();
    if (data_ == inline_)
        std::memcpy(block, inline_, size_ * sizeof(HashedEntry));
    data_ = static_cast<HashedEntry*>(block);
    capacity_ = capacity;
}

// ---------------------------------------------------------------------------------------------
// HashedTable

const void* HashedTable::RemovedKey() noexcept {
    static const char marker = 0;
    return &marker;
}

// Fibonacci hashing: the top bits of the product spread keys whose hashes differ only in their
// high or low bits (pointers, small integers).
size_t HashedTable::HomeSlot(CFHashCode hash) const noexcept {
    return size_t((uint64_t(hash) * 0x9e3779b97f4a7c15ULL) >> slotShift_);
}

CFIndex HashedTable::Find(const void* key, CFHashCode hash) const {
    if (slots_.empty()) {
        // A small table has no index: compare the stored hashes one by one.
        for (size_t position = 0; position < entries_.size(); ++position) {
            const HashedEntry& entry = entries_[position];
            if (entry.hash == hash && entry.key != RemovedKey() &&
                CallEqual(equalCallBack_, entry.key, key))
                return CFIndex(position);
        }
        return -1;
    }
    // The index is at most half full, so the probe always reaches an empty slot.
    const size_t mask = slots_.size() - 1;
    for (size_t slot = HomeSlot(hash);; slot = (slot + 1) & mask) {
        size_t position = slots_[slot];
        if (position == 0)
            return -1;
        const HashedEntry& entry = entries_[position - 1];
        if (entry.hash == hash && entry.key != RemovedKey() &&
            CallEqual(equalCallBack_, entry.key, key))
            return CFIndex(position - 1);
    }
}

void HashedTable::PlaceInIndex(CFHashCode hash, size_t position) {
    const size_t mask = slots_.size() - 1;
    size_t slot = HomeSlot(hash);
    while (slots_[slot] != 0)
        slot = (slot + 1) & mask;
    slots_[slot] = position + 1;
}

void HashedTable::Append(const void* key, const void* value, CFHashCode hash) {
    // Every entry, removed or not, holds one slot; keep at most half of the slots in use (a
    // small table: at most kLargestUnindexed entries). The new index leaves room for half as
    // many entries again, so regrowth stays amortised O(1) even when removals and additions
    // alternate.
    const size_t needed = entries_.size() + 1;
    if (slots_.empty() ? needed > kLargestUnindexed : 2 * needed > slots_.size())
        Rebuild(size_t(liveCount_) + size_t(liveCount_) / 2 + 1);
    entries_.push_back(HashedEntry{key, value, hash});
    ++liveCount_;
    if (!slots_.empty())
        PlaceInIndex(hash, entries_.size() - 1);
}

HashedEntry HashedTable::Remove(CFIndex position) {
    HashedEntry& slotEntry = entries_[size_t(position)];
    HashedEntry removed = slotEntry;
    slotEntry.key = RemovedKey();
    slotEntry.value = nullptr;
    --liveCount_;
    ++removedCount_;
    // Compact once removed entries outnumber live ones: amortised O(1) per removal.
    if (removedCount_ > size_t(liveCount_))
        Rebuild(size_t(liveCount_));
    return removed;
}

EntryVector HashedTable::TakeAll() noexcept {
    EntryVector taken(std::move(entries_));
    taken.erase_if([](const HashedEntry& entry) { return entry.key == RemovedKey(); });
    slots_.clear();
    slotShift_ = 64;
    liveCount_ = 0;
    removedCount_ = 0;
    return taken;
}

void HashedTable::Reserve(CFIndex count) {
    if (count <= 0)
        return;
    if (slots_.empty() && size_t(count) <= kLargestUnindexed)
        entries_.reserve(size_t(count));
    else if (2 * size_t(count) > slots_.size())
        Rebuild(size_t(count));
}

void HashedTable::Rebuild(size_t count) {
    if (removedCount_ > 0) {
        entries_.erase_if([](const HashedEntry& entry) { return entry.key == RemovedKey(); });
        removedCount_ = 0;
    }
    count = std::max(count, entries_.size());
    if (count <= kLargestUnindexed) {
        std::vector<size_t>().swap(slots_); // small again: give the index back
        slotShift_ = 64;
        entries_.reserve(count);
        return;
    }
    size_t size = 8;
    unsigned shift = 61;
    while (size < 2 * count) {
        size *= 2;
        --shift;
    }
    slots_.assign(size, 0);
    slotShift_ = shift;
    entries_.reserve(count);
    for (size_t position = 0; position < entries_.size(); ++position)
        PlaceInIndex(entries_[position].hash, position);
}

// ---------------------------------------------------------------------------------------------
// HashedCollection

HashedCollection::HashedCollection(CFTypeID kind, const char* kindName,
                                   const CFDictionaryKeyCallBacks* keyCallBacks,
                                   const CFDictionaryValueCallBacks* valueCallBacks, bool isMutable)
    : CFObject(kind), keyCallBacks(keyCallBacks ? *keyCallBacks : CFDictionaryKeyCallBacks{}),
      valueCallBacks(valueCallBacks ? *valueCallBacks : CFDictionaryValueCallBacks{}),
      isMutable(isMutable), table(this->keyCallBacks.hash, this->keyCallBacks.equal),
      kindName_(kindName) {}

HashedCollection::~HashedCollection() {
    ElementReleaser releaser;
    table.ForEach([&](const HashedEntry& entry) {
        releaser.Release(keyCallBacks.release, entry.key);
        releaser.Release(valueCallBacks.release, entry.value);
    });
}

bool HashedCollection::Equals(const CFObject& other) const {
    const auto& that = static_cast<const HashedCollection&>(other);
    if (table.Count() != that.table.Count())
        return false;
    return !table.Any([&](const HashedEntry& entry) {
        CFIndex position = that.Find(entry.key);
        return position < 0 ||
               !CallEqual(valueCallBacks.equal, entry.value, that.table.EntryAt(position).value);
    });
}

std::string HashedCollection::Description() const {
    const bool isSet = Kind() == kSetKind;
    std::string text = DescriptionPrefix(this, kindName_);
    text += "{count = " + std::to_string(table.Count()) +
            (isSet ? ", values = (\n" : ", entries = (\n");
    table.ForEach([&](const HashedEntry& entry) {
        text += '\t';
        text += CallDescribe(keyCallBacks.copyDescription, entry.key);
        if (!isSet) {
            text += " = ";
            text += CallDescribe(valueCallBacks.copyDescription, entry.value);
        }
        text += '\n';
    });
    text += ")}";
    return text;
}

void HashedCollection::Put(const void* key, const void* value, PutMode mode) {
    CFHashCode hash = table.HashOf(key);
    CFIndex position = table.Find(key, hash);
    if (position < 0) {
        if (mode != PutMode::ReplaceOnly)
            table.Append(CallRetain(keyCallBacks.retain, key),
                         CallRetain(valueCallBacks.retain, value), hash);
        return;
    }
    if (mode == PutMode::AddOnly)
        return;
    // Retain the newcomer first: it may be the one it replaces.
    const bool isSet = Kind() == kSetKind;
    const void* retained =
        isSet ? CallRetain(keyCallBacks.retain, key) : CallRetain(valueCallBacks.retain, value);
    HashedEntry& entry = table.EntryAt(position);
    const void*& slot = isSet ? entry.key : entry.value;
    const void* replaced = slot;
    slot = retained;
    CallRelease(isSet ? keyCallBacks.release : valueCallBacks.release, replaced);
}

void HashedCollection::ReleaseEntry(const HashedEntry& entry) const {
    CallRelease(keyCallBacks.release, entry.key);
    CallRelease(valueCallBacks.release, entry.value);
}

void HashedCollection::CopyEntriesTo(HashedCollection& copy) const {
    copy.table.Reserve(table.Count());
    table.ForEach([&](const HashedEntry& entry) {
        copy.table.Append(CallRetain(keyCallBacks.retain, entry.key),
                          CallRetain(valueCallBacks.retain, entry.value), entry.hash);
    });
}

} // namespace glyphwell::runtime
