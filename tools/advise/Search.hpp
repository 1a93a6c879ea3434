// Looks for the settings that are fastest, smallest, and best at both, without trying all: a quick
// look at a coarse grid, steps from the best so far to a better neighbour until there is none, and
// then more rounds for fewer and fewer of the most promising.

#ifndef OBR_TOOLS_ADVISE_SEARCH_HPP
#define OBR_TOOLS_ADVISE_SEARCH_HPP

#include <cstddef>
#include <functional>

#include "advise/Figures.hpp"
#include "advise/Meter.hpp"

namespace Advise {

// How many steps of a trace can be replayed often enough to search for so long.
std::size_t MaxSteps(double seconds);

// Searches for about that many seconds at most, less if it is done. `atStep` is called with the
// number of settings that were tried, now and then. A replay of the heap that fails is a
// std::runtime_error; settings that fail are given up.
Findings Search(Meter& meter, double seconds, const std::function<void(std::size_t)>& atStep);

}  // namespace Advise

#endif
