// The trace, line by line; the moment of each line within its event; and that no line needs the
// heap or a working stream.

#include <MemPool>
#include <iostream>
#include <memory>
#include <new>
#include <optional>
#include <sstream>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "HeapSpy.hpp"
#include "Output.hpp"
#include "diagnostics/text/Text.hpp"

using namespace OBR::MemPool;

namespace {

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
    ~Trace() override {
        NUV_OBR_MEMPOOL_TRACE(false);
        std::cout.copyfmt(std::ios(nullptr));
    }

    Output output;
};

INSTANTIATE_TEST_SUITE_P(, Trace, testing::Values(true, false),
                         [](const auto& param) { return param.param ? "Enabled" : "Disabled"; });

// Whatever the host has set on the stream, which is not changed.
TEST_P(Trace, EachEventWritesItsLine) {
    SetStreamState();
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
    NUV_OBR_MEMPOOL_TRACE(false);
    pool->Free(pool->Alloc(10));
    NUV_OBR_MEMPOOL_TRACE(true);  // From the next event on.
    EXPECT_EQ(output.Take(), "");

    std::cout << 10;
    EXPECT_EQ(output.Take(), "0XA#################");
    for (const auto state : {std::ios::failbit, std::ios::badbit, std::ios::eofbit}) {
        std::cout.setstate(state);
        pool->Free(pool->Alloc(10));
        std::cout.clear();
        EXPECT_EQ(output.Take(), "");
    }

    pool.reset();
    EXPECT_EQ(output.Take(), Line("d", address) + "\n");
}

// The heap refuses its n-th request, once or for good, wherever the output has to grow; each flush
// fails; and the host has enabled all exceptions of the stream.
TEST_P(Trace, AnEventIsAWholeLineOrNoneAndDoesItsWork) {
    for (std::size_t filled = 0; filled <= 512 && !HasFailure(); ++filled) {
        for (const bool forGood : {false, true}) {
            const auto expectLine = [&](std::size_t size, std::size_t n, auto event) {
                Output growing;
                std::cout << std::string(filled, '.');
                std::cout.exceptions(std::ios::badbit | std::ios::failbit);
                growing.onFlush = [] { throw "no device"; };
                const bool fits = growing.Room() >= size;
                HeapSpy::refuseIn = n + 1;
                HeapSpy::refusesForGood = forGood;
                event();
                HeapSpy::refuseIn = 0;
                EXPECT_EQ(growing.Take().size(), filled + (fits ? size : 0)) << filled;
                std::cout.exceptions(std::ios::goodbit);
            };
            std::optional<Mgr> pool;
            expectLine(24, 1, [&pool] {
                try {
                    pool.emplace("traced");
                } catch (const std::bad_alloc&) {}  // Its own.
            });
            if (!pool) { pool.emplace("traced"); }
            void* const first = pool->Alloc(10);
            void* data = nullptr;
            expectLine(44, GetParam() ? 0 : 1, [&] { data = pool->Alloc(10); });
            EXPECT_EQ(pool->Contains(data), GetParam());
            expectLine(42, 0, [&] { EXPECT_TRUE(pool->Free(data)); });
            EXPECT_TRUE(pool->Free(first));
            expectLine(24, 0, [&] { pool.reset(); });
            EXPECT_EQ(GetNumMgrs(), 0u);
        }
    }
}

// A buffer of the host's that writes the time and then fails.
TEST(TraceOfFailures, OnlyTheLineItselfIsTakenBack) {
    struct : std::stringbuf {
        std::streamsize xsputn(const char*, std::streamsize) override {
            return std::stringbuf::xsputn("12:00 ", 6) - 6;
        }
        int sync() override {
            ADD_FAILURE() << "What is to be taken back would be written.";
            return 0;
        }
    } stamping;
    std::streambuf* const output = std::cout.rdbuf(&stamping);
    NUV_OBR_MEMPOOL_TRACE(true);
    { const Mgr pool("stamped"); }
    NUV_OBR_MEMPOOL_TRACE(false);
    std::cout.rdbuf(output);
    EXPECT_EQ(stamping.str(), "12:00 12:00 ");
}

// A pool enters the registry after its "c:" line and leaves it before its "d:" line. A block is in
// use when either of its lines is written, and at the end of its pool. A failed Free is traced like
// another.
TEST(TraceOfMoments, EachLineHasItsMoment) {
    NUV_OBR_MEMPOOL_ON(true);
    Mgr other("other");
    void* const foreign = other.Alloc(10);
    alignas(Mgr) char place[sizeof(Mgr)];
    Mgr* const pool = reinterpret_cast<Mgr*>(place);
    std::vector<const void*> blocks;
    std::string events;
    Output output;
    output.onFlush = [&] {
        const std::string line = output.Take();  // "xmpt:a:", the pool, ":", the block, ...
        const bool isOfBlock = line[5] == 'a' || line[5] == 'f';
        events += line[5];
        EXPECT_EQ(GetMgr("watched"), isOfBlock ? pool : nullptr);
        if (isOfBlock) {
            blocks = {reinterpret_cast<const void*>(std::stoull(line.substr(24), nullptr, 16))};
        }
        for (const void* block : blocks) {
            EXPECT_TRUE(pool->Contains(block) || block == foreign) << line;
        }
    };
    NUV_OBR_MEMPOOL_TRACE(true);
    new (place) Mgr("watched");
    for (const unsigned int size : {10u, 2000u}) { pool->Free(pool->Alloc(size)); }
    EXPECT_FALSE(pool->Free(foreign));
    void* const record = pool->Alloc(10);
    blocks = {record, pool->Alloc(2000)};
    pool->~Mgr();
    NUV_OBR_MEMPOOL_TRACE(false);
    EXPECT_EQ(events, "cafaffaad");
    EXPECT_TRUE(other.Contains(foreign));
}

}  // namespace
