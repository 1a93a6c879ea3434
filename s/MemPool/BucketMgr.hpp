// The pool of a Mgr. It copies the settings once, and finds the size class of each request. It
// serves the request from the class's Group, or from the heap if the request is too large for a
// bucket or the pool is disabled.

#ifndef OBR_MEMPOOL_BUCKETMGR_HPP
#define OBR_MEMPOOL_BUCKETMGR_HPP

#include <algorithm>
#include <cassert>
#include <cstdint>
#include <iosfwd>
#include <string>

#include "MemPool/Group.hpp"
#include "MemPool/Record.hpp"
#include "MemPool/Settings.hpp"

namespace OBR::MemPool {

class Mgr;

// The largest size that Alloc accepts, so that the sum of a size and a header never wraps.
constexpr std::uint32_t maxAllocSize = 0x3FFFFFFF;

// Size classes. A request of `size` bytes has d = RoundUp(size, dataAlignment) data bytes and a
// record of r = d + 4. It goes into a bucket if r <= maxRecordSize, from the group at
// (max(r, minRecordSize) - minRecordSize) / dataAlignment.
//
// Heap forms: array form for buckets, heap records, `groups` and the blocks of a disabled pool,
// single-object form for Group and BucketMgr.
class BucketMgr {
public:
    std::string name;
    Mgr* mgr;                      // The handle that built the pool; null once it is destroyed.
    Group** groups = nullptr;      // One place per size class, null until its first request.
    ExtRec* extRecs = nullptr;     // Front of the list of heap records, the newest first.
    std::uint32_t numGroups = 0;   // Places in `groups`.
    std::uint32_t numExtRecs = 0;  // Heap records on the list.
    std::uint32_t bucketSize;      // This and the next three are as in PoolSizes.
    std::uint32_t dataAlignment;   // Data sizes are rounded up to a multiple of it.
    std::uint32_t maxRecordSize;   // Largest record in a bucket.
    std::uint32_t minRecordSize;   // Smallest record of the first class.
    bool keepEmptyBuckets;
    bool enabled = true;  // False: every request goes straight to the heap.

private:
    // The size-class rule of the fast path, which has no division: the index for `size` is
    // (size - 1) >> alignmentShift, less skippedSteps, but at least 0. See PrepareFastPath.
    std::uint16_t fastMax = 0;        // The rule holds for sizes from 1 to this; 0: for none.
    std::int16_t skippedSteps = 0;    // Steps of dataAlignment before index 0; may be negative.
    std::uint8_t alignmentShift = 0;  // dataAlignment is 2 to the power of this.

public:
    // Builds a pool from the settings. Stops the process if they cannot make one.
    BucketMgr(Mgr* handle, const std::string& poolName);
    BucketMgr(const BucketMgr&) = delete;
    BucketMgr& operator=(const BucketMgr&) = delete;
    ~BucketMgr();

    // Returns a block of at least `size` bytes, never null. Stops the process if `size` is above
    // maxAllocSize.
    void* Alloc(std::uint32_t size) {
        const std::uint32_t below = size - 1;  // Wraps for 0, which thus takes the slow path.
        if (OBR_UNLIKELY(below >= fastMax || Settings::trace)) { return AllocSlow(size); }
        const std::int32_t skipped = skippedSteps;
        const auto step = static_cast<std::int32_t>(below >> alignmentShift);
        const auto index = static_cast<std::uint32_t>(std::max(step, skipped) - skipped);
        assert(index == IndexOf(RoundUp(size, dataAlignment) + std::uint32_t{sizeof(RecHdr)}));
        Group* const group = groups[index];
        if (OBR_UNLIKELY(group == nullptr)) { return AllocSlow(size); }
        return group->Alloc();
    }

    // Frees a block. False for null and, in an enabled pool, for a foreign pointer.
    OBR_READS_FOREIGN bool Free(void* data) {
        if (OBR_UNLIKELY(data == nullptr)) { return false; }
        if (OBR_UNLIKELY(!enabled || Settings::trace)) { return FreeSlow(data); }
        Bucket* const bucket = FindBucket(data);
        if (OBR_UNLIKELY(bucket == nullptr)) { return FreeExtRec(data); }
        assert(groups[IndexOf(bucket->recSize)] == bucket->parent);
        return bucket->parent->Free(data, bucket);
    }

    // Drops all blocks. The pool is as new.
    void Clear();

    // The bucket of this pool that holds the used record at `data`, or null. `data` may be null or
    // foreign. This and the next two are the same in an enabled and a disabled pool.
    OBR_READS_FOREIGN Bucket* FindBucket(void* data) const {
        if (data == nullptr) { return nullptr; }
        const std::uint32_t hdr = RecHdr::Of(data)->Word();
        if (!RecHdr::IsUsed(hdr)) { return nullptr; }
        Bucket* const bucket = Bucket::Holding(data, RecHdr::LinkOf(hdr));
        const Group* const owner = bucket->Owner();
        if (owner == nullptr || owner->parent != this) { return nullptr; }
        return bucket;
    }
    const Bucket* FindBucket(const void* data) const { return FindBucket(const_cast<void*>(data)); }

    bool Contains(const void* data) const;
    std::uint32_t GetSize(const void* data) const;

    // The buckets in the order of the groups' indices and of each group's list. `index` counts from
    // 0; null above the last. The library does not call GetBucket: kept for compatibility.
    std::uint32_t GetNumBuckets() const;
    const Bucket* GetBucket(std::uint32_t index) const;

    // Reports, all read-only and exact to the character, defined in s/diagnostics/reports. Each
    // `level` indents by three blanks.
    void DbgReport(std::ostream& stream, std::uint32_t level, bool showBuckets, bool showRecords,
                   bool showFreeList) const;
    void DbgUsedData(std::ostream& stream, std::uint32_t level,
                     const SizeCounts& usedDataFreq) const;
    void DbgBuckets(std::ostream& stream, std::uint32_t level) const;
    void DbgFreeBuckets(std::ostream& stream, std::uint32_t level, std::uint32_t freeBucks,
                        std::uint32_t freeBucksM) const;
    void DbgExtRecs(std::ostream& stream, std::uint32_t level) const;

private:
    void PrepareFastPath();
    std::uint32_t IndexOf(std::uint32_t recSize) const;
    Group* GroupFor(std::uint32_t recSize);

    void* AllocSlow(std::uint32_t size);
    void* AllocExtRec(std::uint32_t size);
    bool FreeSlow(void* data);
    bool FreeExtRec(void* data);
};
static_assert(sizeof(BucketMgr) == 88, "A pool has 88 bytes, which the reports print.");

}  // namespace OBR::MemPool

#endif
