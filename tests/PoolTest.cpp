// A pool from within: which group serves a request, which requests go to the heap, what is taken
// back and what is not, and what is left when the heap refuses.

#include <algorithm>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <vector>

#include <gtest/gtest.h>

#include "HeapSpy.hpp"
#include "MemPool/BucketMgr.hpp"
#include "PoolFixture.hpp"
#include "PoolLaws.hpp"

namespace OBR::MemPool {

namespace {

class PoolTest : public PoolFixture {};

constexpr std::uint32_t largest = 0xFFFFFFFF;

// Settings, and what a pool makes of them.
constexpr struct SizeSettings {
    std::uint32_t bucketSize;
    std::uint16_t alignment;
    std::uint32_t maximum, minimum;
    std::uint32_t poolBucketSize, poolAlignment, poolMaximum, poolMinimum, numGroups;
} sizeSettings[] = {
    {4010, 4, 1000, 8, 4010, 4, 1000, 8, 249},
    {4010, 4, 1001, 9, 4010, 4, 1000, 12, 248},
    {4010, 4, 8, 0, 4010, 4, 8, 4, 2},
    {4010, 4, 200, 64, 4010, 4, 200, 64, 35},  // The minimum is above alignment + 4.
    {4010, 8, 200, 64, 4010, 8, 200, 64, 18},
    {4010, 8, 64, 64, 4010, 8, 64, 64, 1},  // 56 bytes share the one group, 64 do not fit.
    {4010, 1, 40, 40, 4010, 1, 40, 40, 1},
    {4010, 1, 100, 8, 4010, 1, 100, 8, 93},
    {4010, 0, 100, 8, 4010, 1, 100, 8, 93},
    {4010, 2, 101, 8, 4010, 2, 100, 8, 47},
    {4010, 3, 100, 7, 4010, 3, 99, 9, 31},
    {4010, 12, 300, 50, 4010, 12, 300, 60, 21},
    {4010, 8, 1000, 8, 4010, 8, 1000, 8, 125},  // The last place is never reached.
    {4010, 16, 500, 4, 4010, 16, 496, 16, 31},
    {4010, 16, 32, 16, 4010, 16, 32, 16, 2},
    {4010, 32, 1000, 100, 4010, 32, 992, 128, 28},
    {504, 4, 500, 8, 504, 4, 500, 8, 124},  // The largest record fills its bucket.
    {65536, 256, 4096, 8, 65535, 256, 4096, 256, 16},
    {65540, 4, 100, 8, 65535, 4, 100, 8, 24},
    {4010, 4, 7, 1, 4010, 4, 4, 4, 1},  // No record fits: everything goes to the heap.
    {4010, 8, 11, 4, 4010, 8, 8, 8, 1},
    {4010, 4, 100, largest, 4010, 4, 100, 0, 26},  // The minimum wraps to 0.
    {4010, 32, 100, largest, 4010, 32, 96, 0, 4},
    {4010, 4, largest, largest, 4010, 4, 0, 0, 1},
};

// The size class of a request, found by counting up.
struct SizeClass {
    bool isRecord;
    std::uint32_t index, dataSize;
};
SizeClass ClassOf(std::uint32_t size, const SizeSettings& is) {
    SizeClass result{false, 0, is.poolAlignment};
    while (result.dataSize < size) { result.dataSize += is.poolAlignment; }
    const std::uint32_t recSize = result.dataSize + 4;
    while (is.poolMinimum + (result.index + 1) * is.poolAlignment <= recSize) { ++result.index; }
    result.isRecord = recSize <= is.poolMaximum;
    return result;
}

void ExpectNone(BucketMgr& pool, void* data) {
    const Blocks before = CheckLaws(pool);
    for (const bool slow : {false, true}) {
        const SlowRoad road(slow);
        EXPECT_EQ(pool.FindBucket(data), nullptr);
        EXPECT_FALSE(pool.Contains(data));
        EXPECT_EQ(pool.GetSize(data), 0u);
        EXPECT_FALSE(pool.Free(data));
    }
    EXPECT_EQ(CheckLaws(pool), before);
}

// Bytes that look like a bucket with one record, at any address: the record's data.
std::uint8_t* ForgeRecord(std::uint8_t* bucket, const Group* parent, std::uint16_t size,
                          std::uint16_t offset, std::uint8_t type) {
    std::memcpy(bucket, &parent, sizeof parent);
    std::memcpy(bucket + 40, &size, sizeof size);
    std::memcpy(bucket + 46 + offset, &offset, sizeof offset);
    bucket[46 + offset + 2] = type;
    return bucket + 46 + offset + 4;
}

}  // namespace

// All sizes up to well above the largest record live at once, the smallest or the largest asked for
// first, on the short road or the slow one.
TEST_F(PoolTest, EverySizeIsServedByItsClass) {
    for (const SizeSettings& is : sizeSettings) {
        std::vector<SizeClass> classes;
        std::vector<std::uint32_t> recDataSizes(is.numGroups);  // Room for all that come there.
        for (std::uint32_t size = 0; size <= is.poolMaximum + 8; ++size) {
            classes.push_back(ClassOf(size, is));
            if (classes[size].isRecord) {
                recDataSizes[classes[size].index] = classes[size].dataSize;
            }
        }
        for (const int variant : {0, 1, 2, 3}) {
            SCOPED_TRACE(testing::Message() << "alignment " << is.alignment << ", " << is.minimum
                                            << " to " << is.maximum << ", variant " << variant);
            const bool upwards = variant % 2 == 0;
            Use(is.bucketSize, is.alignment, is.maximum, is.minimum, upwards);
            BucketMgr pool(nullptr, "pool");
            const SlowRoad road(variant >= 2);
            EXPECT_EQ(pool.bucketSize, is.poolBucketSize);
            EXPECT_EQ(pool.dataAlignment, is.poolAlignment);
            EXPECT_EQ(pool.maxRecordSize, is.poolMaximum);
            EXPECT_EQ(pool.minRecordSize, is.poolMinimum);
            ASSERT_EQ(pool.numGroups, is.numGroups);

            std::vector<void*> blocks(classes.size());
            for (std::uint32_t i = 0; i < blocks.size(); ++i) {
                const std::uint32_t size = upwards ? i : is.poolMaximum + 8 - i;
                void* const data = blocks[size] = pool.Alloc(size);
                const Bucket* const bucket = pool.FindBucket(data);
                ASSERT_EQ(bucket != nullptr, classes[size].isRecord) << size;
                std::uint32_t usable = size;
                if (bucket != nullptr) {
                    ASSERT_EQ(bucket->parent, pool.groups[classes[size].index]) << size;
                    usable = recDataSizes[classes[size].index];
                }
                ASSERT_EQ(pool.GetSize(data), usable) << size;
                std::memset(data, static_cast<int>(size % 0x100), usable);
            }
            EXPECT_EQ(CheckLaws(pool).size(), blocks.size());

            std::size_t numRefused = 0;
            for (std::uint32_t size = 0; size < blocks.size(); ++size) {
                const auto* const data = static_cast<const std::uint8_t*>(blocks[size]);
                const std::uint32_t usable = pool.GetSize(data);
                EXPECT_EQ(std::count(data, data + usable, size % 0x100), usable) << size;
                if (!pool.Free(blocks[size])) { ++numRefused; }
            }
            // A heap record of 0 bytes is none's, and stays.
            EXPECT_EQ(numRefused, classes[0].isRecord ? 0u : 1u);
            EXPECT_EQ(CheckLaws(pool).size(), numRefused);
        }
    }
}

TEST_F(PoolTest, ForeignPointersAreNone) {
    BucketMgr pool(nullptr, "pool");
    BucketMgr other(nullptr, "other");
    void* const freed = pool.Alloc(12);
    void* const keepsTheBucket = pool.Alloc(12);
    EXPECT_TRUE(pool.Free(freed));
    auto* const inHeap = static_cast<std::uint8_t*>(std::calloc(64, 1));
    std::uint8_t onStack[64] = {};
    ExpectNone(pool, nullptr);
    ExpectNone(pool, freed);
    ExpectNone(pool, inHeap);
    ExpectNone(pool, inHeap + 33);
    ExpectNone(pool, onStack + 8);
    ExpectNone(pool, other.Alloc(12));
    std::free(inHeap);
    EXPECT_TRUE(pool.Free(keepsTheBucket));
}

// Headers that are like a record's in all but one point, also at odd addresses.
TEST_F(PoolTest, EachTestOfARecordCounts) {
    BucketMgr pool(nullptr, "pool");
    BucketMgr other(nullptr, "other");
    pool.Alloc(12);
    other.Alloc(12);
    const Group* const own = pool.groups[2];
    alignas(Bucket) std::uint8_t memory[128] = {};

    void* const data = ForgeRecord(memory, own, 50, 2, 1);
    EXPECT_EQ(static_cast<void*>(pool.FindBucket(data)), memory);
    for (std::uint8_t* const bucket : {memory, memory + 1}) {
        for (const int type : {0, 2, 3, 0x81}) {
            ExpectNone(pool, ForgeRecord(bucket, own, 50, 2, static_cast<std::uint8_t>(type)));
        }
        ExpectNone(pool, ForgeRecord(bucket, own, 50, 0, 1));
        ExpectNone(pool, ForgeRecord(bucket, own, 50, 1, 1));
        ExpectNone(pool, ForgeRecord(bucket, nullptr, 50, 2, 1));
        ExpectNone(pool, ForgeRecord(bucket, own, 0, 2, 1));
        ExpectNone(pool, ForgeRecord(bucket, other.groups[2], 50, 2, 1));
    }
}

TEST_F(PoolTest, EachTestOfAHeapRecordCounts) {
    BucketMgr pool(nullptr, "pool");
    constexpr std::uint8_t image[] = {0x10, 0x27, 0, 0, 0xAA, 0xBB, 2, 0xCC};
    alignas(ExtRec) std::uint8_t memory[64] = {};
    for (std::uint8_t* const block : {memory, memory + 1}) {
        std::memcpy(block + 16, image, sizeof image);
        EXPECT_TRUE(pool.Contains(block + 24));
        EXPECT_EQ(pool.GetSize(block + 24), 10000u);
        for (std::size_t i = 20; i < 24; ++i) {
            ++block[i];
            ExpectNone(pool, block + 24);
            --block[i];
        }
        block[16] = block[17] = 0;
        ExpectNone(pool, block + 24);
    }

    // Whose it is, is no test.
    BucketMgr other(nullptr, "other");
    void* const data = other.Alloc(2001);
    EXPECT_TRUE(pool.Contains(data));
    EXPECT_EQ(pool.GetSize(data), 2001u);
}

TEST_F(PoolTest, HeapRecordsLeaveTheirListInEveryOrder) {
    std::vector<std::size_t> order{0, 1, 2};
    do {
        for (const bool slow : {false, true}) {
            BucketMgr pool(nullptr, "pool");
            void* blocks[3];
            for (void*& data : blocks) {
                data = pool.Alloc(5000);
                EXPECT_EQ(pool.extRecs->Data(), data) << "The newest is in front.";
            }
            for (std::size_t left = 3; left-- > 0;) {
                const SlowRoad road(slow);
                EXPECT_TRUE(pool.Free(blocks[order[left]]));
                EXPECT_EQ(HeapSpy::lastRelease.size, 5024u);
                const std::uint8_t* const head = HeapSpy::releasedHead.data();
                EXPECT_EQ(std::count(head, head + 24, 0), 24);
                EXPECT_EQ(CheckLaws(pool).size(), left);
            }
            EXPECT_EQ(pool.extRecs, nullptr);
        }
    } while (std::next_permutation(order.begin(), order.end()));
}

TEST_F(PoolTest, ClearLeavesAPoolAsNew) {
    Use(52, 4, 40, 8);
    BucketMgr pool(nullptr, "pool");
    const std::size_t before = HeapSpy::numLive;
    for (int round = 0; round < 3; ++round) {
        for (std::uint32_t size = 0; size < 60; ++size) { pool.Alloc(size); }
        EXPECT_EQ(CheckLaws(pool).size(), 60u);
        for (int again = 0; again < 2; ++again) {
            pool.Clear();
            EXPECT_EQ(HeapSpy::numLive, before);
            EXPECT_EQ(CheckLaws(pool), Blocks());
            EXPECT_EQ(std::count(pool.groups, pool.groups + pool.numGroups, nullptr), 9);
        }
    }
}

TEST_F(PoolTest, BucketsAreNumberedByClassAndThenTheNewestFirst) {
    Use(40, 4, 36, 8);
    BucketMgr pool(nullptr, "pool");
    std::vector<const Bucket*> expected;
    for (const std::uint32_t size : {32u, 32u, 20u, 20u, 16u}) {  // A bucket each.
        expected.insert(expected.begin(), pool.FindBucket(pool.Alloc(size)));
    }
    EXPECT_EQ(pool.GetNumBuckets(), 5u);
    for (std::uint32_t index = 0; index < 5; ++index) {
        EXPECT_EQ(pool.GetBucket(index), expected[index]) << index;
    }
    EXPECT_EQ(pool.GetBucket(5), nullptr);
    EXPECT_EQ(pool.GetBucket(largest), nullptr);
}

TEST_F(PoolTest, ADisabledPoolIsTheHeap) {
    Settings::off = true;
    BucketMgr pool(nullptr, "pool");
    Settings::off = false;
    EXPECT_EQ(pool.numGroups, 249u);
    for (const std::uint32_t size : {0u, 1u, 12u, 997u, 70000u}) {
        for (const bool slow : {false, true}) {
            const SlowRoad road(slow);
            void* const data = pool.Alloc(size);
            const HeapSpy::Block block{data, size, HeapSpy::Form::array};
            ASSERT_NE(HeapSpy::Find(data), nullptr);
            EXPECT_TRUE(*HeapSpy::Find(data) == block);
            EXPECT_FALSE(pool.Contains(data));
            EXPECT_EQ(pool.GetSize(data), 0u);
            pool.Clear();
            EXPECT_NE(HeapSpy::Find(data), nullptr) << "Clear is not for blocks of the heap.";
            EXPECT_EQ(CheckLaws(pool), Blocks());
            EXPECT_EQ(std::count(pool.groups, pool.groups + pool.numGroups, nullptr), 249);
            EXPECT_TRUE(pool.Free(data));
            EXPECT_TRUE(HeapSpy::lastRelease == block);
            EXPECT_FALSE(pool.Free(nullptr));
        }
    }
    // Its questions still know the heap record of an enabled pool.
    BucketMgr enabled(nullptr, "enabled");
    EXPECT_EQ(pool.GetSize(enabled.Alloc(2000)), 2000u);
}

TEST_F(PoolTest, APoolKeepsTheSettingsThatItWasBuiltWith) {
    BucketMgr pool(nullptr, "pool");
    Use(100, 16, 64, 32, true);
    Settings::off = true;
    void* const data = pool.Alloc(9);
    EXPECT_EQ(pool.GetSize(data), 12u);
    EXPECT_EQ(pool.FindBucket(data)->size, 4002);
    EXPECT_TRUE(pool.Free(data));
    EXPECT_EQ(pool.GetNumBuckets(), 0u);
    EXPECT_EQ(pool.GetSize(pool.Alloc(996)), 996u);
    EXPECT_EQ(pool.numExtRecs, 0u);
}

// Each request of the heap behind one Alloc is refused in turn.
TEST_F(PoolTest, ARefusedRequestLeavesThePoolWhole) {
    constexpr struct {
        std::uint32_t size, numRequests;
    } rows[] = {{12, 2},  {12, 0}, {12, 0},  // a class and its bucket of three records,
                {12, 1},  {28, 2},           // a second bucket, another class,
                {100, 1}, {100, 1}};         // two heap records.
    Use(52, 4, 48, 8);
    BucketMgr pool(nullptr, "pool");
    for (const auto& row : rows) {
        SCOPED_TRACE(row.size);
        const Blocks before = CheckLaws(pool);
        std::uint32_t n = 0;
        for (; HeapSpy::FailsAt(n, [&] { pool.Alloc(row.size); }); ++n) {
            EXPECT_EQ(CheckLaws(pool), before);
        }
        EXPECT_EQ(n, row.numRequests);
        EXPECT_EQ(CheckLaws(pool).size(), before.size() + 1);
    }
}

}  // namespace OBR::MemPool
