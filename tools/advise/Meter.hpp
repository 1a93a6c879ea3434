// The measurements that a search needs: one replay at a time, of the heap or of pools with some
// settings. A test has a meter with made-up costs.

#ifndef OBR_TOOLS_ADVISE_METER_HPP
#define OBR_TOOLS_ADVISE_METER_HPP

#include <optional>
#include <string>
#include <variant>

#include <MemPoolSettings>

#include "replay/Recording.hpp"

namespace Advise {

// What is replayed: the C library's malloc, mimalloc, pools with these settings, or the pools of a
// plan with these settings, from a recording of their own.
struct Malloc {};
struct Mimalloc {};
struct Planned {
    const Replay::Recording* recording;
    OBR::MemPool::PoolSettings settings;
};
using Side = std::variant<Malloc, Mimalloc, OBR::MemPool::PoolSettings, Planned>;

// The figure of a replay, or why there is none.
struct Outcome {
    std::optional<double> figure;
    std::string problem;

    // The figure. If there is none, throws a std::runtime_error with that text before the problem.
    double OrFail(const std::string& text) const;
};

class Meter {
public:
    Meter() = default;
    Meter(const Meter&) = delete;
    Meter& operator=(const Meter&) = delete;
    virtual ~Meter() = default;

    // Processor time per event of one replay, in nanoseconds.
    virtual Outcome Time(const Side& side) = 0;

    // Bytes held at the peak.
    virtual Outcome Held(const Side& side) = 0;

    // Elapsed seconds since the meter was made.
    virtual double Elapsed() const = 0;

    // Whether the search must end now. A replay then may have no figure.
    virtual bool IsStopped() const = 0;
};

}  // namespace Advise

#endif
