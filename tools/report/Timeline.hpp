// Figures over the course of a trace, at a bounded number of points: at first each event is a
// point, later each point stands for an interval of equal length.

#ifndef OBR_TOOLS_REPORT_TIMELINE_HPP
#define OBR_TOOLS_REPORT_TIMELINE_HPP

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <vector>

namespace Report {

// Figures of one moment, the sizes in bytes.
struct Moment {
    std::uint64_t event = 0;
    std::optional<std::uint64_t> milliseconds;  // If the trace has times.

    std::uint64_t asked = 0;    // Requested bytes of the live blocks.
    std::uint64_t blocks = 0;   // Live blocks.
    std::uint64_t pools = 0;    // Held by pools, one per traced pool.
    std::uint64_t onePool = 0;  // Held by a single pool for all blocks.
    std::uint64_t heap = 0;     // Held by the heap, without malloc's own headers.
    std::uint64_t chunks = 0;   // The same with these headers.
};

// The moment of an interval with the most requested bytes, so that no peak is lost.
struct Point {
    Moment most;
    std::uint64_t leastAsked = 0;  // In the interval.
};

class Timeline {
public:
    static constexpr std::size_t maxPoints = 512;

    // Called after each event.
    void Add(const Moment& moment) {
        if (filled == 0) {
            points.push_back({moment, moment.asked});
        } else {
            Point& point = points.back();
            if (moment.asked > point.most.asked) { point.most = moment; }
            if (moment.asked < point.leastAsked) { point.leastAsked = moment.asked; }
        }
        if (++filled == interval) { EndInterval(); }
    }

    const std::vector<Point>& Points() const { return points; }

private:
    // Joins the points in pairs when there are too many.
    void EndInterval() {
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

    std::vector<Point> points;
    std::uint64_t interval = 1;  // Events per point.
    std::uint64_t filled = 0;    // Events of the last point.
};

}  // namespace Report

#endif
