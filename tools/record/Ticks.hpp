// A clock that is cheap to read, in ticks of its own. On some processors it advances by several
// ticks at once, so that only the mean of many measurements is meaningful.

#ifndef OBR_TOOLS_RECORD_TICKS_HPP
#define OBR_TOOLS_RECORD_TICKS_HPP

#include <cstdint>

#if defined(__x86_64__)
#include <x86intrin.h>
#else
#include <ctime>
#endif

namespace Recorder {

inline std::uint64_t Ticks() {
#if defined(__x86_64__)
    return __rdtsc();
#elif defined(__aarch64__)
    std::uint64_t ticks = 0;
    asm volatile("mrs %0, cntvct_el0" : "=r"(ticks));
    return ticks;
#else
    timespec now = {};
    clock_gettime(CLOCK_MONOTONIC, &now);
    return static_cast<std::uint64_t>(now.tv_sec) * 1000000000U +
           static_cast<std::uint64_t>(now.tv_nsec);
#endif
}

// The time at which the code before this call is done. Without the barrier, a processor may read
// the counter before the short call that precedes it has returned.
inline std::uint64_t TicksWhenDone() {
#if defined(__x86_64__)
    _mm_lfence();
#elif defined(__aarch64__)
    asm volatile("isb" ::: "memory");
#endif
    return Ticks();
}

}  // namespace Recorder

#endif
