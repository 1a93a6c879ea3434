// The blocks by size. Each size up to 1024 has a row. Above that there are eight rows per power of
// two, so that the length of the table is bounded.

#ifndef OBR_TOOLS_REPORT_SIZES_HPP
#define OBR_TOOLS_REPORT_SIZES_HPP

#include <cstddef>
#include <cstdint>
#include <vector>

#include "report/Tally.hpp"

namespace Report {

struct SizeRow {
    std::uint32_t smallest = 0;  // Of those that occur.
    std::uint32_t largest = 0;
    Tally tally;
};

class Sizes {
public:
    SizeRow& Row(std::uint32_t size) {
        const std::size_t place = PlaceOf(size);
        if (place >= rows.size()) { rows.resize(place + 1); }
        return rows[place];
    }

    // Including rows without a block.
    const std::vector<SizeRow>& Rows() const { return rows; }

private:
    // A range ends with a power of two or a multiple of an eighth of it: common sizes.
    static std::size_t PlaceOf(std::uint32_t size) {
        constexpr std::uint32_t exact = 1024;
        if (size <= exact) { return size; }
        const std::uint32_t below = size - 1;
        std::uint32_t shift = 0;
        while (below >> shift >= 2 * exact) { ++shift; }
        return exact + 1 + shift * 8 + ((below >> shift) - exact) / (exact / 8);
    }

    std::vector<SizeRow> rows;
};

}  // namespace Report

#endif
