// Replays a recording and either counts bytes or measures time, never both at once.

#include "replay/Measure.hpp"

#include "replay/Clock.hpp"
#include "replay/HeapCount.hpp"
#include "replay/Sides.hpp"

namespace Replay {

namespace {

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
        case Layer::System: {
            FreeingSide<SystemHeap> side(recording);
            return measure(side);
        }
        case Layer::Mimalloc: {
            Mimalloc::Get();  // Loading it is not part of an event.
            FreeingSide<MimallocHeap> side(recording);
            return measure(side);
        }
        case Layer::Mgr:
            break;
    }
    DroppingSide<MgrPool> side(recording);
    return measure(side);
}

}  // namespace

std::int64_t BytesHeld(const Recording& recording, Layer layer,
                       const std::function<void()>& atPeak) {
    return WithSide(recording, layer, [&](auto& side) {
        HeapCount::Start();
        Run(side, recording, recording.peakSteps);
        const std::int64_t held = HeapCount::Stop();
        atPeak();
        if (layer == Layer::Mimalloc) { return Mimalloc::BytesHeld(); }
        return layer == Layer::Malloc ? held + bytesOfPreload : held;
    });
}

double NanosecondsPerEvent(const Recording& recording, Layer layer) {
    return WithSide(recording, layer, [&](auto& side) {
        const double start = ProcessorNanoseconds();
        Run(side, recording, recording.steps.size());
        const double time = ProcessorNanoseconds() - start - side.untimed;
        return time / static_cast<double>(recording.steps.size());
    });
}

}  // namespace Replay
