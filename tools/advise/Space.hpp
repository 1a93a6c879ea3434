// The settings that a search may try: a list of values for each, and how to walk among them.

#ifndef OBR_TOOLS_ADVISE_SPACE_HPP
#define OBR_TOOLS_ADVISE_SPACE_HPP

#include <vector>

#include "replay/PoolSettings.hpp"

namespace Advise {

// In how many of the settings the two differ.
unsigned int NumDifferences(const Replay::PoolSettings& a, const Replay::PoolSettings& b);

// What to look at first: the defaults, then a coarse grid around them, the most telling first.
std::vector<Replay::PoolSettings> CoarseGrid();

// One setting a step up or down. Where a bucket would not take the largest record, the other one of
// the two goes along. Both ways of the environment and of HeapSettings take all of these.
std::vector<Replay::PoolSettings> Neighbours(const Replay::PoolSettings& center);

}  // namespace Advise

#endif
