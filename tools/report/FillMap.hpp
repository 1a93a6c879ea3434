// How full the buckets of each size class are over the course of a trace, at regular moments, whose
// number is bounded.

#ifndef OBR_TOOLS_REPORT_FILLMAP_HPP
#define OBR_TOOLS_REPORT_FILLMAP_HPP

#include <cstddef>
#include <cstdint>
#include <vector>

#include "report/PoolModel.hpp"

namespace Report {

// The size classes that have a bucket, at one moment.
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

    // After each event.
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
