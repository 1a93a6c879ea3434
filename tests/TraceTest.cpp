// The trace, line by line, and the moment of each line within its event.

#include <MemPool>
#include <functional>
#include <iostream>
#include <memory>
#include <sstream>
#include <string>

#include <gtest/gtest.h>

#include "diagnostics/text/Text.hpp"

using namespace OBR::MemPool;

namespace {

// Stands in for standard output while it lives. Each flush is a moment to look around at.
class Output : public std::stringbuf {
public:
    Output() : former(std::cout.rdbuf(this)) {}
    ~Output() override { std::cout.rdbuf(former); }

    // What was written since the last call.
    std::string Take() {
        const std::string text = str();
        str("");
        return text;
    }

    std::function<void()> onFlush = [] {};

private:
    int sync() override {
        onFlush();
        return 0;
    }

    std::streambuf* const former;
};

std::string Line(const char* event, const BucketMgr* pool) {
    return "xmpt:" + std::string(event) + ":" + BareHex(pool);
}
std::string Freed(const Mgr& pool, const void* data) {
    return Line("f", pool.GetBucketMgr()) + ":" + BareHex(data) + ":\n";
}
std::string Allocated(const Mgr& pool, const void* data, unsigned int size) {
    return Line("a", pool.GetBucketMgr()) + ":" + BareHex(data) + ":" + std::to_string(size) + "\n";
}

class Trace : public testing::TestWithParam<bool> {
protected:
    Trace() {
        NUV_OBR_MEMPOOL_ON(GetParam());
        NUV_OBR_MEMPOOL_TRACE(true);
    }
    ~Trace() override { NUV_OBR_MEMPOOL_TRACE(false); }

    Output output;
};

INSTANTIATE_TEST_SUITE_P(, Trace, testing::Values(true, false),
                         [](const auto& param) { return param.param ? "Enabled" : "Disabled"; });

TEST_P(Trace, EachEventWritesItsLine) {
    auto pool = std::make_unique<Mgr>("traced");
    const BucketMgr* const address = pool->GetBucketMgr();
    EXPECT_EQ(output.Take(), Line("c", address) + "\n");

    // The sizes of the first and a later record, of records with and without a group, and of heap
    // records.
    for (const unsigned int size : {0u, 10u, 10u, 996u, 997u, 100000u}) {
        void* const data = pool->Alloc(size);
        EXPECT_EQ(output.Take(), Allocated(*pool, data, size));
        EXPECT_TRUE(pool->Free(data));
        EXPECT_EQ(output.Take(), Freed(*pool, data));
    }
    EXPECT_FALSE(pool->Free(nullptr));
    pool->Clear();
    EXPECT_EQ(output.Take(), "");

    // The switch counts from the next event on.
    NUV_OBR_MEMPOOL_TRACE(false);
    void* const quiet = pool->Alloc(10);
    pool->Free(pool->Alloc(10));
    EXPECT_EQ(output.Take(), "");
    NUV_OBR_MEMPOOL_TRACE(true);
    pool->Free(quiet);
    EXPECT_EQ(output.Take(), Freed(*pool, quiet));

    pool.reset();
    EXPECT_EQ(output.Take(), Line("d", address) + "\n");
}

// A pool enters the registry behind its "c:" line and leaves it ahead of its "d:" line. A block is
// in use at the moments of both its lines, and at the end of its pool. A failed Free is told like
// another.
TEST(TraceOfMoments, EachLineHasItsMoment) {
    NUV_OBR_MEMPOOL_ON(true);
    Mgr other("other");
    void* const foreign = other.Alloc(10);
    NUV_OBR_MEMPOOL_TRACE(true);
    Output output;
    unsigned int events = 0;
    const auto unlisted = [&] {
        ++events;
        EXPECT_EQ(GetMgr("watched"), nullptr);
    };
    output.onFlush = unlisted;
    auto pool = std::make_unique<Mgr>("watched");
    EXPECT_EQ(GetMgr("watched"), pool.get());
    output.Take();

    output.onFlush = [&] {
        ++events;
        const std::string line = output.Take();  // "xmpt:a:", the pool, ":", the block, ...
        const auto block = std::stoull(line.substr(24), nullptr, 16);
        EXPECT_TRUE(pool->Contains(reinterpret_cast<const void*>(block))) << line;
    };
    for (const unsigned int size : {10u, 2000u}) { pool->Free(pool->Alloc(size)); }
    const void* const record = pool->Alloc(10);
    const void* const heapRecord = pool->Alloc(2000);

    output.onFlush = [] {};
    EXPECT_FALSE(pool->Free(foreign));
    EXPECT_EQ(output.Take(), Freed(*pool, foreign));
    EXPECT_TRUE(other.Contains(foreign));

    output.onFlush = [&] {
        unlisted();
        EXPECT_TRUE(pool->Contains(record));
        EXPECT_TRUE(pool->Contains(heapRecord));
    };
    // A moment inside the destructor: the handle is still there to be asked.
    pool->~Mgr();
    ::operator delete(pool.release());
    EXPECT_EQ(events, 8u);
    output.onFlush = [] {};
    NUV_OBR_MEMPOOL_TRACE(false);
}

}  // namespace
