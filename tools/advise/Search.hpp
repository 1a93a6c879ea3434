// Looks for the settings that are fastest, smallest, and best at both, without trying all. It first
// tries a coarse grid, then steps from the best to a better neighbour until there is none, and then
// measures more rounds of fewer and fewer of the most promising settings.

#ifndef OBR_TOOLS_ADVISE_SEARCH_HPP
#define OBR_TOOLS_ADVISE_SEARCH_HPP

#include <cstddef>
#include <functional>

#include "advise/Figures.hpp"
#include "advise/Meter.hpp"

namespace Advise {

// The number of steps that can be replayed often enough in a search of that many seconds.
std::size_t MaxSteps(double seconds);

// Searches for at most about that many seconds. Calls `atStep` with the number of settings that
// were tried, from time to time. Gives up settings whose replay fails. Throws a std::runtime_error
// if a replay of the heap fails.
Findings Search(Meter& meter, double seconds, const std::function<void(std::size_t)>& atStep);

}  // namespace Advise

#endif
