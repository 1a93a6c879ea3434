// Collects the steps of a trace and finds its peak.

#include "replay/Recording.hpp"

#include <algorithm>
#include <future>
#include <tuple>
#include <utility>

namespace Replay {

namespace {

// Whether the pools of the trace are groups that `mempool record` has made of a heap. Pools that
// are cleared or destroyed are real, whatever the trace says.
bool HasGroups(const Trace::StepReader& reader, const std::vector<Trace::Step>& steps) {
    const auto by = reader.Facts().find("by");
    return by != reader.Facts().end() && by->second != "pools" &&
           std::none_of(steps.begin(), steps.end(), [](const Trace::Step& step) {
               return step.kind == Trace::Kind::Cleared || step.kind == Trace::Kind::Destroyed;
           });
}

class Recorder {
public:
    explicit Recorder(std::size_t max) : maxSteps(max) {}

    // Adds a step. `blocks` is the state after it.
    void Add(Trace::Step step, const Trace::Resolver& blocks) {
        if (recording.steps.size() == maxSteps) {
            if (step.kind != Trace::Kind::Named) { ++recording.numLeftOut; }
            return;
        }
        switch (step.kind) {
            case Trace::Kind::Named:
                return;
            case Trace::Kind::Cleared:
                recording.numCleared += Drop(step, blocks.Dropped());
                break;
            case Trace::Kind::Destroyed:
                recording.numNeverFreed += Drop(step, blocks.Dropped());
                break;
            case Trace::Kind::Freed:
                Forget(step.block);
                break;
            case Trace::Kind::Created:
            case Trace::Kind::Allocated:
            case Trace::Kind::Info:
            case Trace::Kind::Time:
            case Trace::Kind::Malformed:
                break;
        }
        recording.steps.push_back(step);
        if (step.kind == Trace::Kind::Allocated) { Count(step.block); }
    }

    Recording Finish(Trace::Resolver& blocks) {
        while (blocks.EndPool()) { recording.numNeverFreed += blocks.Dropped().size(); }
        recording.pools = blocks.Pools();
        recording.numBlocks = blocks.NumBlocks();
        return std::move(recording);
    }

private:
    // Keeps the blocks that the step drops and returns their number.
    std::uint32_t Drop(Trace::Step& step, const std::vector<Trace::Block>& dropped) {
        step.block.index = static_cast<std::uint32_t>(recording.dropped.size());
        step.block.size = static_cast<std::uint32_t>(dropped.size());
        for (const Trace::Block& block : dropped) {
            recording.dropped.push_back(block.index);
            Forget(block);
        }
        return step.block.size;
    }

    void Forget(const Trace::Block& block) {
        liveBytes -= block.size;
        --liveBlocks;
    }

    void Count(const Trace::Block& block) {
        liveBytes += block.size;
        ++liveBlocks;
        if (std::tie(liveBytes, liveBlocks) > std::tie(recording.peakBytes, recording.peakBlocks)) {
            recording.peakSteps = recording.steps.size();
            recording.peakBytes = liveBytes;
            recording.peakBlocks = liveBlocks;
        }
    }

    const std::size_t maxSteps;
    Recording recording;
    std::uint64_t liveBytes = 0;
    std::uint64_t liveBlocks = 0;
};

}  // namespace

Recording ReadRecording(Trace::StepReader& reader,
                        const std::function<void(std::uint64_t position)>& atEvent,
                        std::size_t maxSteps) {
    constexpr std::uint64_t interval = 100000;
    const auto read = [&] {
        Recorder recorder(maxSteps);
        Trace::Step step = {};
        for (std::uint64_t number = 1; reader.Next(step); ++number) {
            recorder.Add(step, reader.Blocks());
            if (number % interval == 0) { atEvent(reader.Position()); }
        }
        Recording recording = recorder.Finish(reader.Blocks());
        recording.hasGroups = HasGroups(reader, recording.steps);
        return recording;
    };
    // In another thread, which has an arena of its own in the C library: the heap of the calling
    // thread, which a replay uses, stays as fresh as that of a new program.
    return std::async(std::launch::async, read).get();
}

void MergePools(Recording& recording) {
    if (!recording.hasGroups) { return; }
    std::vector<Trace::Step>& steps = recording.steps;
    std::size_t kept = 0;
    std::size_t keptToPeak = 0;
    for (std::size_t i = 0; i < steps.size(); ++i) {
        Trace::Step step = steps[i];
        const bool isAnotherPool = step.kind == Trace::Kind::Created && kept > 0;
        step.pool = 0;
        if (!isAnotherPool) { steps[kept++] = step; }
        if (i + 1 == recording.peakSteps) { keptToPeak = kept; }
    }
    steps.resize(kept);
    recording.peakSteps = keptToPeak;
    recording.pools.resize(std::min<std::size_t>(recording.pools.size(), 1));
    recording.hasGroups = false;
}

}  // namespace Replay
