// The advice on a trace: what was measured, and the verdict.

#ifndef OBR_TOOLS_ADVISE_ADVICE_HPP
#define OBR_TOOLS_ADVISE_ADVICE_HPP

#include <functional>
#include <map>
#include <optional>
#include <string>

#include "advise/Figures.hpp"
#include "advise/Plan.hpp"
#include "advise/Verdict.hpp"
#include "replay/Layer.hpp"
#include "replay/Recording.hpp"
#include "trace/StepReader.hpp"

namespace Advise {

struct Advice {
    Replay::Layer layer = Replay::Layer::Heap;
    Program program;
    Findings findings;
    Verdict verdict;
    std::optional<Plan> plan;  // None if several pools gain nothing over one.
    bool isStopped = false;    // By the user, before the search was done.
};

struct Question {
    Replay::Layer layer = Replay::Layer::Heap;
    double seconds = 30;  // The approximate time of the search.
    bool hasPlan = true;  // Whether a plan of pools is wanted too.
};

// From the part of the trace that is replayed, its facts, and the layer that the program would use.
Program ProgramOf(const Replay::Recording& recording,
                  const std::map<std::string, std::string>& facts, Replay::Layer layer);

// Reads the trace and searches. A signal that System::Interruption has noted ends the search. Calls
// `show` with a line of progress from time to time. Throws a std::runtime_error if the trace has no
// allocation, or if the signal comes before the heap was measured.
Advice TakeAdvice(Trace::StepReader& reader, const Question& question,
                  const std::function<void(const std::string&)>& show);

}  // namespace Advise

#endif
