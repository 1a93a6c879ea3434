// Figures over the course of a trace, at a number of points that does not grow with it: while it is
// short each event is a point, later each point stands for an interval of equal length.

#ifndef OBR_TOOLS_REPORT_TIMELINE_HPP
#define OBR_TOOLS_REPORT_TIMELINE_HPP

#include <cstddef>
#include <cstdint>
#include <vector>

#include "report/PoolModel.hpp"

namespace Report {

// All at one moment, in bytes.
struct Moment {
    std::uint64_t event = 0;
    std::uint64_t asked = 0;    // By the blocks that live,
    std::uint64_t blocks = 0;   // which are so many.
    std::uint64_t pools = 0;    // Held by pools, one a traced pool,
    std::uint64_t onePool = 0;  // by a single one for all,
    std::uint64_t heap = 0;     // and lent by the heap, without
    std::uint64_t chunks = 0;   // and with what malloc has of its own ahead of each block.
};

// The moment of an interval at which most was asked for: no peak is lost.
struct Point {
    Moment most;
    std::uint64_t leastAsked = 0;  // Of the whole interval.
};

class Timeline {
public:
    static constexpr std::size_t maxPoints = 512;

    // Behind each event.
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
    void EndInterval();

    std::vector<Point> points;
    std::uint64_t interval = 1;  // Events a point.
    std::uint64_t filled = 0;    // Of the last point.
};

// Used records and records of the size classes that have a bucket, at regular moments.
struct FillColumn {
    struct Cell {
        std::uint32_t sizeClass;
        std::uint64_t used;
        std::uint64_t records;
    };
    std::uint64_t event = 0;
    std::vector<Cell> cells;
};

class FillMap {
public:
    static constexpr std::size_t maxColumns = 128;

    // Behind each event.
    void Add(std::uint64_t event, const PoolModel& pools) {
        if (event % interval == 0) { AddColumn(event, pools); }
    }

    const std::vector<FillColumn>& Columns() const { return columns; }

private:
    void AddColumn(std::uint64_t event, const PoolModel& pools);

    std::vector<FillColumn> columns;
    std::uint64_t interval = 1;
};

}  // namespace Report

#endif
