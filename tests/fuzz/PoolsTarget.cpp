// The fuzz target of the library: a process with several pools and heaps, whose memory comes from a
// heap that sometimes refuses. After each step the touched pool is intact, and at the end nothing
// is left.

#include <cstddef>
#include <cstdint>
#include <iostream>

#include <gtest/gtest.h>

#include "../HeapSpy.hpp"
#include "Bytes.hpp"
#include "MemPool/Settings.hpp"
#include "World.hpp"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    std::streambuf* const output = std::cout.rdbuf(nullptr);  // The trace goes nowhere.
    const std::size_t numLive = HeapSpy::numLive;
    {
        Fuzz::Bytes bytes(data, size);
        Fuzz::World world(bytes);
        while (!bytes.AtEnd() && !testing::Test::HasFailure()) { world.Step(); }
    }
    EXPECT_EQ(HeapSpy::numLive, numLive);
    EXPECT_EQ(HeapSpy::numMisfits, 0);
    OBR::MemPool::Settings::trace = false;
    std::cout.rdbuf(output);
    return 0;
}
