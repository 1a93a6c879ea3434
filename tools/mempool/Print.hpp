// Prints what several subcommands have in their reports.

#ifndef OBR_TOOLS_MEMPOOL_PRINT_HPP
#define OBR_TOOLS_MEMPOOL_PRINT_HPP

#include <iostream>
#include <string>

#include "trace/StepReader.hpp"

namespace Tool {

// How many lines of the trace were ignored, why, and where the first of them are.
void PrintBadLines(std::ostream& out, const std::string& trace, const Trace::BadLines& bad);

// Warns on standard error if the trace breaks off. Returns the exit status: that of a failure then.
int WarnOfBrokenTrace(const Trace::StepReader& reader);

}  // namespace Tool

#endif
