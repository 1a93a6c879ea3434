// The settings that a search may try: a list of values for each, and how to walk among them.

#ifndef OBR_TOOLS_ADVISE_SPACE_HPP
#define OBR_TOOLS_ADVISE_SPACE_HPP

#include <vector>

#include <MemPoolSettings>

namespace Advise {

// The number of settings in which the two differ.
unsigned int NumDifferences(const OBR::MemPool::PoolSettings& a,
                            const OBR::MemPool::PoolSettings& b);

// What to try first: the defaults, then a coarse grid around them, the most important first.
std::vector<OBR::MemPool::PoolSettings> CoarseGrid();

// The settings with one value a step up or down. If the largest record would no longer fit into a
// bucket, the other one of these two values changes too. Both the environment and HeapSettings
// accept all results.
std::vector<OBR::MemPool::PoolSettings> Neighbours(const OBR::MemPool::PoolSettings& center);

}  // namespace Advise

#endif
