// Replays, counted or timed, never both.

#include "replay/Measure.hpp"

#include "replay/Clock.hpp"
#include "replay/HeapCount.hpp"
#include "replay/Sides.hpp"

namespace Replay {

namespace {

template <typename Side>
std::int64_t HeldAtPeak(const Recording& recording, const std::function<void()>& atPeak) {
    Side side(recording);
    HeapCount::Start();
    Run(side, recording, recording.peakSteps);
    const std::int64_t held = HeapCount::Stop();
    atPeak();
    return held;
}

template <typename Side>
double TimePerEvent(const Recording& recording) {
    Side side(recording);
    const double start = ProcessorNanoseconds();
    Run(side, recording, recording.steps.size());
    const double time = ProcessorNanoseconds() - start - side.untimed;
    return time / static_cast<double>(recording.steps.size());
}

}  // namespace

std::int64_t BytesHeldByPools(const Recording& recording, const std::function<void()>& atPeak) {
    return HeldAtPeak<PoolSide>(recording, atPeak);
}

std::int64_t BytesHeldByHeap(const Recording& recording) {
    return HeldAtPeak<HeapSide>(recording, [] {});
}

double PoolNanosecondsPerEvent(const Recording& recording) {
    return TimePerEvent<PoolSide>(recording);
}

double HeapNanosecondsPerEvent(const Recording& recording) {
    return TimePerEvent<HeapSide>(recording);
}

}  // namespace Replay
