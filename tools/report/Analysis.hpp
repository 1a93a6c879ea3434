// What a trace tells about a program's memory: which sizes, how long blocks live, which groups of
// the recording have them, and what pools would hold beside the heap. Read in one pass, in memory
// that grows with the blocks that live at a time and with the pools, not with the events.
//
// A *group* is what the recording has traced as one pool: all blocks, or those of a caller, module,
// thread or real pool. Traced pools of one name are one group; without names, those of one address.
// An *event* is an allocation, a release, a Clear, and the begin or the end of a pool.

#ifndef OBR_TOOLS_REPORT_ANALYSIS_HPP
#define OBR_TOOLS_REPORT_ANALYSIS_HPP

#include <cstdint>
#include <functional>
#include <map>
#include <string>
#include <vector>

#include "replay/PoolSettings.hpp"
#include "report/PoolModel.hpp"
#include "report/Runs.hpp"
#include "report/Sizes.hpp"
#include "report/Tally.hpp"
#include "report/Timeline.hpp"
#include "trace/StepReader.hpp"

namespace Report {

struct GroupRow {
    std::string name;  // What the trace calls it, else its address.
    std::uint64_t numPools = 0;
    Tally tally;
    Runs runs;
};

struct Analysis {
    std::string trace;
    std::map<std::string, std::string> facts;  // What the trace tells about itself.
    Trace::BadLines badLines;
    std::string warning;  // If the trace breaks off.
    Replay::PoolSettings settings;

    std::uint64_t events = 0;
    std::uint64_t frees = 0;
    std::uint64_t clears = 0;
    Tally total;
    Runs runs;    // Of all groups.
    Moment peak;  // The first moment with the most bytes, and among those with the most blocks.
    Moment most;  // The most of each figure at any time. Its event means nothing.

    std::vector<SizeRow> sizes;    // Only those that occur, the smallest first.
    std::vector<GroupRow> groups;  // The largest at the peak first.
    std::vector<Point> timeline;
    std::vector<SizeClass> classes;  // As they stand at the end: for their sizes.
    std::vector<FillColumn> fill;
};

// Reads to the end. `atEvent` is called with the position now and then. The settings must be such
// that a pool can be built.
Analysis Analyse(Trace::StepReader& reader, const Replay::PoolSettings& settings,
                 const std::function<void(std::uint64_t position)>& atEvent);

}  // namespace Report

#endif
