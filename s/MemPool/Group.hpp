// All buckets of one record size of one pool. Here records are really taken and given back, and
// here it is decided when a bucket comes and when it goes.

#ifndef OBR_MEMPOOL_GROUP_HPP
#define OBR_MEMPOOL_GROUP_HPP

#include <cstddef>
#include <cstdint>

#include "MemPool/Bucket.hpp"
#include "MemPool/Checks.hpp"

namespace OBR::MemPool {

class BucketMgr;

// Two lists run through the buckets themselves, and new buckets enter both in front: all buckets
// (next1, prev1), and those with at least one free record (next2, prev2).
//
// Invariants: a bucket is on the free-bucket list exactly while its numFree > 0. Records are only
// taken from the front of that list, so a bucket that becomes full leaves it from the front. The
// front bucket's prev2 is null. freeBuckets is null exactly while numFreeBuckets is 0.
class Group {
public:
    BucketMgr* parent;                 // The pool that owns the group. Here it is only a name.
    Bucket* head = nullptr;            // Front of the list of all buckets.
    Bucket* tail = nullptr;            // Back of that list, part of the format: nothing reads it.
    Bucket* freeBuckets = nullptr;     // Front of the free-bucket list.
    std::uint32_t numBuckets = 0;      // Buckets on the list of all buckets.
    std::uint32_t numFreeBuckets = 0;  // Buckets on the free-bucket list.
    std::uint16_t recDataSize;         // Data bytes of every record.
    const std::uint16_t bucketSize;    // The pool's, told once: a group asks for nothing above it.
    const std::uint16_t totalRecs;     // Records of every bucket.
    const bool keepEmptyBuckets;       // The pool's too: whether an empty bucket stays.

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

    // Returns the data of a used record. Fails only with the heap, and then changes nothing.
    void* Alloc() {
        Bucket* const bucket = freeBuckets;
        if (OBR_UNLIKELY(bucket == nullptr)) { return AllocFromNewBucket(); }
        void* const data = bucket->TakeRecord();
        CheckTouched(*bucket);
        return OBR_UNLIKELY(bucket->numFree == 0) ? UnlinkFull(data) : data;
    }

    // Gives back a used record of `bucket`. False, with nothing changed, for null data or another
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
    // Slow paths. Each returns what its caller is to return, so that the call is the last thing
    // that the fast path does: a jump, for which no register is saved and no frame made.
    void* AllocFromNewBucket();
    void* UnlinkFull(void* data);
    bool LinkFree(Bucket* bucket);
    bool FreeLastUsed(Bucket* bucket);
};
static_assert(sizeof(Group) == 48 && offsetof(Group, recDataSize) == 40,
              "Four pointers, two counts and the data size, in this order.");

}  // namespace OBR::MemPool

#endif
