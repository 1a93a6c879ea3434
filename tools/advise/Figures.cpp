#include "advise/Figures.hpp"

#include <algorithm>
#include <cmath>
#include <cstddef>

namespace Advise {

double Cost(const Figures& figures, const Figures& heap, Aim aim) {
    const double time = figures.time / heap.time;
    const double bytes = figures.bytes / heap.bytes;
    switch (aim) {
        case Aim::Time:
            return time;
        case Aim::Bytes:
            return bytes;
        default:
            return time * bytes;
    }
}

bool DifferInTime(const Figures& a, const Figures& b) {
    return std::min(a.rounds, b.rounds) >= leastRounds &&
           std::abs(a.time - b.time) > std::max(a.spread, b.spread);
}

double Quantile(std::vector<double> values, double share) {
    std::sort(values.begin(), values.end());
    const double place = share * static_cast<double>(values.size() - 1);
    const auto below = static_cast<std::size_t>(place);
    const std::size_t above = std::min(below + 1, values.size() - 1);
    return values[below] + (place - static_cast<double>(below)) * (values[above] - values[below]);
}

double Spread(const std::vector<double>& values) {
    return Quantile(values, 0.75) - Quantile(values, 0.25);
}

Figures FiguresOfHeap(const std::vector<double>& times, double bytes) {
    const double time = Quantile(times, 0.5);
    std::vector<double> ratios = {1};
    for (std::size_t i = 2; i < times.size(); ++i) {
        ratios.push_back(2 * times[i - 1] / (times[i - 2] + times[i]));
    }
    return {time, time * Spread(ratios), bytes, static_cast<unsigned int>(times.size())};
}

Figures FiguresOf(const std::vector<double>& ratios, double bytes, double heapTime) {
    return {heapTime * Quantile(ratios, 0.5), heapTime * Spread(ratios), bytes,
            static_cast<unsigned int>(ratios.size())};
}

}  // namespace Advise
