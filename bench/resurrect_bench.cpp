// Reading a message: TCFResurrectContext rebuilding the property values from our stream, as the
// request dispatch does for each request, beside msgpack-cxx unpacking the same content into its
// object tree (msgpack::unpack into a msgpack::object_handle) and libcbor decoding it from CBOR
// (cbor_load, then cbor_decref). Each reader reads its own format's bytes of the same content.
//
// Bytes per second count the bytes each reader consumes; items per second count messages read,
// which is the figure to compare between readers. Strings come from the process-wide uniquer,
// so after the first read every text is a hit there, as in a long-running agent.
#include <benchmark/benchmark.h>
#include <cbor.h>

#include <string>

#include "BenchContent.h"
#include "serialization/TCFResurrectContext.h"

namespace {

/// The top-level value of `bytes`, read with the Retrieve operation of `kind`; the caller releases
/// it.
CFTypeRef Retrieve(const std::vector<unsigned char>& bytes, CFTypeID kind) {
    TCFResurrectContext context(bytes.data(), bytes.size());
    if (kind == CFDictionaryGetTypeID())
        return context.RetrieveCFDictionary();
    if (kind == CFDataGetTypeID())
        return context.RetrieveCFData();
    if (kind == CFCharacterSetGetTypeID())
        return context.RetrieveCFCharacterSet();
    return context.Resurrect(kTCFTypeAny);
}

void ResurrectMessage(benchmark::State& state, const bench::StreamCase& message) {
    CFTypeRef check = Retrieve(message.flattened, message.kind);
    const bool equal = check && CFEqual(check, message.value);
    if (check)
        CFRelease(check);
    if (!equal) {
        state.SkipWithError("the stream does not read back to the value written");
        return;
    }
    for (auto _ : state) {
        CFTypeRef value = Retrieve(message.flattened, message.kind);
        benchmark::DoNotOptimize(value);
        CFRelease(value);
    }
    state.SetBytesProcessed(int64_t(message.flattened.size()) * int64_t(state.iterations()));
    state.SetItemsProcessed(state.iterations());
    state.counters["message_bytes"] = double(message.flattened.size());
}

void UnpackMessage(benchmark::State& state, const bench::StreamCase& message) {
    const char* bytes = reinterpret_cast<const char*>(message.msgpack.data());
    const size_t length = message.msgpack.size();
    for (auto _ : state) {
        msgpack::object_handle handle = msgpack::unpack(bytes, length);
        benchmark::DoNotOptimize(handle.get().type);
    }
    state.SetBytesProcessed(int64_t(length) * int64_t(state.iterations()));
    state.SetItemsProcessed(state.iterations());
    state.counters["message_bytes"] = double(length);
}

void LoadCbor(benchmark::State& state, const bench::StreamCase& message) {
    const unsigned char* bytes = message.cbor.data();
    const size_t length = message.cbor.size();
    cbor_load_result result;
    cbor_item_t* check = cbor_load(bytes, length, &result);
    if (!check || result.error.code != CBOR_ERR_NONE || result.read != length) {
        state.SkipWithError("libcbor cannot read the CBOR bytes");
        return;
    }
    cbor_decref(&check);
    for (auto _ : state) {
        cbor_item_t* item = cbor_load(bytes, length, &result);
        benchmark::DoNotOptimize(item);
        cbor_decref(&item);
    }
    state.SetBytesProcessed(int64_t(length) * int64_t(state.iterations()));
    state.SetItemsProcessed(state.iterations());
    state.counters["message_bytes"] = double(length);
}

} // namespace

int main(int argc, char** argv) {
    for (const bench::StreamCase& message : bench::StreamCases()) {
        const std::string prefix = "Read/" + message.name + "/";
        // The cases live for the process; the benchmarks refer to them.
        const bench::StreamCase* shared = &message;
        benchmark::RegisterBenchmark(
            (prefix + "TCFResurrectContext").c_str(),
            [shared](benchmark::State& s) { ResurrectMessage(s, *shared); });
        benchmark::RegisterBenchmark((prefix + "msgpack-cxx").c_str(),
                                     [shared](benchmark::State& s) { UnpackMessage(s, *shared); });
        benchmark::RegisterBenchmark((prefix + "libcbor").c_str(),
                                     [shared](benchmark::State& s) { LoadCbor(s, *shared); });
    }
    benchmark::Initialize(&argc, argv);
    if (benchmark::ReportUnrecognizedArguments(argc, argv))
        return 1;
    benchmark::RunSpecifiedBenchmarks();
    benchmark::Shutdown();
    return 0;
}
