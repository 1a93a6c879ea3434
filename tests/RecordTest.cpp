// The memory of a bucket, byte by byte, and the order in which a group takes records and makes and
// releases buckets.

#include <algorithm>
#include <array>
#include <cstdint>
#include <cstring>
#include <random>
#include <vector>

#include <gtest/gtest.h>

#include "HeapSpy.hpp"
#include "Layout.hpp"
#include "MemPool/BucketMgr.hpp"
#include "PoolFixture.hpp"

namespace OBR::MemPool {

namespace {

class RecordTest : public PoolFixture {};

using Bytes = std::vector<std::uint8_t>;

// The bytes of all records from the first one's header on.
Bytes RecordsOf(const Bucket* bucket) {
    return Bytes(Layout::Record(bucket, Layout::firstOffset), Layout::Record(bucket, bucket->size));
}

// Sets the expected header of the record at `offset`.
void Expect(Bytes& records, std::uint32_t offset, std::uint8_t type, std::uint32_t link) {
    Layout::SetHeader(&records[offset - Layout::firstOffset], type, link);
}

}  // namespace

// Every byte of a bucket when it is made, when all records have been taken, when they have come
// back in any order, and when it is destroyed.
TEST_F(RecordTest, EveryByteOfABucketIsAsDrawn) {
    constexpr struct {
        std::uint32_t bucketSize, dataSize, totalRecs, size;
    } rows[] = {
        {4010, 4, 501, 4010},    {4011, 397, 9, 3611},  // One byte short of ten records.
        {4012, 397, 10, 4012},   {9, 1, 1, 7},
        {65535, 9, 5041, 65535}, {65535, 65527, 1, 65533},
    };
    std::mt19937 random(1);
    for (const auto& row : rows) {
        SCOPED_TRACE(testing::Message() << row.bucketSize << " of " << row.dataSize);
        const std::uint32_t recSize = row.dataSize + 4;
        Group group(nullptr, row.dataSize, row.bucketSize, false);
        Bucket* const bucket = Bucket::Create(&group, row.bucketSize, row.dataSize);
        EXPECT_TRUE(HeapSpy::IsArray(bucket, row.size + Layout::recsBase));
        EXPECT_EQ(bucket->parent, &group);
        for (const Bucket* link : {bucket->next1, bucket->prev1, bucket->next2, bucket->prev2}) {
            EXPECT_EQ(link, nullptr);
        }
        ASSERT_EQ(bucket->size, row.size);
        ASSERT_EQ(bucket->recSize, recSize);
        ASSERT_EQ(bucket->numFree, row.totalRecs);
        EXPECT_EQ(bucket->freeHead, 2);
        EXPECT_EQ(bucket->TotalRecs(), static_cast<std::int32_t>(row.totalRecs));

        Bytes expected(row.size - 2, HeapSpy::freshByte);
        for (std::uint32_t offset = 2; offset < row.size; offset += recSize) {
            Expect(expected, offset, Layout::typeFree,
                   offset + recSize < row.size ? offset + recSize : 0);
        }
        EXPECT_TRUE(RecordsOf(bucket) == expected) << "made";

        std::vector<std::uint32_t> offsets;
        for (std::uint32_t offset = 2; offset < row.size; offset += recSize) {
            EXPECT_EQ(bucket->numFree == bucket->TotalRecs(), offset == 2);
            EXPECT_NE(bucket->numFree, 0);
            EXPECT_EQ(bucket->TakeRecord(), Layout::Data(bucket, offset));
            Expect(expected, offset, Layout::typeUsed, offset);
            offsets.push_back(offset);
        }
        EXPECT_TRUE(RecordsOf(bucket) == expected) << "taken";
        EXPECT_EQ(bucket->freeHead, 0);
        EXPECT_EQ(bucket->numFree, 0);

        std::shuffle(offsets.begin(), offsets.end(), random);
        std::uint32_t last = 0;
        for (const std::uint32_t offset : offsets) {
            std::uint8_t* const data = Layout::Data(bucket, offset);
            std::memset(data, 0xEE, row.dataSize);
            std::memset(&expected[offset + 2], 0xEE, row.dataSize);
            bucket->ReturnRecord(data);
            Expect(expected, offset, Layout::typeFree, last);
            last = offset;
            EXPECT_EQ(bucket->freeHead, offset);
        }
        EXPECT_TRUE(RecordsOf(bucket) == expected) << "given back";
        EXPECT_EQ(bucket->numFree, bucket->TotalRecs());

        std::array<std::uint8_t, 48> head = {};
        std::memcpy(&head[Layout::freeHeadAt], &bucket->freeHead, 4);
        bucket->next1 = bucket->prev1 = bucket->next2 = bucket->prev2 = bucket;
        Bucket::Destroy(bucket);
        EXPECT_EQ(HeapSpy::lastRelease, bucket);
        EXPECT_EQ(HeapSpy::releasedHead, head);
    }
}

TEST_F(RecordTest, WhatIsNoBucketIsNotDestroyed) {
    alignas(Bucket) std::uint8_t header[sizeof(Bucket)] = {};
    Bucket::Destroy(reinterpret_cast<Bucket*>(header));
    EXPECT_NE(HeapSpy::lastRelease, header);
}

// Three full buckets gain room in every order, and the first of them becomes empty.
TEST_F(RecordTest, TheBucketThatGainedRoomLastIsUsedNext) {
    for (const bool keep : {false, true}) {
        Use(4 + 16 * 2, 4, 16, 16, keep);  // Two records of one class in a bucket.
        std::vector<std::size_t> gains{0, 1, 2};
        do {
            SCOPED_TRACE(testing::Message() << keep << ' ' << gains[0] << gains[1] << gains[2]);
            BucketMgr pool(nullptr, "pool");
            void* records[6];
            for (void*& record : records) { record = pool.Alloc(12); }
            const Group& group = *pool.groups[0];
            const Buckets all = AllBuckets(group);  // The newest first.
            Buckets withFree;
            for (const std::size_t bucket : gains) {
                EXPECT_TRUE(pool.Free(records[2 * bucket]));
                withFree.insert(withFree.begin(), all[2 - bucket]);
                EXPECT_EQ(FreeBuckets(group), withFree);
            }
            EXPECT_EQ(pool.Alloc(12), records[2 * gains[2]]);
            EXPECT_EQ(FreeBuckets(group), Buckets(withFree.begin() + 1, withFree.end()));

            EXPECT_TRUE(pool.Free(records[2 * gains[0] + 1]));
            EXPECT_EQ(AllBuckets(group).size(), keep ? 3u : 2u);
            EXPECT_EQ(CheckInvariants(pool).size(), 3u);
        } while (std::next_permutation(gains.begin(), gains.end()));
    }
}

TEST_F(RecordTest, AGroupTakesBackOnlyItsOwnUntilItDropsAll) {
    BucketMgr pool(nullptr, "pool");
    void* const small = pool.Alloc(4);
    void* const large = pool.Alloc(8);
    const Blocks before = CheckInvariants(pool);
    EXPECT_FALSE(pool.groups[0]->Free(large, pool.FindBucket(large)));
    EXPECT_FALSE(pool.groups[0]->Free(nullptr, pool.FindBucket(small)));
    EXPECT_EQ(CheckInvariants(pool), before);
    EXPECT_TRUE(pool.groups[0]->Free(small, pool.FindBucket(small)));
    EXPECT_EQ(CheckInvariants(pool).size(), 1u);
    Group& group = *pool.groups[1];
    group.DestroyBuckets();
    EXPECT_EQ(AllBuckets(group).size() + FreeBuckets(group).size(), 0u);
    EXPECT_EQ(group.numBuckets + group.numFreeBuckets, 0u);
}

}  // namespace OBR::MemPool
