// Output that several subcommands share.

#ifndef OBR_TOOLS_MEMPOOL_PRINT_HPP
#define OBR_TOOLS_MEMPOOL_PRINT_HPP

#include <iostream>
#include <string>

#include "trace/StepReader.hpp"

namespace Tool {

// Prints how many lines of the trace were ignored, why, and where the first of them are.
void PrintBadLines(std::ostream& out, const std::string& trace, const Trace::BadLines& bad);

// Warns on standard error if the trace is incomplete. Returns the exit status, which is then that
// of a failure.
int WarnOfBrokenTrace(const Trace::StepReader& reader);

}  // namespace Tool

#endif
