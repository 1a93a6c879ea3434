// The report on a trace, for `mempool report` and for whoever ends with one.

#ifndef OBR_TOOLS_MEMPOOL_REPORT_HPP
#define OBR_TOOLS_MEMPOOL_REPORT_HPP

#include <string>

#include "mempool/ReportText.hpp"
#include "replay/PoolSettings.hpp"
#include "trace/StepReader.hpp"

namespace Tool {

struct ReportOptions {
    Replay::PoolSettings settings = Replay::PoolSettings::OfProcess();
    Extent extent = Extent::Page;
    bool json = false;  // In place of the text.
    std::string html;   // Where the page goes, besides; "-" is the standard output, with the page
                        // alone. Empty for none.
};

// Reads the trace, shows progress on a terminal, and writes the report to the standard output.
// Returns the exit status. Bad settings, a trace that is none and a file that cannot be written are
// a std::runtime_error.
int WriteReport(Trace::StepReader& reader, const ReportOptions& options);

}  // namespace Tool

#endif
