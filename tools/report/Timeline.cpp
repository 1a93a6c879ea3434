// Joins the points in pairs when there are too many.

#include "report/Timeline.hpp"

#include <algorithm>

namespace Report {

void Timeline::EndInterval() {
    filled = 0;
    if (points.size() < maxPoints) { return; }
    for (std::size_t i = 0; i < maxPoints / 2; ++i) {
        const Point& a = points[2 * i];
        const Point& b = points[2 * i + 1];
        points[i] = {b.most.asked > a.most.asked ? b.most : a.most,
                     std::min(a.leastAsked, b.leastAsked)};
    }
    points.resize(maxPoints / 2);
    interval *= 2;
}

}  // namespace Report
