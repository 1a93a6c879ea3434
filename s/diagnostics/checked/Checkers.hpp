// What the checkers that may watch the host, AddressSanitizer and Valgrind, know and can be told.
// The library needs neither: AddressSanitizer's interface is there if the host brings it, and
// Valgrind's is a few instructions that do nothing elsewhere.

#ifndef OBR_DIAGNOSTICS_CHECKERS_HPP
#define OBR_DIAGNOSTICS_CHECKERS_HPP

#include <cstddef>

namespace OBR::MemPool::Checkers {

// From now on AddressSanitizer reports accesses of the host to these bytes, or no longer. It marks
// 8 bytes at a time, and leaves out the last bytes if they are fewer.
void Poison(const void* start, std::size_t size);
void Unpoison(const void* start, std::size_t size);

// Prints the stack of the caller.
void PrintStack();

// Prints what is known of an address: where its block was taken, and where it was released.
void PrintHistory(const void* address);

}  // namespace OBR::MemPool::Checkers

#endif
