// A script of every operation of both headers. Its k-th request of the heap is refused, for every k
// until none is: that one alone, or all from there on. A step that fails has changed nothing, each
// later one finds everything whole, and in the end nothing is left.

#include <MemPool>
#include <MemPoolHeap>

#include <list>
#include <map>
#include <new>
#include <optional>
#include <string>
#include <tuple>
#include <utility>
#include <vector>

#include "MemPool/MgrRegistry.hpp"
#include "Output.hpp"
#include "PoolFixture.hpp"

namespace OBR::MemPool {

namespace {

using Handles = std::vector<Mgr*>;

// What the script works on. What was refused is null or not built, and later steps pass it over.
struct World {
    std::optional<Mgr> pool, other, unnamed;
    std::optional<Heap> heap;
    BucketMgr* left = nullptr;  // The pool that a handle has left by an assignment.
    std::vector<void*> blocks, heapBlocks;
    Handles handles;
    OBR::vector<Mgr*> compact;

    World() {
        blocks.reserve(20);
        heapBlocks.reserve(20);
    }
};

void Alloc(World& world, unsigned int size) {
    if (world.pool) { world.blocks.push_back(world.pool->Alloc(size)); }
}

// The calls of C tell by null what those of C++ throw.
template <typename Request>
void Take(World& world, Request request) {
    if (!world.heap) { return; }
    void* const block = request(*world.heap);
    if (block == nullptr) { throw std::bad_alloc(); }
    world.heapBlocks.push_back(block);
}

void AssignHandle(World& world) {
    if (!world.other || !world.unnamed) { return; }
    BucketMgr* const pool = world.other->GetBucketMgr();
    *world.other = *world.unnamed;
    world.left = pool;
}

// Nobody else ends it.
void EndPoolLeft(World& world) {
    if (world.left == nullptr) { return; }
    registry.Erase(world.left->name);
    delete world.left;
    world.left = nullptr;
}

const std::string longName = "a name that no string holds in place";

// Requests may fail, and a report that does not is whole. All else asks the heap for nothing.
enum class Kind { request, report, rest };

const struct Step {
    const char* name;
    Kind kind;
    void (*run)(World& world);
} script[] = {
    {"Mgr", Kind::request, [](World& w) { w.pool.emplace(longName.c_str()); }},
    {"Mgr of no name", Kind::request, [](World& w) { w.unnamed.emplace(); }},
    {"another Mgr", Kind::request, [](World& w) { w.other.emplace("other"); }},
    {"Alloc of a new class", Kind::request, [](World& w) { Alloc(w, 12); }},
    {"Alloc of a record", Kind::request, [](World& w) { Alloc(w, 12); }},
    {"Alloc of 0 bytes", Kind::request, [](World& w) { Alloc(w, 0); }},
    {"Alloc of the last record", Kind::request, [](World& w) { Alloc(w, 12); }},
    {"Alloc of a new bucket", Kind::request, [](World& w) { Alloc(w, 12); }},
    {"Alloc of a heap record", Kind::request, [](World& w) { Alloc(w, 100); }},
    {"Alloc of another", Kind::request, [](World& w) { Alloc(w, 101); }},
    {"questions", Kind::rest,
     [](World& w) {
         if (!w.pool) { return; }
         for (void* const block : w.blocks) {
             EXPECT_EQ(w.pool->Contains(block), w.pool->IsEnabled());
             EXPECT_EQ(w.pool->GetSize(block) != 0, w.pool->IsEnabled());
         }
         EXPECT_EQ(w.pool->GetName(), longName);
         EXPECT_FALSE(w.pool->CollectGarbage());
         EXPECT_EQ(GetMgr("other"), w.other ? &*w.other : nullptr);
         EXPECT_EQ(GetNumMgrs(), registry.All().size());
     }},
    {"GetMgr", Kind::request,
     [](World& w) { EXPECT_EQ(GetMgr(longName.c_str()), w.pool ? &*w.pool : nullptr); }},
    {"GetMgrs", Kind::request, [](World& w) { GetMgrs(w.handles); }},
    {"compact GetMgrs", Kind::request, [](World& w) { GetMgrs(w.compact); }},
    {"push_back", Kind::request, [](World& w) { w.compact.push_back(nullptr); }},
    {"reserve", Kind::request, [](World& w) { w.compact.reserve(100); }},
    {"Heap", Kind::request, [](World& w) { w.heap.emplace(("heap, " + longName).c_str()); }},
    {"Malloc", Kind::request, [](World& w) { Take(w, [](Heap& heap) { return heap.Malloc(9); }); }},
    {"Calloc", Kind::request,
     [](World& w) { Take(w, [](Heap& heap) { return heap.Calloc(3, 50); }); }},
    {"Allocate", Kind::request,
     [](World& w) { Take(w, [](Heap& heap) { return heap.Allocate(1, 1); }); }},
    {"Allocate, aligned", Kind::request,
     [](World& w) { Take(w, [](Heap& heap) { return heap.Allocate(20, 64); }); }},
    {"Realloc of null", Kind::request,
     [](World& w) { Take(w, [](Heap& heap) { return heap.Realloc(nullptr, 5); }); }},
    {"Realloc", Kind::request,
     [](World& w) {
         if (w.heapBlocks.empty()) { return; }
         void* const block = w.heap->Realloc(w.heapBlocks.back(), 200);
         if (block == nullptr) { throw std::bad_alloc(); }
         w.heapBlocks.back() = block;
     }},
    {"a list", Kind::request,
     [](World& w) {
         if (w.heap) { const std::list<int, Allocator<int>> list({1, 2, 3, 4}, *w.heap); }
     }},
    {"a vector of strings", Kind::request,
     [](World& w) {
         if (!w.heap) { return; }
         Resource resource(*w.heap);
         std::pmr::vector<std::pmr::string> strings(&resource);
         for (int n = 0; n < 3; ++n) { strings.emplace_back(longName); }
     }},
    {"Dbg", Kind::report,
     [](World& w) {
         if (w.pool) { w.pool->Dbg(); }
     }},
    {"DbgDetailed of all", Kind::report, [](World&) { DbgDetailed(); }},
    {"questions of a Heap", Kind::rest,
     [](World& w) {
         if (!w.heap) { return; }
         for (void* const block : w.heapBlocks) { EXPECT_GE(w.heap->UsableSize(block), 1u); }
         const HeapStats stats = w.heap->GetStats();
         EXPECT_EQ(stats.usedRecords + stats.heapRecords, w.heapBlocks.size());
     }},
    {"=", Kind::request, AssignHandle},
    {"= of the same pool", Kind::rest,
     [](World& w) {
         if (w.left == nullptr) { return; }
         *w.unnamed = *w.other;
         EXPECT_EQ(registry.Sharers().size(), 1u);
     }},
    {"Free", Kind::rest,
     [](World& w) {
         for (; w.blocks.size() > 1; w.blocks.pop_back()) {
             EXPECT_TRUE(w.pool->Free(w.blocks.back()));
         }
     }},
    {"Alloc into a bucket left", Kind::request, [](World& w) { Alloc(w, 12); }},
    {"Clear", Kind::rest,
     [](World& w) {
         if (!w.pool) { return; }
         w.pool->Clear();
         for (void* const block : w.blocks) { EXPECT_EQ(w.pool->Free(block), Settings::off); }
     }},
    {"Free of a Heap's", Kind::rest,
     [](World& w) {
         if (w.heapBlocks.empty()) { return; }
         EXPECT_TRUE(w.heap->Free(w.heapBlocks.back()));
     }},
    {"FreeAll", Kind::rest,
     [](World& w) {
         if (w.heap) { w.heap->FreeAll(); }
     }},
    {"~Heap", Kind::rest, [](World& w) { w.heap.reset(); }},
    {"~Mgr of a shared pool", Kind::rest, [](World& w) { w.unnamed.reset(); }},
    {"~Mgr without a pool", Kind::rest, [](World& w) { w.other.reset(); }},
    {"~Mgr", Kind::rest, [](World& w) { w.pool.reset(); }},
    {"~BucketMgr", Kind::rest, EndPoolLeft},
};

// All that a step may have changed.
auto Look(const World& world) {
    std::map<std::string, std::tuple<Blocks, const Mgr*>> pools;
    for (const auto& [name, pool] : registry.All()) {
        pools[name] = {CheckInvariants(*pool), MgrRegistry::HandleOf(pool)};
    }
    return std::tuple(pools, world.handles, world.compact.size, world.compact.capacity,
                      registry.Sharers(), world.left,
                      world.heap ? world.heap->GetStats().bytesUsed : 0);
}

class HeapFailsTest : public PoolFixture, public testing::WithParamInterface<bool> {
protected:
    // Runs the script with the k-th request refused. True if there was one.
    static bool Run(std::size_t k, bool traces) {
        World world;
        Output output;
        std::size_t left = k + 1;  // As HeapSpy::refuseIn.
        for (const Step& step : script) {
            SCOPED_TRACE(testing::Message() << step.name << ", request " << k);
            if (step.kind == Kind::report && traces) { continue; }
            const auto before = Look(world);
            const auto run = [&] {
                Settings::trace = traces;
                step.run(world);
            };
            bool failed = false;
            HeapSpy::refuseIn = left;
            try {
                run();
            } catch (const std::bad_alloc&) { failed = true; }
            left = std::exchange(HeapSpy::refuseIn, 0);
            Settings::trace = false;

            std::string text = output.Take();
            if (step.kind == Kind::rest) { EXPECT_FALSE(failed); }
            if (failed) { EXPECT_TRUE(Look(world) == before); }
            if (step.kind != Kind::report) {
                EXPECT_TRUE(text.empty() || text.back() == '\n') << text;
                for (std::size_t at = 0; at < text.size(); at = text.find('\n', at) + 1) {
                    EXPECT_EQ(text.compare(at, 5, "xmpt:"), 0) << text;
                }
            } else if (!failed) {
                run();
                EXPECT_EQ(text, output.Take());
            } else {
                std::cout.clear();
                EXPECT_EQ(std::cout.exceptions(), std::ios::goodbit);
            }
            std::cout.copyfmt(std::ios(nullptr));
        }
        return left == 0;
    }
};

}  // namespace

TEST_P(HeapFailsTest, AFailedStepChangesNothing) {
    Use(50, 4, 40, 8);
    Settings::off = !GetParam();
    for (const bool traces : {false, true}) {
        bool refused = true;
        std::size_t k = 0;
        for (; refused && !HasFailure(); ++k) {
            HeapSpy::refusesForGood = true;
            Run(k, traces);
            HeapSpy::refusesForGood = false;
            refused = Run(k, traces);
            EXPECT_EQ(GetNumMgrs(), 0u);
        }
        EXPECT_GT(k, 50u) << "The script has asked for less than it says.";
    }
}

INSTANTIATE_TEST_SUITE_P(, HeapFailsTest, testing::Values(true, false),
                         [](const auto& param) { return param.param ? "On" : "Off"; });

}  // namespace OBR::MemPool
