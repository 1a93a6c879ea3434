// An analysis as text: a page for a terminal or a file, without escape codes.

#ifndef OBR_TOOLS_MEMPOOL_REPORTTEXT_HPP
#define OBR_TOOLS_MEMPOOL_REPORTTEXT_HPP

#include <cstdint>
#include <iosfwd>
#include <string>

#include "report/Analysis.hpp"

namespace Tool {

enum class Extent : std::uint8_t {
    Short,  // The totals, and a few sizes and groups.
    Page,   // About 40 lines.
    All,    // Every size and every group.
};

// `heading` stands between the name of the trace and the figures.
void PrintAnalysis(std::ostream& out, const Report::Analysis& analysis, Extent extent,
                   const std::string& heading = "");

}  // namespace Tool

#endif
