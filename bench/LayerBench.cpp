// What hosts build on the pools, compared with the same on other allocators. A process runs one
// subject:
//
//     LayerBench --subject=layer|raw|heap|pmr [Google Benchmark's options]
//
// layer is a Heap (MemPoolHeap), raw a bare Mgr, heap is new and delete or, with LD_PRELOAD, the
// allocator that replaces them, and pmr is std::pmr's pool for one thread. Containers use each of
// them through a memory resource, single blocks through the subject's own calls.
//
// The rows "live N" and "drop N" show how cost grows with work: the time per operation while N
// blocks are live, and the time per block to drop all of them at once.

#include <MemPoolHeap>

#include <chrono>
#include <cstdint>
#include <iostream>
#include <list>
#include <map>
#include <memory>
#include <memory_resource>
#include <new>
#include <random>
#include <string>
#include <vector>

#include <benchmark/benchmark.h>

#include "RunSubject.hpp"

namespace {

using OBR::MemPool::HeapSettings;
using OBR::MemPool::Mgr;

// The subjects: `Memory` for containers, Alloc, Free and DropAll for blocks.

struct Layer {
    OBR::MemPool::Heap heap{"layer", HeapSettings().On(true).BucketSize(65535)};
    OBR::MemPool::Resource memory{heap};
    void* Alloc(std::size_t size) { return heap.Allocate(size); }
    void Free(void* block, std::size_t size) { heap.Deallocate(block, size); }
    void DropAll(const std::vector<void*>&) { heap.FreeAll(); }
};

// Its blocks are aligned to 4 bytes only, which is enough on x86-64.
class RawMemory : public std::pmr::memory_resource {
public:
    explicit RawMemory(Mgr& ofMgr) : mgr(ofMgr) {}

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

struct Raw {
    Mgr mgr{"raw"};
    RawMemory memory{mgr};
    void* Alloc(std::size_t size) { return mgr.Alloc(static_cast<unsigned>(size)); }
    void Free(void* block, std::size_t) { mgr.Free(block); }
    void DropAll(const std::vector<void*>&) { mgr.Clear(); }
};

struct Plain {
    std::pmr::memory_resource& memory = *std::pmr::new_delete_resource();
    static void* Alloc(std::size_t size) { return ::operator new(size); }
    static void Free(void* block, std::size_t) { ::operator delete(block); }
    static void DropAll(const std::vector<void*>& blocks) {
        for (void* const block : blocks) { ::operator delete(block); }
    }
};

struct Pmr {
    std::pmr::unsynchronized_pool_resource memory;
    void* Alloc(std::size_t size) { return memory.allocate(size, 8); }
    void Free(void* block, std::size_t size) { memory.deallocate(block, size, 8); }
    void DropAll(const std::vector<void*>&) { memory.release(); }
};

void SetOperations(benchmark::State& state, std::size_t perIteration) {
    state.SetItemsProcessed(state.iterations() * static_cast<std::int64_t>(perIteration));
}

template <typename Subject>
void Pair(benchmark::State& state) {
    Subject subject;
    void* const other = subject.Alloc(32);
    for (auto _ : state) {
        void* const block = subject.Alloc(32);
        benchmark::DoNotOptimize(block);
        subject.Free(block, 32);
    }
    subject.Free(other, 32);
    SetOperations(state, 2);
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
void DropTree(Plain& subject, TreeNode* node) {
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
void Live(benchmark::State& state, std::size_t live) {
    constexpr std::size_t size = 32;
    Subject subject;
    std::mt19937 random(3);
    std::vector<std::uint32_t> places(1 << 20);
    for (std::uint32_t& place : places) { place = static_cast<std::uint32_t>(random() % live); }
    std::vector<void*> blocks(live);
    const auto renew = [&](void*& block) {
        block = subject.Alloc(size);
        *static_cast<char*>(block) = 1;
        benchmark::ClobberMemory();
    };
    for (void*& block : blocks) { renew(block); }
    std::size_t turn = 0;
    for (auto _ : state) {
        void*& block = blocks[places[turn++ % places.size()]];
        subject.Free(block, size);
        renew(block);
    }
    subject.DropAll(blocks);
    SetOperations(state, 2);
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

template <typename Subject>
void RegisterRows() {
    benchmark::RegisterBenchmark("pair of 32 bytes", Pair<Subject>);
    benchmark::RegisterBenchmark("tree of 262k nodes, dropped whole", Tree<Subject>);
    benchmark::RegisterBenchmark("list of 100k, built and cleared", List<Subject>);
    benchmark::RegisterBenchmark("map, 10k live, insert or erase", Map<Subject>);
    for (std::size_t number : {1000U, 10000U, 100000U, 1000000U, 10000000U, 30000000U}) {
        const std::string suffix = " " + std::to_string(number);
        benchmark::RegisterBenchmark(("live" + suffix).c_str(), [number](auto& state) {
            Live<Subject>(state, number);
        })->Iterations(1000000);
        benchmark::RegisterBenchmark(("drop" + suffix).c_str(),
                                     [number](auto& state) { Drop<Subject>(state, number); })
            ->UseManualTime()
            ->Iterations(number < 1000000 ? 20 : 2);
    }
}

bool Register(const std::string& subject) {
    OBR::MemPool::NUV_OBR_MEMPOOL_ON(true);
    OBR::MemPool::NUV_OBR_MEMPOOL_BUCKET_SIZE(65535);
    if (subject == "layer") {
        RegisterRows<Layer>();
    } else if (subject == "raw") {
        RegisterRows<Raw>();
    } else if (subject == "heap") {
        RegisterRows<Plain>();
    } else if (subject == "pmr") {
        RegisterRows<Pmr>();
    } else {
        return false;
    }
    return true;
}

}  // namespace

int main(int argc, char** argv) {
    return RunSubject(argc, argv, "LayerBench --subject=layer|raw|heap|pmr", Register);
}
