// The advice on a trace: what was measured, and the verdict.

#ifndef OBR_TOOLS_ADVISE_ADVICE_HPP
#define OBR_TOOLS_ADVISE_ADVICE_HPP

#include <cstdint>
#include <functional>
#include <string>

#include "advise/Figures.hpp"
#include "advise/Verdict.hpp"
#include "trace/StepReader.hpp"

namespace Advise {

struct Advice {
    Program program;
    Findings findings;
    Verdict verdict;
};

// A pool for each one that the trace has, or one for all groups of a recorded heap.
enum class Pools : std::uint8_t { AsTraced, One };

// Reads the trace and searches for about that many seconds. `show` is called with a line about the
// progress now and then. A trace without an allocation is a std::runtime_error.
Advice TakeAdvice(Trace::StepReader& reader, double seconds,
                  const std::function<void(const std::string&)>& show,
                  Pools pools = Pools::AsTraced);

}  // namespace Advise

#endif
