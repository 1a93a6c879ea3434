// What all tests of a pool share: settings to start with, a check of the invariants of a pool's
// memory, and at the end a heap to which every block went back, in the form in which it was
// requested.

#ifndef OBR_TESTS_POOLFIXTURE_HPP
#define OBR_TESTS_POOLFIXTURE_HPP

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <iostream>
#include <map>
#include <streambuf>
#include <vector>

#include <gtest/gtest.h>

#include "HeapSpy.hpp"
#include "Layout.hpp"
#include "MemPool/BucketMgr.hpp"
#include "MemPool/Settings.hpp"

namespace OBR::MemPool {

class PoolFixture : public testing::Test {
protected:
    PoolFixture() { Use(4010, 4, 1000, 8); }
    ~PoolFixture() override {
        EXPECT_EQ(HeapSpy::numLive, numLive);
        EXPECT_EQ(HeapSpy::numMisfits, 0u);
        Settings::trace = false;
        std::cout.rdbuf(output);
    }

    // New pools are enabled and have these sizes.
    static void Use(std::uint32_t bucketSize, std::uint16_t dataAlignment,
                    std::uint32_t maxRecordSize, std::uint32_t minRecordSize,
                    bool keepEmptyBuckets = false) {
        Settings::pool.bucketSize = bucketSize;
        Settings::pool.dataAlignment = dataAlignment;
        Settings::pool.maxRecordSize = maxRecordSize;
        Settings::pool.minRecordSize = minRecordSize;
        Settings::pool.keepEmptyBuckets = keepEmptyBuckets;
        Settings::off = false;
    }

private:
    static std::size_t NumLive() {
        { SCOPED_TRACE(""); }  // The first one leaves blocks of the framework behind.
        return HeapSpy::numLive;
    }

    const std::size_t numLive = NumLive();
    // The trace is enabled only for the slow path, which it forces. Its lines are dropped.
    std::streambuf* const output = std::cout.rdbuf(nullptr);
};

// The nodes of a list, which must be intact in both directions.
template <typename Node>
std::vector<const Node*> ListOf(const Node* front, Node* Node::*next, Node* Node::*prev) {
    std::vector<const Node*> nodes;
    for (const Node* node = front; node != nullptr; node = node->*next) {
        if (node->*prev != (nodes.empty() ? nullptr : nodes.back())) {
            ADD_FAILURE() << "A link back is wrong.";
            break;
        }
        nodes.push_back(node);
    }
    return nodes;
}

using Buckets = std::vector<const Bucket*>;
inline Buckets AllBuckets(const Group& group) {
    return ListOf(group.head, &Bucket::next1, &Bucket::prev1);
}
inline Buckets FreeBuckets(const Group& group) {
    return ListOf(group.freeBuckets, &Bucket::next2, &Bucket::prev2);
}

// The blocks that a pool has given out: their usable bytes by their data.
using Blocks = std::map<const std::uint8_t*, std::uint32_t>;

// Each record of a bucket must be on the free list once, or USED and known to the pool.
inline void CheckBucket(const BucketMgr& pool, const Group& group, const Bucket& bucket,
                        Blocks& blocks) {
    const std::uint32_t recSize = group.recDataSize + Layout::recHdr;
    ASSERT_EQ(bucket.parent, &group);
    ASSERT_EQ(bucket.recSize, recSize);
    EXPECT_LE(recSize, pool.maxRecordSize);
    const std::uint32_t totalRecs = (pool.bucketSize - Layout::firstOffset) / recSize;
    ASSERT_EQ(bucket.size, Layout::firstOffset + totalRecs * recSize);
    EXPECT_TRUE(HeapSpy::IsArray(&bucket, bucket.size + Layout::recsBase));
    EXPECT_TRUE(pool.keepEmptyBuckets || bucket.numFree < totalRecs);

    std::vector<bool> isFree(bucket.size, false);
    for (std::uint32_t offset = bucket.freeHead; offset != 0;
         offset = Layout::Link(Layout::Record(&bucket, offset))) {
        ASSERT_LT(offset, bucket.size);
        ASSERT_FALSE(isFree[offset]) << "The free list is circular.";
        isFree[offset] = true;
    }
    EXPECT_EQ(std::count(isFree.begin(), isFree.end(), true), bucket.numFree);

    std::uint32_t numUsed = 0;
    for (std::uint32_t offset = Layout::firstOffset; offset < bucket.size; offset += recSize) {
        const std::uint8_t* const data = Layout::Data(&bucket, offset);
        ASSERT_EQ(Layout::Type(data - Layout::recHdr),
                  isFree[offset] ? Layout::typeFree : Layout::typeUsed);
        ASSERT_EQ(pool.FindBucket(data), isFree[offset] ? nullptr : &bucket);
        if (isFree[offset]) { continue; }
        ++numUsed;
        EXPECT_EQ(pool.GetSize(data), group.recDataSize);
        blocks[data] = group.recDataSize;
    }
    EXPECT_EQ(numUsed + bucket.numFree, totalRecs);
}

// Both lists of a group must have the right counts, and a bucket must be on the second exactly
// while it has a free record.
inline void CheckGroup(const BucketMgr& pool, const Group& group, Blocks& blocks) {
    ASSERT_EQ(group.parent, &pool);
    const Buckets all = AllBuckets(group);
    EXPECT_EQ(group.tail, all.empty() ? nullptr : all.back());
    EXPECT_EQ(group.numBuckets, all.size());
    Buckets withFree;
    for (const Bucket* const bucket : all) {
        CheckBucket(pool, group, *bucket, blocks);
        if (bucket->numFree > 0) { withFree.push_back(bucket); }
    }
    const Buckets listed = FreeBuckets(group);
    EXPECT_TRUE(
        std::is_permutation(listed.begin(), listed.end(), withFree.begin(), withFree.end()));
    EXPECT_EQ(group.numFreeBuckets, withFree.size());
}

// Checks all invariants of `pool` and returns the blocks that live in it.
inline Blocks CheckInvariants(const BucketMgr& pool) {
    Blocks blocks;
    std::uint32_t numBuckets = 0;
    for (std::uint32_t index = 0; index < pool.numGroups; ++index) {
        const Group* const group = pool.groups[index];
        if (group == nullptr) { continue; }
        CheckGroup(pool, *group, blocks);
        for (const Bucket* const bucket : AllBuckets(*group)) {
            EXPECT_EQ(pool.GetBucket(numBuckets++), bucket);
        }
    }
    EXPECT_EQ(pool.GetNumBuckets(), numBuckets);
    EXPECT_EQ(pool.GetBucket(numBuckets), nullptr);

    const auto extRecs = ListOf<ExtRec>(pool.extRecs, &ExtRec::next, &ExtRec::prev);
    EXPECT_EQ(pool.numExtRecs, extRecs.size());
    for (const ExtRec* const extRec : extRecs) {
        EXPECT_TRUE(HeapSpy::IsArray(extRec, extRec->length + Layout::extRec));
        const auto* const data = Layout::Bytes(extRec) + Layout::extRec;
        EXPECT_EQ(pool.GetSize(data), extRec->length);
        EXPECT_EQ(pool.Contains(data), extRec->length != 0);
        blocks[data] = extRec->length;
    }

    const std::uint8_t* end = nullptr;
    for (const auto& [data, size] : blocks) {
        EXPECT_LE(end, data) << "Two blocks overlap.";
        end = data + size;
    }
    return blocks;
}

}  // namespace OBR::MemPool

#endif
