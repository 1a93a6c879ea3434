// Counts what operator new lends to this program, the library's requests included. A program that
// links this replaces the operators of the C++ library by ones that can count; while they do not,
// they pay one test of a flag for it.

#ifndef OBR_TOOLS_REPLAY_HEAPCOUNT_HPP
#define OBR_TOOLS_REPLAY_HEAPCOUNT_HPP

#include <cstdint>

namespace HeapCount {

// Counts from 0 on.
void Start();

// Stops, and returns the bytes lent since the start and not given back: rounded as the allocator
// rounds, as malloc_usable_size tells, and with the header that the GNU C library keeps for each
// block.
std::int64_t Stop();

}  // namespace HeapCount

#endif
