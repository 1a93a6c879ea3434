// Collects the steps of a trace and finds its peak.

#include "replay/Recording.hpp"

#include <optional>
#include <tuple>
#include <utility>

namespace Replay {

namespace {

class Recorder {
public:
    void Add(const Trace::Event& event, std::uint64_t position) {
        Trace::Step step = {};
        if (const auto fault = resolver.Resolve(event, step)) {
            AddBadLine({position, *fault});
            return;
        }
        switch (step.kind) {
            case Trace::Kind::Info:
                recording.facts[std::string(event.key)] = event.text;
                return;
            case Trace::Kind::Named:
                return;
            case Trace::Kind::Cleared:
                recording.numCleared += Drop(step);
                break;
            case Trace::Kind::Destroyed:
                recording.numNeverFreed += Drop(step);
                break;
            case Trace::Kind::Freed:
                Forget(step.block);
                break;
            default:
                break;
        }
        recording.steps.push_back(step);
        if (step.kind == Trace::Kind::Allocated) { Count(step.block); }
    }

    Recording Finish() {
        while (resolver.EndPool()) { recording.numNeverFreed += resolver.Dropped().size(); }
        recording.pools = resolver.Pools();
        recording.numBlocks = resolver.NumBlocks();
        return std::move(recording);
    }

private:
    void AddBadLine(BadLine line) {
        constexpr std::size_t maxShown = 5;
        ++recording.numFaults[static_cast<std::size_t>(line.fault)];
        if (recording.badLines.size() < maxShown) { recording.badLines.push_back(line); }
    }

    // Keeps the blocks that go with the step and returns their number.
    std::uint32_t Drop(Trace::Step& step) {
        step.block.index = static_cast<std::uint32_t>(recording.dropped.size());
        step.block.size = static_cast<std::uint32_t>(resolver.Dropped().size());
        for (const Trace::Block& block : resolver.Dropped()) {
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

    Recording recording;
    Trace::Resolver resolver;
    std::uint64_t liveBytes = 0;
    std::uint64_t liveBlocks = 0;
};

}  // namespace

Recording ReadRecording(Trace::EventSource& source,
                        const std::function<void(std::uint64_t position)>& atEvent) {
    constexpr std::uint64_t interval = 100000;
    Recorder recorder;
    Trace::Event event;
    for (std::uint64_t number = 1; source.Next(event); ++number) {
        recorder.Add(event, source.Position());
        if (number % interval == 0) { atEvent(source.Position()); }
    }
    return recorder.Finish();
}

}  // namespace Replay
