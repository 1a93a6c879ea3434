// What every test of a pool starts from and ends with: settings of its own, and a heap on which
// nothing is left behind and every block went back in the form in which it came.

#ifndef OBR_TESTS_POOLFIXTURE_HPP
#define OBR_TESTS_POOLFIXTURE_HPP

#include <cstddef>
#include <cstdint>
#include <iostream>
#include <streambuf>

#include <gtest/gtest.h>

#include "HeapSpy.hpp"
#include "MemPool/Settings.hpp"

namespace OBR::MemPool {

class PoolFixture : public testing::Test {
protected:
    PoolFixture() { Use(4010, 4, 1000, 8); }
    ~PoolFixture() override {
        EXPECT_EQ(HeapSpy::numLive, numLive);
        EXPECT_EQ(HeapSpy::numMisfits, 0u);
        Settings::off = true;
        Settings::trace = false;
    }

    // New pools are enabled and have these sizes.
    static void Use(std::uint32_t bucketSize, std::uint16_t dataAlignment,
                    std::uint32_t maxRecordSize, std::uint32_t minRecordSize,
                    bool keepEmptyBuckets = false) {
        Settings::bucketSize = bucketSize;
        Settings::dataAlignment = dataAlignment;
        Settings::maxRecordSize = maxRecordSize;
        Settings::minRecordSize = minRecordSize;
        Settings::keepEmptyBuckets = keepEmptyBuckets;
        Settings::off = false;
        Settings::trace = false;
    }

private:
    static std::size_t NumLive() {
        { SCOPED_TRACE(""); }  // The first one of all leaves blocks of the framework's own behind.
        return HeapSpy::numLive;
    }

    const std::size_t numLive = NumLive();
};

// Sends every request down the slow road while it lives, if asked to, and swallows its trace.
class SlowRoad {
public:
    explicit SlowRoad(bool on) : former(on ? std::cout.rdbuf(nullptr) : std::cout.rdbuf()) {
        Settings::trace = on;
    }
    ~SlowRoad() {
        Settings::trace = false;
        std::cout.rdbuf(former);
    }
    SlowRoad(const SlowRoad&) = delete;
    SlowRoad& operator=(const SlowRoad&) = delete;

private:
    std::streambuf* const former;
};

}  // namespace OBR::MemPool

#endif
