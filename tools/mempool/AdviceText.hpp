// Prints advice as text.

#ifndef OBR_TOOLS_MEMPOOL_ADVICETEXT_HPP
#define OBR_TOOLS_MEMPOOL_ADVICETEXT_HPP

#include <iosfwd>
#include <string>
#include <vector>

#include "advise/Advice.hpp"

namespace Tool {

// Prints a line for the heap and a line for each of the settings, the best first: all, or only
// the best and those that are named.
void PrintTable(std::ostream& out, const Advise::Advice& advice, bool all);

// Prints the verdict in words, the lines to paste if pools would help, and the plan if there is
// one.
void PrintVerdict(std::ostream& out, const Advise::Advice& advice);

// The command line of `mempool try` with these settings, for a shell. It has no option for a
// setting that would be the same without one.
std::string TryCommand(const OBR::MemPool::PoolSettings& settings,
                       const std::vector<std::string>& command);

}  // namespace Tool

#endif
