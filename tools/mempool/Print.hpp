// Prints what several subcommands have in their reports.

#ifndef OBR_TOOLS_MEMPOOL_PRINT_HPP
#define OBR_TOOLS_MEMPOOL_PRINT_HPP

#include <iostream>
#include <string>

#include "replay/Recording.hpp"

namespace Tool {

// How many lines of the trace were left out, why, and where the first of them stand.
void PrintBadLines(std::ostream& out, const std::string& path, const Replay::Recording& recording);

}  // namespace Tool

#endif
