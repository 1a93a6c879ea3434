// The interface to AddressSanitizer and Valgrind, which may watch the host. The library needs
// neither: AddressSanitizer's functions exist only if the host brings them, and Valgrind's requests
// are a few instructions that do nothing outside of Valgrind.

#ifndef OBR_DIAGNOSTICS_CHECKERS_HPP
#define OBR_DIAGNOSTICS_CHECKERS_HPP

#include <cstddef>

namespace OBR::MemPool::Checkers {

// Start and stop AddressSanitizer's reports of accesses to these bytes. It marks 8 bytes at a time;
// fewer bytes at the end stay unmarked.
void Poison(const void* start, std::size_t size);
void Unpoison(const void* start, std::size_t size);

// Prints the stack of the caller.
void PrintStack();

// Prints what the checker knows about an address: where its block was allocated and freed.
void PrintHistory(const void* address);

}  // namespace OBR::MemPool::Checkers

#endif
