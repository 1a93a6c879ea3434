// The lists of buckets as the library keeps them.

#include "report/PoolModel.hpp"

#include <algorithm>

#include "report/MallocSizes.hpp"

namespace Report {

namespace {

constexpr std::uint32_t recHdrSize = OBR::MemPool::recordOverhead;
constexpr std::uint32_t bucketHeadSize = 48;
constexpr std::uint32_t extRecHeadSize = 24;
constexpr std::uint32_t firstOffset = 2;  // Bytes of a bucket's size that no record uses.
constexpr std::uint64_t poolBytes = MallocBytes(88);
constexpr std::uint64_t groupBytes = MallocBytes(48);

}  // namespace

PoolModel::PoolModel(const OBR::MemPool::PoolSettings& settings)
    : sizes(settings), keepEmptyBuckets(settings.keepEmptyBuckets), buckets(1) {
    const std::uint32_t alignment = sizes.dataAlignment;
    classes.resize((sizes.maxRecordSize - sizes.minRecordSize) / alignment + 1);
    // If several sizes share a class, its records have room for the largest.
    for (std::uint32_t data = alignment; data + recHdrSize <= sizes.maxRecordSize;
         data += alignment) {
        SizeClass& sizeClass = classes[ClassOf(data)];
        sizeClass.dataSize = data;
        sizeClass.recsPerBucket = (sizes.bucketSize - firstOffset) / (data + recHdrSize);
        sizesInBuckets = data + 1;
    }
}

void PoolModel::Create(std::uint32_t pool) {
    if (pools.size() <= pool) { pools.resize(pool + 1); }
    pools[pool].groups.resize(classes.size());
    bytesHeld += TableBytes();
}

Place PoolModel::Allocate(std::uint32_t pool, std::uint32_t size) {
    if (!IsRecord(size)) {
        const std::uint64_t bytes = MallocBytes(std::uint64_t{size} + extRecHeadSize);
        pools[pool].heapBytes += bytes;
        bytesHeld += bytes;
        return heapRecord;
    }
    const std::uint32_t number = ClassOf(size);
    SizeClass& sizeClass = classes[number];
    Group& group = pools[pool].groups[number];
    if (group.freeHead == 0) { LinkFree(group, AddBucket(group, sizeClass)); }
    const std::uint32_t index = group.freeHead;
    ++sizeClass.usedRecords;
    if (++buckets[index].used == sizeClass.recsPerBucket) { UnlinkFree(group, index); }
    return index;
}

void PoolModel::Free(std::uint32_t pool, Place place, std::uint32_t size) {
    if (place == heapRecord) {
        const std::uint64_t bytes = MallocBytes(std::uint64_t{size} + extRecHeadSize);
        pools[pool].heapBytes -= bytes;
        bytesHeld -= bytes;
        return;
    }
    const std::uint32_t number = ClassOf(size);
    SizeClass& sizeClass = classes[number];
    Group& group = pools[pool].groups[number];
    Bucket& bucket = buckets[place];
    const bool wasFull = bucket.used == sizeClass.recsPerBucket;
    --sizeClass.usedRecords;
    --bucket.used;
    if (bucket.used == 0 && !keepEmptyBuckets) {
        if (!wasFull) { UnlinkFree(group, place); }
        Remove(group, sizeClass, place);
    } else if (wasFull) {
        LinkFree(group, place);
    }
}

void PoolModel::Clear(std::uint32_t pool) {
    bytesHeld -= pools[pool].heapBytes;
    pools[pool].heapBytes = 0;
    for (std::size_t number = 0; number < classes.size(); ++number) {
        Group& group = pools[pool].groups[number];
        while (group.head != 0) {
            classes[number].usedRecords -= buckets[group.head].used;
            Remove(group, classes[number], group.head);
        }
        if (group.exists) { bytesHeld -= groupBytes; }
        group = {};
    }
}

void PoolModel::Destroy(std::uint32_t pool) {
    Clear(pool);
    pools[pool] = {};
    bytesHeld -= TableBytes();
}

std::uint32_t PoolModel::ClassOf(std::uint32_t size) const {
    const std::uint32_t record = OBR::MemPool::RoundUp(size, sizes.dataAlignment) + recHdrSize;
    return (std::max(record, sizes.minRecordSize) - sizes.minRecordSize) / sizes.dataAlignment;
}

std::uint64_t PoolModel::TableBytes() const {
    return poolBytes + MallocBytes(classes.size() * sizeof(void*));
}

std::uint64_t PoolModel::BucketBytes(const SizeClass& sizeClass) const {
    return MallocBytes(bucketHeadSize +
                       std::uint64_t{sizeClass.recsPerBucket} * (sizeClass.dataSize + recHdrSize));
}

std::uint32_t PoolModel::AddBucket(Group& group, SizeClass& sizeClass) {
    if (!group.exists) {
        group.exists = true;
        bytesHeld += groupBytes;
    }
    if (unusedBuckets.empty()) {
        unusedBuckets.push_back(static_cast<std::uint32_t>(buckets.size()));
        buckets.emplace_back();
    }
    const std::uint32_t index = unusedBuckets.back();
    unusedBuckets.pop_back();
    buckets[index] = {group.head, 0, 0, 0, 0};
    if (group.head != 0) { buckets[group.head].prev = index; }
    group.head = index;
    sizeClass.records += sizeClass.recsPerBucket;
    bytesHeld += BucketBytes(sizeClass);
    return index;
}

// Puts a bucket that has room again in front.
void PoolModel::LinkFree(Group& group, std::uint32_t index) {
    buckets[index].prevFree = 0;
    buckets[index].nextFree = group.freeHead;
    if (group.freeHead != 0) { buckets[group.freeHead].prevFree = index; }
    group.freeHead = index;
}

void PoolModel::UnlinkFree(Group& group, std::uint32_t index) {
    const Bucket& bucket = buckets[index];
    (bucket.prevFree != 0 ? buckets[bucket.prevFree].nextFree : group.freeHead) = bucket.nextFree;
    if (bucket.nextFree != 0) { buckets[bucket.nextFree].prevFree = bucket.prevFree; }
}

void PoolModel::Remove(Group& group, SizeClass& sizeClass, std::uint32_t index) {
    const Bucket& bucket = buckets[index];
    (bucket.prev != 0 ? buckets[bucket.prev].next : group.head) = bucket.next;
    if (bucket.next != 0) { buckets[bucket.next].prev = bucket.prev; }
    sizeClass.records -= sizeClass.recsPerBucket;
    bytesHeld -= BucketBytes(sizeClass);
    unusedBuckets.push_back(index);
}

}  // namespace Report
