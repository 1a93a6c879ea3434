#include "diagnostics/checked/Checkers.hpp"

#include <cstdint>

#ifdef OBR_KNOWS_VALGRIND
#include <valgrind/valgrind.h>
#endif

#include "diagnostics/text/Text.hpp"

// Null if the host has no AddressSanitizer.
// NOLINTBEGIN(bugprone-reserved-identifier,readability-identifier-naming)
#define OBR_WEAK __attribute__((weak, visibility("default")))
extern "C" {
OBR_WEAK void __asan_poison_memory_region(const volatile void* start, std::size_t size);
OBR_WEAK void __asan_unpoison_memory_region(const volatile void* start, std::size_t size);
OBR_WEAK void __asan_describe_address(void* address);
OBR_WEAK void __sanitizer_print_stack_trace();
}
// NOLINTEND(bugprone-reserved-identifier,readability-identifier-naming)

namespace OBR::MemPool::Checkers {

namespace {

#ifdef OBR_KNOWS_VALGRIND
void ValgrindStack() {
    if (RUNNING_ON_VALGRIND) { VALGRIND_PRINTF_BACKTRACE("reported here\n"); }
}
void ValgrindHistory(const void* address) {
    const std::string command = "v.info location " + PtrText(address);
    if (RUNNING_ON_VALGRIND) { VALGRIND_MONITOR_COMMAND(command.c_str()); }
}
#else
void ValgrindStack() {}
void ValgrindHistory(const void*) {}
#endif

}  // namespace

void Poison(const void* start, std::size_t size) {
    if (__asan_poison_memory_region != nullptr) { __asan_poison_memory_region(start, size); }
}

void Unpoison(const void* start, std::size_t size) {
    if (__asan_unpoison_memory_region != nullptr) { __asan_unpoison_memory_region(start, size); }
}

void PrintStack() {
    if (__sanitizer_print_stack_trace != nullptr) { __sanitizer_print_stack_trace(); }
    ValgrindStack();
}

void PrintHistory(const void* address) {
    if (__asan_describe_address != nullptr) { __asan_describe_address(const_cast<void*>(address)); }
    ValgrindHistory(address);
}

}  // namespace OBR::MemPool::Checkers
