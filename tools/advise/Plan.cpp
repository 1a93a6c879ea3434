// Each pool grows from one group: another one joins if the runs of the two together still end with
// no live block. The groups are tried by their number of blocks, which also orders the pools.

#include "advise/Plan.hpp"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstddef>
#include <map>
#include <numeric>
#include <tuple>
#include <utility>

#include <fmt/format.h>

#include "report/Runs.hpp"
#include "report/Stack.hpp"
#include "report/Tally.hpp"

namespace Advise {

namespace {

constexpr std::size_t maxPools = 5;
constexpr std::size_t maxGroups = 24;  // With the most blocks. The others are in no planned pool.
// A FreeAll takes about as long as so many frees. A shorter run is freed block by block.
constexpr std::uint64_t costOfFreeAll = 50;
// The share of a pool's blocks, and of those of each group in it, that FreeAlls must drop.
constexpr double leastShare = 0.4;
// The share of all blocks that a pool must save.
constexpr double leastOfAll = 0.01;
// The share of its clear runs that a group may lose by sharing a pool.
constexpr double mostLost = 0.1;
constexpr unsigned int enoughRounds = 15;

using Report::BlockSum;
using Report::Runs;

// A set of groups: a bit each.
using Groups = std::uint32_t;
constexpr Groups Only(std::size_t group) {
    return Groups{1} << group;
}
constexpr bool Has(Groups groups, std::size_t group) {
    return (groups & Only(group)) != 0;
}

// In frees.
double Saved(const Runs& runs) {
    return static_cast<double>(runs.clearable) -
           static_cast<double>(costOfFreeAll) * static_cast<double>(runs.numClears);
}

bool IsShareOf(std::uint64_t part, std::uint64_t whole) {
    return static_cast<double>(part) >= leastShare * static_cast<double>(whole);
}

// A name as the report has it: of a call stack, the caller.
std::string NameOf(const Trace::Pool& pool) {
    if (pool.name.empty()) { return pool.address; }
    const std::vector<std::string> frames = Report::FramesOf(pool.name);
    return frames[Report::CallerIn(frames, {})];
}

// Writes a recording anew, with each block in its planned pool.
class Rewriter {
public:
    Rewriter(const Replay::Recording& recorded, std::vector<PlannedPool> planned)
        : pools(planned.size()) {
        proposal.pools = std::move(planned);
        recording.numBlocks = recorded.numBlocks;
        recording.steps.reserve(recorded.steps.size() + pools.size() + 1);
        for (std::uint32_t pool = 0; pool <= pools.size(); ++pool) {
            recording.pools.push_back({fmt::format("pool {}", pool + 1), ""});
            recording.steps.push_back({Trace::Kind::Created, pool, {}});
        }
    }

    // Adds an allocation or a release. A pool beyond the planned ones is that of all other blocks.
    void Add(std::uint64_t event, Trace::Step step, std::size_t pool) {
        step.pool = static_cast<std::uint32_t>(pool);
        if (pool == pools.size()) {
            recording.steps.push_back(step);
            return;
        }
        Pool& its = pools[pool];
        if (step.kind == Trace::Kind::Freed) {
            its.runs.Release();
            its.live.Remove(step.block.size);
            its.frees.push_back(recording.steps.size());
            its.lastFree = event;
        } else {
            EndRun(pool);
            its.live.Add(step.block.size);
            std::uint64_t& peak = proposal.pools[pool].peakBytes;
            peak = std::max(peak, its.live.bytes);
        }
        recording.steps.push_back(step);
    }

    Proposal Finish() {
        for (std::size_t pool = 0; pool < pools.size(); ++pool) { EndRun(pool); }
        std::vector<Trace::Step>& steps = recording.steps;
        steps.erase(std::remove_if(steps.begin(), steps.end(),
                                   [](const Trace::Step& step) { return step.kind == replaced; }),
                    steps.end());
        FindPeak();
        return std::move(proposal);
    }

private:
    struct Pool {
        Runs runs;
        BlockSum live;
        std::vector<std::size_t> frees;  // The steps of the run that has not ended.
        std::uint64_t lastFree = 0;      // Its event.
    };

    static constexpr Trace::Kind replaced = Trace::Kind::Info;  // In no recording.

    void EndRun(std::size_t pool) {
        Pool& its = pools[pool];
        if (its.runs.End(its.live.blocks) >= costOfFreeAll) {
            PlannedPool& row = proposal.pools[pool];
            if (row.numFreeAlls++ == 0) { row.firstFreeAll = its.lastFree; }
            row.numReplaced += its.frees.size();
            for (const std::size_t free : its.frees) { recording.steps[free].kind = replaced; }
            recording.steps[its.frees.back()].kind = Trace::Kind::Cleared;
        }
        its.frees.clear();
    }

    // A FreeAll comes later than the frees that it replaces, so the peak may be another one.
    void FindPeak() {
        std::vector<BlockSum> live(recording.pools.size());
        BlockSum all;
        for (std::size_t i = 0; i < recording.steps.size(); ++i) {
            const Trace::Step& step = recording.steps[i];
            BlockSum& its = live[step.pool];
            if (step.kind == Trace::Kind::Allocated) {
                its.Add(step.block.size);
                all.Add(step.block.size);
            } else if (step.kind == Trace::Kind::Freed) {
                its.Remove(step.block.size);
                all.Remove(step.block.size);
            } else {
                all.blocks -= its.blocks;
                all.bytes -= its.bytes;
                its = {};
            }
            if (std::tie(all.bytes, all.blocks) >
                std::tie(recording.peakBytes, recording.peakBlocks)) {
                recording.peakSteps = i + 1;
                recording.peakBytes = all.bytes;
                recording.peakBlocks = all.blocks;
            }
        }
    }

    Proposal proposal;
    Replay::Recording& recording = proposal.recording;
    std::vector<Pool> pools;
};

class Planner {
public:
    explicit Planner(const Replay::Recording& recorded) : recording(recorded) {
        FindGroups();
        for (const Trace::Step& step : recording.steps) {
            const std::uint8_t group = groupOf[step.pool];
            if (step.kind == Trace::Kind::Created || group == maxGroups) { continue; }
            const bool isFree = step.kind == Trace::Kind::Freed;
            events.push_back(static_cast<std::uint8_t>(2 * group + (isFree ? 1 : 0)));
        }
    }

    std::vector<Groups> FindPools() const {
        std::vector<Groups> pools;
        Groups open = Only(groups.size()) - 1;
        for (std::size_t first = 0; first < groups.size() && pools.size() < maxPools; ++first) {
            if (!Has(open, first)) { continue; }
            Groups pool = Only(first);
            Runs runs = RunsOf(pool);
            if (!IsShareOf(runs.clearable, groups[first].numBlocks)) { continue; }
            while (Grow(pool, runs, open)) {}
            if (Saved(runs) > leastOfAll * static_cast<double>(numBlocks)) {
                pools.push_back(pool);
            }
            open &= ~pool;
        }
        return pools;
    }

    // The recording with these pools.
    Proposal Propose(const std::vector<Groups>& pools) const {
        std::vector<PlannedPool> planned(pools.size());
        for (std::size_t group = 0; group < groups.size(); ++group) {
            const std::size_t pool = PoolOf(pools, group);
            if (pool == pools.size()) { continue; }
            planned[pool].groups.push_back(groups[group].name);
            planned[pool].numBlocks += groups[group].numBlocks;
        }
        Rewriter rewriter(recording, std::move(planned));
        std::uint64_t event = 0;
        for (const Trace::Step& step : recording.steps) {
            ++event;
            if (step.kind == Trace::Kind::Created) { continue; }
            rewriter.Add(event, step, PoolOf(pools, groupOf[step.pool]));
        }
        return rewriter.Finish();
    }

private:
    struct Group {
        std::string name;
        std::uint64_t numBlocks = 0;
    };

    // Traced pools of one name are a group.
    void FindGroups() {
        std::map<std::string, std::size_t> places;
        std::vector<std::size_t> placeOf;
        for (const Trace::Pool& pool : recording.pools) {
            placeOf.push_back(places.try_emplace(NameOf(pool), places.size()).first->second);
        }
        std::vector<Group> all(places.size());
        for (const auto& [name, place] : places) { all[place].name = name; }
        for (const Trace::Step& step : recording.steps) {
            if (step.kind != Trace::Kind::Allocated) { continue; }
            ++all[placeOf[step.pool]].numBlocks;
            ++numBlocks;
        }
        std::vector<std::size_t> order(all.size());
        std::iota(order.begin(), order.end(), 0);
        std::stable_sort(order.begin(), order.end(), [&](std::size_t a, std::size_t b) {
            return all[a].numBlocks > all[b].numBlocks;
        });
        order.resize(std::min(order.size(), maxGroups));
        for (const std::size_t place : order) { groups.push_back(all[place]); }
        for (const std::size_t place : placeOf) {
            const auto group = std::find(order.begin(), order.end(), place);
            groupOf.push_back(group == order.end()
                                  ? maxGroups
                                  : static_cast<std::uint8_t>(group - order.begin()));
        }
    }

    // The index of its pool, or the number of pools if it is in none.
    static std::size_t PoolOf(const std::vector<Groups>& pools, std::size_t group) {
        const auto pool =
            std::find_if(pools.begin(), pools.end(), [&](Groups each) { return Has(each, group); });
        return static_cast<std::size_t>(pool - pools.begin());
    }

    // The runs of one pool for these groups.
    Runs RunsOf(Groups pool) const {
        Runs runs;
        std::uint64_t numLive = 0;
        for (const std::uint8_t event : events) {
            if (!Has(pool, event / 2)) { continue; }
            if (event % 2 != 0) {
                runs.Release();
                --numLive;
            } else {
                runs.End(numLive);
                ++numLive;
            }
        }
        runs.End(numLive);
        return runs;
    }

    // Adds to the pool each open group that fits. False if there is none.
    bool Grow(Groups& pool, Runs& runs, Groups open) const {
        const Groups before = pool;
        for (std::size_t group = 0; group < groups.size(); ++group) {
            if (!Has(open & ~pool, group)) { continue; }
            const Runs alone = RunsOf(Only(group));
            const Runs joined = RunsOf(pool | Only(group));
            const auto lost = static_cast<double>(runs.clearable + alone.clearable) -
                              static_cast<double>(joined.clearable);
            const auto least = static_cast<double>(std::min(runs.clearable, alone.clearable));
            const bool fits =
                lost <= mostLost * least && joined.clearable > runs.clearable &&
                IsShareOf(joined.clearable - runs.clearable, groups[group].numBlocks) &&
                Saved(joined) >= Saved(runs);
            if (!fits) { continue; }
            pool |= Only(group);
            runs = joined;
        }
        return pool != before;
    }

    const Replay::Recording& recording;
    std::uint64_t numBlocks = 0;        // Of all groups.
    std::vector<Group> groups;          // The one with the most blocks first.
    std::vector<std::uint8_t> groupOf;  // By index of the traced pool; `maxGroups` of the others.
    std::vector<std::uint8_t> events;   // Twice the group, and one more for a free.
};

Plan WithSentence(Plan plan) {
    const auto of = [&](const Figures& figures, Aim aim) { return Cost(figures, plan.heap, aim); };
    plan.sentence = fmt::format(
        "{} for blocks that die together, and one more for the rest, would take {:.2f} of the "
        "heap's time and {:.2f} of its bytes; one pool for all takes {:.2f} and {:.2f}.",
        plan.pools.size() == 1 ? "A pool" : fmt::format("{} pools", plan.pools.size()),
        of(plan.figures, Aim::Time), of(plan.figures, Aim::Bytes), of(plan.onePool, Aim::Time),
        of(plan.onePool, Aim::Bytes));
    return plan;
}

}  // namespace

Proposal ProposePools(const Replay::Recording& recorded) {
    const Planner planner(recorded);
    const std::vector<Groups> pools = planner.FindPools();
    return pools.empty() ? Proposal() : planner.Propose(pools);
}

std::optional<Plan> MeasurePlan(const Proposal& proposal,
                                const OBR::MemPool::PoolSettings& settings, const Program& program,
                                Meter& meter, double seconds) {
    OBR::MemPool::PoolSettings kept = settings;
    kept.keepEmptyBuckets = true;  // A pool fills up again after a FreeAll.
    const std::array<Side, 3> sides = {Malloc(), settings, Planned{&proposal.recording, kept}};
    std::array<double, sides.size()> bytes = {};
    std::array<std::vector<double>, sides.size()> times;
    for (std::size_t i = 0; i < sides.size(); ++i) {
        const Outcome held = meter.Held(sides[i]);
        if (!held.figure.has_value()) { return std::nullopt; }
        bytes[i] = *held.figure;
    }
    for (unsigned int round = 0; round < enoughRounds; ++round) {
        if (round >= leastRounds && meter.Elapsed() >= seconds) { break; }
        std::array<Outcome, sides.size()> outcomes;
        for (std::size_t i = 0; i < sides.size(); ++i) { outcomes[i] = meter.Time(sides[i]); }
        if (!std::all_of(outcomes.begin(), outcomes.end(),
                         [](const Outcome& each) { return each.figure.has_value(); })) {
            break;
        }
        for (std::size_t i = 0; i < sides.size(); ++i) { times[i].push_back(*outcomes[i].figure); }
    }
    if (times[0].size() < leastRounds) { return std::nullopt; }

    // In a round the machine is as fast for all sides, so they are compared round by round.
    constexpr std::size_t heap = 0;
    constexpr std::size_t onePool = 1;
    constexpr std::size_t plan = 2;
    const auto figures = [&](std::size_t side, std::size_t other) {
        std::vector<double> ratios;
        for (std::size_t round = 0; round < times[side].size(); ++round) {
            ratios.push_back(times[side][round] / times[other][round]);
        }
        return FiguresOf(ratios, bytes[side], Quantile(times[other], 0.5));
    };
    // Both are replayed, so that what a replay cannot show is the same for both.
    Program whole = program;
    whole.leastGain = leastMeasured;
    whole.startSeconds = 0;
    whole.shareError = {};
    // The more rounds, the less the median varies: twice its standard error is about this.
    const auto gainsOver = [&](std::size_t other) {
        Figures base = FiguresOfHeap(times[other], bytes[other]);
        Figures planned = figures(plan, other);
        base.spread = 0;  // The ratios have that of both sides.
        planned.spread *= 2 / std::sqrt(planned.rounds);
        return Judge({base, {}, {{kept, planned}}, {}}, whole).advised.has_value();
    };
    if (!gainsOver(heap) || !gainsOver(onePool)) { return std::nullopt; }
    return WithSentence({proposal.pools, kept, FiguresOfHeap(times[heap], bytes[heap]),
                         figures(onePool, heap), figures(plan, heap), ""});
}

}  // namespace Advise
