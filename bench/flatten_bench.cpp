// Writing a message: TCFFlattenContext into a fresh buffer, as the request dispatch does for each
// reply, beside msgpack-cxx packing the same content into a fresh msgpack::sbuffer (and, for the
// 1 MiB data value, a plain memcpy of its bytes as the floor).
//
// Bytes per second count the bytes each writer produces (message_bytes per message); items per
// second count messages written, which is the figure to compare between writers.
#include <benchmark/benchmark.h>

#include <cstring>
#include <string>

#include "BenchContent.h"
#include "serialization/TCFFlattenContext.h"

namespace {

void FlattenMessage(benchmark::State& state, const bench::StreamCase& message) {
    int64_t bytes = 0;
    for (auto _ : state) {
        CFMutableDataRef data = CFDataCreateMutable(nullptr, 0);
        {
            TCFFlattenContext context(data, false);
            context.Flatten(message.value);
        }
        bytes += CFDataGetLength(data);
        benchmark::DoNotOptimize(CFDataGetBytePtr(data));
        CFRelease(data);
    }
    if (bytes != int64_t(message.flattened.size()) * int64_t(state.iterations()))
        state.SkipWithError("the stream's length changed between runs");
    state.SetBytesProcessed(bytes);
    state.SetItemsProcessed(state.iterations());
    state.counters["message_bytes"] = double(message.flattened.size());
}

void PackMessage(benchmark::State& state, const bench::StreamCase& message) {
    int64_t bytes = 0;
    for (auto _ : state) {
        msgpack::sbuffer buffer;
        message.packMsgpack(buffer);
        bytes += int64_t(buffer.size());
        benchmark::DoNotOptimize(buffer.data());
    }
    state.SetBytesProcessed(bytes);
    state.SetItemsProcessed(state.iterations());
    state.counters["message_bytes"] = double(message.msgpack.size());
}

void CopyBytes(benchmark::State& state, const bench::StreamCase& message) {
    const UInt8* source = CFDataGetBytePtr(static_cast<CFDataRef>(message.value));
    const size_t length = size_t(CFDataGetLength(static_cast<CFDataRef>(message.value)));
    std::vector<UInt8> destination(length, 1); // touched, so no page faults are timed
    for (auto _ : state) {
        std::memcpy(destination.data(), source, length);
        benchmark::DoNotOptimize(destination.data());
        benchmark::ClobberMemory();
    }
    state.SetBytesProcessed(int64_t(length) * int64_t(state.iterations()));
    state.SetItemsProcessed(state.iterations());
    state.counters["message_bytes"] = double(length);
}

} // namespace

int main(int argc, char** argv) {
    for (const bench::StreamCase& message : bench::StreamCases()) {
        const std::string prefix = "Write/" + message.name + "/";
        // The cases live for the process; the benchmarks refer to them.
        const bench::StreamCase* shared = &message;
        benchmark::RegisterBenchmark((prefix + "TCFFlattenContext").c_str(),
                                     [shared](benchmark::State& s) { FlattenMessage(s, *shared); });
        benchmark::RegisterBenchmark((prefix + "msgpack-cxx").c_str(),
                                     [shared](benchmark::State& s) { PackMessage(s, *shared); });
        if (message.kind == CFDataGetTypeID())
            benchmark::RegisterBenchmark((prefix + "memcpy").c_str(),
                                         [shared](benchmark::State& s) { CopyBytes(s, *shared); });
    }
    benchmark::Initialize(&argc, argv);
    if (benchmark::ReportUnrecognizedArguments(argc, argv))
        return 1;
    benchmark::RunSpecifiedBenchmarks();
    benchmark::Shutdown();
    return 0;
}
