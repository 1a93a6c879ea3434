// Prints what several subcommands have in their reports.

#ifndef OBR_TOOLS_MEMPOOL_PRINT_HPP
#define OBR_TOOLS_MEMPOOL_PRINT_HPP

#include <iostream>

#include "trace/StepReader.hpp"

namespace Tool {

// How many lines of the trace were left out, why, and where the first of them stand.
void PrintBadLines(std::ostream& out, const Trace::StepReader& reader);

// Warns on standard error if the trace breaks off. Returns the exit status: that of a failure then.
int WarnOfBrokenTrace(const Trace::StepReader& reader);

}  // namespace Tool

#endif
