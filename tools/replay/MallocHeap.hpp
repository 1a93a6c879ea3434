// The Heap from which the preloaded library serves malloc, in a program and in a replay.
//
// malloc promises an alignment of 16 bytes. Here that costs only the rounding of sizes: records are
// multiples of 16 bytes, and buckets are shifted so that the data of records lie at multiples of
// 16. The Heap, which is asked for an alignment of 4, moves no block. A block thus costs 4 bytes
// and the rounding, and the header before it leads to its bucket.

#ifndef OBR_TOOLS_REPLAY_MALLOCHEAP_HPP
#define OBR_TOOLS_REPLAY_MALLOCHEAP_HPP

#include <cstddef>
#include <cstdint>

#include <MemPool/Bucket.hpp>
#include <MemPool/Group.hpp>
#include <MemPoolHeap>
#include <MemPoolSettings>

#include "replay/Layer.hpp"

namespace Replay {

// While this lives, no other pool gets or releases a bucket.
class MallocHeap {
public:
    explicit MallocHeap(const OBR::MemPool::PoolSettings& settings) : sizes(settings) {}
    MallocHeap(const MallocHeap&) = delete;
    MallocHeap& operator=(const MallocHeap&) = delete;
    ~MallocHeap() = default;

    // Blocks of so many bytes or more are left to the C library.
    std::size_t Limit() const { return sizes.limit; }

    // A block of fewer bytes. Throws std::bad_alloc.
    void* Allocate(std::size_t size) { return heap.Allocate(((size + 3) | sizes.mask) - 3, 4); }

    // The bucket of a block of this heap; null for a block of the C library, where the 4 bytes
    // before the block are the upper half of its size. `block` must not be null.
    static OBR::MemPool::Bucket* BucketOf(void* block) {
        using OBR::MemPool::RecHdr;
        const std::uint32_t hdr = RecHdr::Of(block)->Word();
        return RecHdr::IsUsed(hdr) ? OBR::MemPool::Bucket::Holding(block, RecHdr::LinkOf(hdr))
                                   : nullptr;
    }

    static void Free(void* block, OBR::MemPool::Bucket* bucket) {
        bucket->parent->Free(block, bucket);
    }

    void Report() const { heap.Report(); }

private:
    struct Shift {
        Shift() { OBR::MemPool::Bucket::shift = 12; }
        Shift(const Shift&) = delete;
        Shift& operator=(const Shift&) = delete;
        ~Shift() { OBR::MemPool::Bucket::shift = 0; }
    };

    const MallocRecords sizes;
    const Shift shift;  // Ends after the heap.
    OBR::MemPool::Heap heap{"malloc", HeapSettingsOf(sizes.settings)};
};

}  // namespace Replay

#endif
