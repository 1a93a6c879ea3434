// Columns of figures at regular moments of a trace. When there are too many, every other one is
// dropped.

#ifndef OBR_TOOLS_REPORT_SAMPLES_HPP
#define OBR_TOOLS_REPORT_SAMPLES_HPP

#include <cstddef>
#include <cstdint>
#include <utility>
#include <vector>

namespace Report {

constexpr std::size_t maxSamples = 128;

template <typename Column>
class Samples {
public:
    // Called after each event. Returns the column to fill in, or null if this moment has none.
    Column* At(std::uint64_t event) {
        if (event % interval != 0) { return nullptr; }
        if (columns.size() == maxSamples) {
            for (std::size_t i = 0; i < maxSamples / 2; ++i) {
                columns[i] = std::move(columns[2 * i + 1]);
            }
            columns.resize(maxSamples / 2);
            interval *= 2;
            if (event % interval != 0) { return nullptr; }
        }
        return &columns.emplace_back();
    }

    const std::vector<Column>& Columns() const { return columns; }

private:
    std::vector<Column> columns;
    std::uint64_t interval = 1;
};

}  // namespace Report

#endif
