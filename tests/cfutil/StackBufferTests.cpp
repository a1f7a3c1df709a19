// TStackBuffer: where the elements live, what each resize keeps, and what it allocates. The
// heap traffic is observed through a replacement of the global operator new/delete that records
// the sizes requested while a test's work runs.
#include <algorithm>
#include <cstdint>
#include <cstdlib>
#include <new>
#include <optional>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

#include "cfutil/TStackBuffer.h"

namespace {

struct HeapTraffic {
    std::size_t sizes[8] = {}, allocations = 0, frees = 0;
    std::vector<std::size_t> Sizes() const {
        return {sizes, sizes + std::min<std::size_t>(allocations, 8)};
    }
};
HeapTraffic* gTraffic = nullptr;

/// The heap traffic of `work`.
template <class Work> HeapTraffic TrafficOf(Work work) {
    HeapTraffic traffic;
    gTraffic = &traffic;
    work();
    gTraffic = nullptr;
    return traffic;
}

template <class Buffer> bool IsInline(const Buffer& buffer) {
    auto begin = reinterpret_cast<std::uintptr_t>(&buffer);
    auto element = reinterpret_cast<std::uintptr_t>(buffer.GetBuffer());
    return element >= begin && element < begin + sizeof(Buffer);
}

} // namespace

void* operator new(std::size_t size) {
    if (gTraffic && gTraffic->allocations < 8)
        gTraffic->sizes[gTraffic->allocations] = size;
    if (gTraffic)
        ++gTraffic->allocations;
    if (void* memory = std::malloc(size ? size : 1))
        return memory;
    throw std::bad_alloc();
}
void operator delete(void* memory) noexcept {
    if (gTraffic && memory)
        ++gTraffic->frees;
    std::free(memory);
}
void operator delete(void* memory, std::size_t) noexcept {
    operator delete(memory);
}

TEST(StackBuffer, UpToCapacityIsInlineAndBeyondIsOneExactAllocationBothZeroed) {
    std::optional<TStackBuffer<char, 30>> full, empty;
    std::optional<TStackBuffer<const void*, 30>> spilled;
    EXPECT_EQ(TrafficOf([&] {
                  full.emplace(30);
                  empty.emplace(0);
              }).Sizes(),
              std::vector<std::size_t>{});
    EXPECT_EQ(TrafficOf([&] { spilled.emplace(31); }).Sizes(),
              std::vector<std::size_t>{31 * sizeof(void*)});
    EXPECT_TRUE(IsInline(*full) && IsInline(*empty) && !IsInline(*spilled));
    EXPECT_EQ(full->GetCount() + empty->GetCount() + spilled->GetCount(), 61u);
    for (uint64_t i = 0; i < 31; ++i) {
        EXPECT_EQ(std::as_const(*spilled)[i], nullptr) << i;
        EXPECT_EQ(i < 30 ? (*full)[i] : 0, 0) << i;
    }
    EXPECT_EQ(reinterpret_cast<std::uintptr_t>(full->GetBuffer()) % 16, 0u);
}

TEST(StackBuffer, ResizingKeepsThePrefixZeroesTheRestAndFreesWhatItLeaves) {
    const struct {
        uint64_t from, to;
        bool isInline; // afterwards: the heap block is freed, and nothing allocated
    } rows[] = {{40, 10, true}, {31, 0, true}, {10, 40, false}, {40, 100, false}};
    for (const auto& row : rows) {
        SCOPED_TRACE(testing::Message() << row.from << " to " << row.to);
        TStackBuffer<char, 30> buffer(row.from);
        for (uint64_t i = 0; i < row.from; ++i)
            buffer[i] = static_cast<char>(i + 1);
        HeapTraffic traffic = TrafficOf([&] { buffer.SetCount(row.to); });
        EXPECT_EQ(buffer.GetCount(), row.to);
        EXPECT_EQ(IsInline(buffer), row.isInline);
        if (row.isInline) {
            EXPECT_EQ(traffic.Sizes(), std::vector<std::size_t>{});
            EXPECT_EQ(traffic.frees, 1u);
        }
        for (uint64_t i = 0; i < row.to; ++i)
            EXPECT_EQ(buffer[i], i < row.from ? static_cast<char>(i + 1) : 0) << i;
    }
}

TEST(StackBuffer, ResizingWithinInlineStorageNeitherMovesNorZeroes) {
    TStackBuffer<char, 30> buffer(20);
    for (uint64_t i = 0; i < 20; ++i)
        buffer[i] = static_cast<char>(i + 1);
    const char* before = buffer.GetBuffer();
    EXPECT_EQ(TrafficOf([&] {
                  buffer.SetCount(5);
                  buffer.SetCount(20);
              }).Sizes(),
              std::vector<std::size_t>{});
    EXPECT_EQ(buffer.GetBuffer(), before);
    for (uint64_t i = 0; i < 20; ++i)
        EXPECT_EQ(buffer[i], static_cast<char>(i + 1)) << i;
}
