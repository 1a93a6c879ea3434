// The verdict: which settings are best at what, whether the program would gain from one of them, at
// which price, and why. Code that prints a verdict decides nothing.

#ifndef OBR_TOOLS_ADVISE_VERDICT_HPP
#define OBR_TOOLS_ADVISE_VERDICT_HPP

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "advise/Figures.hpp"
#include "replay/Layer.hpp"

namespace Advise {

// The smallest gains that count, as shares of the program's time and of the heap's bytes. A promise
// must be larger than its error: it must hold even if the share of the allocation calls is as small
// as its error allows. docs/advisor.md compares promises with trials.
struct LeastGain {
    double time;
    double bytes;
};
inline constexpr LeastGain leastMeasured = {0.01, 0.01};
inline constexpr LeastGain leastPromised = {0.08, 0.03};

// What the trace says about the program.
struct Program {
    std::uint64_t numEvents = 0;                 // Replayed events.
    std::uint64_t numLeftOut = 0;                // Later events, above the limit.
    std::optional<double> allocationShare = {};  // Of its processor time, an estimate,
    std::optional<double> shareError = {};       // and how far off that can be.
    std::optional<double> seconds = {};          // Its processor time.
    double startSeconds = 0;                     // That of the start of preloaded pools.
    LeastGain leastGain = leastPromised;
    std::uint64_t numThreads = 1;  // That would share the pool.
    bool hasPlan = false;          // Several pools gain more than one.
};

// The effect of pools on the time or the bytes of the program. None if the difference is within the
// spread, or so small that it would not be noticed.
enum class Effect : std::uint8_t { None, Gain, Price };

// Indices into the settings of the findings.
struct Verdict {
    std::optional<std::size_t> fastest;
    std::optional<std::size_t> smallest;
    std::optional<std::size_t> best;  // Of those without a price.

    // The settings to use, if pools help: the best, if they gain anything, else settings that gain
    // more than they cost.
    std::optional<std::size_t> advised;
    Effect time = Effect::None;  // Of the advised settings.
    Effect bytes = Effect::None;
    bool isMimallocBetter = false;  // It gains more than the advised settings, without a price.

    // The verdict in words: whether pools would help comes first, then what the figures mean for
    // the whole program.
    std::vector<std::string> sentences;

    const char* Name() const;   // What the program gains: "faster", "smaller", "both" or "none".
    const char* Price() const;  // What it pays: "time", "bytes" or "none".
};

Verdict Judge(const Findings& findings, const Program& program);

// The number in the text, from 0 to `most`; none if the text is not such a number.
std::optional<double> NumberIn(const std::string& text, double most);

// The settings to paste: the environment variables, in the order in which they are read, and lines
// of C++ for those that are not the default, empty for a layer that needs none.
std::vector<std::pair<std::string, std::string>> EnvironmentOf(
    const OBR::MemPool::PoolSettings& settings);
std::vector<std::string> CodeOf(const OBR::MemPool::PoolSettings& settings, Replay::Layer layer);

}  // namespace Advise

#endif
