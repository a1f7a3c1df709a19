// TStackBuffer: where the elements live, what each resize keeps, and what it allocates. The
// heap traffic is observed through a replacement of the global operator new/delete that records
// the sizes requested while an AllocationRecorder is active.
#include <algorithm>
#include <cstdint>
#include <cstdlib>
#include <new>
#include <vector>

#include <gtest/gtest.h>

#include "cfutil/TStackBuffer.h"

namespace {

struct AllocationLog {
    bool recording = false;
    std::size_t allocations = 0;
    std::size_t sizes[8] = {};
    std::size_t frees = 0;
};
AllocationLog gLog;

/// Records the heap traffic of the current thread from construction to Stop().
class AllocationRecorder {
public:
    AllocationRecorder() { gLog = AllocationLog{true}; }
    ~AllocationRecorder() { gLog.recording = false; }
    void Stop() { gLog.recording = false; }
    std::vector<std::size_t> Sizes() const {
        return {gLog.sizes, gLog.sizes + std::min<std::size_t>(gLog.allocations, 8)};
    }
    std::size_t Frees() const { return gLog.frees; }
};

template <class Buffer> bool IsInline(const Buffer& buffer) {
    auto begin = reinterpret_cast<std::uintptr_t>(&buffer);
    auto element = reinterpret_cast<std::uintptr_t>(buffer.GetBuffer());
    return element >= begin && element < begin + sizeof(Buffer);
}

template <class Buffer> void FillWithIndexPlusOne(Buffer& buffer) {
    for (uint64_t i = 0; i < buffer.GetCount(); ++i)
        buffer[i] = static_cast<char>(i + 1);
}

} // namespace

void* operator new(std::size_t size) {
    if (gLog.recording) {
        if (gLog.allocations < 8)
            gLog.sizes[gLog.allocations] = size;
        ++gLog.allocations;
    }
    if (void* memory = std::malloc(size ? size : 1))
        return memory;
    throw std::bad_alloc();
}
void operator delete(void* memory) noexcept {
    if (gLog.recording && memory)
        ++gLog.frees;
    std::free(memory);
}
void operator delete(void* memory, std::size_t) noexcept {
    operator delete(memory);
}

TEST(StackBuffer, CountUpToCapacityIsInlineAndZeroedWithoutAllocation) {
    AllocationRecorder recorder;
    TStackBuffer<char, 30> buffer(30);
    TStackBuffer<char, 30> empty(0);
    recorder.Stop();

    EXPECT_EQ(recorder.Sizes(), std::vector<std::size_t>{});
    EXPECT_EQ(buffer.GetCount(), 30u);
    EXPECT_TRUE(IsInline(buffer));
    for (uint64_t i = 0; i < 30; ++i)
        EXPECT_EQ(buffer[i], 0) << i;
    EXPECT_EQ(empty.GetCount(), 0u);
    EXPECT_TRUE(IsInline(empty));
    EXPECT_EQ(reinterpret_cast<std::uintptr_t>(buffer.GetBuffer()) % 16, 0u);
}

TEST(StackBuffer, CountBeyondCapacityAllocatesExactlyThatManyZeroElements) {
    AllocationRecorder recorder;
    TStackBuffer<const void*, 30> buffer(31);
    recorder.Stop();

    EXPECT_EQ(recorder.Sizes(), std::vector<std::size_t>{31 * sizeof(void*)});
    EXPECT_EQ(buffer.GetCount(), 31u);
    EXPECT_FALSE(IsInline(buffer));
    const auto& constBuffer = buffer;
    for (uint64_t i = 0; i < 31; ++i)
        EXPECT_EQ(constBuffer[i], nullptr) << i;
}

TEST(StackBuffer, ShrinkingFromHeapMovesPrefixInlineOrToZeroAndFreesHeap) {
    TStackBuffer<char, 30> buffer(40);
    FillWithIndexPlusOne(buffer);

    AllocationRecorder recorder;
    buffer.SetCount(10);
    recorder.Stop();

    EXPECT_EQ(recorder.Sizes(), std::vector<std::size_t>{});
    EXPECT_EQ(recorder.Frees(), 1u);
    EXPECT_EQ(buffer.GetCount(), 10u);
    EXPECT_TRUE(IsInline(buffer));
    EXPECT_EQ(std::vector<char>(buffer.GetBuffer(), buffer.GetBuffer() + 10),
              (std::vector<char>{1, 2, 3, 4, 5, 6, 7, 8, 9, 10}));

    TStackBuffer<char, 30> emptied(31);
    AllocationRecorder toZero;
    emptied.SetCount(0);
    toZero.Stop();
    EXPECT_EQ(toZero.Frees(), 1u);
    EXPECT_EQ(emptied.GetCount(), 0u);
    EXPECT_TRUE(IsInline(emptied));
}

TEST(StackBuffer, GrowingKeepsElementsAndAddsZerosWhetherSpillingOrOnHeap) {
    for (auto [from, to] : {std::pair<uint64_t, uint64_t>{10, 40}, {40, 100}}) {
        TStackBuffer<char, 30> buffer(from);
        FillWithIndexPlusOne(buffer);
        buffer.SetCount(to);
        EXPECT_EQ(buffer.GetCount(), to);
        EXPECT_FALSE(IsInline(buffer));
        for (uint64_t i = 0; i < to; ++i)
            EXPECT_EQ(buffer[i], i < from ? static_cast<char>(i + 1) : 0) << from << " " << i;
    }
}

TEST(StackBuffer, ResizingWithinInlineStorageNeitherMovesNorZeroes) {
    TStackBuffer<char, 30> buffer(20);
    FillWithIndexPlusOne(buffer);
    const char* before = buffer.GetBuffer();

    AllocationRecorder recorder;
    buffer.SetCount(5);
    buffer.SetCount(20);
    recorder.Stop();

    EXPECT_EQ(recorder.Sizes(), std::vector<std::size_t>{});
    EXPECT_EQ(buffer.GetBuffer(), before);
    for (uint64_t i = 0; i < 20; ++i)
        EXPECT_EQ(buffer[i], static_cast<char>(i + 1)) << i;
}
