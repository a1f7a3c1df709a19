#include "platform/CFRunLoop.h"

#include <poll.h>
#include <sys/eventfd.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <deque>
#include <unordered_map>
#include <vector>

#include "platform/CFRunLoopInternal.h"
#include "platform/CFString.h"
#include "platform/Log.h"

using glyphwell::runtime::kRunLoopSourceKind;

const CFStringRef kCFRunLoopCommonModes = CFSTR("kCFRunLoopCommonModes");
const CFStringRef kCFRunLoopDefaultMode = CFSTR("kCFRunLoopDefaultMode");

namespace glyphwell {

// ---------------------------------------------------------------------------------------------
// PollRunLoopDriver

struct PollRunLoopDriver::State {
    using Callback = std::function<void(bool readable, bool writable)>;

    struct Entry {
        uint64_t serial;  ///< identifies this registration; a new one after every Unwatch
        bool read, write; ///< current interests
        std::shared_ptr<Callback> callback;
    };

    std::unordered_map<int, Entry> entries;
    uint64_t nextSerial = 1;
    int wakeDescriptor = -1;

    // The poll set, rebuilt only when the registrations change.
    bool pollSetDirty = true;
    std::vector<pollfd> pollSet;
    std::vector<uint64_t> pollSerials;

    // Each RunOnce works on its own copy of the poll set, since a nested RunOnce may rebuild
    // it; the copies are kept per nesting depth so that their memory is reused. (A deque: a
    // nested call adding a level must not move the levels in use.)
    struct Round {
        std::vector<pollfd> ready;
        std::vector<uint64_t> serials;
    };
    std::deque<Round> rounds;
    size_t depth = 0;

    void RebuildPollSet() {
        pollSet.clear();
        pollSerials.clear();
        for (const auto& [descriptor, entry] : entries) {
            if (!entry.read && !entry.write)
                continue;
            short events = 0;
            if (entry.read)
                events |= POLLIN;
            if (entry.write)
                events |= POLLOUT;
            pollSet.push_back({descriptor, events, 0});
            pollSerials.push_back(entry.serial);
        }
        if (wakeDescriptor >= 0)
            pollSet.push_back({wakeDescriptor, POLLIN, 0});
        pollSetDirty = false;
    }
};

PollRunLoopDriver::PollRunLoopDriver() : state_(std::make_unique<State>()) {
    state_->wakeDescriptor = eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK);
    if (state_->wakeDescriptor < 0)
        AppLog("PollRunLoopDriver: eventfd failed (errno %d); Wake will not interrupt a wait",
               errno);
}

PollRunLoopDriver::~PollRunLoopDriver() {
    if (state_->wakeDescriptor >= 0)
        close(state_->wakeDescriptor);
}

void PollRunLoopDriver::Watch(int descriptor, bool read, bool write,
                              std::function<void(bool readable, bool writable)> onEvent) {
    auto found = state_->entries.find(descriptor);
    if (found == state_->entries.end()) {
        found = state_->entries
                    .emplace(descriptor, State::Entry{state_->nextSerial++, false, false, nullptr})
                    .first;
    }
    found->second.read = read;
    found->second.write = write;
    // A new callback object: a callback running now keeps its own copy alive.
    found->second.callback = std::make_shared<State::Callback>(std::move(onEvent));
    state_->pollSetDirty = true;
}

void PollRunLoopDriver::Unwatch(int descriptor) {
    if (state_->entries.erase(descriptor))
        state_->pollSetDirty = true;
}

bool PollRunLoopDriver::RunOnce(int timeoutMs) {
    State& state = *state_;
    if (state.entries.empty())
        return false;
    if (state.pollSetDirty)
        state.RebuildPollSet();
    if (state.rounds.size() <= state.depth)
        state.rounds.emplace_back();
    State::Round& round = state.rounds[state.depth];
    round.ready = state.pollSet;
    round.serials = state.pollSerials;
    std::vector<pollfd>& ready = round.ready;
    const std::vector<uint64_t>& serials = round.serials;
    struct DepthGuard {
        size_t& depth;
        explicit DepthGuard(size_t& value) : depth(value) { ++depth; }
        ~DepthGuard() { --depth; }
    } guard(state.depth);

    int count = poll(ready.data(), nfds_t(ready.size()), timeoutMs < 0 ? -1 : timeoutMs);
    if (count <= 0)
        return true; // timeout or EINTR: the caller loops

    for (size_t i = 0; i < serials.size(); ++i) {
        const short revents = ready[i].revents;
        if (!revents)
            continue;
        auto found = state.entries.find(ready[i].fd);
        if (found == state.entries.end() || found->second.serial != serials[i])
            continue; // unwatched (and maybe reused) since the wait began
        const State::Entry& entry = found->second;
        const bool trouble = revents & (POLLHUP | POLLERR | POLLNVAL);
        const bool readable = entry.read && ((revents & POLLIN) || trouble);
        const bool writable = entry.write && ((revents & POLLOUT) || trouble);
        if (!readable && !writable)
            continue;
        std::shared_ptr<State::Callback> callback = entry.callback;
        (*callback)(readable, writable);
    }
    if (state.wakeDescriptor >= 0 && ready.back().fd == state.wakeDescriptor &&
        ready.back().revents) {
        uint64_t counter;
        while (read(state.wakeDescriptor, &counter, sizeof counter) < 0 && errno == EINTR) {
        }
    }
    return true;
}

void PollRunLoopDriver::Wake() {
    if (state_->wakeDescriptor < 0)
        return;
    const uint64_t one = 1;
    while (write(state_->wakeDescriptor, &one, sizeof one) < 0 && errno == EINTR) {
    }
}

} // namespace glyphwell

// ---------------------------------------------------------------------------------------------
// Run loops

namespace {

thread_local __CFRunLoop currentRunLoop;

__CFRunLoopSource* AsSource(CFRunLoopSourceRef source) {
    return glyphwell::runtime::AsMutable<__CFRunLoopSource>(source, kRunLoopSourceKind);
}

} // namespace

__CFRunLoop::~__CFRunLoop() {
    // The thread is ending; its driver may be gone already, so it is not called.
    std::vector<__CFRunLoopSource*> held;
    held.swap(sources);
    for (__CFRunLoopSource* source : held) {
        source->loop = nullptr;
        source->Cancel(nullptr);
        CFRelease(source);
    }
}

namespace glyphwell {

void SetRunLoopDriver(RunLoopDriver* driver) {
    __CFRunLoop& loop = currentRunLoop;
    if (loop.driver == driver)
        return;
    RunLoopDriver* previous = loop.driver;
    loop.driver = nullptr;
    // Copies: a source may leave the list while it moves.
    const std::vector<__CFRunLoopSource*> sources = loop.sources;
    if (previous)
        for (__CFRunLoopSource* source : sources)
            source->Cancel(previous);
    loop.driver = driver;
    if (driver)
        for (__CFRunLoopSource* source : sources)
            if (source->loop == &loop)
                source->Schedule(driver);
}

} // namespace glyphwell

CFRunLoopRef CFRunLoopGetCurrent() {
    return &currentRunLoop;
}

void CFRunLoopAddSource(CFRunLoopRef runLoop, CFRunLoopSourceRef source, CFStringRef) {
    __CFRunLoopSource* object = AsSource(source);
    GW_ASSERT(runLoop != nullptr && object != nullptr);
    if (!runLoop || !object || !object->valid || object->loop == runLoop)
        return;
    GW_ASSERT(object->loop == nullptr);
    if (object->loop)
        return;
    CFRetain(object);
    object->loop = runLoop;
    auto position = std::upper_bound(
        runLoop->sources.begin(), runLoop->sources.end(), object->order,
        [](CFIndex order, const __CFRunLoopSource* other) { return order < other->order; });
    runLoop->sources.insert(position, object);
    if (runLoop->driver)
        object->Schedule(runLoop->driver);
}

void CFRunLoopRemoveSource(CFRunLoopRef runLoop, CFRunLoopSourceRef source, CFStringRef) {
    __CFRunLoopSource* object = AsSource(source);
    if (!runLoop || !object || object->loop != runLoop)
        return;
    auto found = std::find(runLoop->sources.begin(), runLoop->sources.end(), object);
    if (found == runLoop->sources.end())
        return;
    runLoop->sources.erase(found);
    object->loop = nullptr;
    if (runLoop->driver)
        object->Cancel(runLoop->driver);
    CFRelease(object);
}

Boolean CFRunLoopContainsSource(CFRunLoopRef runLoop, CFRunLoopSourceRef source, CFStringRef) {
    const __CFRunLoopSource* object = AsSource(source);
    return runLoop && object && object->loop == runLoop;
}

CFTypeID CFRunLoopSourceGetTypeID() {
    return kRunLoopSourceKind;
}

Boolean CFRunLoopSourceIsValid(CFRunLoopSourceRef source) {
    const __CFRunLoopSource* object = AsSource(source);
    return object && object->valid;
}
