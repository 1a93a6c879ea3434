// All buckets of one record size of one pool. A group allocates and frees records, and decides when
// a bucket is made and when it is released.

#ifndef OBR_MEMPOOL_GROUP_HPP
#define OBR_MEMPOOL_GROUP_HPP

#include <cstddef>
#include <cstdint>

#include "MemPool/Bucket.hpp"

namespace OBR::MemPool {

class BucketMgr;

// With OBR_MEMPOOL_CHECKS, checks a bucket's free list after each record that is taken or freed.
#ifdef OBR_MEMPOOL_CHECKS
inline void CheckTouched(const Bucket& bucket) {
    bucket.CheckFreeList();
}
#else
inline void CheckTouched(const Bucket&) {}
#endif

// Two lists link the buckets, and a new bucket enters both in front: the list of all buckets
// (next1, prev1), and the free-bucket list of those with at least one free record (next2, prev2).
//
// Invariants: a bucket is on the free-bucket list exactly while its numFree > 0. Records are taken
// only from the front of that list, so a bucket that becomes full leaves it from the front. The
// front bucket's prev2 is null. freeBuckets is null exactly while numFreeBuckets is 0.
class Group {
public:
    BucketMgr* parent;                 // The pool that owns the group; never followed here.
    Bucket* head = nullptr;            // Front of the list of all buckets.
    Bucket* tail = nullptr;            // Back of that list: part of the format, never read.
    Bucket* freeBuckets = nullptr;     // Front of the free-bucket list.
    std::uint32_t numBuckets = 0;      // Buckets on the list of all buckets.
    std::uint32_t numFreeBuckets = 0;  // Buckets on the free-bucket list.
    std::uint16_t recDataSize;         // Data bytes of every record.
    const std::uint16_t bucketSize;    // Copied from the pool.
    const std::uint16_t totalRecs;     // Records of every bucket.
    const bool keepEmptyBuckets;       // Copied from the pool: whether an empty bucket stays.

    // Makes no bucket. `bucketBytes` must leave room for a record.
    Group(BucketMgr* owner, std::uint32_t dataSize, std::uint32_t bucketBytes, bool keepsEmpty)
        : parent(owner),
          recDataSize(static_cast<std::uint16_t>(dataSize)),
          bucketSize(static_cast<std::uint16_t>(bucketBytes)),
          totalRecs(static_cast<std::uint16_t>(
              Bucket::RecsWithin(bucketBytes, dataSize + std::uint32_t{sizeof(RecHdr)}))),
          keepEmptyBuckets(keepsEmpty) {}
    Group(const Group&) = delete;
    Group& operator=(const Group&) = delete;
    ~Group() = default;

    // Returns the data of a used record. Throws only what the heap throws, and then changes
    // nothing.
    void* Alloc() {
        Bucket* const bucket = freeBuckets;
        if (OBR_UNLIKELY(bucket == nullptr)) { return AllocFromNewBucket(); }
        void* const data = bucket->TakeRecord();
        CheckTouched(*bucket);
        return OBR_UNLIKELY(bucket->numFree == 0) ? UnlinkFull(data) : data;
    }

    // Frees a used record of `bucket`. False, with nothing changed, for null data or another
    // group's bucket.
    bool Free(void* data, Bucket* bucket) {
        if (OBR_UNLIKELY(bucket->parent != this || data == nullptr)) { return false; }
        bucket->ReturnRecord(data);
        CheckTouched(*bucket);
        if (OBR_UNLIKELY(bucket->numFree == totalRecs)) { return FreeLastUsed(bucket); }
        return OBR_UNLIKELY(bucket->numFree == 1) ? LinkFree(bucket) : true;  // It was full.
    }

    // Releases all buckets, used or not.
    void DestroyBuckets();

private:
    // Slow paths. Each returns what its caller returns, so that the call is a tail call: a jump,
    // for which the fast path saves no register and needs no stack frame.
    void* AllocFromNewBucket();
    void* UnlinkFull(void* data);
    bool LinkFree(Bucket* bucket);
    bool FreeLastUsed(Bucket* bucket);
};
static_assert(sizeof(Group) == 48 && offsetof(Group, recDataSize) == 40,
              "Four pointers, two counts and the data size, in this order.");

}  // namespace OBR::MemPool

#endif
