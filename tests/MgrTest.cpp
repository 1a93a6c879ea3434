// Handles and the registry: names, the lists of all pools, and what is left if memory is exhausted.
// tests/fuzz makes, assigns and destroys handles that share a pool in any order.

#include <MemPool>

#include <new>
#include <optional>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "HeapSpy.hpp"
#include "Layout.hpp"
#include "MemPool/BucketMgr.hpp"
#include "MemPool/MgrRegistry.hpp"
#include "PoolFixture.hpp"

namespace OBR::MemPool {

namespace {

class MgrTest : public PoolFixture {
protected:
    MgrTest() { EXPECT_EQ(firstName, "__OBR_MEMPOOL_00001"); }

    // Makes the first pool of the process that has no name.
    static void SetUpTestSuite() { firstName = Mgr().GetName(); }
    inline static std::string firstName;
};

// The number in a generated name.
int Number(const Mgr& mgr) {
    return std::stoi(std::string(mgr.GetName()).substr(14));
}

using Handles = std::vector<Mgr*>;

Handles All() {
    Handles mgrs;
    GetMgrs(mgrs);
    return mgrs;
}

}  // namespace

TEST_F(MgrTest, OnlyAPoolWithoutANameIsNumbered) {
    const int number = Number(Mgr());
    char text[] = "own";
    const Mgr named(text);
    text[0] = '?';
    EXPECT_STREQ(named.GetName(), "own");
    EXPECT_STREQ(Mgr("").GetName(), "");
    EXPECT_EQ(Number(Mgr(nullptr)), number + 1);
    Use(100, 4, 16, 16);
    for (int i = number + 2; i < 99999; ++i) { const Mgr mgr; }
    EXPECT_STREQ(Mgr().GetName(), "__OBR_MEMPOOL_99999");
    EXPECT_STREQ(Mgr().GetName(), "__OBR_MEMPOOL_100000");
}

TEST_F(MgrTest, PoolsAreFoundByNameAsLongAsTheyLive) {
    for (int round = 0; round < 2; ++round) {
        EXPECT_EQ(GetNumMgrs(), 0u);
        EXPECT_EQ(GetMgr("a"), nullptr);
        EXPECT_EQ(GetMgr(nullptr), nullptr);
        const Mgr a("a");
        const Mgr empty("");
        Settings::off = true;
        const Mgr disabled("disabled");
        Settings::off = false;
        EXPECT_EQ(GetNumMgrs(), 3u);
        EXPECT_EQ(GetMgr(std::string("a").c_str()), &a);
        EXPECT_EQ(GetMgr("b"), nullptr);
        EXPECT_EQ(GetMgr(nullptr), &empty);
        EXPECT_EQ(GetMgr(disabled.GetName()), &disabled);
        EXPECT_TRUE(a.IsEnabled());
        EXPECT_FALSE(disabled.IsEnabled());
    }
}

TEST_F(MgrTest, AllPoolsAreAppendedInTheOrderOfTheirNames) {
    Mgr last("\xC3");
    Mgr b("b");
    Mgr a("a");
    Mgr ab("ab");
    Mgr generated;
    Handles expected{nullptr, &generated, &a, &ab, &b, &last};
    Handles standard{nullptr};
    GetMgrs(standard);
    EXPECT_EQ(standard, expected);

    // Room is reserved for the pools, without those that the vector holds already.
    OBR::vector<Mgr*> compact;
    compact.push_back(nullptr);
    GetMgrs(compact);
    EXPECT_EQ(Handles(compact.begin(), compact.end()), expected);
    EXPECT_EQ(compact.capacity, 10u);

    EXPECT_TRUE(HeapSpy::FailsAt(0, [&] { GetMgrs(expected); })) << "It is full.";
    EXPECT_EQ(expected, standard);
}

TEST_F(MgrTest, AHandlePassesEverythingOn) {
    constexpr unsigned int limit = 1073741823;  // The largest request reaches the heap.
    Mgr mgr("mgr");
    const BucketMgr& pool = *mgr.GetBucketMgr();
    void* const record = mgr.Alloc(5);
    void* const heapRecord = mgr.Alloc(997);
    EXPECT_TRUE(HeapSpy::FailsAt(0, [&] { mgr.Alloc(limit); }));
    EXPECT_EQ(HeapSpy::lastRequest, limit + Layout::extRec);
    EXPECT_EQ(CheckInvariants(pool).size(), 2u);
    EXPECT_EQ(mgr.GetSize(record), 8u);
    EXPECT_TRUE(mgr.Contains(record));
    EXPECT_FALSE(mgr.Contains(nullptr));
    EXPECT_FALSE(mgr.CollectGarbage());
    EXPECT_TRUE(mgr.Free(heapRecord));
    EXPECT_FALSE(mgr.Free(nullptr));
    EXPECT_EQ(CheckInvariants(pool).size(), 1u);
    mgr.Clear();
    EXPECT_EQ(CheckInvariants(pool).size(), 0u);
}

// Each heap request of a new handle is refused in turn.
TEST_F(MgrTest, ARefusedPoolLeavesNothingButAGapInTheNumbers) {
    Mgr other("other");
    const int number = Number(Mgr());
    const std::size_t outside = HeapSpy::numLive;
    std::optional<Mgr> mgr;
    std::size_t n = 0;
    for (; HeapSpy::FailsAt(n, [&] { mgr.emplace(); }); ++n) {
        EXPECT_EQ(HeapSpy::numLive, outside);
        EXPECT_EQ(All(), Handles{&other});
    }
    EXPECT_EQ(GetMgr(mgr->GetName()), &*mgr);
    EXPECT_EQ(Number(*mgr), number + 1 + static_cast<int>(n));
    EXPECT_EQ(mgr->GetSize(mgr->Alloc(1)), 4u);
}

// However often a handle is assigned to, it is noted once.
TEST_F(MgrTest, AssignmentsToAHandleDoNotAddUp) {
    const Mgr a("a");
    const Mgr b("b");
    const Mgr c("c");
    std::optional<Mgr> left("left");
    BucketMgr* const former = left->GetBucketMgr();
    for (const Mgr* const right : {&a, &b, &c}) { *left = *right; }
    EXPECT_EQ(registry.Sharers(), Handles{&*left});
    left.reset();
    registry.Erase("left");  // No handle leads to it any more.
    delete former;
}

}  // namespace OBR::MemPool
