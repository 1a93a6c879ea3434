// Replays, counted or timed, never both.

#include "replay/Measure.hpp"

#include <algorithm>
#include <cstddef>
#include <utility>

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

double Median(std::vector<double> values) {
    const auto middle = values.begin() + static_cast<std::ptrdiff_t>(values.size() / 2);
    std::nth_element(values.begin(), middle, values.end());
    return *middle;
}

std::int64_t BytesHeldByPools(const Recording& recording) {
    return HeldAtPeak<PoolSide>(recording, [] {});
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

Compared<std::int64_t> BytesHeld(const Recording& recording,
                                 const std::function<void()>& atPoolPeak) {
    const std::int64_t pool = HeldAtPeak<PoolSide>(recording, atPoolPeak);
    return {pool, BytesHeldByHeap(recording)};
}

Compared<double> NanosecondsPerEvent(const Recording& recording, unsigned int rounds,
                                     const std::function<void(unsigned int round)>& atRound) {
    std::vector<double> pool;
    std::vector<double> heap;
    for (unsigned int round = 1; round <= rounds; ++round) {
        atRound(round);
        if (round % 2 == 0) { heap.push_back(HeapNanosecondsPerEvent(recording)); }
        pool.push_back(PoolNanosecondsPerEvent(recording));
        if (round % 2 != 0) { heap.push_back(HeapNanosecondsPerEvent(recording)); }
    }
    return {Median(std::move(pool)), Median(std::move(heap))};
}

}  // namespace Replay
