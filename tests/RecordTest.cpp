// The memory of a bucket, byte by byte, and the order in which a group's records and buckets come
// and go.

#include <algorithm>
#include <cstdint>
#include <cstring>
#include <random>
#include <vector>

#include <gtest/gtest.h>

#include "HeapSpy.hpp"
#include "MemPool/BucketMgr.hpp"
#include "PoolFixture.hpp"
#include "PoolLaws.hpp"

namespace OBR::MemPool {

namespace {

using Bytes = std::vector<std::uint8_t>;
using Buckets = std::vector<const Bucket*>;

class RecordTest : public PoolFixture {
protected:
    // Pools with buckets of `totalRecs` records of 16 bytes, all of one class.
    static void UseBucketsOf(std::uint32_t totalRecs, bool keepEmptyBuckets) {
        Use(4 + 16 * totalRecs, 4, 16, 16, keepEmptyBuckets);
    }
};

// The bytes of all records from the first one's header on.
Bytes RecordsOf(const Bucket* bucket) {
    const auto* const start = reinterpret_cast<const std::uint8_t*>(bucket);
    return Bytes(start + 48, start + 46 + bucket->size);
}

// Says what the header of the record at `offset` is to be.
void Expect(Bytes& records, std::uint32_t offset, std::uint8_t type, std::uint32_t link) {
    records[offset - 2] = static_cast<std::uint8_t>(link % 0x100);
    records[offset - 1] = static_cast<std::uint8_t>(link / 0x100);
    records[offset] = type;
}

Buckets ListOf(const Bucket* front, Bucket* Bucket::*next) {
    Buckets list;
    for (; front != nullptr; front = front->*next) { list.push_back(front); }
    return list;
}
Buckets AllBuckets(const Group& group) {
    return ListOf(group.head, &Bucket::next1);
}
Buckets FreeBuckets(const Group& group) {
    return ListOf(group.freeBuckets, &Bucket::next2);
}

}  // namespace

// From the cradle to the grave: every byte of a bucket, when it is made, when all records have been
// taken, when they came back in any order, and when it ends.
TEST_F(RecordTest, EveryByteOfABucketIsAsDrawn) {
    constexpr struct {
        std::uint32_t bucketSize, dataSize, totalRecs, size;
    } rows[] = {
        {4010, 4, 501, 4010},
        {4010, 8, 334, 4010},
        {4010, 12, 250, 4002},
        {4010, 996, 4, 4002},
        {4010, 397, 9, 3611},  // 0, 1, 2 and 3 bytes beyond ten records
        {4011, 397, 9, 3611},
        {4012, 397, 10, 4012},
        {4013, 397, 10, 4012},
        {1004, 996, 1, 1002},
        {9, 1, 1, 7},
        {12, 1, 2, 12},
        {65535, 9, 5041, 65535},
        {65535, 1, 13106, 65532},
        {65535, 65527, 1, 65533},
    };
    std::mt19937 random(1);
    for (const auto& row : rows) {
        SCOPED_TRACE(testing::Message() << row.bucketSize << " of " << row.dataSize);
        const std::uint32_t recSize = row.dataSize + 4;
        Group group(nullptr, static_cast<std::uint16_t>(row.dataSize));
        Bucket* const bucket = Bucket::Create(&group, row.bucketSize, row.dataSize);
        const HeapSpy::Block block = HeapSpy::lastRequest;
        EXPECT_TRUE((block == HeapSpy::Block{bucket, row.size + 46, HeapSpy::Form::array}));
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
            Expect(expected, offset, 0, offset + recSize < row.size ? offset + recSize : 0);
        }
        EXPECT_TRUE(RecordsOf(bucket) == expected) << "made";

        std::vector<std::uint32_t> offsets;
        for (std::uint32_t offset = 2; offset < row.size; offset += recSize) {
            EXPECT_EQ(bucket->IsEmpty(), offset == 2);
            EXPECT_FALSE(bucket->IsFull());
            EXPECT_EQ(bucket->TakeRecord(), reinterpret_cast<char*>(bucket) + 50 + offset);
            Expect(expected, offset, 1, offset);
            offsets.push_back(offset);
        }
        EXPECT_TRUE(RecordsOf(bucket) == expected) << "taken";
        EXPECT_EQ(bucket->freeHead, 0);
        EXPECT_TRUE(bucket->IsFull());

        std::shuffle(offsets.begin(), offsets.end(), random);
        std::uint32_t last = 0;
        for (const std::uint32_t offset : offsets) {
            char* const data = reinterpret_cast<char*>(bucket) + 50 + offset;
            std::memset(data, 0xEE, row.dataSize);
            std::memset(&expected[offset + 2], 0xEE, row.dataSize);
            bucket->ReturnRecord(data);
            Expect(expected, offset, 0, last);
            last = offset;
            EXPECT_EQ(bucket->freeHead, offset);
        }
        EXPECT_TRUE(RecordsOf(bucket) == expected) << "given back";
        EXPECT_TRUE(bucket->IsEmpty());

        std::array<std::uint8_t, 48> head = {};
        std::memcpy(&head[44], &bucket->freeHead, 4);
        bucket->next1 = bucket->prev1 = bucket->next2 = bucket->prev2 = bucket;
        Bucket::Destroy(bucket);
        EXPECT_TRUE(HeapSpy::lastRelease == block);
        EXPECT_EQ(HeapSpy::releasedHead, head);
    }
}

TEST_F(RecordTest, WhatIsNoBucketIsNotDestroyed) {
    alignas(Bucket) std::uint8_t header[sizeof(Bucket)] = {};
    const std::size_t numReleases = HeapSpy::numReleases;
    Bucket::Destroy(reinterpret_cast<Bucket*>(header));
    EXPECT_EQ(HeapSpy::numReleases, numReleases);
    EXPECT_EQ(HeapSpy::numMisfits, 0u);
}

// Three full buckets of 1 to 3 records give back one record each, in every order, and then all
// others, bucket by bucket, in every order again: every place in both lists is left and entered.
// The bucket that gained room last is used next.
TEST_F(RecordTest, BucketsEnterAndLeaveBothListsInEveryOrder) {
    std::vector<std::size_t> gains{0, 1, 2};
    std::vector<std::size_t> ends{0, 1, 2};
    for (const bool keep : {false, true}) {
        for (const std::size_t totalRecs : {1u, 2u, 3u}) {
            do {
                do {
                    SCOPED_TRACE(testing::Message()
                                 << keep << totalRecs << ' ' << gains[0] << gains[1] << gains[2]
                                 << ' ' << ends[0] << ends[1] << ends[2]);
                    UseBucketsOf(static_cast<std::uint32_t>(totalRecs), keep);
                    BucketMgr pool(nullptr, "pool");
                    std::vector<void*> records(3 * totalRecs);
                    for (void*& record : records) { record = pool.Alloc(12); }
                    Group& group = *pool.groups[0];
                    Buckets all = AllBuckets(group);
                    const Buckets byAge(all.rbegin(), all.rend());
                    Buckets withFree;
                    const auto giveBack = [&](std::size_t bucket, std::size_t first,
                                              std::size_t end) {
                        for (std::size_t i = first; i < end; ++i) {
                            EXPECT_TRUE(pool.Free(records[bucket * totalRecs + i]));
                        }
                        if (end == totalRecs && !keep) {
                            for (Buckets* list : {&all, &withFree}) {
                                list->erase(std::remove(list->begin(), list->end(), byAge[bucket]),
                                            list->end());
                            }
                        } else if (first == 0) {
                            withFree.insert(withFree.begin(), byAge[bucket]);
                        }
                        EXPECT_EQ(AllBuckets(group), all);
                        EXPECT_EQ(FreeBuckets(group), withFree);
                        CheckLaws(pool);
                    };
                    for (const std::size_t bucket : gains) { giveBack(bucket, 0, 1); }
                    if (!withFree.empty()) {
                        void* const data = pool.Alloc(12);
                        EXPECT_EQ(pool.FindBucket(data), withFree[0]);
                        EXPECT_EQ(FreeBuckets(group),
                                  Buckets(withFree.begin() + 1, withFree.end()));
                        CheckLaws(pool);
                        EXPECT_TRUE(pool.Free(data));
                    }
                    for (const std::size_t bucket : ends) {
                        if (totalRecs > 1) { giveBack(bucket, 1, totalRecs); }
                    }
                    ASSERT_EQ(pool.groups[0], &group);
                    const std::size_t numRequests = HeapSpy::numRequests;
                    pool.Alloc(12);
                    EXPECT_EQ(HeapSpy::numRequests - numRequests, keep ? 0u : 1u);
                    EXPECT_EQ(CheckLaws(pool).size(), 1u);
                } while (std::next_permutation(ends.begin(), ends.end()));
            } while (std::next_permutation(gains.begin(), gains.end()));
        }
    }
}

TEST_F(RecordTest, AGroupTakesBackOnlyItsOwn) {
    BucketMgr pool(nullptr, "pool");
    void* const small = pool.Alloc(4);
    void* const large = pool.Alloc(8);
    const Blocks before = CheckLaws(pool);
    EXPECT_FALSE(pool.groups[0]->Free(large, pool.FindBucket(large)));
    EXPECT_FALSE(pool.groups[0]->Free(nullptr, pool.FindBucket(small)));
    EXPECT_EQ(CheckLaws(pool), before);
    EXPECT_TRUE(pool.groups[0]->Free(small, pool.FindBucket(small)));
    EXPECT_EQ(CheckLaws(pool).size(), 1u);
}

}  // namespace OBR::MemPool
