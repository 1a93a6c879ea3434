// An analysis as text for a terminal or a file, without escape codes.

#ifndef OBR_TOOLS_MEMPOOL_REPORTTEXT_HPP
#define OBR_TOOLS_MEMPOOL_REPORTTEXT_HPP

#include <cstdint>
#include <iosfwd>

#include "report/Analysis.hpp"

namespace Tool {

enum class Extent : std::uint8_t {
    Short,  // The totals, and a few sizes and groups.
    Page,   // About 40 lines.
    All,    // Every size and every group.
};

// A line per stack that has blocks at the peak: its functions, the outermost first, and its bytes.
void PrintFolded(std::ostream& out, const Report::Analysis& analysis);

void PrintAnalysis(std::ostream& out, const Report::Analysis& analysis, Extent extent);

}  // namespace Tool

#endif
