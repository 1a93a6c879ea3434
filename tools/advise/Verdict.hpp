// What follows from the figures: which settings are best at what, whether the program would gain
// from one of them, at which price, and why. Whoever prints a verdict decides nothing.

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

// What the trace says about the program.
struct Program {
    std::uint64_t numEvents = 0;            // Replayed ones,
    std::uint64_t numLeftOut = 0;           // and those after them, which were too many.
    std::optional<double> allocationShare;  // Of its processor time, an estimate.
};

// What pools do to the time or the bytes of the program. A difference within the spread of the
// runs, or one that the program would not notice, is none.
enum class Effect : std::uint8_t { None, Gain, Price };

// Indices into the settings of the findings.
struct Verdict {
    std::optional<std::size_t> fastest;
    std::optional<std::size_t> smallest;
    std::optional<std::size_t> best;  // Of those at no price.

    // What to use, if pools help: the best, if it gains anything, or else what gains more than it
    // costs.
    std::optional<std::size_t> advised;
    Effect time = Effect::None;  // Of the advised settings.
    Effect bytes = Effect::None;

    // The verdict in words: whether pools would help comes first, then what the figures mean for
    // the whole program.
    std::vector<std::string> sentences;

    const char* Name() const;   // What the program gains: "faster", "smaller", "both" or "none".
    const char* Price() const;  // What it pays: "time", "bytes" or "none".
};

Verdict Judge(const Findings& findings, const Program& program);

// The share in the text, between 0 and 1; none if the text is something else.
std::optional<double> ShareOf(const std::string& text);

// The settings to paste: variables of the environment, in the order in which they are read, and
// lines of C++, none for a layer that needs none.
std::vector<std::pair<std::string, std::string>> EnvironmentOf(
    const Replay::PoolSettings& settings);
std::vector<std::string> CodeOf(const Replay::PoolSettings& settings, Replay::Layer layer);

}  // namespace Advise

#endif
