// The slow paths of a pool: building and destroying it, making a group, requests that are too large
// for a bucket or traced, and queries.

#include "MemPool/BucketMgr.hpp"

#include <algorithm>
#include <limits>
#include <new>

#include "MemPool/Checked.hpp"
#include "diagnostics/text/Messages.hpp"
#include "diagnostics/text/TraceLine.hpp"

namespace OBR::MemPool {

namespace {

constexpr std::uint32_t recHdrSize = sizeof(RecHdr);
static_assert(recHdrSize == recordOverhead, "PoolSizes counts the header of a record.");

}  // namespace

BucketMgr::BucketMgr(Mgr* handle, const std::string& poolName)
    : name(poolName), mgr(handle), keepEmptyBuckets(Settings::pool.keepEmptyBuckets) {
    const PoolSizes sizes(Settings::pool);
    bucketSize = sizes.bucketSize;
    dataAlignment = sizes.dataAlignment;
    maxRecordSize = sizes.maxRecordSize;
    minRecordSize = sizes.minRecordSize;
    TraceLine::PoolCreated(this);
    enabled = !Settings::off;
    if (sizes.IsMaxAboveRoom()) {
        Messages::MaxRecordAboveBucket(maxRecordSize, sizes.RoomInBucket(), bucketSize);
    }
    if (sizes.IsMinAboveMax()) { Messages::MinRecordAboveMax(minRecordSize, maxRecordSize); }
    Checked::KeepSizesExact(*this);
    numGroups = (maxRecordSize - minRecordSize) / dataAlignment + 1;
    groups = new Group*[numGroups]();
    PrepareFastPath();
}

BucketMgr::~BucketMgr() {
    TraceLine::PoolDestroyed(this);
    Clear();
    delete[] groups;
}

// Let dataAlignment be 2^k and minRecordSize m * 2^k. A size of at least 1 has d = (s + 1) * 2^k
// data bytes, where its step s is (size - 1) >> k. The index (d + 4 - minRecordSize) / 2^k is
// therefore s + 1 + (4 >> k) - m, which is s less the skipped steps m - 1 - (4 >> k). It is
// negative exactly if d + 4 is below minRecordSize, and then the index is 0.
void BucketMgr::PrepareFastPath() {
    const bool isPowerOfTwo = (dataAlignment & (dataAlignment - 1)) == 0;
    const bool fits = minRecordSize <= std::numeric_limits<std::int16_t>::max();
    if (!enabled || !isPowerOfTwo || !fits || maxRecordSize < dataAlignment + recHdrSize) {
        return;
    }

    while (std::uint32_t{1} << alignmentShift < dataAlignment) { ++alignmentShift; }
    const std::uint32_t minSteps = minRecordSize >> alignmentShift;
    skippedSteps = static_cast<std::int16_t>(minSteps - 1 - (recHdrSize >> alignmentShift));
    const std::uint32_t largest = (maxRecordSize - recHdrSize) >> alignmentShift << alignmentShift;
    fastMax = static_cast<std::uint16_t>(largest);
}

// The place in `groups` of records of `recSize` bytes.
std::uint32_t BucketMgr::IndexOf(std::uint32_t recSize) const {
    return (std::max(recSize, minRecordSize) - minRecordSize) / dataAlignment;
}

// The group that serves records of `recSize` bytes, made if it is missing. Several sizes can share
// the first place; its records have room for the largest of them, whichever comes first.
Group* BucketMgr::GroupFor(std::uint32_t recSize) {
    const std::uint32_t index = IndexOf(recSize);
    if (groups[index] == nullptr) {
        std::uint32_t dataSize = recSize - recHdrSize;
        while (IndexOf(dataSize + dataAlignment + recHdrSize) == index &&
               dataSize + dataAlignment + recHdrSize <= maxRecordSize) {
            dataSize += dataAlignment;
        }
        groups[index] = new Group(this, dataSize, Checked::BucketSize(bucketSize, dataSize),
                                  Checked::KeepsEmptyBuckets(keepEmptyBuckets));
    }
    return groups[index];
}

OBR_NOINLINE void* BucketMgr::AllocSlow(std::uint32_t size) {
    if (size > maxAllocSize) { Messages::SizeAboveLimit(size, maxAllocSize); }
    void* data = nullptr;
    if (!enabled) {
        data = ::operator new[](size);
    } else {
        const std::uint32_t recSize = RoundUp(size, dataAlignment) + recHdrSize;
        data = recSize > maxRecordSize ? AllocExtRec(size) : GroupFor(recSize)->Alloc();
    }
    TraceLine::BlockAllocated(this, data, size);
    return data;
}

void* BucketMgr::AllocExtRec(std::uint32_t size) {
    ExtRec* const extRec = ExtRec::Create(size);
    ++numExtRecs;
    extRec->next = extRecs;
    if (extRecs != nullptr) { extRecs->prev = extRec; }
    extRecs = extRec;
    return extRec->Data();
}

OBR_NOINLINE bool BucketMgr::FreeSlow(void* data) {
    TraceLine::BlockFreed(this, data);
    if (!enabled) {
        ::operator delete[](data);
        return true;
    }
    Bucket* const bucket = FindBucket(data);
    return bucket != nullptr ? bucket->parent->Free(data, bucket) : FreeExtRec(data);
}

// Frees a heap record; false if `data` is not a heap record's.
OBR_NOINLINE bool BucketMgr::FreeExtRec(void* data) {
    if (ExtRec::LengthAt(data) == 0) { return false; }
    ExtRec* const extRec = ExtRec::Of(data);
    --numExtRecs;
    (extRec->prev != nullptr ? extRec->prev->next : extRecs) = extRec->next;
    if (extRec->next != nullptr) { extRec->next->prev = extRec->prev; }
    *extRec = {};
    KeepStores(extRec);
    ::operator delete[](extRec);
    return true;
}

void BucketMgr::Clear() {
    while (extRecs != nullptr) {
        ExtRec* const next = extRecs->next;
        ::operator delete[](extRecs);
        extRecs = next;
    }
    numExtRecs = 0;

    for (std::uint32_t index = 0; index < numGroups; ++index) {
        if (groups[index] == nullptr) { continue; }
        groups[index]->DestroyBuckets();
        delete groups[index];
        groups[index] = nullptr;
    }
}

bool BucketMgr::Contains(const void* data) const {
    return FindBucket(data) != nullptr || (data != nullptr && ExtRec::LengthAt(data) != 0);
}

std::uint32_t BucketMgr::GetSize(const void* data) const {
    if (data == nullptr) { return 0; }
    const Bucket* const bucket = FindBucket(data);
    return bucket != nullptr ? bucket->recSize - recHdrSize : ExtRec::LengthAt(data);
}

std::uint32_t BucketMgr::GetNumBuckets() const {
    std::uint32_t count = 0;
    for (std::uint32_t index = 0; index < numGroups; ++index) {
        if (groups[index] != nullptr) { count += groups[index]->numBuckets; }
    }
    return count;
}

const Bucket* BucketMgr::GetBucket(std::uint32_t index) const {
    for (std::uint32_t place = 0; place < numGroups; ++place) {
        if (groups[place] == nullptr) { continue; }
        for (const Bucket* bucket = groups[place]->head; bucket != nullptr;
             bucket = bucket->next1) {
            if (index == 0) { return bucket; }
            --index;
        }
    }
    return nullptr;
}

}  // namespace OBR::MemPool
