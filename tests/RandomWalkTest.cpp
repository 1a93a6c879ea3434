// A seeded walk through everything that a host can do to a pool, with a heap that refuses at times,
// beside a simple account of the blocks that live. All invariants hold after every step, and no
// block's bytes are ever touched.

#include <algorithm>
#include <cstdint>
#include <cstring>
#include <iterator>
#include <map>
#include <random>
#include <vector>

#include <gtest/gtest.h>

#include "HeapSpy.hpp"
#include "MemPool/BucketMgr.hpp"
#include "PoolFixture.hpp"

namespace OBR::MemPool {

namespace {

class RandomWalkTest : public PoolFixture, public testing::WithParamInterface<WalkSettings> {
protected:
    struct Block {
        std::uint32_t usable;
        std::uint8_t fill;
    };

    std::uint32_t Below(std::size_t n) { return static_cast<std::uint32_t>(random() % n); }

    void Alloc(BucketMgr& pool) {
        const std::uint32_t maximum = GetParam().maximum;
        const std::uint32_t sizes[] = {Below(40), Below(maximum), maximum - Below(12),
                                       Below(3 * maximum)};
        const std::uint32_t size = sizes[Below(4)];
        void* data = nullptr;
        const bool refuses = Below(8) == 0;
        Settings::trace = Below(4) == 0;
        const std::size_t refusal = refuses ? Below(2) : SIZE_MAX - 1;
        if (HeapSpy::FailsAt(refusal, [&] { data = pool.Alloc(size); })) { return; }
        const Block block{pool.GetSize(data), static_cast<std::uint8_t>(Below(256))};
        ASSERT_GE(block.usable, size);
        std::memset(data, block.fill, block.usable);
        ASSERT_TRUE(live.emplace(static_cast<std::uint8_t*>(data), block).second);
    }

    void Free(BucketMgr& pool) {
        if (live.empty()) { return; }
        const auto entry = std::next(live.begin(), Below(live.size()));
        const auto [data, block] = *entry;
        EXPECT_EQ(std::count(data, data + block.usable, block.fill), block.usable);
        Settings::trace = Below(4) == 0;
        const bool staysInBucket = pool.keepEmptyBuckets && pool.FindBucket(data) != nullptr;
        // A heap record of no bytes waits for Clear.
        EXPECT_EQ(pool.Free(data), block.usable != 0);
        if (block.usable != 0) { live.erase(entry); }
        if (staysInBucket) { EXPECT_FALSE(pool.Free(data)) << "freed twice"; }
    }

    std::mt19937 random{3};
    std::map<std::uint8_t*, Block> live;
};

}  // namespace

TEST_P(RandomWalkTest, KeepsEveryInvariant) {
    Use(GetParam());
    BucketMgr pool(nullptr, "pool");
    const std::size_t numLiveIfNew = HeapSpy::numLive;
    Use(100, 7, 77, 1, !GetParam().keepEmptyBuckets);  // Later settings do not reach the pool.
    Settings::off = true;
    for (int step = 0; step < 1500 && !HasFailure(); ++step) {
        SCOPED_TRACE(step);
        const bool grows = step % 300 < 150;
        const std::uint32_t event = Below(200);
        if (event == 0) {
            pool.Clear();
            live.clear();
            EXPECT_EQ(HeapSpy::numLive, numLiveIfNew);
            EXPECT_EQ(std::count(pool.groups, pool.groups + pool.numGroups, nullptr),
                      pool.numGroups);
        } else if (event < (grows ? 150u : 60u)) {
            Alloc(pool);
        } else {
            Free(pool);
        }
        Blocks expected;
        for (const auto& [data, block] : live) { expected[data] = block.usable; }
        ASSERT_EQ(CheckInvariants(pool), expected);
    }
}

INSTANTIATE_TEST_SUITE_P(Settings, RandomWalkTest,
                         testing::Values(WalkSettings{"Small", 200, 4, 100, 8, false},
                                         WalkSettings{"SmallKept", 200, 4, 100, 8, true},
                                         WalkSettings{"OddAddresses", 103, 1, 50, 8, false},
                                         WalkSettings{"AlignedTo3", 300, 3, 90, 40, true},
                                         WalkSettings{"AlignedTo32", 500, 32, 490, 64, false},
                                         WalkSettings{"OneRecord", 24, 4, 20, 20, false},
                                         WalkSettings{"OneRecordKept", 24, 4, 20, 20, true},
                                         WalkSettings{"NoBucket", 4010, 16, 19, 4, false}));

}  // namespace OBR::MemPool
