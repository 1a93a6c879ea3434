// Measures the sides of a replay: bytes held at the peak, and time per event. Pools have the
// settings of the process.

#ifndef OBR_TOOLS_REPLAY_MEASURE_HPP
#define OBR_TOOLS_REPLAY_MEASURE_HPP

#include <cstdint>
#include <functional>

#include "replay/Layer.hpp"
#include "replay/Recording.hpp"

namespace Replay {

// Replays once and returns the bytes that the layer holds at the peak: from the system's heap, and
// mimalloc from the system. The preloaded library counts with its own pages. Calls `atPeak` while
// the pools are at the peak.
std::int64_t BytesHeld(
    const Recording& recording, Layer layer, const std::function<void()>& atPeak = [] {});

// Replays once and returns the processor time per event in nanoseconds, including page faults.
// There must be an event.
double NanosecondsPerEvent(const Recording& recording, Layer layer);

}  // namespace Replay

#endif
