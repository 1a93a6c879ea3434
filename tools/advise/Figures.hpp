// The measurements of the heap and of all settings, and how they are compared.

#ifndef OBR_TOOLS_ADVISE_FIGURES_HPP
#define OBR_TOOLS_ADVISE_FIGURES_HPP

#include <array>
#include <optional>
#include <string>
#include <vector>

#include <MemPoolSettings>

namespace Advise {

struct Figures {
    double time = 0;    // Nanoseconds per event, or seconds of a program: the median of the rounds.
    double spread = 0;  // Of the time, between the lower and the upper quartile.
    double bytes = 0;   // At the peak.
    unsigned int rounds = 0;
};

struct Measured {
    OBR::MemPool::PoolSettings settings;
    Figures figures;
};

struct GivenUp {
    OBR::MemPool::PoolSettings settings;
    std::string problem;
};

struct Findings {
    Figures heap;
    std::optional<Figures> mimalloc;  // None if it is not installed.
    std::vector<Measured> settings;   // The first are the defaults, unless they were given up.
    std::vector<GivenUp> givenUp;
};

// What settings are judged by. Both weighs time and bytes equally: half of one makes up for twice
// the other.
enum class Aim { Both, Time, Bytes };
inline constexpr std::array<Aim, 3> aims = {Aim::Both, Aim::Time, Aim::Bytes};

// The ratio to the heap: below 1 is better than the heap, and less is better.
double Cost(const Figures& figures, const Figures& heap, Aim aim);

// Fewer rounds show no difference.
inline constexpr unsigned int leastRounds = 3;

// Whether the times differ by more than the spread of either.
bool DifferInTime(const Figures& a, const Figures& b);

// The value below which the share `share` of the values lies, interpolated between the nearest two.
// There must be at least one value.
double Quantile(std::vector<double> values, double share);

// From the lower to the upper quartile.
double Spread(const std::vector<double>& values);

// The figures of the heap, from its times in order. Its spread is that of the ratios of successive
// times.
Figures FiguresOfHeap(const std::vector<double>& times, double bytes);

// The figures of another side, from the ratios of its times to those of the heap beside them.
Figures FiguresOf(const std::vector<double>& ratios, double bytes, double heapTime);

}  // namespace Advise

#endif
