// The pool behind a Mgr: it copies the settings once, turns the size of a request into a size class
// and serves it from that class's Group, or from the heap if it is too large for a bucket or the
// pool is disabled.

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

// The largest size that Alloc lets through: sums of a size and a header never wrap.
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
    Mgr* mgr;                      // The handle that made the pool; null once it is destroyed.
    Group** groups = nullptr;      // One place per size class, null until it is asked for.
    ExtRec* extRecs = nullptr;     // Front of the list of heap records, the newest first.
    std::uint32_t numGroups = 0;   // Places in `groups`.
    std::uint32_t numExtRecs = 0;  // Heap records on the list.
    std::uint32_t bucketSize;      // This and the next three are those of PoolSizes.
    std::uint32_t dataAlignment;   // Data sizes are rounded up to a multiple of it.
    std::uint32_t maxRecordSize;   // Largest record in a bucket.
    std::uint32_t minRecordSize;   // Smallest record of the first class.
    bool keepEmptyBuckets;
    bool enabled = true;  // False: every request goes straight to the heap.

private:
    // The size-class rule for the fast path, worked out once, without its division and its cases:
    // the index for `size` is (size - 1) >> alignmentShift, less skippedSteps, but at least 0.
    // PrepareFastPath derives it.
    std::uint16_t fastMax = 0;        // Sizes from 1 to this go that way. 0: none does.
    std::int16_t skippedSteps = 0;    // Steps of dataAlignment up to index 0. Can be below 0.
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

    // Gives a block back. False for null and, in an enabled pool, for what it does not recognise.
    OBR_READS_FOREIGN bool Free(void* data) {
        if (OBR_UNLIKELY(data == nullptr)) { return false; }
        if (OBR_UNLIKELY(!enabled || Settings::trace)) { return FreeSlow(data); }
        Bucket* const bucket = FindBucket(data);
        if (OBR_UNLIKELY(bucket == nullptr)) { return FreeExtRec(data); }
        assert(groups[IndexOf(bucket->recSize)] == bucket->parent);
        return bucket->parent->Free(data, bucket);
    }

    // Gives everything back. The pool is as new.
    void Clear();

    // The bucket of this pool that holds the used record at `data`, or null. `data` may be
    // anybody's; the same in an enabled and a disabled pool, as for the two questions below.
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

    // Buckets, counted from 0 in the order of the groups' indices and of each group's list.
    // GetBucket is part of the interface: nothing in the library calls it.
    std::uint32_t GetNumBuckets() const;
    const Bucket* GetBucket(std::uint32_t index) const;

    // Reports, all read-only and exact to the character; s/diagnostics/reports holds them. `level`
    // indents by three blanks each.
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
static_assert(sizeof(BucketMgr) == 88, "A pool has 88 bytes, which the reports show.");

}  // namespace OBR::MemPool

#endif
