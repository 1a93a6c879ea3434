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

// One replay of one side: what it holds from the heap at the peak, in bytes.
std::int64_t BytesHeldByPools(const Recording& recording);
std::int64_t BytesHeldByHeap(const Recording& recording);

// One replay of one side: processor time an event in nanoseconds, page faults included. There must
// be an event.
double PoolNanosecondsPerEvent(const Recording& recording);
double HeapNanosecondsPerEvent(const Recording& recording);

// The bytes of each side. `atPoolPeak` is called while the pools stand at the peak.
Compared<std::int64_t> BytesHeld(const Recording& recording,
                                 const std::function<void()>& atPoolPeak);

// The time an event of each side: medians over `rounds` of one replay a side. Every other round the
// heap goes first. `atRound` is called with each round's number, from 1 on.
Compared<double> NanosecondsPerEvent(const Recording& recording, unsigned int rounds,
                                     const std::function<void(unsigned int round)>& atRound);

// The middle of the values, of an even number the upper one of the two. There must be one.
double Median(std::vector<double> values);

}  // namespace Replay

#endif
