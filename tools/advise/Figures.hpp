// What was measured of the heap and of each setting, and the ways to compare them.

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
    double nsSpread = 0;    // Between their lower and their upper quartile. 0 of a single round.
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
    std::vector<Measured> settings;  // The first one has the defaults, unless it was given up.
    std::vector<GivenUp> givenUp;
};

// What a setting can be good at. Both is time and bytes alike: half of one is worth twice the
// other.
enum class Aim { Both, Time, Bytes };
inline constexpr std::array<Aim, 3> aims = {Aim::Both, Aim::Time, Aim::Bytes};

// How much it takes of what the heap takes: below 1 it is better, and less is better.
double Cost(const Figures& figures, const Figures& heap, Aim aim);

// The value below which the share `share` of the values lies, between the nearest two if it is none
// of them. There must be one.
double Quantile(std::vector<double> values, double share);

}  // namespace Advise

#endif
