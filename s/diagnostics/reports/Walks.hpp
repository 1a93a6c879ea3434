// How the reports walk through a pool and a bucket. They read no byte outside the block that a
// bucket's header describes, even if the header or the free list is damaged.

#ifndef OBR_DIAGNOSTICS_WALKS_HPP
#define OBR_DIAGNOSTICS_WALKS_HPP

#include <cstdint>

#include "MemPool/Bucket.hpp"
#include "MemPool/BucketMgr.hpp"
#include "diagnostics/reports/RecordHeaders.hpp"

namespace OBR::MemPool {

// All groups of a pool in the order of their indices: visit(index, group).
template <typename Visit>
void ForEachGroup(const BucketMgr& pool, Visit visit) {
    for (std::uint32_t index = 0; index < pool.numGroups; ++index) {
        if (pool.groups[index] != nullptr) { visit(index, *pool.groups[index]); }
    }
}

// All buckets of a group, the newest first: visit(bucket).
template <typename Visit>
void ForEachBucket(const Group& group, Visit visit) {
    for (const Bucket* bucket = group.head; bucket != nullptr; bucket = bucket->next1) {
        visit(*bucket);
    }
}

// All records of a bucket in the order of their addresses: visit(offset). The first is always
// visited, since a bucket has at least one.
template <typename Visit>
void ForEachRecord(const Bucket& bucket, Visit visit) {
    std::uint32_t offset = firstOffset;
    do {
        visit(offset);
        offset += bucket.recSize;
    } while (offset < bucket.size && bucket.recSize != 0);
}

// A walk along a bucket's free list:
//
//     for (FreeListWalk walk(bucket); walk.IsOnRecord(); walk.Next()) { ... walk.Offset() ... }
//
// It does not end if the list is circular, and must not go on from a place that is not a record.
class FreeListWalk {
public:
    explicit FreeListWalk(const Bucket& walked) : bucket(walked), offset(walked.freeHead) {}

    bool IsAtEnd() const { return offset == 0; }
    bool IsOnRecord() const { return HasRecordAt(bucket, offset); }
    std::uint16_t Offset() const { return offset; }
    std::uint16_t Link() const { return LinkAt(bucket, offset); }
    void Next() { offset = Link(); }

private:
    const Bucket& bucket;
    std::uint16_t offset;
};

}  // namespace OBR::MemPool

#endif
