// An advice as text.

#ifndef OBR_TOOLS_MEMPOOL_ADVICETEXT_HPP
#define OBR_TOOLS_MEMPOOL_ADVICETEXT_HPP

#include <iosfwd>

#include "advise/Advice.hpp"

namespace Tool {

// A line for the heap and a line for each of the settings, the best first: all, or those that
// matter.
void PrintTable(std::ostream& out, const Advise::Advice& advice, bool all);

// The verdict in words, and the lines to paste if pools would help.
void PrintVerdict(std::ostream& out, const Advise::Advice& advice);

}  // namespace Tool

#endif
