// Measures the sides of a replay: bytes held at the peak, and time per event. Pools have the
// settings of the process.

#ifndef OBR_TOOLS_REPLAY_MEASURE_HPP
#define OBR_TOOLS_REPLAY_MEASURE_HPP

#include <cstdint>
#include <functional>

#include "replay/Layer.hpp"
#include "replay/Recording.hpp"

namespace Replay {

// Replays one side and returns the bytes that it holds from the heap at the peak. Calls `atPeak`
// while the pools are at the peak.
std::int64_t BytesHeldByPools(
    const Recording& recording, Layer layer, const std::function<void()>& atPeak = [] {});
std::int64_t BytesHeldByHeap(const Recording& recording);

// Replays one side and returns the processor time per event in nanoseconds, including page faults.
// There must be an event.
double PoolNanosecondsPerEvent(const Recording& recording, Layer layer);
double HeapNanosecondsPerEvent(const Recording& recording);

}  // namespace Replay

#endif
