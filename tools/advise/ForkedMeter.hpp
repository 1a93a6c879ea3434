// A meter that replays a recording through the real library and the real heap, each time in a child
// process of its own: it begins with the memory of this process, the recording among it, and what
// it does to its heap or dies of is its own affair.

#ifndef OBR_TOOLS_ADVISE_FORKEDMETER_HPP
#define OBR_TOOLS_ADVISE_FORKEDMETER_HPP

#include <chrono>
#include <functional>

#include "advise/Meter.hpp"
#include "replay/Layer.hpp"
#include "replay/Recording.hpp"

namespace Advise {

// Runs `work` in a child process and returns its figure, or what became of the child. It may use
// that many seconds of the processor, then it is stopped.
Outcome InChild(const std::function<double()>& work, double processorSeconds);

class ForkedMeter final : public Meter {
public:
    // The recording must have an event, and live as long as this. A replay of the pools that takes
    // more than `limit` times the time of the heap, and more than a while, is stopped.
    ForkedMeter(const Replay::Recording& replayed, Replay::Layer measured, double limit = 8);

    Outcome Time(const Side& side) override;
    Outcome Held(const Side& side) override;
    double Elapsed() const override;

private:
    Outcome Run(const Side& side, const std::function<double()>& work);

    const Replay::Recording& recording;
    const Replay::Layer layer;
    const double mostOfHeapTime;
    const std::chrono::steady_clock::time_point start;
    unsigned int numReplays = 1;  // In a child that measures time.
    double heapSeconds = 0;       // The longest replay of the heap so far.
};

}  // namespace Advise

#endif
