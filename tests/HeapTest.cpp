// A Heap from within, on a heap that is watched: blocks, the calls of C, figures and settings.

#include <MemPoolHeap>

#include <fcntl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cstdint>
#include <cstring>
#include <iterator>
#include <map>
#include <memory>
#include <random>
#include <sstream>
#include <string>
#include <tuple>

#include <gtest/gtest.h>

#include "HeapSpy.hpp"
#include "PoolFixture.hpp"

namespace OBR::MemPool {

namespace {

struct WalkSettings {
    std::uint32_t bucketSize;
    std::uint16_t alignment;
    std::uint32_t maximum, minimum;
    bool keepEmptyBuckets;
    bool on;
};

// The walk's heap has the settings of the process. Live blocks are filled as far as they may be.
class HeapWalkTest : public PoolFixture, public testing::WithParamInterface<WalkSettings> {
protected:
    struct Block {
        std::size_t size, alignment, usable;
        std::uint8_t fill;
    };
    using Live = std::map<std::uint8_t*, Block>;

    std::uint32_t Below(std::size_t n) { return static_cast<std::uint32_t>(random() % n); }
    std::size_t Size() {
        const std::size_t sizes[] = {Below(40), Below(GetParam().maximum + 20),
                                     Below(3 * GetParam().maximum)};
        return sizes[Below(3)];
    }

    // Runs `request` for a block that replaces `old`, if given. It may be refused, and then gives
    // null, or throws if it is C++'s, and changes nothing.
    template <typename Request>
    void Take(std::size_t size, std::size_t alignment, Live::iterator old, Request request) {
        const Block before = old == live.end() ? Block{} : old->second;
        HeapSpy::refuseIn = Below(6) == 0 ? 1 + Below(2) : 0;
        const std::size_t armed = HeapSpy::refuseIn;
        auto* const data = static_cast<std::uint8_t*>(request());
        const bool refused = armed != 0 && HeapSpy::refuseIn == 0;
        HeapSpy::refuseIn = 0;
        ASSERT_EQ(data == nullptr, refused);
        if (refused) { return; }
        if (old != live.end()) {
            EXPECT_EQ(data == old->first, size <= before.usable);
            const std::size_t kept = std::min(size, before.usable);
            EXPECT_EQ(std::count(data, data + kept, before.fill), kept);
            if (data == old->first) { size = std::max(size, before.size); }
            live.erase(old);
        }
        const Block block{size, alignment, heap->UsableSize(data),
                          static_cast<std::uint8_t>(Below(256))};
        ASSERT_GE(block.usable, size);
        std::memset(data, block.fill, block.usable);
        ASSERT_TRUE(live.emplace(data, block).second);
    }

    void Give(bool forC) {
        if (live.empty()) { return; }
        const auto entry = std::next(live.begin(), Below(live.size()));
        const auto [data, block] = *entry;
        EXPECT_EQ(std::count(data, data + block.usable, block.fill), block.usable);
        if (forC) {
            EXPECT_TRUE(heap->Free(data));
        } else {
            heap->Deallocate(data, block.size, block.alignment);
        }
        live.erase(entry);
    }

    void Step() {
        const std::size_t event = Below(100);
        const std::size_t size = Size();
        if (event < 20) {
            Take(size, 8, live.end(), [&] { return heap->Malloc(size); });
        } else if (event < 40) {
            const std::size_t alignment = std::size_t{1} << Below(13);
            Take(size, alignment, live.end(), [&]() -> void* {
                try {
                    return heap->Allocate(size, alignment);
                } catch (const std::bad_alloc&) { return nullptr; }
            });
        } else if (event < 50) {
            Take(size * 3, 8, live.end(), [&] {
                auto* const data = static_cast<std::uint8_t*>(heap->Calloc(3, size));
                if (data != nullptr) { EXPECT_EQ(std::count(data, data + size * 3, 0), size * 3); }
                return data;
            });
        } else if (event < 70 && !live.empty() && size != 0) {
            const auto old = std::next(live.begin(), Below(live.size()));
            const std::size_t alignment = size <= old->second.usable ? old->second.alignment : 8;
            Take(size, alignment, old, [&] { return heap->Realloc(old->first, size); });
        } else if (event < 99) {
            Give(event % 2 == 0);
        } else {
            heap->FreeAll();
            live.clear();
        }
    }

    // The heap's figures are those of the blocks and of what was asked of the heap below. Each
    // block lies where it should, in data of the pool's if it has records.
    void Check(std::size_t arrayBytesIfNew) {
        std::size_t sizes = 0;
        for (const auto& [data, block] : live) {
            sizes += std::max<std::size_t>(block.size, 1);
            EXPECT_EQ(reinterpret_cast<std::uintptr_t>(data) % block.alignment, 0u);
            EXPECT_EQ(heap->UsableSize(data), block.usable);
        }
        const HeapStats stats = heap->GetStats();
        EXPECT_EQ(stats.bytesHeld, HeapSpy::arrayBytes - arrayBytesIfNew);
        EXPECT_EQ(stats.usedRecords + stats.heapRecords, live.size());
        const Blocks blocks = CheckInvariants(*heap->GetMgr().GetBucketMgr());
        if (!GetParam().on) {
            EXPECT_EQ(stats.bytesUsed, sizes);
            return;
        }
        ASSERT_EQ(blocks.size(), live.size());
        std::size_t bytes = 0;
        auto block = blocks.begin();
        for (const auto& [data, is] : live) {
            EXPECT_LE(block->first, data);
            EXPECT_EQ(data + is.usable, block->first + block->second);
            bytes += block->second;
            ++block;
        }
        EXPECT_EQ(stats.bytesUsed, bytes);
    }

    std::mt19937 random{4};
    Live live;
    std::unique_ptr<Heap> heap;
};

}  // namespace

TEST_P(HeapWalkTest, KeepsEveryBlock) {
    const WalkSettings& is = GetParam();
    Use(is.bucketSize, is.alignment, is.maximum, is.minimum, is.keepEmptyBuckets);
    Settings::off = !is.on;
    heap = std::make_unique<Heap>();
    const std::size_t arrayBytesIfNew = HeapSpy::arrayBytes;
    for (int step = 0; step < 1500 && !HasFailure(); ++step) {
        SCOPED_TRACE(step);
        Step();
        Check(arrayBytesIfNew);
    }
    heap.reset();
}

INSTANTIATE_TEST_SUITE_P(Settings, HeapWalkTest,
                         testing::Values(WalkSettings{4010, 4, 1000, 8, false, true},
                                         WalkSettings{4010, 4, 1000, 8, false, false},
                                         WalkSettings{203, 1, 101, 7, true, true},
                                         WalkSettings{300, 3, 90, 40, false, true},
                                         WalkSettings{500, 12, 490, 5, true, true},
                                         WalkSettings{24, 4, 20, 20, false, true},
                                         WalkSettings{4010, 16, 19, 4, false, true}));

}  // namespace OBR::MemPool
