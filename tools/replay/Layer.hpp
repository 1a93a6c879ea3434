// A layer serves a program's blocks instead of malloc. Its blocks cost as much here as in a program
// that uses it.

#ifndef OBR_TOOLS_REPLAY_LAYER_HPP
#define OBR_TOOLS_REPLAY_LAYER_HPP

#include <cstddef>
#include <cstdint>

#include <MemPoolHeap>

#include "replay/PoolSettings.hpp"

namespace Replay {

enum class Layer : std::uint8_t {
    Heap,    // OBR::MemPool::Heap, with blocks aligned to 8.
    Malloc,  // The preloaded library of `mempool try`, with blocks aligned to 16.
    Mgr,     // OBR::MemPool::Mgr, with blocks aligned to 4 or less.
};

constexpr std::size_t alignmentOfMalloc = 16;

// The preloaded library serves blocks of fewer bytes than this from its Heap. The others come from
// the C library. A record has up to 16 bytes more than its block, for the header and the alignment.
constexpr std::size_t MallocLimit(std::size_t maxRecordSize) {
    return maxRecordSize < 2 * alignmentOfMalloc
               ? 0
               : ((maxRecordSize - alignmentOfMalloc) & ~std::size_t{7}) + 1;
}

// The settings as a layer uses them: a Heap rounds the data alignment up to a multiple of 4.
inline PoolSettings InLayer(PoolSettings settings, Layer layer) {
    if (layer != Layer::Mgr) {
        settings.dataAlignment = OBR::MemPool::RoundUp(settings.dataAlignment, 4);
    }
    return settings;
}

// Whether a Heap gets this setting. A default bucket size is not set, so that large size classes
// continue in larger buckets.
inline bool IsSetInHeap(const OBR::MemPool::Setting& row, const PoolSettings& settings) {
    return row.size != &PoolSettings::bucketSize || row.In(settings) != row.In(PoolSettings());
}

// The settings of a Heap.
inline OBR::MemPool::HeapSettings HeapSettingsOf(const PoolSettings& settings) {
    OBR::MemPool::HeapSettings heapSettings;
    if (IsSetInHeap(OBR::MemPool::SettingTable::bucketSize, settings)) {
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
