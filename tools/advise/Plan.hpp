// A plan of pools for a recorded heap: which groups should share a pool because their blocks die
// together, so that one FreeAll replaces the frees of a run. report/Runs.hpp defines runs.

#ifndef OBR_TOOLS_ADVISE_PLAN_HPP
#define OBR_TOOLS_ADVISE_PLAN_HPP

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include <MemPoolSettings>

#include "advise/Figures.hpp"
#include "advise/Meter.hpp"
#include "advise/Verdict.hpp"
#include "replay/Recording.hpp"

namespace Advise {

struct PlannedPool {
    std::vector<std::string> groups;  // The one with the most blocks first.
    std::uint64_t numBlocks = 0;      // All that it ever allocates.
    std::uint64_t peakBytes = 0;      // The most requested bytes that it holds at any time.
    std::uint64_t numFreeAlls = 0;
    std::uint64_t numReplaced = 0;   // The frees that these replace.
    std::uint64_t firstFreeAll = 0;  // The event of the last free that the first one replaces.
};

// Pools that have not been measured yet, and the recording as the program would run on them.
struct Proposal {
    std::vector<PlannedPool> pools;
    Replay::Recording recording;
};

struct Plan {
    std::vector<PlannedPool> pools;  // All other blocks are in one more pool.
    OBR::MemPool::PoolSettings settings;
    Figures heap;
    Figures onePool;  // For all blocks, freed one by one.
    Figures figures;  // Of the plan.
    std::string sentence;
};

// Looks for groups whose lifetimes nest in one another. The recording must have groups. There may
// be no such pool; then the new recording is empty.
Proposal ProposePools(const Replay::Recording& recorded);

// Measures the proposal in turns with one pool that has these settings and with the heap, for so
// many seconds. The pools of the plan have the same settings, and keep empty buckets. There is none
// if it gains nothing over one pool or nothing over the heap.
std::optional<Plan> MeasurePlan(const Proposal& proposal,
                                const OBR::MemPool::PoolSettings& settings, const Program& program,
                                Meter& meter, double seconds);

}  // namespace Advise

#endif
