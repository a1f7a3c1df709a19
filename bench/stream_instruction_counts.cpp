// Runs one of the stream benchmarks' operations a fixed number of times, for counting its
// instructions under callgrind, which is exact and does not depend on the machine's load (the
// timed benchmarks swing by tens of percent on a shared machine). The count of one operation is
// the difference between a run of N operations and a run of 0, divided by N.
//
// Not built by CMake (it needs no harness): RESULTS.md, "Instruction counts", has the commands
// that build it against a benchmark build and count with callgrind.
//
// Operations: read (TCFResurrectContext, Retrieve of the top-level kind, result released),
// write (TCFFlattenContext into a new buffer), unpack and pack (msgpack-cxx, as in the
// benchmarks). Cases: the names of BenchContent's cases.
#include <cstdio>
#include <cstdlib>
#include <string>

#include "BenchContent.h"

namespace {

void Unpack(const bench::StreamCase& message) {
    msgpack::object_handle handle = msgpack::unpack(
        reinterpret_cast<const char*>(message.msgpack.data()), message.msgpack.size());
    asm volatile("" : : "r"(handle.get().type));
}

void Pack(const bench::StreamCase& message) {
    msgpack::sbuffer buffer;
    message.packMsgpack(buffer);
    asm volatile("" : : "r"(buffer.data()));
}

} // namespace

int main(int argc, char** argv) {
    if (argc != 4) {
        std::fprintf(stderr, "usage: %s read|write|unpack|pack <case> <count>\n", argv[0]);
        return 2;
    }
    const std::string operation = argv[1];
    void (*run)(const bench::StreamCase&) = operation == "read"     ? bench::ReadOnce
                                            : operation == "write"  ? bench::WriteOnce
                                            : operation == "unpack" ? Unpack
                                            : operation == "pack"   ? Pack
                                                                    : nullptr;
    const bench::StreamCase* message = bench::FindStreamCase(argv[2]);
    if (!run || !message) {
        std::fprintf(stderr, "unknown operation or case\n");
        return 2;
    }
    run(*message); // once before counting: the uniquer holds every text from then on
    for (long i = std::atol(argv[3]); i > 0; --i)
        run(*message);
    return 0;
}
