// Handles and the registry: names, the lists of all pools, handles that share a pool, and what is
// left when memory runs out.

#include <MemPool>

#include <algorithm>
#include <array>
#include <cstdint>
#include <map>
#include <new>
#include <optional>
#include <random>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "HeapSpy.hpp"
#include "MemPool/BucketMgr.hpp"
#include "MemPool/MgrRegistry.hpp"
#include "PoolFixture.hpp"
#include "PoolLaws.hpp"

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
    EXPECT_EQ(GetNumMgrs(), 0u);
    EXPECT_EQ(GetMgr("a"), nullptr);
    EXPECT_EQ(GetMgr(nullptr), nullptr);
    for (int round = 0; round < 2; ++round) {
        const Mgr a("a");
        const Mgr empty("");
        Settings::off = true;
        const Mgr disabled("disabled");
        Settings::off = false;
        EXPECT_EQ(GetNumMgrs(), 3u);
        EXPECT_EQ(GetMgr(std::string("a").c_str()), &a);
        EXPECT_EQ(GetMgr("b"), nullptr);
        EXPECT_EQ(GetMgr(""), &empty);
        EXPECT_EQ(GetMgr(nullptr), &empty);
        EXPECT_EQ(GetMgr(disabled.GetName()), &disabled);
        EXPECT_TRUE(a.IsEnabled());
        EXPECT_FALSE(disabled.IsEnabled());
    }
    EXPECT_EQ(GetNumMgrs(), 0u);
    EXPECT_EQ(GetMgr("a"), nullptr);
}

TEST_F(MgrTest, AllPoolsAreAppendedInTheOrderOfTheirNames) {
    OBR::vector<Mgr*> compact;
    std::vector<Mgr*> standard;
    GetMgrs(compact);
    GetMgrs(standard);
    EXPECT_EQ(compact.data, nullptr);
    EXPECT_TRUE(standard.empty());

    Mgr last("\xC3");
    Mgr b("b");
    Mgr a("a");
    Mgr ab("ab");
    Mgr generated;
    const Handles once{&generated, &a, &ab, &b, &last};
    GetMgrs(compact);
    GetMgrs(standard);
    EXPECT_EQ(standard, once);
    EXPECT_EQ(Handles(compact.begin(), compact.end()), once);
    EXPECT_EQ(compact.capacity, 5u);
    EXPECT_EQ(standard.capacity(), 5u);

    // Room is made for what there is and not for what the vector holds already.
    OBR::vector<Mgr*> behindThree;
    for (int i = 0; i < 3; ++i) { behindThree.push_back(nullptr); }
    GetMgrs(behindThree);
    Handles expected(3, nullptr);
    expected.insert(expected.end(), once.begin(), once.end());
    EXPECT_EQ(Handles(behindThree.begin(), behindThree.end()), expected);
    EXPECT_EQ(behindThree.capacity, 10u);

    EXPECT_TRUE(HeapSpy::FailsAt(0, [&] { GetMgrs(standard); }));
    EXPECT_EQ(standard, once);
}

TEST_F(MgrTest, AHandlePassesEverythingOn) {
    Mgr mgr("mgr");
    const BucketMgr& pool = *mgr.GetBucketMgr();
    void* const record = mgr.Alloc(5);
    void* const heapRecord = mgr.Alloc(997);
    EXPECT_EQ(CheckLaws(pool).size(), 2u);
    EXPECT_EQ(mgr.GetSize(record), 8u);
    EXPECT_TRUE(mgr.Contains(record));
    EXPECT_FALSE(mgr.Contains(nullptr));
    EXPECT_FALSE(mgr.CollectGarbage());
    EXPECT_TRUE(mgr.Free(heapRecord));
    EXPECT_FALSE(mgr.Free(nullptr));
    EXPECT_EQ(CheckLaws(pool).size(), 1u);
    mgr.Clear();
    EXPECT_EQ(CheckLaws(pool).size(), 0u);
}

TEST_F(MgrTest, TheLargestRequestReachesTheHeap) {
    constexpr unsigned int limit = 1073741823;
    for (const bool off : {false, true}) {
        Settings::off = off;
        Mgr mgr("mgr");
        EXPECT_TRUE(HeapSpy::FailsAt(0, [&] { mgr.Alloc(limit); }));
        EXPECT_EQ(HeapSpy::lastRequest.size, limit + (off ? 0u : 24u));
    }
}

// Each request of the heap behind a new handle is refused in turn.
TEST_F(MgrTest, ARefusedPoolLeavesNothingButAGapInTheNumbers) {
    const Mgr other("other");
    const std::string longName(100, 'n');
    for (const char* const name : {static_cast<const char*>(nullptr), longName.c_str()}) {
        const int number = Number(Mgr());
        const std::size_t outside = HeapSpy::numLive;
        std::optional<Mgr> mgr;
        int n = 0;
        for (; HeapSpy::FailsAt(static_cast<std::size_t>(n), [&] { mgr.emplace(name); }); ++n) {
            EXPECT_EQ(HeapSpy::numLive, outside);
            EXPECT_EQ(All(), Handles{const_cast<Mgr*>(&other)});
        }
        EXPECT_GE(n, 6) << "Two names, the pool, its groups, the entry and its key.";
        EXPECT_EQ(GetNumMgrs(), 2u);
        if (name == nullptr) { EXPECT_EQ(Number(*mgr), number + 1 + n); }
        EXPECT_EQ(GetMgr(mgr->GetName()), &*mgr);
        EXPECT_EQ(mgr->GetSize(mgr->Alloc(1)), 4u);
    }
}

TEST_F(MgrTest, ARefusedAssignmentChangesNothing) {
    Mgr a("a");
    Mgr b("b");
    BucketMgr* const pool = a.GetBucketMgr();
    EXPECT_TRUE(HeapSpy::FailsAt(0, [&] { a = b; }));
    EXPECT_EQ(a.GetBucketMgr(), pool);
    EXPECT_TRUE(registry.Sharers().empty());
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
            if (pool.registered) { registry.Erase(pool.name); }
            if (pool.address != nullptr) { delete pool.address; }
        }
    }

    void Construct(std::size_t place) {
        Place& at = places[place];
        if (at.handle) { return; }
        const std::string name = "the name of pool " + std::to_string(pools.size());
        at.handle.emplace(name.c_str());
        at.pool = static_cast<int>(pools.size());
        at.isSharer = false;
        ++at.generation;
        pools.push_back({name, at.handle->GetBucketMgr(), true, place, at.generation});
    }

    void Assign(std::size_t left, std::size_t right) {
        Place& to = places[left];
        const Place& from = places[right];
        if (!to.handle || !from.handle) { return; }
        EXPECT_EQ(&(*to.handle = *from.handle), &*to.handle);
        if (to.pool != from.pool) { to.isSharer = true; }
        to.pool = from.pool;
    }

    void Destroy(std::size_t place) {
        if (!places[place].handle) { return; }
        places[place].handle.reset();
        const int pool = places[place].pool;
        if (pool == none) { return; }
        pools[static_cast<std::size_t>(pool)].address = nullptr;
        for (Place& other : places) {
            if (other.pool == pool) { other.pool = none; }
        }
    }

    void UnloadRegistry() {
        registry.ReleaseNodes();
        for (Pool& pool : pools) { pool.registered = false; }
    }

    void Check() const {
        unsigned int numPools = 0;
        std::map<std::string, Mgr*> listed;
        for (const Pool& pool : pools) {
            const Place& at = places[pool.maker];
            const bool hasMaker = at.handle && at.generation == pool.generation;
            Mgr* const maker = hasMaker ? const_cast<Mgr*>(&*at.handle) : nullptr;
            const bool inRegistry = pool.registered && pool.address != nullptr;
            if (inRegistry) {
                ++numPools;
                EXPECT_EQ(pool.address->mgr, maker);
                if (hasMaker && at.pool != none) { listed[pool.name] = maker; }
            }
            const auto entry = listed.find(pool.name);
            EXPECT_EQ(GetMgr(pool.name.c_str()), entry == listed.end() ? nullptr : entry->second);
        }
        EXPECT_EQ(GetNumMgrs(), numPools);
        Handles expected;
        for (const auto& entry : listed) { expected.push_back(entry.second); }
        EXPECT_EQ(All(), expected);

        std::size_t numSharers = 0;
        for (const Place& at : places) {
            if (!at.handle) { continue; }
            numSharers += at.isSharer;
            BucketMgr* const pool =
                at.pool == none ? nullptr : pools[static_cast<std::size_t>(at.pool)].address;
            EXPECT_EQ(at.handle->GetBucketMgr(), pool);
            // Also after the exit step a pool that can be reached names no maker that is gone.
            if (pool != nullptr && pool->mgr != nullptr) {
                EXPECT_TRUE(std::any_of(places.begin(), places.end(), [pool](const Place& maker) {
                    return maker.handle && &*maker.handle == pool->mgr;
                }));
            }
        }
        EXPECT_EQ(registry.Sharers().size(), numSharers);
    }

private:
    static constexpr int none = -1;
    struct Place {
        std::optional<Mgr> handle;
        int generation = 0;  // Of the handles that have stood here.
        int pool = none;
        bool isSharer = false;  // Whether it has ever been assigned another pool.
    };
    struct Pool {
        std::string name;
        BucketMgr* address;  // Null once it is destroyed.
        bool registered;
        std::size_t maker;  // The place of its maker, who may be gone,
        int generation;     // and its generation.
    };
    std::array<Place, numPlaces> places;
    std::vector<Pool> pools;
};

}  // namespace

// Handles come, go and are assigned in any order, at addresses where others stood before, and in
// some rounds the library's exit step comes in between.
TEST_F(MgrTest, APoolEndsOnceAndNoHandleLeadsToADeadOne) {
    std::mt19937 random(2);
    const auto below = [&random](std::size_t n) { return random() % n; };
    for (int round = 0; round < 1500; ++round) {
        SCOPED_TRACE(round);
        HandleModel model;
        for (std::size_t place = 0; place < model.numPlaces; ++place) { model.Construct(place); }
        for (int step = 0; step < 14 && !HasFailure(); ++step) {
            const std::size_t place = below(model.numPlaces);
            const std::size_t event = below(round % 4 == 0 ? 13 : 12);
            if (event < 6) {
                model.Assign(place, below(model.numPlaces));
            } else if (event < 10) {
                model.Destroy(place);
            } else if (event < 12) {
                model.Construct(place);
            } else {
                model.UnloadRegistry();
            }
            model.Check();
        }
    }
}

}  // namespace OBR::MemPool
