// The report on a trace, as several subcommands print it.

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
    bool json = false;  // Instead of text.
    std::string html;   // Where to write the page too, or empty. "-" is the standard output, with
                        // the page alone.
};

// Reads the trace, shows progress on a terminal, and writes the report to the standard output.
// Returns the exit status. Throws std::runtime_error if no pool can have the settings, the input is
// not a trace, or a file cannot be written.
int WriteReport(Trace::StepReader& reader, const ReportOptions& options);

}  // namespace Tool

#endif
