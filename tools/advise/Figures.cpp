#include "advise/Figures.hpp"

#include <algorithm>
#include <cstddef>

namespace Advise {

double Cost(const Figures& figures, const Figures& heap, Aim aim) {
    const double time = figures.nsPerEvent / heap.nsPerEvent;
    const double bytes = figures.bytesHeld / heap.bytesHeld;
    switch (aim) {
        case Aim::Time:
            return time;
        case Aim::Bytes:
            return bytes;
        default:
            return time * bytes;
    }
}

double Quantile(std::vector<double> values, double share) {
    std::sort(values.begin(), values.end());
    const double place = share * static_cast<double>(values.size() - 1);
    const auto below = static_cast<std::size_t>(place);
    const std::size_t above = std::min(below + 1, values.size() - 1);
    return values[below] + (place - static_cast<double>(below)) * (values[above] - values[below]);
}

}  // namespace Advise
