// Replays a recording and either counts bytes or measures time, never both at once.

#include "replay/Measure.hpp"

#include "replay/Clock.hpp"
#include "replay/HeapCount.hpp"
#include "replay/Sides.hpp"

namespace Replay {

namespace {

using HeapSide = FreeingSide<SystemHeap>;

// Calls `measure` with the side of that layer.
template <typename Measure>
auto WithSide(const Recording& recording, Layer layer, const Measure& measure) {
    switch (layer) {
        case Layer::Heap: {
            DroppingSide<HeapPool> side(recording);
            return measure(side);
        }
        case Layer::Malloc: {
            FreeingSide<MallocPool> side(recording);
            return measure(side);
        }
        case Layer::Mgr:
            break;
    }
    DroppingSide<MgrPool> side(recording);
    return measure(side);
}

template <typename Side>
std::int64_t HeldAtPeak(Side& side, const Recording& recording) {
    HeapCount::Start();
    Run(side, recording, recording.peakSteps);
    return HeapCount::Stop();
}

template <typename Side>
double TimePerEvent(Side& side, const Recording& recording) {
    const double start = ProcessorNanoseconds();
    Run(side, recording, recording.steps.size());
    const double time = ProcessorNanoseconds() - start - side.untimed;
    return time / static_cast<double>(recording.steps.size());
}

}  // namespace

std::int64_t BytesHeldByPools(const Recording& recording, Layer layer,
                              const std::function<void()>& atPeak) {
    return WithSide(recording, layer, [&](auto& side) {
        const std::int64_t held = HeldAtPeak(side, recording);
        atPeak();
        return held;
    });
}

std::int64_t BytesHeldByHeap(const Recording& recording) {
    HeapSide side(recording);
    return HeldAtPeak(side, recording);
}

double PoolNanosecondsPerEvent(const Recording& recording, Layer layer) {
    return WithSide(recording, layer, [&](auto& side) { return TimePerEvent(side, recording); });
}

double HeapNanosecondsPerEvent(const Recording& recording) {
    HeapSide side(recording);
    return TimePerEvent(side, recording);
}

}  // namespace Replay
