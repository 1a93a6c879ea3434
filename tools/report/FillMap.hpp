// How full the buckets of each size class are over the course of a trace.

#ifndef OBR_TOOLS_REPORT_FILLMAP_HPP
#define OBR_TOOLS_REPORT_FILLMAP_HPP

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

inline FillColumn FillOf(std::uint64_t event, const PoolModel& pools) {
    FillColumn column = {event, {}};
    const std::vector<SizeClass>& classes = pools.Classes();
    for (std::uint32_t number = 0; number < classes.size(); ++number) {
        const SizeClass& sizeClass = classes[number];
        if (sizeClass.records == 0) { continue; }
        column.cells.push_back({number, sizeClass.usedRecords, sizeClass.records});
    }
    return column;
}

}  // namespace Report

#endif
