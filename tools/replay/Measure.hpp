// Measures the sides of a replay: bytes held at the peak, and time an event.

#ifndef OBR_TOOLS_REPLAY_MEASURE_HPP
#define OBR_TOOLS_REPLAY_MEASURE_HPP

#include <cstdint>
#include <functional>
#include <vector>

#include "replay/Recording.hpp"

namespace Replay {

// A figure of each side.
template <typename Value>
struct Compared {
    Value pool;
    Value heap;
};

// What each side holds from the heap at the peak, in bytes. `atPoolPeak` is called while the pools
// stand there.
Compared<std::int64_t> BytesHeld(const Recording& recording,
                                 const std::function<void()>& atPoolPeak);

// Processor time an event in nanoseconds, page faults included: medians over `rounds` of one replay
// a side. Every other round the heap goes first. `atRound` is called with each round's number, from
// 1 on. There must be an event.
Compared<double> NanosecondsPerEvent(const Recording& recording, unsigned int rounds,
                                     const std::function<void(unsigned int round)>& atRound);

// The middle of the values, of an even number the upper one of the two. There must be one.
double Median(std::vector<double> values);

}  // namespace Replay

#endif
