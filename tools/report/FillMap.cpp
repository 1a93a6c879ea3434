// Drops every other column whenever there are too many.

#include "report/FillMap.hpp"

#include <utility>

namespace Report {

void FillMap::AddColumn(std::uint64_t event, const PoolModel& pools) {
    if (columns.size() == maxColumns) {
        for (std::size_t i = 0; i < maxColumns / 2; ++i) {
            columns[i] = std::move(columns[2 * i + 1]);
        }
        columns.resize(maxColumns / 2);
        interval *= 2;
        if (event % interval != 0) { return; }
    }
    FillColumn column = {event, {}};
    const std::vector<SizeClass>& classes = pools.Classes();
    for (std::uint32_t number = 0; number < classes.size(); ++number) {
        const SizeClass& sizeClass = classes[number];
        if (sizeClass.records == 0) { continue; }
        column.cells.push_back({number, sizeClass.usedRecords, sizeClass.records});
    }
    columns.push_back(std::move(column));
}

}  // namespace Report
