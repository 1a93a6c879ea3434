// What follows from the figures: which settings are best at what, whether a program would gain from
// one of them, how much, and at which price.

#ifndef OBR_TOOLS_ADVISE_VERDICT_HPP
#define OBR_TOOLS_ADVISE_VERDICT_HPP

#include <cstddef>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "advise/Figures.hpp"

namespace Advise {

// Indices into the settings of the findings.
struct Verdict {
    std::optional<std::size_t> fastest;
    std::optional<std::size_t> smallest;
    std::optional<std::size_t> best;  // Of those that are neither slower nor larger than the heap.

    // What to use, if pools help: the best, if it gains anything, or else what gains more than it
    // costs.
    std::optional<std::size_t> advised;
    bool isFaster = false;   // The advised one is, by more than the spread of the runs,
    bool isSmaller = false;  // and by more than a hundredth.

    const char* Name() const;  // "faster", "smaller", "both" or "none".
};

Verdict Judge(const Findings& findings);

// Whether the difference of their times is more than the spread of the runs of either.
bool TimesDiffer(const Figures& a, const Figures& b);

// The time of the whole program in place of 1, if its allocation calls took `share` of it and now
// take `ratio` of what they took.
double TimeOfProgram(double share, double ratio);

// The share that a recording tells, between 0 and 1. Nothing if the text is none.
std::optional<double> ShareOf(const std::string& text);

// The settings to paste: variables of the environment, in the order in which they are read, and
// C++.
std::vector<std::pair<std::string, std::string>> EnvironmentOf(
    const Replay::PoolSettings& settings);
std::vector<std::string> CodeOf(const Replay::PoolSettings& settings);

}  // namespace Advise

#endif
