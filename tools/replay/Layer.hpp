// A layer serves a program's blocks instead of malloc. Its blocks cost as much here as in a program
// that uses it.

#ifndef OBR_TOOLS_REPLAY_LAYER_HPP
#define OBR_TOOLS_REPLAY_LAYER_HPP

#include <cstddef>
#include <cstdint>

#include <MemPoolHeap>
#include <MemPoolSettings>

namespace Replay {

enum class Layer : std::uint8_t {
    Heap,    // OBR::MemPool::Heap, with blocks aligned to 8.
    Malloc,  // The preloaded library of `mempool try`, with blocks aligned to 16.
    Mgr,     // OBR::MemPool::Mgr, with blocks aligned to 4 or less.
    // Without pools:
    System,    // The operators new and delete.
    Mimalloc,  // mimalloc, where it is installed.
};

constexpr std::size_t alignmentOfMalloc = 16;

// What the preloaded library costs before its first block, measured on small programs: processor
// time of its start, and resident pages of its own and of the C library that it uses.
constexpr double secondsOfPreload = 0.00024;
constexpr std::int64_t bytesOfPreload = 500000;

// The sizes of the records from which the preloaded library serves malloc: see MallocHeap.
struct MallocRecords {
    OBR::MemPool::PoolSettings settings;       // Of the Heap.
    std::size_t mask = alignmentOfMalloc - 1;  // The sizes are multiples of mask + 1.
    std::size_t limit = 0;                     // Blocks of so many bytes come from the C library.

    explicit constexpr MallocRecords(const OBR::MemPool::PoolSettings& wanted) : settings(wanted) {
        while (mask + 1 < wanted.dataAlignment) { mask = 2 * mask + 1; }
        settings.dataAlignment = OBR::MemPool::recordOverhead;
        settings.minRecordSize =
            OBR::MemPool::RoundUp(wanted.minRecordSize, static_cast<unsigned int>(mask + 1));
        const std::size_t largest = wanted.maxRecordSize & ~mask;
        if (largest != 0) { limit = largest - OBR::MemPool::recordOverhead + 1; }
    }
};

// The settings as a layer uses them. A Heap rounds the data alignment up to a multiple of 4.
inline OBR::MemPool::PoolSettings InLayer(OBR::MemPool::PoolSettings settings, Layer layer) {
    if (layer == Layer::Malloc) { return MallocRecords(settings).settings; }
    if (layer != Layer::Mgr) {
        settings.dataAlignment = OBR::MemPool::RoundUp(settings.dataAlignment, 4);
    }
    return settings;
}

// All pools built from now on have these settings, are enabled and write no trace.
inline void UsePools(const OBR::MemPool::PoolSettings& settings) {
    settings.Apply();
    OBR::MemPool::NUV_OBR_MEMPOOL_ON(true);
    OBR::MemPool::NUV_OBR_MEMPOOL_TRACE(false);
}

// The settings of a Heap. A default bucket size is not set, so that large size classes continue in
// larger buckets.
inline OBR::MemPool::HeapSettings HeapSettingsOf(const OBR::MemPool::PoolSettings& settings) {
    OBR::MemPool::HeapSettings heapSettings;
    if (settings.bucketSize != OBR::MemPool::PoolSettings().bucketSize) {
        heapSettings.BucketSize(settings.bucketSize);
    }
    return heapSettings.On(true)
        .MaxRecordSize(settings.maxRecordSize)
        .MinRecordSize(settings.minRecordSize)
        .DataAlignment(settings.dataAlignment)
        .KeepEmptyBuckets(settings.keepEmptyBuckets);
}

}  // namespace Replay

#endif
