// Counts the heap memory one stream operation asks for: the bytes and the number of calls to
// malloc, calloc and realloc (operator new goes through malloc) while it reads or writes one of
// the stream benchmarks' cases. The counts are exact and do not depend on the machine's load.
// The first operation is reported on its own: for a read, it is the one that enters every text
// into the uniquer (whose strings then live for the process), so it shows what the strings cost.
//
// The allocation functions are replaced by counting wrappers around glibc's own, so every
// allocation of the process is seen, the libraries' included. Each operation runs once before
// counting, so that the uniquer already holds every text (as in a long-running agent), then
// `count` times; the report is per operation, after the first one's. Frees are not counted: every
// operation here gives back what it took.
//
// Not built by CMake (it needs no harness): RESULTS.md, "Memory per request", has the commands.
//
// Operations: read (TCFResurrectContext, Retrieve of the top-level kind, result released) and
// write (TCFFlattenContext into a new buffer). Cases: the names of BenchContent's cases.
#include <cstddef>
#include <cstdio>
#include <cstdlib>
#include <string>

#include "BenchContent.h"

extern "C" {
void* __libc_malloc(size_t size);
void* __libc_calloc(size_t count, size_t size);
void* __libc_realloc(void* pointer, size_t size);
void __libc_free(void* pointer);
}

namespace {

bool counting = false;
unsigned long long allocations = 0;
unsigned long long allocatedBytes = 0;

void Count(size_t bytes) {
    if (counting) {
        ++allocations;
        allocatedBytes += bytes;
    }
}

} // namespace

extern "C" {
void* malloc(size_t size) {
    Count(size);
    return __libc_malloc(size);
}
void* calloc(size_t count, size_t size) {
    Count(count * size);
    return __libc_calloc(count, size);
}
void* realloc(void* pointer, size_t size) {
    Count(size);
    return __libc_realloc(pointer, size);
}
void free(void* pointer) {
    __libc_free(pointer);
}
}

int main(int argc, char** argv) {
    if (argc != 4) {
        std::fprintf(stderr, "usage: %s read|write <case> <count>\n", argv[0]);
        return 2;
    }
    const std::string operation = argv[1];
    void (*run)(const bench::StreamCase&) = operation == "read"    ? bench::ReadOnce
                                            : operation == "write" ? bench::WriteOnce
                                                                   : nullptr;
    const bench::StreamCase* message = bench::FindStreamCase(argv[2]);
    const long count = std::atol(argv[3]);
    if (!run || !message || count <= 0) {
        std::fprintf(stderr, "unknown operation or case, or a count below 1\n");
        return 2;
    }
    // The first run: the uniquer holds every text from then on.
    counting = true;
    run(*message);
    std::printf("%s %s, first: %llu allocations, %llu bytes\n", argv[1], argv[2], allocations,
                allocatedBytes);
    allocations = allocatedBytes = 0;
    for (long i = count; i > 0; --i)
        run(*message);
    counting = false;
    std::printf("%s %s: %.1f allocations, %.1f bytes per operation\n", argv[1], argv[2],
                double(allocations) / double(count), double(allocatedBytes) / double(count));
    return 0;
}
