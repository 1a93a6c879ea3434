// Measures the pool and other allocators at the same work. A process runs one subject:
//
//     PoolBench --subject=NAME [Google Benchmark's options]
//
// pool, pool-keep (which keeps empty buckets) and pool-64k (buckets of 65535 bytes) are bare Mgrs,
// layer is a Heap with its default settings. heap calls malloc and free or, with LD_PRELOAD, the
// allocator that replaces them, so that every malloc is measured through the same two calls into a
// shared library. boost, for blocks of one size, and pmr, the standard's pool for one thread, are
// headers.
//
// Each row is a function over a subject. Sizes, orders and traces are made before the clock starts.
// The first byte of every block is written. The time is that of one operation: an Alloc, a Free, an
// event of a trace, or a block that is built and dropped. The rows "live N" and "drop N" show how
// the cost grows with N.

#include <MemPoolHeap>

#include <malloc.h>

#include <algorithm>
#include <chrono>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <functional>
#include <iostream>
#include <list>
#include <map>
#include <memory>
#include <memory_resource>
#include <numeric>
#include <random>
#include <stdexcept>
#include <string>
#include <utility>
#include <vector>

#include <benchmark/benchmark.h>
#if __has_include(<boost/pool/pool.hpp>)
#include <boost/pool/pool.hpp>
#define HAS_BOOST
#endif

#include "trace/OpenTrace.hpp"
#include "trace/Resolver.hpp"

namespace {

using OBR::MemPool::HeapSettings;
using OBR::MemPool::Mgr;

using Blocks = std::vector<void*>;

// The subjects. Free gets the size, which some need. Containers use `memory`.

// Its blocks are aligned to 4 bytes only, which is enough on x86-64.
class MgrMemory : public std::pmr::memory_resource {
public:
    explicit MgrMemory(Mgr& ofMgr) : mgr(ofMgr) {}

private:
    void* do_allocate(std::size_t size, std::size_t) override {
        return mgr.Alloc(static_cast<unsigned>(size));
    }
    void do_deallocate(void* block, std::size_t, std::size_t) override { mgr.Free(block); }
    bool do_is_equal(const memory_resource& other) const noexcept override {
        return this == &other;
    }

    Mgr& mgr;
};

struct Pool {
    Mgr mgr;
    MgrMemory memory{mgr};
    void* Alloc(unsigned size) { return mgr.Alloc(size); }
    void Free(void* block, unsigned) { mgr.Free(block); }
    void DropAll(const Blocks&) { mgr.Clear(); }
    unsigned GetSize(void* block) { return mgr.GetSize(block); }
};

struct Layer {
    OBR::MemPool::Heap heap{nullptr, HeapSettings().On(true)};
    OBR::MemPool::Resource memory{heap};
    void* Alloc(unsigned size) { return heap.Allocate(size); }
    void Free(void* block, unsigned size) { heap.Deallocate(block, size); }
    void* Realloc(void* block, std::size_t size) { return heap.Realloc(block, size); }
    void DropAll(const Blocks&) { heap.FreeAll(); }
    std::size_t GetSize(void* block) { return heap.UsableSize(block); }
};

struct Heap {
    std::pmr::memory_resource& memory = *std::pmr::new_delete_resource();
    void* Alloc(unsigned size) { return std::malloc(size); }
    void Free(void* block, unsigned) { std::free(block); }
    void* Realloc(void* block, std::size_t size) { return std::realloc(block, size); }
    void DropAll(const Blocks& blocks) { std::for_each(blocks.begin(), blocks.end(), std::free); }
    std::size_t GetSize(void* block) { return malloc_usable_size(block); }
};

#ifdef HAS_BOOST
struct Boost {
    explicit Boost(unsigned size) : pool(size) {}
    boost::pool<> pool;
    void* Alloc(unsigned) { return pool.malloc(); }
    void Free(void* block, unsigned) { pool.free(block); }
};
#endif

struct Pmr {
    std::pmr::unsynchronized_pool_resource memory;
    void* Alloc(unsigned size) { return memory.allocate(size, 8); }
    void Free(void* block, unsigned size) { memory.deallocate(block, size, 8); }
    void DropAll(const Blocks&) { memory.release(); }
};

template <typename Subject>
std::unique_ptr<Subject> Make(unsigned) {
    return std::make_unique<Subject>();
}
#ifdef HAS_BOOST
template <>
std::unique_ptr<Boost> Make<Boost>(unsigned size) {
    return std::make_unique<Boost>(size);
}
#endif

template <typename Subject>
void* AllocAndTouch(Subject& subject, unsigned size) {
    void* const block = subject.Alloc(size);
    *static_cast<char*>(block) = 1;
    benchmark::ClobberMemory();
    return block;
}

// Random numbers that are the same in every process.

constexpr std::size_t numBuilt = 200000;

std::vector<unsigned> MixedSizes() {
    std::mt19937 random(1);
    std::vector<unsigned> sizes(1 << 18);
    for (unsigned& size : sizes) { size = std::uniform_int_distribution<unsigned>(8, 508)(random); }
    return sizes;
}

std::vector<std::uint32_t> RandomOrder() {
    std::vector<std::uint32_t> order(numBuilt);
    std::iota(order.begin(), order.end(), 0U);
    std::shuffle(order.begin(), order.end(), std::mt19937(2));
    return order;
}

void SetOperations(benchmark::State& state, std::size_t perIteration) {
    state.SetItemsProcessed(state.iterations() * static_cast<std::int64_t>(perIteration));
}

// The rows.

template <typename Subject>
void Pair(benchmark::State& state, unsigned size, bool anotherLives) {
    const auto subject = Make<Subject>(size);
    void* const other = anotherLives ? subject->Alloc(size) : nullptr;
    for (auto _ : state) { subject->Free(AllocAndTouch(*subject, size), size); }
    if (anotherLives) { subject->Free(other, size); }
    SetOperations(state, 2);
}

enum class Order { Same, Reverse, Random };

template <typename Subject>
void AllThenFree(benchmark::State& state, Order order) {
    constexpr unsigned size = 32;
    const auto subject = Make<Subject>(size);
    std::vector<std::uint32_t> places = RandomOrder();
    if (order != Order::Random) { std::sort(places.begin(), places.end()); }
    if (order == Order::Reverse) { std::reverse(places.begin(), places.end()); }
    Blocks blocks(numBuilt);
    for (auto _ : state) {
        for (void*& block : blocks) { block = AllocAndTouch(*subject, size); }
        for (const std::uint32_t place : places) { subject->Free(blocks[place], size); }
    }
    SetOperations(state, 2 * numBuilt);
}

struct Sized {
    void* block;
    unsigned size;
};

template <typename Subject>
void Churn(benchmark::State& state, std::size_t live, const std::vector<unsigned>& sizes) {
    const auto subject = Make<Subject>(sizes.front());
    std::mt19937 random(3);
    std::vector<std::uint32_t> places(1 << 20);
    for (std::uint32_t& place : places) { place = static_cast<std::uint32_t>(random() % live); }
    std::vector<Sized> blocks(live);
    std::size_t turn = 0;
    const auto renew = [&](Sized& sized) {
        sized.size = sizes[turn++ % sizes.size()];
        sized.block = AllocAndTouch(*subject, sized.size);
    };
    for (Sized& sized : blocks) { renew(sized); }
    for (auto _ : state) {
        Sized& sized = blocks[places[turn % places.size()]];
        subject->Free(sized.block, sized.size);
        renew(sized);
    }
    for (const Sized& sized : blocks) { subject->Free(sized.block, sized.size); }
    SetOperations(state, 2);
}

template <typename Subject>
void BuildAndDrop(benchmark::State& state) {
    const auto subject = Make<Subject>(0);
    const std::vector<unsigned> sizes = MixedSizes();
    Blocks blocks(numBuilt);
    for (auto _ : state) {
        for (std::size_t i = 0; i < numBuilt; ++i) {
            blocks[i] = AllocAndTouch(*subject, sizes[i]);
        }
        subject->DropAll(blocks);
    }
    SetOperations(state, numBuilt);
}

// The blocks that the events of a trace allocate and free, in their order.
std::vector<Trace::Step> ReadTrace(const std::string& name) {
    const auto source = Trace::OpenTrace(std::string(TRACES) + "/" + name + ".xmpt.gz");
    std::vector<Trace::Step> steps;
    Trace::Resolver resolver;
    Trace::Event event;
    Trace::Step step = {};
    while (source->Next(event)) {
        if (resolver.Resolve(event, step)) { throw std::runtime_error(name + ": a bad line"); }
        const bool ofBlock = step.kind == Trace::Kind::Allocated || step.kind == Trace::Kind::Freed;
        if (ofBlock) { steps.push_back(step); }
    }
    return steps;
}

template <typename Subject>
void Replay(benchmark::State& state, const std::string& name) {
    const auto subject = Make<Subject>(0);
    const std::vector<Trace::Step> steps = ReadTrace(name);
    std::vector<Sized> blocks(steps.size());
    for (auto _ : state) {
        for (const Trace::Step& step : steps) {
            Sized& sized = blocks[step.block.index];
            if (step.kind == Trace::Kind::Allocated) {
                sized = {AllocAndTouch(*subject, step.block.size), step.block.size};
            } else {
                subject->Free(std::exchange(sized.block, nullptr), sized.size);
            }
        }
        state.PauseTiming();
        for (Sized& sized : blocks) {
            if (sized.block != nullptr) {
                subject->Free(std::exchange(sized.block, nullptr), sized.size);
            }
        }
        state.ResumeTiming();
    }
    SetOperations(state, steps.size());
}

template <typename Subject>
void AskSizes(benchmark::State& state, std::size_t number) {
    const auto subject = Make<Subject>(32);
    Blocks blocks(number);
    for (void*& block : blocks) { block = AllocAndTouch(*subject, 32); }
    std::shuffle(blocks.begin(), blocks.end(), std::mt19937(4));
    for (auto _ : state) {
        for (void* const block : blocks) { benchmark::DoNotOptimize(subject->GetSize(block)); }
    }
    for (void* const block : blocks) { subject->Free(block, 32); }
    SetOperations(state, number);
}

// A text that is read piece by piece.
template <typename Subject>
void Grow(benchmark::State& state, std::size_t step) {
    constexpr std::size_t end = 1 << 20;
    Subject subject;
    for (auto _ : state) {
        char* text = nullptr;
        for (std::size_t size = step; size <= end; size += step) {
            text = static_cast<char*>(subject.Realloc(text, size));
            std::memset(text + size - step, 1, step);
        }
        subject.Free(text, end);
    }
    SetOperations(state, end / step);
}

void AskContains(benchmark::State& state) {
    Pool pool;
    void* const block = pool.Alloc(32);
    for (auto _ : state) { benchmark::DoNotOptimize(pool.mgr.Contains(block)); }
    SetOperations(state, 1);
}

// Makes the pools, finds each by its name, and destroys them.
void ManyPools(benchmark::State& state) {
    std::vector<std::string> names(100000);
    for (std::size_t i = 0; i < names.size(); ++i) { names[i] = "pool " + std::to_string(i); }
    std::vector<std::unique_ptr<OBR::MemPool::Mgr>> mgrs(names.size());
    for (auto _ : state) {
        for (std::size_t i = 0; i < names.size(); ++i) {
            mgrs[i] = std::make_unique<OBR::MemPool::Mgr>(names[i].c_str());
        }
        for (const std::string& name : names) {
            benchmark::DoNotOptimize(OBR::MemPool::GetMgr(name.c_str()));
        }
        for (auto& mgr : mgrs) { mgr.reset(); }
    }
    SetOperations(state, names.size());
}

// A tree as a compiler builds it, and drops it whole.
struct TreeNode {
    TreeNode* left;
    TreeNode* right;
    double value;
    std::uint64_t line;
};

template <typename Subject>
TreeNode* BuildTree(Subject& subject, int depth) {
    auto* const node = ::new (subject.Alloc(sizeof(TreeNode))) TreeNode{};
    node->value = depth;
    if (depth > 0) {
        node->left = BuildTree(subject, depth - 1);
        node->right = BuildTree(subject, depth - 1);
    }
    return node;
}

// Without a pool a host drops a tree node by node.
template <typename Subject>
void DropTree(Subject& subject, TreeNode*) {
    subject.DropAll({});
}
void DropTree(Heap& subject, TreeNode* node) {
    if (node == nullptr) { return; }
    DropTree(subject, node->left);
    DropTree(subject, node->right);
    subject.Free(node, sizeof(TreeNode));
}

template <typename Subject>
void Tree(benchmark::State& state) {
    constexpr int depth = 17;
    Subject subject;
    for (auto _ : state) { DropTree(subject, BuildTree(subject, depth)); }
    SetOperations(state, (std::size_t{2} << depth) - 1);
}

template <typename Subject>
void List(benchmark::State& state) {
    constexpr int number = 100000;
    Subject subject;
    for (auto _ : state) {
        std::pmr::list<int> list(&subject.memory);
        for (int i = 0; i < number; ++i) { list.push_back(i); }
        benchmark::DoNotOptimize(list.front());
    }
    SetOperations(state, number);
}

template <typename Subject>
void Map(benchmark::State& state) {
    constexpr std::uint32_t range = 20000;
    Subject subject;
    std::pmr::map<std::uint32_t, int> map(&subject.memory);
    std::mt19937 random(1);
    std::vector<std::uint32_t> keys(1 << 20);
    for (std::uint32_t& key : keys) { key = static_cast<std::uint32_t>(random() % range); }
    std::size_t turn = 0;
    for (auto _ : state) {
        const std::uint32_t key = keys[turn++ % keys.size()];
        if (map.erase(key) == 0) { map.emplace(key, 1); }
    }
    SetOperations(state, 1);
}

template <typename Subject>
void Drop(benchmark::State& state, std::size_t number) {
    Subject subject;
    std::vector<void*> blocks(number);
    for (auto _ : state) {
        for (void*& block : blocks) {
            block = subject.Alloc(32);
            *static_cast<char*>(block) = 1;
        }
        const auto begin = std::chrono::steady_clock::now();
        subject.DropAll(blocks);
        const std::chrono::duration<double> time = std::chrono::steady_clock::now() - begin;
        state.SetIterationTime(time.count());
    }
    SetOperations(state, number);
}

// The rows, in the order of the tables.

using Row = std::function<void(benchmark::State&)>;

void Register(const std::string& name, const Row& row, std::int64_t iterations = 0) {
    auto* const bench = benchmark::RegisterBenchmark(name.c_str(), row);
    if (iterations != 0) { bench->Iterations(iterations); }
}

template <typename Subject>
void RegisterOneSizeRows() {
    Register("pair, another block live", [](auto& s) { Pair<Subject>(s, 32, true); });
    Register("200k x 32, free in order", [](auto& s) { AllThenFree<Subject>(s, Order::Same); });
    Register("200k x 32, free in reverse",
             [](auto& s) { AllThenFree<Subject>(s, Order::Reverse); });
    Register("200k x 32, free in random order",
             [](auto& s) { AllThenFree<Subject>(s, Order::Random); });
    Register("churn 16 bytes, 1k live", [](auto& s) { Churn<Subject>(s, 1000, {16}); });
    Register(
        "churn 16 bytes, 10M live", [](auto& s) { Churn<Subject>(s, 10000000, {16}); }, 1000000);
    Register("pair, no other block", [](auto& s) { Pair<Subject>(s, 32, false); });
}

template <typename Subject>
void RegisterMixedRows() {
    Register("churn mixed, 1k live", [](auto& s) { Churn<Subject>(s, 1000, MixedSizes()); });
    Register(
        "churn mixed, 20k live", [](auto& s) { Churn<Subject>(s, 20000, MixedSizes()); }, 1000000);
    Register(
        "churn mixed, 200k live", [](auto& s) { Churn<Subject>(s, 200000, MixedSizes()); },
        1000000);
    Register("build 200k mixed, drop all", [](auto& s) { BuildAndDrop<Subject>(s); });
    Register("trace lua", [](auto& s) { Replay<Subject>(s, "lua"); });
    Register("trace jq", [](auto& s) { Replay<Subject>(s, "jq"); });
    Register("trace sqlite", [](auto& s) { Replay<Subject>(s, "sqlite"); });
    Register("pair of 2000 bytes", [](auto& s) { Pair<Subject>(s, 2000, true); });
    Register("churn mixed, 1k live, alignment 3", [](auto& s) {
        const unsigned alignment = OBR::MemPool::NUV_OBR_MEMPOOL_DATA_ALIGNMENT();
        OBR::MemPool::NUV_OBR_MEMPOOL_DATA_ALIGNMENT(3);
        Churn<Subject>(s, 1000, MixedSizes());
        OBR::MemPool::NUV_OBR_MEMPOOL_DATA_ALIGNMENT(alignment);
    });
}

template <typename Subject>
void RegisterSizeRows() {
    Register("size of one block", [](auto& s) { AskSizes<Subject>(s, 1); });
    Register("size of each of 200k, random order", [](auto& s) { AskSizes<Subject>(s, numBuilt); });
}

template <typename Subject>
void RegisterGrowthRows() {
    for (const std::size_t step : {16U, 64U, 1000U}) {
        Register("grow to 1 MB in steps of " + std::to_string(step),
                 [=](auto& s) { Grow<Subject>(s, step); });
    }
}

template <typename Subject>
void RegisterContainerRows() {
    Register("tree of 262k nodes, dropped whole", Tree<Subject>);
    Register("list of 100k, built and cleared", List<Subject>);
    Register("map, 10k live, insert or erase", Map<Subject>);
    for (std::size_t number : {1000U, 10000U, 100000U, 1000000U, 10000000U}) {
        const std::string name = std::to_string(number);
        Register(
            "live " + name, [=](auto& s) { Churn<Subject>(s, number, {32}); }, 1000000);
        benchmark::RegisterBenchmark(("drop " + name).c_str(),
                                     [=](auto& s) { Drop<Subject>(s, number); })
            ->UseManualTime()
            ->Iterations(number < 1000000 ? 20 : 2);
    }
}

bool RegisterRows(const std::string& subject) {
    if (subject == "pool" || subject == "pool-keep" || subject == "pool-64k") {
        OBR::MemPool::NUV_OBR_MEMPOOL_ON(true);
        OBR::MemPool::NUV_OBR_MEMPOOL_KEEP_EMPTY_BUCKETS(subject == "pool-keep");
        if (subject == "pool-64k") { OBR::MemPool::NUV_OBR_MEMPOOL_BUCKET_SIZE(65535); }
        RegisterOneSizeRows<Pool>();
        RegisterMixedRows<Pool>();
        RegisterSizeRows<Pool>();
        Register("Contains", AskContains);
        Register("100k pools: make, find, destroy", ManyPools);
        if (subject == "pool-64k") { RegisterContainerRows<Pool>(); }
    } else if (subject == "layer") {
        RegisterOneSizeRows<Layer>();
        RegisterMixedRows<Layer>();
        RegisterSizeRows<Layer>();
        RegisterContainerRows<Layer>();
        RegisterGrowthRows<Layer>();
    } else if (subject == "heap") {
        RegisterOneSizeRows<Heap>();
        RegisterMixedRows<Heap>();
        RegisterSizeRows<Heap>();
        RegisterContainerRows<Heap>();
        RegisterGrowthRows<Heap>();
#ifdef HAS_BOOST
    } else if (subject == "boost") {
        RegisterOneSizeRows<Boost>();
#endif
    } else if (subject == "pmr") {
        RegisterOneSizeRows<Pmr>();
        RegisterMixedRows<Pmr>();
        RegisterContainerRows<Pmr>();
    } else {
        return false;
    }
    return true;
}

// Makes the heap as long as that of a host with other data, and keeps a block at its end. Otherwise
// the C library returns the memory that a round has freed to the system and asks for it again in
// the next, and a row would measure that.
void LengthenHeap() {
    constexpr std::size_t size = 65536;
    std::vector<void*> blocks(3000);
    for (void*& block : blocks) { block = std::malloc(size); }
    static void* const end = std::malloc(size);
    benchmark::DoNotOptimize(end);
    std::for_each(blocks.begin(), blocks.end(), std::free);
}

}  // namespace

int main(int argc, char** argv) {
    const std::string option = "--subject=";
    const std::string first = argc > 1 ? argv[1] : "";
    if (first.compare(0, option.size(), option) != 0 ||
        !RegisterRows(first.substr(option.size()))) {
        std::cerr << "usage: PoolBench --subject=pool|pool-keep|pool-64k|layer|heap|boost|pmr"
                     " [benchmark options]\n";
        return 2;
    }
    argv[1] = argv[0];
    --argc;
    ++argv;
    benchmark::Initialize(&argc, argv);
    if (benchmark::ReportUnrecognizedArguments(argc, argv)) { return 2; }
    LengthenHeap();
    benchmark::RunSpecifiedBenchmarks();
    return 0;
}
