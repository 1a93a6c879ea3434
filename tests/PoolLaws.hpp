// One walker over a whole pool that restates every law of its memory, in bytes and from the outside
// where it can. Tests call it after each step.

#ifndef OBR_TESTS_POOLLAWS_HPP
#define OBR_TESTS_POOLLAWS_HPP

#include <cstdint>
#include <map>
#include <set>
#include <vector>

#include <gtest/gtest.h>

#include "HeapSpy.hpp"
#include "MemPool/BucketMgr.hpp"

namespace OBR::MemPool {

// The blocks that a pool has given out: their usable bytes by their data.
using Blocks = std::map<const std::uint8_t*, std::uint32_t>;

namespace Laws {

inline void ExpectHeapBlock(const void* start, std::size_t size) {
    const HeapSpy::Block* const block = HeapSpy::Find(start);
    ASSERT_NE(block, nullptr);
    EXPECT_EQ(block->size, size);
    EXPECT_EQ(block->form, HeapSpy::Form::array);
}

// The records of a bucket follow each other, each of them is either on the free list, once, or USED
// and known to the pool.
inline void CheckBucket(const BucketMgr& pool, const Group& group, const Bucket& bucket,
                        Blocks& blocks) {
    const std::uint32_t recSize = group.recDataSize + 4u;
    ASSERT_EQ(bucket.parent, &group);
    ASSERT_EQ(bucket.recSize, recSize);
    const std::uint32_t totalRecs = (bucket.size - 2u) / recSize;
    ASSERT_EQ(bucket.TotalRecs(), static_cast<std::int32_t>(totalRecs));
    ASSERT_EQ(bucket.size, 2 + totalRecs * recSize);
    EXPECT_LE(bucket.size, pool.bucketSize);
    EXPECT_GT(bucket.size + recSize, pool.bucketSize) << "There is room for one more record.";
    EXPECT_GE(totalRecs, 1u);
    EXPECT_LE(bucket.numFree, totalRecs - (pool.keepEmptyBuckets ? 0 : 1));
    ExpectHeapBlock(&bucket, bucket.size + 46u);

    const auto* const recsBase = reinterpret_cast<const std::uint8_t*>(&bucket) + 46;
    const auto linkAt = [recsBase](std::uint32_t offset) {
        return recsBase[offset] + recsBase[offset + 1] * 0x100u;
    };
    std::vector<bool> isFree(totalRecs, false);
    std::uint32_t numFree = 0;
    for (std::uint32_t offset = bucket.freeHead; offset != 0; offset = linkAt(offset)) {
        const std::uint32_t index = (offset - 2) / recSize;
        ASSERT_EQ(offset, 2 + index * recSize);
        ASSERT_LT(index, totalRecs);
        ASSERT_FALSE(isFree[index]) << "The free list runs in a circle.";
        isFree[index] = true;
        ++numFree;
    }
    EXPECT_EQ(bucket.numFree, numFree);

    for (std::uint32_t index = 0; index < totalRecs; ++index) {
        const std::uint32_t offset = 2 + index * recSize;
        const std::uint8_t* const data = recsBase + offset + 4;
        ASSERT_EQ(recsBase[offset + 2], isFree[index] ? 0 : 1);
        ASSERT_EQ(pool.FindBucket(data), isFree[index] ? nullptr : &bucket);
        if (isFree[index]) { continue; }
        EXPECT_EQ(linkAt(offset), offset);
        EXPECT_EQ(pool.GetSize(data), group.recDataSize);
        blocks[data] = group.recDataSize;
    }
}

// Both lists of a group are whole in both directions, have the counts that they should, and a
// bucket is on the second while it has a free record.
inline void CheckGroup(const BucketMgr& pool, const Group& group, Blocks& blocks) {
    ASSERT_EQ(group.parent, &pool);
    std::set<const Bucket*> all, withFree;
    const Bucket* before = nullptr;
    for (const Bucket* bucket = group.head; bucket != nullptr; bucket = bucket->next1) {
        ASSERT_TRUE(all.insert(bucket).second);
        ASSERT_EQ(bucket->prev1, before);
        CheckBucket(pool, group, *bucket, blocks);
        if (bucket->numFree > 0) { withFree.insert(bucket); }
        before = bucket;
    }
    EXPECT_EQ(group.tail, before);
    EXPECT_EQ(group.numBuckets, all.size());

    before = nullptr;
    std::uint32_t numFreeBuckets = 0;
    for (const Bucket* bucket = group.freeBuckets; bucket != nullptr; bucket = bucket->next2) {
        ASSERT_EQ(withFree.count(bucket), 1u);
        ASSERT_EQ(bucket->prev2, before);
        ASSERT_LE(++numFreeBuckets, withFree.size());
        before = bucket;
    }
    EXPECT_EQ(numFreeBuckets, withFree.size());
    EXPECT_EQ(group.numFreeBuckets, withFree.size());
}

inline void CheckExtRecs(const BucketMgr& pool, Blocks& blocks) {
    const ExtRec* before = nullptr;
    std::uint32_t numExtRecs = 0;
    for (const ExtRec* extRec = pool.extRecs; extRec != nullptr; extRec = extRec->next) {
        ASSERT_LE(++numExtRecs, pool.numExtRecs);
        ASSERT_EQ(extRec->prev, before);
        ExpectHeapBlock(extRec, extRec->length + 24u);
        const auto* const data = reinterpret_cast<const std::uint8_t*>(extRec) + 24;
        EXPECT_EQ(std::vector<std::uint8_t>(data - 4, data),
                  (std::vector<std::uint8_t>{0xAA, 0xBB, 2, 0xCC}));
        EXPECT_EQ(pool.GetSize(data), extRec->length);
        EXPECT_EQ(pool.Contains(data), extRec->length != 0);
        blocks[data] = extRec->length;
        before = extRec;
    }
    EXPECT_EQ(pool.numExtRecs, numExtRecs);
}

}  // namespace Laws

// Checks all laws of `pool` and returns the blocks that live in it.
inline Blocks CheckLaws(const BucketMgr& pool) {
    Blocks blocks;
    std::uint32_t numBuckets = 0;
    for (std::uint32_t index = 0; index < pool.numGroups; ++index) {
        const Group* const group = pool.groups[index];
        if (group == nullptr) { continue; }
        const std::uint32_t recSize = group->recDataSize + 4u;
        EXPECT_EQ(group->recDataSize % pool.dataAlignment, 0u);
        EXPECT_LE(recSize, pool.maxRecordSize);
        EXPECT_EQ(
            recSize < pool.minRecordSize ? 0 : (recSize - pool.minRecordSize) / pool.dataAlignment,
            index);
        Laws::CheckGroup(pool, *group, blocks);
        numBuckets += group->numBuckets;
    }
    EXPECT_EQ(pool.GetNumBuckets(), numBuckets);
    Laws::CheckExtRecs(pool, blocks);

    const std::uint8_t* end = nullptr;
    for (const auto& [data, size] : blocks) {
        EXPECT_LE(end, data) << "Two blocks overlap.";
        end = data + size;
    }
    return blocks;
}

}  // namespace OBR::MemPool

#endif
