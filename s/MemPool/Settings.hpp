// The settings of the process: plain values, which every layer may read. The exported accessors and
// the start-up from the environment store them; a new pool copies all but `trace`. Sizes in bytes.

#ifndef OBR_MEMPOOL_SETTINGS_HPP
#define OBR_MEMPOOL_SETTINGS_HPP

#include <cstdint>

// Hidden by name, so that reading a setting is one load even where it is only declared.
#define OBR_HIDDEN __attribute__((visibility("hidden")))

namespace OBR::MemPool {

namespace Settings {

// The bounds of the two record sizes in the environment.
constexpr std::uint32_t largestMaxRecordSize = 0x7FFF;
constexpr std::uint32_t smallestMinRecordSize = 4;

OBR_HIDDEN extern std::uint32_t bucketSize;     // Target size of a bucket.
OBR_HIDDEN extern std::uint16_t dataAlignment;  // Data sizes become a multiple of it.
OBR_HIDDEN extern std::uint32_t maxRecordSize;  // Largest record in a bucket, header included.
OBR_HIDDEN extern std::uint32_t minRecordSize;  // Smallest one.
OBR_HIDDEN extern bool keepEmptyBuckets;        // Whether empty buckets stay in their group.
OBR_HIDDEN extern bool off;                     // Whether new pools pass requests to the heap.
OBR_HIDDEN extern bool trace;                   // Read at every event of every pool.

}  // namespace Settings

}  // namespace OBR::MemPool

#endif
