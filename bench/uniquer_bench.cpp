// The string uniquer's hit path: looking up texts that are already in the table, as the stream
// reader does for every key and name of a request after the first. One thread, then two threads
// hitting the same table at once.
//
// Both run on real (wall) time, so items_per_second is the total of hits per second of all
// threads together, and the time per iteration is wall time divided by the hits of all threads.
// The counter ns_per_hit is what one hit costs one thread: each thread's own wall time over its
// own hits, averaged over the threads. CPU time per iteration is CPU time of all threads over
// the hits of all threads, so it shows what a hit costs a core when the machine is shared.
#include <benchmark/benchmark.h>

#include <chrono>
#include <cstdio>
#include <string>
#include <vector>

#include "cfutil/TCFStringUniquer.h"

namespace {

constexpr size_t kTextCount = 64; // a power of two, for cheap cycling

/// Texts of the kind a download request holds: keys, PostScript and family names, localised
/// names (UTF-8 beyond ASCII), from 2 to 36 bytes.
const std::vector<std::string>& Texts() {
    static const std::vector<std::string> texts = [] {
        std::vector<std::string> all = {"QZUIPropertyApplicationName",
                                        "QZUIPropertyProcessID",
                                        "QZUIPropertyFontProperties",
                                        "QZUIPropertySuppress",
                                        "QZUIPropertyResult",
                                        "NSFontNameAttribute",
                                        "NSFontFamilyAttribute",
                                        "NSCTFontLocalizedFamilyNameAttribute",
                                        "de",
                                        "fr",
                                        "ja",
                                        "zh-Hans",
                                        "Glyphwell Writer"};
        for (int i = 0; all.size() < kTextCount; ++i) {
            char digits[16];
            std::snprintf(digits, sizeof digits, "%02d", i);
            const std::string nn = digits;
            for (std::string text : {"Family" + nn + "-Regular", "Family " + nn,
                                     "書体ファミリー " + nn + " 明朝", "字体家族 " + nn + " 宋体"})
                if (all.size() < kTextCount)
                    all.push_back(text);
        }
        return all;
    }();
    return texts;
}

/// The uniquer's string for each text, entered before anything is timed.
const std::vector<CFStringRef>& Entered() {
    static const std::vector<CFStringRef> strings = [] {
        std::vector<CFStringRef> all;
        const TCFStringUniquer uniquer;
        for (const std::string& text : Texts())
            all.push_back(uniquer.GetUniqueString(text.c_str(), CFIndex(text.size())));
        return all;
    }();
    return strings;
}

using Clock = std::chrono::steady_clock;

/// Records this thread's hits and its own wall time per hit, averaged over the threads.
void Finish(benchmark::State& state, Clock::time_point start) {
    const double elapsed = std::chrono::duration<double, std::nano>(Clock::now() - start).count();
    state.SetItemsProcessed(state.iterations());
    state.counters["ns_per_hit"] =
        benchmark::Counter(elapsed / double(state.iterations()), benchmark::Counter::kAvgThreads);
}

/// Hits through the byte form, the reader's path: one hash over the bytes and one comparison.
void UniquerHitBytes(benchmark::State& state) {
    const std::vector<std::string>& texts = Texts();
    const std::vector<CFStringRef>& expected = Entered();
    const TCFStringUniquer uniquer;
    for (size_t i = 0; i < kTextCount; ++i) {
        if (uniquer.GetUniqueString(texts[i].c_str(), CFIndex(texts[i].size())) != expected[i]) {
            state.SkipWithError("a text already present yielded another string");
            return;
        }
    }
    size_t next = size_t(state.thread_index()) * 17;
    const Clock::time_point start = Clock::now();
    for (auto _ : state) {
        const std::string& text = texts[next++ % kTextCount];
        benchmark::DoNotOptimize(uniquer.GetUniqueString(text.c_str(), CFIndex(text.size())));
    }
    Finish(state, start);
}

/// Hits through the string form: the string is converted to UTF-8 first, then looked up.
void UniquerHitString(benchmark::State& state) {
    static const std::vector<CFStringRef> strings = [] {
        std::vector<CFStringRef> all;
        for (const std::string& text : Texts())
            all.push_back(
                CFStringCreateWithBytes(nullptr, reinterpret_cast<const UInt8*>(text.data()),
                                        CFIndex(text.size()), kCFStringEncodingUTF8, false));
        return all;
    }();
    const std::vector<CFStringRef>& expected = Entered();
    const TCFStringUniquer uniquer;
    for (size_t i = 0; i < kTextCount; ++i) {
        if (uniquer.GetUniqueString(strings[i]) != expected[i]) {
            state.SkipWithError("a text already present yielded another string");
            return;
        }
    }
    size_t next = size_t(state.thread_index()) * 17;
    const Clock::time_point start = Clock::now();
    for (auto _ : state)
        benchmark::DoNotOptimize(uniquer.GetUniqueString(strings[next++ % kTextCount]));
    Finish(state, start);
}

} // namespace

BENCHMARK(UniquerHitBytes)->Threads(1)->Threads(2)->UseRealTime();
BENCHMARK(UniquerHitString)->Threads(1)->Threads(2)->UseRealTime();

BENCHMARK_MAIN();
