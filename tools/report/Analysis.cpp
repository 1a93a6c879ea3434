// The pass over a trace, and the sums after it.

#include "report/Analysis.hpp"

#include <algorithm>
#include <array>
#include <cstddef>
#include <set>
#include <tuple>
#include <unordered_map>
#include <utility>

#include "report/MallocSizes.hpp"
#include "report/Samples.hpp"

namespace Report {

namespace {

enum class End : std::uint8_t { Freed, FreedAtOnce, Cleared, Destroyed };

// The group of a traced pool.
const std::string& NameOf(const Trace::Pool& pool) {
    return pool.name.empty() ? pool.address : pool.name;
}

class Analyst {
public:
    Analyst(const OBR::MemPool::PoolSettings& settings, Skipped skippedFunctions)
        : skipped(std::move(skippedFunctions)), pools(settings), onePool(settings) {
        result.settings = settings;
        onePool.Create(0);
    }

    // Handles the last step that the reader has read.
    void Take(const Trace::Step& step, const Trace::StepReader& reader) {
        if (step.kind == Trace::Kind::Named) { return; }
        ++result.events;
        std::uint64_t& allocation = lastAllocations[reader.Thread()];
        const std::uint64_t formerAllocation = std::exchange(allocation, 0);
        switch (step.kind) {
            case Trace::Kind::Created:
                if (rowOf.empty()) { isByStack = IsByStack(reader.Facts()); }
                rowOf.push_back(isByStack ? noRow : AddRow({}));
                stacks.resize(isByStack ? rowOf.size() : 0);
                break;
            case Trace::Kind::Allocated:
                if (rowOf[step.pool] == noRow) {
                    FindRow(step.pool, NameOf(reader.Blocks().Pools()[step.pool]));
                }
                Allocate(step.pool, step.block);
                allocation = result.events;
                break;
            case Trace::Kind::Freed:
                ++result.frees;
                pools.Free(rowOf[step.pool], alive[step.block.index].place, step.block.size);
                Release(step.pool, step.block,
                        alive[step.block.index].since == formerAllocation ? End::FreedAtOnce
                                                                          : End::Freed);
                break;
            case Trace::Kind::Cleared:
                ++result.clears;
                Drop(step.pool, reader.Blocks().Dropped(), End::Cleared);
                break;
            case Trace::Kind::Destroyed:
                Drop(step.pool, reader.Blocks().Dropped(), End::Destroyed);
                break;
            case Trace::Kind::Named:
            case Trace::Kind::Info:
            case Trace::Kind::Time:
            case Trace::Kind::Malformed:
                return;
        }
        Look(reader.Milliseconds());
    }

    Analysis Finish(const Trace::StepReader& reader) {
        result.trace = reader.Name();
        result.facts = reader.Facts();
        result.badLines = reader.Bad();
        result.warning = reader.Warning();
        result.total.Finish(result.peak.event);
        result.timeline = timeline.Points();
        result.classes = pools.Classes();
        result.fill = fill.Columns();
        for (const SizeRow& row : sizes.Rows()) {
            if (row.tally.all.blocks == 0) { continue; }
            result.sizes.push_back(row);
            result.sizes.back().tally.Finish(result.peak.event);
        }
        JoinGroups(reader.Blocks().Pools());
        AddGrowth(reader.Blocks().Pools());
        AddStacks(reader.Blocks().Pools());
        return std::move(result);
    }

private:
    struct Alive {
        std::uint64_t since;  // The event of its allocation.
        Place place;
        Place placeInOne;
    };
    struct Row {
        std::string name;  // Empty for that of the traced pool.
        Tally tally;
        Runs runs;
    };
    // Live bytes by row.
    struct LiveColumn {
        std::uint64_t event = 0;
        std::optional<std::uint64_t> milliseconds;
        std::vector<std::pair<std::uint32_t, std::uint64_t>> rows;
    };
    static constexpr std::uint32_t noRow = ~std::uint32_t{0};

    static bool IsByStack(const std::map<std::string, std::string>& facts) {
        const auto by = facts.find("by");
        return by != facts.end() && by->second == "stack";
    }

    std::uint32_t AddRow(std::string name) {
        const auto row = static_cast<std::uint32_t>(rows.size());
        rows.push_back({std::move(name), {}, {}});
        pools.Create(row);
        liveRows.insert(row);
        return row;
    }

    // Of a stack: the row of its caller.
    void FindRow(std::uint32_t pool, const std::string& stack) {
        const std::vector<std::string> frames = FramesOf(stack);
        const std::string& name = frames[CallerIn(frames, skipped)];
        const auto [place, isNew] = rowsByName.try_emplace(name, noRow);
        if (isNew) { place->second = AddRow(name); }
        rowOf[pool] = place->second;
    }

    std::array<Tally*, 4> Tallies(std::uint32_t pool, std::uint32_t size) {
        return {&result.total, &sizes.Row(size).tally, &rows[rowOf[pool]].tally,
                isByStack ? &stacks[pool] : &noStack};
    }

    void Allocate(std::uint32_t pool, const Trace::Block& block) {
        const std::uint32_t row = rowOf[pool];
        rows[row].runs.End(rows[row].tally.live.blocks);
        SizeRow& sizeRow = sizes.Row(block.size);
        if (sizeRow.tally.all.blocks == 0) { sizeRow.smallest = block.size; }
        sizeRow.smallest = std::min(sizeRow.smallest, block.size);
        sizeRow.largest = std::max(sizeRow.largest, block.size);
        for (Tally* const tally : Tallies(pool, block.size)) {
            tally->Change(result.events, result.peak.event);
            tally->live.Add(block.size);
            tally->all.Add(block.size);
            if (!pools.IsRecord(block.size)) { continue; }
            tally->inRecords.Add(block.size);
            tally->padding += pools.RecordBytes(block.size) - block.size;
        }
        heapBytes += MallocBytes(block.size);
        if (alive.size() <= block.index) { alive.resize(block.index + std::size_t{1}); }
        alive[block.index] = {result.events, pools.Allocate(row, block.size),
                              onePool.Allocate(0, block.size)};
    }

    // Handles the release of a block. The caller updates the model of the block's own pool.
    void Release(std::uint32_t pool, const Trace::Block& block, End end) {
        const Alive& was = alive[block.index];
        onePool.Free(0, was.placeInOne, block.size);
        heapBytes -= MallocBytes(block.size);
        rows[rowOf[pool]].runs.Release();
        const std::size_t bin = LifetimeBin(result.events - was.since);
        for (Tally* const tally : Tallies(pool, block.size)) {
            tally->Change(result.events, result.peak.event);
            tally->live.Remove(block.size);
            if (end == End::Destroyed) {
                tally->never.Add(block.size);
            } else {
                ++tally->lifetimes[bin];
            }
            if (end == End::Cleared) { ++tally->dropped; }
            if (end == End::FreedAtOnce) { ++tally->temporary; }
        }
    }

    void Drop(std::uint32_t pool, const std::vector<Trace::Block>& dropped, End end) {
        const std::uint32_t row = rowOf[pool];
        for (const Trace::Block& block : dropped) {
            // The pool of a caller lasts while one of its stacks goes.
            if (isByStack) { pools.Free(row, alive[block.index].place, block.size); }
            Release(pool, block, end);
        }
        if (result.total.live.blocks == 0) { onePool.Clear(0); }
        if (isByStack) { return; }
        if (end == End::Cleared) {
            pools.Clear(row);
        } else {
            pools.Destroy(row);
            liveRows.erase(row);
        }
    }

    // Called after each event.
    void Look(std::optional<std::uint64_t> milliseconds) {
        const BlockSum& live = result.total.live;
        const Moment now = {result.events,     milliseconds,
                            live.bytes,        live.blocks,
                            pools.BytesHeld(), onePool.BytesHeld(),
                            heapBytes,         heapBytes + mallocHeader * live.blocks};
        timeline.Add(now);
        if (FillColumn* const column = fill.At(now.event)) { *column = FillOf(now.event, pools); }
        if (LiveColumn* const column = growth.At(now.event)) {
            column->event = now.event;
            column->milliseconds = milliseconds;
            for (const std::uint32_t row : liveRows) {
                column->rows.emplace_back(row, rows[row].tally.live.bytes);
            }
        }
        if (std::tie(now.asked, now.blocks) > std::tie(result.peak.asked, result.peak.blocks)) {
            result.peak = now;
        }
        Moment& most = result.most;
        most.asked = std::max(most.asked, now.asked);
        most.blocks = std::max(most.blocks, now.blocks);
        most.pools = std::max(most.pools, now.pools);
        most.onePool = std::max(most.onePool, now.onePool);
        most.heap = std::max(most.heap, now.heap);
        most.chunks = std::max(most.chunks, now.chunks);
    }

    // Without stacks the rows are those of the traced pools.
    const std::string& NameOfRow(std::size_t row, const std::vector<Trace::Pool>& traced) const {
        return rows[row].name.empty() ? NameOf(traced[row]) : rows[row].name;
    }

    void JoinGroups(const std::vector<Trace::Pool>& traced) {
        std::map<std::string, std::size_t> places;
        for (std::size_t row = 0; row < rows.size(); ++row) {
            rows[row].tally.Finish(result.peak.event);
            rows[row].runs.End(rows[row].tally.live.blocks);
            const std::string& name = NameOfRow(row, traced);
            const auto [place, isNew] = places.try_emplace(name, result.groups.size());
            if (isNew) { result.groups.push_back({name, 0, {}, {}, {}}); }
            GroupRow& group = result.groups[place->second];
            ++group.numPools;
            group.tally.Add(rows[row].tally);
            group.runs.Add(rows[row].runs);
        }
        for (const GroupRow& group : result.groups) { result.runs.Add(group.runs); }
        std::sort(result.groups.begin(), result.groups.end(),
                  [](const GroupRow& a, const GroupRow& b) {
                      return std::tie(b.tally.atPeak.bytes, b.tally.all.bytes, a.name) <
                             std::tie(a.tally.atPeak.bytes, a.tally.all.bytes, b.name);
                  });
    }

    // Called after JoinGroups.
    void AddGrowth(const std::vector<Trace::Pool>& traced) {
        const std::size_t numGrowing = std::min(result.groups.size(), maxGrowing);
        std::map<std::string, std::size_t> places;
        for (std::size_t i = 0; i < numGrowing; ++i) { places.emplace(result.groups[i].name, i); }
        const std::vector<std::uint64_t> nothing(numGrowing + 1);
        for (const LiveColumn& column : growth.Columns()) {
            result.growth.push_back({column.event, column.milliseconds, nothing});
            for (const auto& [row, bytes] : column.rows) {
                const auto place = places.find(NameOfRow(row, traced));
                result.growth.back().live[place != places.end() ? place->second : numGrowing] +=
                    bytes;
            }
        }
        GrowthPoint peak = {result.peak.event, result.peak.milliseconds, nothing};
        for (std::size_t i = 0; i < result.groups.size(); ++i) {
            peak.live[std::min(i, numGrowing)] += result.groups[i].tally.atPeak.bytes;
        }
        const auto place =
            std::find_if(result.growth.begin(), result.growth.end(),
                         [&](const GrowthPoint& point) { return point.event >= peak.event; });
        if (place == result.growth.end() || place->event != peak.event) {
            result.growth.insert(place, std::move(peak));
        }
    }

    // After JoinGroups.
    void AddStacks(const std::vector<Trace::Pool>& traced) {
        for (std::size_t pool = 0; pool < stacks.size(); ++pool) {
            if (rowOf[pool] == noRow) { continue; }
            stacks[pool].Finish(result.peak.event);
            result.stacks.push_back(
                {FramesOf(NameOf(traced[pool])), stacks[pool].all, stacks[pool].atPeak});
        }
        std::sort(result.stacks.begin(), result.stacks.end(),
                  [](const StackRow& a, const StackRow& b) {
                      return std::tie(b.atPeak.bytes, b.all.bytes, a.frames) <
                             std::tie(a.atPeak.bytes, a.all.bytes, b.frames);
                  });
        result.passingOn = FindPassingOn(result.stacks, skipped);
        std::map<std::string, const StackRow*> largest;
        for (const StackRow& stack : result.stacks) {
            largest.try_emplace(stack.frames[CallerIn(stack.frames, skipped)], &stack);
        }
        for (GroupRow& group : result.groups) {
            const auto place = largest.find(group.name);
            if (place != largest.end()) { group.stack = place->second->frames; }
        }
    }

    Analysis result;
    const Skipped skipped;
    PoolModel pools;
    PoolModel onePool;
    Sizes sizes;
    std::vector<Row> rows;             // Of the traced pools, or of the callers of their stacks.
    std::vector<std::uint32_t> rowOf;  // By index of the traced pool.
    bool isByStack = false;
    std::unordered_map<std::string, std::uint32_t> rowsByName;  // Of callers.
    std::vector<Tally> stacks;  // By index of the traced pool, if each is a stack.
    Tally noStack;              // In place of one.
    std::vector<Alive> alive;   // By index of the block.
    std::uint64_t heapBytes = 0;
    Timeline timeline;
    Samples<FillColumn> fill;
    Samples<LiveColumn> growth;
    std::set<std::uint32_t> liveRows;
    std::unordered_map<std::uint64_t, std::uint64_t>
        lastAllocations;  // By thread: the event of its last one, or 0 if another event followed.
};

}  // namespace

Analysis Analyse(Trace::StepReader& reader, const OBR::MemPool::PoolSettings& settings,
                 const std::function<void(std::uint64_t position)>& atEvent,
                 const Skipped& skipped) {
    constexpr std::uint64_t interval = 100000;
    Analyst analyst(settings, skipped);
    Trace::Step step = {};
    for (std::uint64_t number = 1; reader.Next(step); ++number) {
        analyst.Take(step, reader);
        if (number % interval == 0) { atEvent(reader.Position()); }
    }
    return analyst.Finish(reader);
}

}  // namespace Report
