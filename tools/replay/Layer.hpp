// What serves a program's blocks in place of malloc. The blocks of a layer cost what they cost the
// program that uses it.

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

// The preloaded library serves blocks of fewer bytes than this from its Heap, and leaves the others
// to the C library. A block takes up to 16 bytes more in its record: the header, and the way to its
// alignment.
constexpr std::size_t MallocLimit(std::size_t maxRecordSize) {
    return maxRecordSize < 2 * alignmentOfMalloc
               ? 0
               : ((maxRecordSize - alignmentOfMalloc) & ~std::size_t{7}) + 1;
}

// What a layer makes of settings: a Heap rounds the data alignment up to a multiple of 4.
inline PoolSettings InLayer(PoolSettings settings, Layer layer) {
    if (layer != Layer::Mgr) {
        settings.dataAlignment = OBR::MemPool::RoundUp(settings.dataAlignment, 4);
    }
    return settings;
}

// Whether a Heap is told this setting: one that is told no bucket size begins with the default, and
// goes on in larger buckets where it becomes large.
inline bool IsSaid(const OBR::MemPool::Setting& row, const PoolSettings& settings) {
    return row.size != &PoolSettings::bucketSize || row.In(settings) != row.In(PoolSettings());
}

// The settings of a Heap.
inline OBR::MemPool::HeapSettings HeapSettingsOf(const PoolSettings& settings) {
    OBR::MemPool::HeapSettings said;
    if (IsSaid(OBR::MemPool::SettingTable::bucketSize, settings)) {
        said.BucketSize(settings.bucketSize);
    }
    return said.On(true)
        .MaxRecordSize(settings.maxRecordSize)
        .MinRecordSize(settings.minRecordSize)
        .DataAlignment(settings.dataAlignment)
        .KeepEmptyBuckets(settings.keepEmptyBuckets);
}

}  // namespace Replay

#endif
