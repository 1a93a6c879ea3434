// The checkers that may watch the host, AddressSanitizer and Valgrind, asked for what they know.
// The library needs neither: AddressSanitizer's interface is there if the host brings it, and
// Valgrind's is a few instructions that do nothing elsewhere.

#ifndef OBR_DIAGNOSTICS_CHECKERS_HPP
#define OBR_DIAGNOSTICS_CHECKERS_HPP

#include <cstddef>

namespace OBR::MemPool::Checkers {

// Under AddressSanitizer the host's accesses to these bytes are faults from now on, or no longer.
// They begin at a multiple of 8, and an odd rest of them is left out.
void Poison(const void* start, std::size_t size);
void Unpoison(const void* start, std::size_t size);

// Writes which code is running.
void TellStack();

// Writes what is known of an address: where its block was taken, and where it was released.
void TellHistory(const void* address);

}  // namespace OBR::MemPool::Checkers

#endif
