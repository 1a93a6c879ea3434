// A whole trace in memory, resolved, so that a replay looks nothing up.

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
    // All steps except names. In a step that clears or destroys a pool, `block` is a range of
    // `dropped`: the index of its first element, and the number of elements.
    std::vector<Trace::Step> steps;
    std::vector<std::uint32_t> dropped;  // Indices of blocks.
    std::vector<Trace::Pool> pools;      // Each pool ever created.
    bool hasGroups = false;              // They are groups of a recorded heap, not real pools.
    std::uint32_t numBlocks = 0;         // All indices of blocks are below this.

    std::uint64_t numLeftOut = 0;  // Steps after the last one that was kept.

    std::uint64_t numCleared = 0;     // Blocks that were alive when their pool was cleared,
    std::uint64_t numNeverFreed = 0;  // when it was destroyed, or at the end of the trace.

    // The peak: the first moment with the most requested bytes and, among equal ones, the most
    // blocks.
    std::size_t peakSteps = 0;  // Steps up to and including it.
    std::uint64_t peakBytes = 0;
    std::uint64_t peakBlocks = 0;
};

// Reads to the end, and keeps the first `maxSteps` steps. Calls `atEvent` with the position from
// time to time.
Recording ReadRecording(Trace::StepReader& reader,
                        const std::function<void(std::uint64_t position)>& atEvent,
                        std::size_t maxSteps = std::numeric_limits<std::size_t>::max());

// Merges the groups of a heap into one pool. Leaves real pools as they are.
void MergePools(Recording& recording);

}  // namespace Replay

#endif
