// Indexes the words of the standard input in std::pmr containers, and prints those that are on most
// lines. The containers are in a heap, which is dropped as a whole; --close destroys them first.
// With --heap they use std::pmr's resource over new and delete. With --pmr they are in its
// unsynchronized pool, which is also dropped as a whole.

#include <MemPoolHeap>

#include <algorithm>
#include <cstdint>
#include <cstdio>
#include <iostream>
#include <memory_resource>
#include <set>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "CommandLine.hpp"

namespace {

using OBR::MemPool::Heap;
using OBR::MemPool::HeapSettings;
using Lines = std::pmr::set<std::uint32_t>;
using Index = std::pmr::unordered_map<std::pmr::string, Lines>;

void Fill(Index& index) {
    std::string line;
    for (std::uint32_t number = 1; std::getline(std::cin, line); ++number) {
        for (std::string_view rest(line); !rest.empty();) {
            const std::size_t end = std::min(rest.find(' '), rest.size());
            Lines& lines = index[std::pmr::string(rest.substr(0, end), index.get_allocator())];
            lines.emplace_hint(lines.end(), number);
            rest.remove_prefix(std::min(end + 1, rest.size()));
        }
    }
}

void Print(const Index& index) {
    std::vector<const Index::value_type*> words;
    for (const auto& word : index) { words.push_back(&word); }
    std::sort(words.begin(), words.end(), [](const auto* a, const auto* b) {
        return a->second.size() != b->second.size() ? a->second.size() > b->second.size()
                                                    : a->first < b->first;
    });
    std::printf("%zu words\n", words.size());
    for (std::size_t i = 0; i < std::min<std::size_t>(words.size(), 10); ++i) {
        std::printf("%s %zu %u\n", words[i]->first.c_str(), words[i]->second.size(),
                    *words[i]->second.rbegin());
    }
}

void Run(std::pmr::memory_resource& memory, bool destroy) {
    std::pmr::polymorphic_allocator<Index> allocator(&memory);
    Index* const index = ::new (allocator.allocate(1)) Index(allocator);
    Fill(*index);
    Print(*index);
    if (destroy) {
        index->~Index();
        allocator.deallocate(index, 1);
    }
}

}  // namespace

int main(int argc, char** argv) {
    bool useNew = false;
    bool usePmr = false;
    bool off = false;
    bool close = false;
    CommandLine line("IndexHost", "Indexes the words of the standard input in a memory pool.");
    line.Flag("--heap", useNew, "Use new and delete instead of pools");
    line.Flag("--pmr", usePmr, "Use std::pmr::unsynchronized_pool_resource instead of pools");
    line.Flag("--off", off, "Disable pools");
    line.Flag("--close", close, "Destroy the index before the heap");
    int status = 0;
    if (!line.Read(argc, argv, status)) { return status; }

    std::ios::sync_with_stdio(false);
    if (useNew) {
        Run(*std::pmr::new_delete_resource(), true);
    } else if (usePmr) {
        std::pmr::unsynchronized_pool_resource pool;
        Run(pool, close);
        pool.release();
    } else {
        Heap heap("index", HeapSettings().On(!off));
        OBR::MemPool::Resource resource(heap);
        Run(resource, close);
        heap.FreeAll();
    }
    return 0;
}
