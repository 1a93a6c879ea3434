// The slow paths of a group: a bucket is made, released, becomes full or regains a free record.

#include "MemPool/Group.hpp"

namespace OBR::MemPool {

OBR_NOINLINE void* Group::AllocFromNewBucket() {
    Bucket* const bucket = Bucket::Create(this, bucketSize, recDataSize);

    ++numBuckets;
    bucket->next1 = head;
    if (head != nullptr) { head->prev1 = bucket; }
    head = bucket;
    if (tail == nullptr) { tail = bucket; }

    LinkFree(bucket);
    return Alloc();
}

// The last free record of the front bucket, the one with these data, was taken.
OBR_NOINLINE void* Group::UnlinkFull(void* data) {
    --numFreeBuckets;
    freeBuckets = freeBuckets->next2;
    if (freeBuckets != nullptr) {
        freeBuckets->prev2 = nullptr;
        freeBuckets->PrefetchFirstFree();
    }
    return data;
}

// Puts a bucket with a free record in front. Its prev2 is null already: a bucket that becomes full
// leaves from the front, and a new one has no links.
OBR_NOINLINE bool Group::LinkFree(Bucket* bucket) {
    ++numFreeBuckets;
    bucket->next2 = freeBuckets;
    if (freeBuckets != nullptr) { freeBuckets->prev2 = bucket; }
    freeBuckets = bucket;
    return true;
}

// A bucket's last used record was freed. If the bucket has a single record, it was full.
OBR_NOINLINE bool Group::FreeLastUsed(Bucket* bucket) {
    const bool wasFull = totalRecs == 1;
    if (keepEmptyBuckets) { return wasFull ? LinkFree(bucket) : true; }

    --numBuckets;
    (bucket->prev1 != nullptr ? bucket->prev1->next1 : head) = bucket->next1;
    (bucket->next1 != nullptr ? bucket->next1->prev1 : tail) = bucket->prev1;

    if (!wasFull) {
        --numFreeBuckets;
        (bucket->prev2 != nullptr ? bucket->prev2->next2 : freeBuckets) = bucket->next2;
        if (bucket->next2 != nullptr) { bucket->next2->prev2 = bucket->prev2; }
    }
    Bucket::Destroy(bucket);
    return true;
}

void Group::DestroyBuckets() {
    for (Bucket* bucket = head; bucket != nullptr;) {
        Bucket* const next = bucket->next1;
        Bucket::Destroy(bucket);
        bucket = next;
    }
    head = nullptr;
    freeBuckets = nullptr;
    numBuckets = 0;
    numFreeBuckets = 0;
}

}  // namespace OBR::MemPool
