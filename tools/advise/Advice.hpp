// The advice on a trace: what was measured, and the verdict.

#ifndef OBR_TOOLS_ADVISE_ADVICE_HPP
#define OBR_TOOLS_ADVISE_ADVICE_HPP

#include <functional>
#include <string>

#include "advise/Figures.hpp"
#include "advise/Verdict.hpp"
#include "replay/Layer.hpp"
#include "trace/StepReader.hpp"

namespace Advise {

struct Advice {
    Replay::Layer layer = Replay::Layer::Heap;
    Program program;
    Findings findings;
    Verdict verdict;
};

struct Question {
    Replay::Layer layer = Replay::Layer::Heap;
    bool mergesGroups = false;  // One pool for all groups of a recorded heap.
    double seconds = 30;        // How long to search, about.
};

// Reads the trace and searches. `show` is called with a line about the progress now and then. A
// trace without an allocation is a std::runtime_error.
Advice TakeAdvice(Trace::StepReader& reader, const Question& question,
                  const std::function<void(const std::string&)>& show);

}  // namespace Advise

#endif
