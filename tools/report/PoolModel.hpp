// A model of the memory that pools would hold during a trace, without that memory itself: the
// bucket of each block, and the number of buckets. The rules are those of the library: a size class
// takes records from the bucket that was last to get a free record, a bucket is released with its
// last record unless it is kept, and a block that is too large is a heap record. The model takes a
// few bytes per block, whatever its size.
//
// It counts bytes as a replay does: those that malloc provides for buckets, heap records and the
// pools' own tables, but not for the names of pools.

#ifndef OBR_TOOLS_REPORT_POOLMODEL_HPP
#define OBR_TOOLS_REPORT_POOLMODEL_HPP

#include <cstdint>
#include <vector>

#include <MemPoolSettings>

namespace Report {

// The bucket of a block, or heapRecord.
using Place = std::uint32_t;
constexpr Place heapRecord = 0;

struct SizeClass {
    std::uint32_t dataSize = 0;  // Bytes of a record without its header of 4.
    std::uint32_t recsPerBucket = 0;
    std::uint64_t usedRecords = 0;  // Now, in all pools.
    std::uint64_t records = 0;      // Now, in all its buckets.
};

class PoolModel {
public:
    // The settings must be valid for a pool.
    explicit PoolModel(const OBR::MemPool::PoolSettings& settings);

    // The caller numbers the pools, with small numbers, and creates each once.
    void Create(std::uint32_t pool);
    Place Allocate(std::uint32_t pool, std::uint32_t size);
    void Free(std::uint32_t pool, Place place, std::uint32_t size);
    void Clear(std::uint32_t pool);
    void Destroy(std::uint32_t pool);

    std::uint64_t BytesHeld() const { return bytesHeld; }
    const std::vector<SizeClass>& Classes() const { return classes; }

    // Whether a block of that size goes into a bucket; if so, its size rounded up.
    bool IsRecord(std::uint32_t size) const { return size < sizesInBuckets; }
    std::uint32_t RecordBytes(std::uint32_t size) const { return classes[ClassOf(size)].dataSize; }

private:
    // All in one vector, linked by index; 0 is none.
    struct Bucket {
        std::uint32_t next = 0;  // In the group's list of all buckets.
        std::uint32_t prev = 0;
        std::uint32_t nextFree = 0;  // In the list of those with room.
        std::uint32_t prevFree = 0;
        std::uint32_t used = 0;
    };
    struct Group {
        std::uint32_t head = 0;
        std::uint32_t freeHead = 0;
        bool exists = false;
    };
    struct Pool {
        std::vector<Group> groups;    // One per size class.
        std::uint64_t heapBytes = 0;  // Provided for its heap records.
    };

    std::uint32_t ClassOf(std::uint32_t size) const;
    std::uint64_t TableBytes() const;
    std::uint32_t AddBucket(Group& group, SizeClass& sizeClass);
    void LinkFree(Group& group, std::uint32_t index);
    void UnlinkFree(Group& group, std::uint32_t index);
    void Remove(Group& group, SizeClass& sizeClass, std::uint32_t index);
    std::uint64_t BucketBytes(const SizeClass& sizeClass) const;

    const OBR::MemPool::PoolSizes sizes;
    std::uint32_t sizesInBuckets = 0;  // Smaller sizes go into buckets.
    bool keepEmptyBuckets;

    std::vector<SizeClass> classes;
    std::vector<Pool> pools;
    std::vector<Bucket> buckets;  // The first is unused.
    std::vector<std::uint32_t> unusedBuckets;
    std::uint64_t bytesHeld = 0;
};

}  // namespace Report

#endif
