// The values, in ascending order. With these bucket sizes the heap block of a bucket, with its
// header, is just below a power of two. A data alignment below 4 would be slower, and few programs
// could use such blocks.

#include "advise/Space.hpp"

#include <algorithm>
#include <array>
#include <cstddef>

namespace Advise {

namespace {

using OBR::MemPool::PoolSettings;
using Values = std::vector<unsigned int>;

const Values bucketSizes = {506, 1010, 2010, 4010, 8106, 16298, 32682, 65450};
const Values maxRecordSizes = {64, 128, 256, 500, 1000, 2000, 4000, 8000, 16000, 32000};
const Values minRecordSizes = {8, 16, 24, 32, 48, 64};
const Values dataAlignments = {4, 8, 16, 32, 64};

struct Dimension {
    unsigned int PoolSettings::*place;
    const Values& values;
};
const std::array<Dimension, 4> dimensions = {{{&PoolSettings::bucketSize, bucketSizes},
                                              {&PoolSettings::maxRecordSize, maxRecordSizes},
                                              {&PoolSettings::minRecordSize, minRecordSizes},
                                              {&PoolSettings::dataAlignment, dataAlignments}}};

bool Fits(const PoolSettings& settings) {
    return !OBR::MemPool::PoolSizes(settings).IsMaxAboveRoom();
}

// One of bucket size and maximum record size was just changed: makes the other one fit, if a value
// does.
bool Repair(PoolSettings& settings, bool bucketWasChanged) {
    if (Fits(settings)) { return true; }
    if (bucketWasChanged) {
        const auto above = std::upper_bound(maxRecordSizes.begin(), maxRecordSizes.end(),
                                            OBR::MemPool::PoolSizes(settings).RoomInBucket());
        if (above == maxRecordSizes.begin()) { return false; }
        settings.maxRecordSize = *(above - 1);
    } else {
        const auto enough = std::lower_bound(bucketSizes.begin(), bucketSizes.end(),
                                             settings.maxRecordSize + OBR::MemPool::recordOverhead);
        if (enough == bucketSizes.end()) { return false; }
        settings.bucketSize = *enough;
    }
    return true;
}

// Whether both the environment and HeapSettings accept the settings.
bool CanBeSet(const PoolSettings& settings) {
    const OBR::MemPool::PoolSizes sizes(settings);
    return !sizes.IsMaxAboveRoom() && !sizes.IsMinAboveMax() && OBR::MemPool::CanStartUp(settings);
}

void AddStep(std::vector<PoolSettings>& steps, PoolSettings settings, const Dimension& dimension,
             unsigned int value) {
    settings.*dimension.place = value;
    if (!Repair(settings, dimension.place == &PoolSettings::bucketSize)) { return; }
    if (CanBeSet(settings)) { steps.push_back(settings); }
}

}  // namespace

unsigned int NumDifferences(const PoolSettings& a, const PoolSettings& b) {
    unsigned int number = 0;
    for (const auto& row : OBR::MemPool::SettingTable::all) {
        if (row.In(a) != row.In(b)) { ++number; }
    }
    return number;
}

std::vector<PoolSettings> CoarseGrid() {
    std::vector<PoolSettings> grid;
    for (const unsigned int alignment : {4U, 16U}) {
        for (const unsigned int bucketSize : {4010U, 65450U, 1010U, 16298U}) {
            for (const bool keep : {false, true}) {
                grid.push_back({bucketSize, 1000, 8, alignment, keep});
            }
        }
    }
    return grid;
}

std::vector<PoolSettings> Neighbours(const PoolSettings& center) {
    std::vector<PoolSettings> steps;
    for (const Dimension& dimension : dimensions) {
        const Values& values = dimension.values;
        const auto place = std::lower_bound(values.begin(), values.end(), center.*dimension.place);
        if (place != values.begin()) { AddStep(steps, center, dimension, *(place - 1)); }
        if (place != values.end() && place + 1 != values.end()) {
            AddStep(steps, center, dimension, *(place + 1));
        }
    }
    steps.push_back(center);
    steps.back().keepEmptyBuckets = !center.keepEmptyBuckets;
    return steps;
}

}  // namespace Advise
