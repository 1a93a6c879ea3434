// Handles and the registry: names, the lists of all pools, handles that share a pool, and what is
// left when memory runs out.

#include <MemPool>

#include <algorithm>
#include <array>
#include <deque>
#include <new>
#include <optional>
#include <random>
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

    // Room is made for what there is and not for what the vector holds already.
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

// Each request of the heap behind a new handle is refused in turn.
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

namespace {

// Handles at a few fixed places, and beside them a simple account of what they should be. A pool
// that no handle would destroy any more is destroyed here in the end.
class HandleModel {
public:
    static constexpr std::size_t numPlaces = 4;

    ~HandleModel() {
        for (std::size_t place = 0; place < numPlaces; ++place) { Destroy(place); }
        for (const Pool& pool : pools) {
            if (pool.address != nullptr) { registry.Erase(pool.name); }
            delete pool.address;
        }
    }

    void Construct(std::size_t place) {
        Place& at = places[place];
        if (at.handle) { return; }
        const std::string name(20, static_cast<char>('a' + pools.size()));
        at.handle.emplace(name.c_str());
        pools.push_back({name, at.handle->GetBucketMgr(), &*at.handle});
        at.pool = &pools.back();
    }

    void Assign(std::size_t left, std::size_t right) {
        Place& to = places[left];
        const Place& from = places[right];
        if (!to.handle || !from.handle) { return; }
        EXPECT_EQ(&(*to.handle = *from.handle), &*to.handle);
        to.pool = from.pool;
    }

    void Destroy(std::size_t place) {
        Place& at = places[place];
        if (!at.handle) { return; }
        for (Pool& pool : pools) {
            if (pool.maker == &*at.handle) { pool.maker = nullptr; }
        }
        at.handle.reset();
        at.pool->address = nullptr;
    }

    void Check() const {
        unsigned int numPools = 0;
        Handles expected;
        for (const Pool& pool : pools) {
            Mgr* found = nullptr;
            if (pool.address != nullptr) {
                ++numPools;
                EXPECT_EQ(pool.address->mgr, pool.maker);
                if (pool.maker != nullptr && pool.maker->GetBucketMgr() != nullptr) {
                    expected.push_back(found = pool.maker);
                }
            }
            EXPECT_EQ(GetMgr(pool.name.c_str()), found);
        }
        EXPECT_EQ(GetNumMgrs(), numPools);
        EXPECT_EQ(All(), expected);
        EXPECT_LE(registry.Sharers().size(), numPlaces);
        for (const Place& at : places) {
            if (at.handle) { EXPECT_EQ(at.handle->GetBucketMgr(), at.pool->address); }
        }
    }

private:
    struct Pool {
        std::string name;
        BucketMgr* address;  // Null once it is destroyed.
        Mgr* maker;          // Null once it is destroyed.
    };
    struct Place {
        std::optional<Mgr> handle;
        Pool* pool = nullptr;
    };

    std::array<Place, numPlaces> places;
    std::deque<Pool> pools;  // A pool stays at its address.
};

}  // namespace

// Handles come, go and are assigned in any order, at addresses where others stood before.
TEST_F(MgrTest, APoolEndsOnceAndNoHandleLeadsToADeadOne) {
    std::mt19937 random(2);
    const auto below = [&random](std::size_t n) { return random() % n; };
    for (int round = 0; round < 1500; ++round) {
        SCOPED_TRACE(round);
        HandleModel model;
        for (std::size_t place = 0; place < model.numPlaces; ++place) { model.Construct(place); }
        for (int step = 0; step < 14 && !HasFailure(); ++step) {
            const std::size_t place = below(model.numPlaces);
            switch (below(6)) {
                case 0:
                    model.Construct(place);
                    break;
                case 1:
                case 2:
                    model.Destroy(place);
                    break;
                default:
                    model.Assign(place, below(model.numPlaces));
            }
            model.Check();
        }
    }
}

}  // namespace OBR::MemPool
