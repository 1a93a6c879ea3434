// The measurements of the heap and of all settings, and how they are compared.

#ifndef OBR_TOOLS_ADVISE_FIGURES_HPP
#define OBR_TOOLS_ADVISE_FIGURES_HPP

#include <array>
#include <cstdint>
#include <string>
#include <vector>

#include "replay/PoolSettings.hpp"

namespace Advise {

struct Figures {
    double nsPerEvent = 0;  // The median of the rounds.
    double nsSpread = 0;    // Between the lower and the upper quartile; 0 for a single round.
    double bytesHeld = 0;   // At the peak.
    unsigned int rounds = 0;
};

struct Measured {
    Replay::PoolSettings settings;
    Figures figures;
};

struct GivenUp {
    Replay::PoolSettings settings;
    std::string problem;
};

struct Findings {
    Figures heap;
    std::vector<Measured> settings;  // The first are the defaults, unless they were given up.
    std::vector<GivenUp> givenUp;
};

// What settings are judged by. Both weighs time and bytes equally: half of one makes up for twice
// the other.
enum class Aim { Both, Time, Bytes };
inline constexpr std::array<Aim, 3> aims = {Aim::Both, Aim::Time, Aim::Bytes};

// The ratio to the heap: below 1 is better than the heap, and less is better.
double Cost(const Figures& figures, const Figures& heap, Aim aim);

// The value below which the share `share` of the values lies, interpolated between the nearest two.
// There must be at least one value.
double Quantile(std::vector<double> values, double share);

}  // namespace Advise

#endif
