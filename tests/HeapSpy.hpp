// The heap as tests see it. HeapSpy.cpp replaces the global operators new and delete of a test
// program by malloc and free: it compares the form of each block when it is released, can refuse
// any request, and records the last request and release. New blocks are filled with one byte and
// released ones with another, so that no test passes by luck.

#ifndef OBR_TESTS_HEAPSPY_HPP
#define OBR_TESTS_HEAPSPY_HPP

#include <array>
#include <cstddef>
#include <cstdint>
#include <new>

#include <gtest/gtest.h>

namespace HeapSpy {

constexpr std::uint8_t freshByte = 0xC5;

extern std::size_t lastRequest;                    // Its bytes, also if it was refused.
extern const void* lastRelease;                    // The block's address,
extern std::array<std::uint8_t, 48> releasedHead;  // and its first bytes when it was released.
extern std::size_t numLive;                        // Blocks requested and not yet released.
extern std::size_t arrayBytes;                     // Bytes of those in array form.
extern std::size_t numMisfits;  // Releases in the wrong form, or of anything but a living block.
extern std::size_t refuseIn;    // 1: the next request is refused, and so on; 0: none is.
extern bool refusesForGood;     // All requests after that one are refused as well.

// Whether a living block of this size starts here that was requested in array form.
bool IsArray(const void* start, std::size_t size);

// Runs `action` and refuses its n-th request, counted from 0. Returns whether there was one; an
// action that swallows the refusal fails the test.
template <typename Action>
bool FailsAt(std::size_t n, Action action) {
    bool failed = false;
    refuseIn = n + 1;
    try {
        action();
    } catch (const std::bad_alloc&) { failed = true; }
    EXPECT_EQ(failed, refuseIn == 0);
    refuseIn = 0;
    return failed;
}

}  // namespace HeapSpy

#endif
