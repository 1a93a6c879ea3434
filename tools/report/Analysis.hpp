// Analyses a program's memory from a trace: the sizes of its blocks, their lifetimes, the groups
// that allocate them, and the bytes that pools would hold compared with the heap. It takes one pass
// over the trace, and memory that grows with the live blocks and the pools, not with the events.
//
// A *group* is what the recording traced as one pool: all blocks, or those of a caller, module,
// thread or real pool. Traced pools with the same name are one group; without names, those with the
// same address. If the recording traced call stacks, the stacks of a caller are one group, as if
// they were one pool. An *event* is an allocation, a release, a Clear, or the creation or the
// destruction of a pool.

#ifndef OBR_TOOLS_REPORT_ANALYSIS_HPP
#define OBR_TOOLS_REPORT_ANALYSIS_HPP

#include <cstddef>
#include <cstdint>
#include <functional>
#include <map>
#include <optional>
#include <string>
#include <vector>

#include <MemPoolSettings>

#include "report/FillMap.hpp"
#include "report/PoolModel.hpp"
#include "report/Runs.hpp"
#include "report/Sizes.hpp"
#include "report/Stack.hpp"
#include "report/Tally.hpp"
#include "report/Timeline.hpp"
#include "trace/StepReader.hpp"

namespace Report {

struct GroupRow {
    std::string name;  // Its address if the trace has no name.
    std::uint64_t numPools = 0;
    Tally tally;
    Runs runs;
    std::vector<std::string> stack;  // The frames of its largest stack at the peak, if it has any.
};

// The live bytes of groups at one moment.
struct GrowthPoint {
    std::uint64_t event = 0;
    std::optional<std::uint64_t> milliseconds;  // If the trace has times.
    std::vector<std::uint64_t>
        live;  // Of the first groups of the analysis; the last is all others.
};
constexpr std::size_t maxGrowing = 9;

struct Analysis {
    std::string trace;
    std::map<std::string, std::string> facts;  // What the trace says about itself.
    Trace::BadLines badLines;
    std::string warning;  // If the trace is incomplete.
    OBR::MemPool::PoolSettings settings;

    std::uint64_t events = 0;
    std::uint64_t frees = 0;
    std::uint64_t clears = 0;
    Tally total;
    Runs runs;    // Of all groups.
    Moment peak;  // The first moment with the most bytes and, among equal ones, the most blocks.
    Moment most;  // The maximum of each figure at any time. Its event is not set.

    std::vector<SizeRow> sizes;    // Those that occur, the smallest first.
    std::vector<GroupRow> groups;  // The largest at the peak first.
    std::vector<StackRow> stacks;  // Likewise.
    Skipped passingOn;             // Functions that only pass memory on, as the stacks show.
    std::vector<Point> timeline;
    std::vector<GrowthPoint> growth;  // Of at most `maxGrowing` groups. The peak is a point.
    std::vector<SizeClass> classes;   // At the end. For their sizes.
    std::vector<FillColumn> fill;
};

// Reads the trace to its end, and calls `atEvent` with the position from time to time. The settings
// must be valid for a pool. Functions that are skipped are not callers.
Analysis Analyse(Trace::StepReader& reader, const OBR::MemPool::PoolSettings& settings,
                 const std::function<void(std::uint64_t position)>& atEvent,
                 const Skipped& skipped = {});

}  // namespace Report

#endif
