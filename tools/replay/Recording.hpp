// A whole trace in memory, resolved: a replay looks nothing up.

#ifndef OBR_TOOLS_REPLAY_RECORDING_HPP
#define OBR_TOOLS_REPLAY_RECORDING_HPP

#include <cstddef>
#include <cstdint>
#include <functional>
#include <limits>
#include <vector>

#include "trace/Resolver.hpp"
#include "trace/StepReader.hpp"

namespace Replay {

struct Recording {
    // All steps but names. In place of a block, that of a pool cleared or destroyed has the range
    // of its blocks in `dropped`: where it begins, and how many they are.
    std::vector<Trace::Step> steps;
    std::vector<std::uint32_t> dropped;  // Indices of blocks.
    std::vector<Trace::Pool> pools;      // Each pool ever created.
    std::uint32_t numBlocks = 0;         // Their indices are below.

    std::uint64_t numLeftOut = 0;  // Steps behind the last one that was to be kept.

    std::uint64_t numCleared = 0;     // Blocks that were alive when their pool was cleared,
    std::uint64_t numNeverFreed = 0;  // when it was destroyed, or at the end of the trace.

    // The first moment with the most bytes asked for, and among those with the most blocks.
    std::size_t peakSteps = 0;  // Steps up to and including it.
    std::uint64_t peakBytes = 0;
    std::uint64_t peakBlocks = 0;
};

// Reads to the end, and keeps the first `maxSteps` steps. `atEvent` is called with the position now
// and then.
Recording ReadRecording(Trace::StepReader& reader,
                        const std::function<void(std::uint64_t position)>& atEvent,
                        std::size_t maxSteps = std::numeric_limits<std::size_t>::max());

// Makes one pool of all, as if nothing told groups apart. A recording in which a pool is cleared or
// destroyed stays as it is: these are pools, not groups of a heap.
void MergePools(Recording& recording);

}  // namespace Replay

#endif
