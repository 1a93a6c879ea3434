// Counts what operator new lends to this program, the library's requests included. A program that
// links this replaces the operators of the C++ library by ones that can count; while they do not,
// they pay one test of a flag for it.

#ifndef OBR_TOOLS_REPLAY_HEAPCOUNT_HPP
#define OBR_TOOLS_REPLAY_HEAPCOUNT_HPP

#include <cstdint>

namespace HeapCount {

// Counts from 0 on.
void Start();

// Stops, and returns the bytes lent since the start and not given back, as malloc_usable_size tells
// them: rounded as the allocator rounds, without its own headers.
std::int64_t Stop();

}  // namespace HeapCount

#endif
