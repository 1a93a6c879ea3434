// Counts the bytes that this program allocates with operator new, including those of the library. A
// program that links this file has operators that can count; while they do not count, that costs
// one test of a flag.

#ifndef OBR_TOOLS_REPLAY_HEAPCOUNT_HPP
#define OBR_TOOLS_REPLAY_HEAPCOUNT_HPP

#include <cstdint>

namespace HeapCount {

// Starts to count, from 0.
void Start();

// Stops, and returns the bytes that were allocated since the start and not freed, with the
// allocator's rounding (malloc_usable_size) and the GNU C library's header of each block.
std::int64_t Stop();

}  // namespace HeapCount

#endif
