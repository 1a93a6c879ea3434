// The inside of a pool: which group serves a request, which requests go to the heap, and which
// pointers are taken back.

#include <algorithm>
#include <cstdint>
#include <cstring>
#include <vector>

#include <gtest/gtest.h>

#include "HeapSpy.hpp"
#include "Layout.hpp"
#include "MemPool/BucketMgr.hpp"
#include "PoolFixture.hpp"

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
    {4010, 4, 1001, 9, 4010, 4, 1000, 12, 248},
    {4010, 4, 200, 64, 4010, 4, 200, 64, 35},  // The minimum is above alignment + 4.
    {4010, 8, 64, 64, 4010, 8, 64, 64, 1},     // 56 bytes share the one group, 64 do not fit.
    {4010, 1, 40, 40, 4010, 1, 40, 40, 1},
    {4010, 0, 100, 8, 4010, 1, 100, 8, 93},
    {4010, 2, 101, 8, 4010, 2, 100, 8, 47},
    {4010, 3, 100, 7, 4010, 3, 99, 9, 31},
    {4010, 12, 300, 50, 4010, 12, 300, 60, 21},
    {4010, 8, 1000, 8, 4010, 8, 1000, 8, 125},  // The last place is never reached.
    {4010, 16, 32, 16, 4010, 16, 32, 16, 2},
    {504, 4, 500, 8, 504, 4, 500, 8, 124},  // The largest record fills its bucket.
    {65540, 256, 4096, 8, 65535, 256, 4096, 256, 16},
    {4010, 4, 7, 1, 4010, 4, 4, 4, 1},  // No record fits: everything goes to the heap.
    {4010, 8, 11, 4, 4010, 8, 8, 8, 1},
    {4010, 32, 100, largest, 4010, 32, 96, 0, 4},  // The minimum wraps to 0.
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
    const Blocks before = CheckInvariants(pool);
    for (const bool slow : {true, false}) {
        Settings::trace = slow;
        EXPECT_EQ(pool.FindBucket(data), nullptr);
        EXPECT_FALSE(pool.Contains(data));
        EXPECT_EQ(pool.GetSize(data), 0u);
        EXPECT_FALSE(pool.Free(data));
    }
    EXPECT_EQ(CheckInvariants(pool), before);
}

// Bytes that look like a bucket with one record, at any address: the record's data.
std::uint8_t* ForgeRecord(std::uint8_t* bucket, const Group* parent, std::uint16_t size,
                          std::uint16_t offset, std::uint8_t type) {
    std::memcpy(bucket, &parent, sizeof parent);
    std::memcpy(bucket + Layout::sizeAt, &size, sizeof size);
    Layout::SetHeader(Layout::Record(bucket, offset), type, offset);
    return Layout::Data(bucket, offset);
}

}  // namespace

// Blocks of all sizes up to well above the largest record live at once, allocated in ascending or
// descending order, on the fast path or the slow one.
TEST_F(PoolTest, EverySizeIsServedByItsClass) {
    for (const SizeSettings& is : sizeSettings) {
        std::vector<SizeClass> classes;
        std::vector<std::uint32_t> recDataSizes(is.numGroups);  // Room for all that come there.
        for (std::uint32_t size = 0; size <= is.poolMaximum + 8; ++size) {
            const SizeClass sizeClass = ClassOf(size, is);
            classes.push_back(sizeClass);
            if (sizeClass.isRecord) { recDataSizes[sizeClass.index] = sizeClass.dataSize; }
        }
        for (const int variant : {0, 1, 2, 3}) {
            SCOPED_TRACE(testing::Message() << "alignment " << is.alignment << ", " << is.minimum
                                            << " to " << is.maximum << ", variant " << variant);
            Use(is.bucketSize, is.alignment, is.maximum, is.minimum);
            BucketMgr pool(nullptr, "pool");
            EXPECT_EQ(pool.bucketSize, is.poolBucketSize);
            EXPECT_EQ(pool.dataAlignment, is.poolAlignment);
            EXPECT_EQ(pool.maxRecordSize, is.poolMaximum);
            EXPECT_EQ(pool.minRecordSize, is.poolMinimum);
            ASSERT_EQ(pool.numGroups, is.numGroups);

            Settings::trace = variant >= 2;
            for (std::uint32_t i = 0; i < classes.size(); ++i) {
                const std::uint32_t size = variant % 2 == 0 ? i : is.poolMaximum + 8 - i;
                const SizeClass& expected = classes[size];
                void* const data = pool.Alloc(size);
                const Bucket* const bucket = pool.FindBucket(data);
                ASSERT_EQ(bucket != nullptr, expected.isRecord) << size;
                if (bucket != nullptr) {
                    ASSERT_EQ(bucket->parent, pool.groups[expected.index]) << size;
                }
                ASSERT_EQ(pool.GetSize(data),
                          expected.isRecord ? recDataSizes[expected.index] : size);
            }
            EXPECT_EQ(CheckInvariants(pool).size(), classes.size());
        }
    }
}

// Sizes up to the limits of 16 bits, with a minimum above 15 bits too.
TEST_F(PoolTest, TheLargestRecordsAreServedByTheirClasses) {
    for (const std::uint32_t minimum : {5u, 40000u}) {
        Use(70000, 1, 65531, minimum);
        BucketMgr pool(nullptr, "pool");
        for (const std::uint32_t size : {1u, 39996u, 39997u, 65527u}) {
            const std::uint32_t recSize = std::max(size + 4, minimum);
            const Bucket* const bucket = pool.FindBucket(pool.Alloc(size));
            ASSERT_NE(bucket, nullptr) << size;
            EXPECT_EQ(bucket->parent, pool.groups[recSize - minimum]) << size;
            EXPECT_EQ(bucket->recSize, recSize);
        }
        EXPECT_EQ(pool.FindBucket(pool.Alloc(65528)), nullptr);
    }
}

// Headers that are like a record's in all but one point, also at odd addresses.
TEST_F(PoolTest, EachTestOfARecordCounts) {
    BucketMgr pool(nullptr, "pool");
    BucketMgr other(nullptr, "other");
    void* const freed = pool.Alloc(12);
    pool.Alloc(12);
    EXPECT_TRUE(pool.Free(freed));
    ExpectNone(pool, nullptr);
    ExpectNone(pool, freed);
    ExpectNone(pool, other.Alloc(12));

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
    }
}

TEST_F(PoolTest, EachTestOfAHeapRecordCounts) {
    BucketMgr pool(nullptr, "pool");
    alignas(ExtRec) std::uint8_t memory[64] = {};
    for (std::uint8_t* const block : {memory, memory + 1}) {
        std::uint8_t* const data = Layout::SetExtRec(block, 10000);
        EXPECT_TRUE(pool.Contains(data));
        EXPECT_EQ(pool.GetSize(data), 10000u);
        for (std::uint8_t* byte = data - Layout::recHdr; byte != data; ++byte) {
            ++*byte;
            ExpectNone(pool, data);
            --*byte;
        }
        ExpectNone(pool, Layout::SetExtRec(block, 0));
    }

    // The newest is in front, and a pool recognises the heap records of others.
    BucketMgr other(nullptr, "other");
    for (const std::uint32_t size : {2001u, 2002u}) {
        void* const data = other.Alloc(size);
        EXPECT_EQ(other.extRecs->Data(), data);
        EXPECT_EQ(
            std::memcmp(Layout::Bytes(data) - Layout::recHdr, Layout::extRecHdr, Layout::recHdr),
            0);
        EXPECT_TRUE(pool.Contains(data));
        EXPECT_EQ(pool.GetSize(data), size);
    }
    const ExtRec* const newest = other.extRecs;
    EXPECT_TRUE(other.Free(other.extRecs->Data()));
    EXPECT_EQ(HeapSpy::lastRelease, newest);
    EXPECT_EQ(std::count(&HeapSpy::releasedHead[0], &HeapSpy::releasedHead[Layout::extRec], 0),
              Layout::extRec);
}

TEST_F(PoolTest, ADisabledPoolIsTheHeap) {
    Settings::off = true;
    BucketMgr pool(nullptr, "pool");
    Settings::off = false;
    EXPECT_EQ(pool.numGroups, 249u);
    for (const std::uint32_t size : {0u, 12u, 70000u}) {
        for (const bool slow : {true, false}) {
            Settings::trace = slow;
            void* const data = pool.Alloc(size);
            EXPECT_FALSE(pool.Contains(data));
            EXPECT_EQ(pool.GetSize(data), 0u);
            pool.Clear();
            EXPECT_TRUE(HeapSpy::IsArray(data, size))
                << "Clear must leave plain heap blocks alone.";
            EXPECT_EQ(CheckInvariants(pool), Blocks());
            EXPECT_TRUE(pool.Free(data));
            EXPECT_EQ(HeapSpy::lastRelease, data);
            EXPECT_FALSE(pool.Free(nullptr));
        }
    }
    // Its queries still recognise the heap record of an enabled pool.
    BucketMgr enabled(nullptr, "enabled");
    EXPECT_EQ(pool.GetSize(enabled.Alloc(2000)), 2000u);
}

}  // namespace OBR::MemPool
