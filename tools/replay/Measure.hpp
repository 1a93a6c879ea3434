// Measures the sides of a replay: bytes held at the peak, and time per event. Pools have the
// settings of the process.

#ifndef OBR_TOOLS_REPLAY_MEASURE_HPP
#define OBR_TOOLS_REPLAY_MEASURE_HPP

#include <cstdint>
#include <functional>

#include "replay/Layer.hpp"
#include "replay/Recording.hpp"

namespace Replay {

// One replay of one side: what it holds from the heap at the peak, in bytes. `atPeak` is called
// while the pools stand there.
std::int64_t BytesHeldByPools(
    const Recording& recording, Layer layer, const std::function<void()>& atPeak = [] {});
std::int64_t BytesHeldByHeap(const Recording& recording);

// One replay of one side: processor time per event in nanoseconds, page faults included. There must
// be an event.
double PoolNanosecondsPerEvent(const Recording& recording, Layer layer);
double HeapNanosecondsPerEvent(const Recording& recording);

}  // namespace Replay

#endif
