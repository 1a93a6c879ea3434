// The pass over a trace, and what is summed up after it.

#include "report/Analysis.hpp"

#include <algorithm>
#include <cstddef>
#include <tuple>
#include <utility>

#include "report/MallocSizes.hpp"

namespace Report {

namespace {

enum class End : std::uint8_t { Freed, Cleared, Destroyed };

class Analyst {
public:
    explicit Analyst(const Replay::PoolSettings& settings) : pools(settings), onePool(settings) {
        result.settings = settings;
        onePool.Create(0);
    }

    // `blocks` is as the step has left it.
    void Take(const Trace::Step& step, const Trace::Resolver& blocks) {
        if (step.kind == Trace::Kind::Named) { return; }
        ++result.events;
        switch (step.kind) {
            case Trace::Kind::Created:
                rows.emplace_back();
                pools.Create(step.pool);
                break;
            case Trace::Kind::Allocated:
                Allocate(step.pool, step.block);
                break;
            case Trace::Kind::Freed:
                ++result.frees;
                pools.Free(step.pool, alive[step.block.index].place, step.block.size);
                Release(step.pool, step.block, End::Freed);
                break;
            case Trace::Kind::Cleared:
                ++result.clears;
                Drop(step.pool, blocks.Dropped(), End::Cleared);
                pools.Clear(step.pool);
                break;
            case Trace::Kind::Destroyed:
                Drop(step.pool, blocks.Dropped(), End::Destroyed);
                pools.Destroy(step.pool);
                break;
            case Trace::Kind::Named:
            case Trace::Kind::Info:
            case Trace::Kind::Malformed:
                return;
        }
        Look();
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
        return std::move(result);
    }

private:
    struct Alive {
        std::uint64_t since;  // The event of its allocation.
        Place place;
        Place placeInOne;
    };
    struct PoolRow {
        Tally tally;
        Runs runs;
    };

    void Allocate(std::uint32_t pool, const Trace::Block& block) {
        rows[pool].runs.End(rows[pool].tally.live.blocks);
        SizeRow& sizeRow = sizes.Row(block.size);
        if (sizeRow.tally.all.blocks == 0) { sizeRow.smallest = block.size; }
        sizeRow.smallest = std::min(sizeRow.smallest, block.size);
        sizeRow.largest = std::max(sizeRow.largest, block.size);
        for (Tally* const tally : {&result.total, &sizeRow.tally, &rows[pool].tally}) {
            tally->Change(result.events, result.peak.event);
            tally->live.Add(block.size);
            tally->all.Add(block.size);
            if (!pools.IsRecord(block.size)) { continue; }
            tally->inRecords.Add(block.size);
            tally->padding += pools.RecordBytes(block.size) - block.size;
        }
        heapBytes += MallocBytes(block.size);
        if (alive.size() <= block.index) { alive.resize(block.index + std::size_t{1}); }
        alive[block.index] = {result.events, pools.Allocate(pool, block.size),
                              onePool.Allocate(0, block.size)};
    }

    // For each block that goes. The caller updates the model of its own pool.
    void Release(std::uint32_t pool, const Trace::Block& block, End end) {
        const Alive& was = alive[block.index];
        onePool.Free(0, was.placeInOne, block.size);
        heapBytes -= MallocBytes(block.size);
        rows[pool].runs.Release(1);
        const std::size_t bin = LifetimeBin(result.events - was.since);
        for (Tally* const tally :
             {&result.total, &sizes.Row(block.size).tally, &rows[pool].tally}) {
            tally->Change(result.events, result.peak.event);
            tally->live.Remove(block.size);
            if (end == End::Destroyed) {
                ++tally->never;
            } else {
                ++tally->lifetimes[bin];
            }
            if (end == End::Cleared) { ++tally->dropped; }
        }
    }

    void Drop(std::uint32_t pool, const std::vector<Trace::Block>& dropped, End end) {
        for (const Trace::Block& block : dropped) { Release(pool, block, end); }
        if (result.total.live.blocks == 0) { onePool.Clear(0); }
    }

    // After each event.
    void Look() {
        const BlockSum& live = result.total.live;
        const Moment now = {result.events,
                            live.bytes,
                            live.blocks,
                            pools.BytesHeld(),
                            onePool.BytesHeld(),
                            heapBytes,
                            heapBytes + mallocHeader * live.blocks};
        timeline.Add(now);
        fill.Add(now.event, pools);
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

    void JoinGroups(const std::vector<Trace::Pool>& traced) {
        std::map<std::string, std::size_t> places;
        for (std::size_t pool = 0; pool < rows.size(); ++pool) {
            rows[pool].tally.Finish(result.peak.event);
            rows[pool].runs.End(rows[pool].tally.live.blocks);
            const Trace::Pool& named = traced[pool];
            const std::string& name = named.name.empty() ? named.address : named.name;
            const auto [place, isNew] = places.try_emplace(name, result.groups.size());
            if (isNew) { result.groups.push_back({name, 0, {}, {}}); }
            GroupRow& group = result.groups[place->second];
            ++group.numPools;
            group.tally.Add(rows[pool].tally);
            group.runs.Add(rows[pool].runs);
        }
        for (const GroupRow& group : result.groups) { result.runs.Add(group.runs); }
        std::sort(result.groups.begin(), result.groups.end(),
                  [](const GroupRow& a, const GroupRow& b) {
                      return std::tie(b.tally.atPeak.bytes, b.tally.all.bytes, a.name) <
                             std::tie(a.tally.atPeak.bytes, a.tally.all.bytes, b.name);
                  });
    }

    Analysis result;
    PoolModel pools;
    PoolModel onePool;
    Sizes sizes;
    std::vector<PoolRow> rows;  // By index of the traced pool.
    std::vector<Alive> alive;   // By index of the block.
    std::uint64_t heapBytes = 0;
    Timeline timeline;
    FillMap fill;
};

}  // namespace

Analysis Analyse(Trace::StepReader& reader, const Replay::PoolSettings& settings,
                 const std::function<void(std::uint64_t position)>& atEvent) {
    constexpr std::uint64_t interval = 100000;
    Analyst analyst(settings);
    Trace::Step step = {};
    for (std::uint64_t number = 1; reader.Next(step); ++number) {
        analyst.Take(step, reader.Blocks());
        if (number % interval == 0) { atEvent(reader.Position()); }
    }
    return analyst.Finish(reader);
}

}  // namespace Report
