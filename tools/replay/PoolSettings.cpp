// How the library rounds its settings, and what it refuses.

#include "replay/PoolSettings.hpp"

#include <algorithm>
#include <cstdint>

#include <MemPool>

namespace Replay {

namespace {

constexpr std::uint64_t recHdrSize = 4;
constexpr std::uint64_t maxBucketSize = 65535;

}  // namespace

PoolSettings PoolSettings::OfProcess() {
    PoolSettings settings;
    settings.bucketSize = OBR::MemPool::NUV_OBR_MEMPOOL_BUCKET_SIZE();
    settings.maxRecordSize = OBR::MemPool::NUV_OBR_MEMPOOL_MAX_RECORD_SIZE();
    settings.minRecordSize = OBR::MemPool::NUV_OBR_MEMPOOL_MIN_RECORD_SIZE();
    settings.dataAlignment = OBR::MemPool::NUV_OBR_MEMPOOL_DATA_ALIGNMENT();
    settings.keepEmptyBuckets = OBR::MemPool::NUV_OBR_MEMPOOL_KEEP_EMPTY_BUCKETS();
    return settings;
}

void PoolSettings::Apply() const {
    OBR::MemPool::NUV_OBR_MEMPOOL_BUCKET_SIZE(bucketSize);
    OBR::MemPool::NUV_OBR_MEMPOOL_MAX_RECORD_SIZE(maxRecordSize);
    OBR::MemPool::NUV_OBR_MEMPOOL_MIN_RECORD_SIZE(minRecordSize);
    OBR::MemPool::NUV_OBR_MEMPOOL_DATA_ALIGNMENT(dataAlignment);
    OBR::MemPool::NUV_OBR_MEMPOOL_KEEP_EMPTY_BUCKETS(keepEmptyBuckets);
}

std::string PoolSettings::Problem() const {
    const std::uint64_t alignment = std::max(dataAlignment, 1U);
    const std::uint64_t bucket = std::min<std::uint64_t>(bucketSize, maxBucketSize);
    const std::uint64_t room = std::max(bucket, recHdrSize) - recHdrSize;
    const std::uint64_t largest = maxRecordSize / alignment * alignment;
    const std::uint64_t smallest = (minRecordSize + alignment - 1) / alignment * alignment;
    if (largest > room) {
        return "a bucket size of " + std::to_string(bucketSize) + " takes records of " +
               std::to_string(room) + " bytes at most, and the maximum record size is " +
               std::to_string(largest);
    }
    if (smallest > largest) {
        return "the minimum record size, rounded up to the alignment, is " +
               std::to_string(smallest) + " and above the maximum, rounded down, of " +
               std::to_string(largest);
    }
    return "";
}

}  // namespace Replay
