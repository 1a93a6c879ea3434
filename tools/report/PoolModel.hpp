// What pools hold while a trace runs, worked out without their memory: which bucket each block
// would lie in, and how many buckets there are. The rules are those of the library: a size class
// takes records from the bucket that most recently gained room, a bucket goes with its last record
// unless it is kept, what is too large is a heap record. So millions of blocks of a program of any
// size are followed in a few bytes each.
//
// Bytes are counted as a replay counts them: what malloc lends for buckets, heap records and the
// pools' own tables, their names left out.

#ifndef OBR_TOOLS_REPORT_POOLMODEL_HPP
#define OBR_TOOLS_REPORT_POOLMODEL_HPP

#include <cstdint>
#include <vector>

#include "replay/PoolSettings.hpp"

namespace Report {

// Where a block lies: a bucket, or none for a heap record.
using Place = std::uint32_t;
constexpr Place heapRecord = 0;

struct SizeClass {
    std::uint32_t dataSize = 0;  // Bytes of its records without their header of 4.
    std::uint32_t recsPerBucket = 0;
    std::uint64_t usedRecords = 0;  // Now, in all pools.
    std::uint64_t records = 0;      // Now, in all buckets of it.
};

class PoolModel {
public:
    // The settings must be such that a pool can be built.
    explicit PoolModel(const Replay::PoolSettings& settings);

    // Pools are told by numbers that the caller gives, small ones and each once.
    void Create(std::uint32_t pool);
    Place Allocate(std::uint32_t pool, std::uint32_t size);
    void Free(std::uint32_t pool, Place place, std::uint32_t size);
    void Clear(std::uint32_t pool);
    void Destroy(std::uint32_t pool);

    std::uint64_t BytesHeld() const { return bytesHeld; }
    const std::vector<SizeClass>& Classes() const { return classes; }

    // Whether a block of that size lies in a bucket, and what it then takes: its size rounded up.
    bool IsRecord(std::uint32_t size) const { return size < sizesInBuckets; }
    std::uint32_t RecordBytes(std::uint32_t size) const { return classes[ClassOf(size)].dataSize; }

private:
    // In one vector, so that 0 stands for none, and no bucket costs a request to the heap.
    struct Bucket {
        std::uint32_t next = 0;  // In the group's list of all buckets.
        std::uint32_t prev = 0;
        std::uint32_t nextFree = 0;  // In its list of those with room.
        std::uint32_t prevFree = 0;
        std::uint32_t used = 0;
    };
    struct Group {
        std::uint32_t head = 0;
        std::uint32_t freeHead = 0;
        bool exists = false;
    };
    struct Pool {
        std::vector<Group> groups;    // One a size class.
        std::uint64_t heapBytes = 0;  // Lent for its heap records.
    };

    std::uint32_t ClassOf(std::uint32_t size) const;
    std::uint64_t TableBytes() const;
    std::uint32_t AddBucket(Group& group, SizeClass& sizeClass);
    void LinkFree(Group& group, std::uint32_t index);
    void UnlinkFree(Group& group, std::uint32_t index);
    void Remove(Group& group, SizeClass& sizeClass, std::uint32_t index);
    std::uint64_t BucketBytes(const SizeClass& sizeClass) const;

    std::uint32_t alignment;
    std::uint32_t smallestRecord;
    std::uint32_t sizesInBuckets = 0;  // Sizes below it go into buckets.
    bool keepEmptyBuckets;

    std::vector<SizeClass> classes;
    std::vector<Pool> pools;
    std::vector<Bucket> buckets;  // The first is none.
    std::vector<std::uint32_t> unusedBuckets;
    std::uint64_t bytesHeld = 0;
};

}  // namespace Report

#endif
