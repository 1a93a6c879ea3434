// A meter that replays a recording on the real library and the real heap, each time in a new child
// process. The child starts with the memory of this process, including the recording. It cannot
// affect this process, even if it crashes.

#ifndef OBR_TOOLS_ADVISE_FORKEDMETER_HPP
#define OBR_TOOLS_ADVISE_FORKEDMETER_HPP

#include <chrono>
#include <functional>

#include "advise/Meter.hpp"
#include "replay/Layer.hpp"
#include "replay/Recording.hpp"

namespace Advise {

// Runs `work` in a child process and returns its figure, or why there is none. The child is stopped
// when it has used that many seconds of processor time, or when `isStopped`.
Outcome InChild(
    const std::function<double()>& work, double processorSeconds,
    const std::function<bool()>& isStopped = [] { return false; });

class ForkedMeter final : public Meter {
public:
    // The recording must have an event, and live as long as the meter. A replay of the pools is
    // stopped if it takes much longer than one of the heap: more than `limit` times its time, and
    // more than half a second. All are stopped by an interruption, and after so many seconds.
    ForkedMeter(const Replay::Recording& replayed, Replay::Layer measured, double seconds,
                double limit = 8);

    Outcome Time(const Side& side) override;
    Outcome Held(const Side& side) override;
    double Elapsed() const override;
    bool IsStopped() const override;

private:
    using Work = std::function<double(const Replay::Recording&, Replay::Layer)>;
    Outcome Run(const Side& side, const Work& work);

    const Replay::Recording& recording;
    const Replay::Layer layer;
    const double mostSeconds;
    const double mostOfHeapTime;
    const std::chrono::steady_clock::time_point start;
    unsigned int numReplays = 1;  // In a child that measures time.
    double heapSeconds = 0;       // The longest replay of the heap so far.
};

}  // namespace Advise

#endif
