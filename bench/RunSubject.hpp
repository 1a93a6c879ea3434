// What the benchmark programs share: the choice of a subject, and the state in which their rows
// find the heap.

#ifndef OBR_MEMPOOL_BENCH_RUNSUBJECT_HPP
#define OBR_MEMPOOL_BENCH_RUNSUBJECT_HPP

#include <algorithm>
#include <cstddef>
#include <cstdlib>
#include <iostream>
#include <string>
#include <vector>

#include <benchmark/benchmark.h>

// Makes the heap as long as that of a host with other data, and keeps a block at its end. Otherwise
// the C library returns the memory that a round has freed to the system and asks for it again in
// the next, and a row would measure that.
inline void LengthenHeap() {
    constexpr std::size_t size = 65536;
    std::vector<void*> blocks(3000);
    for (void*& block : blocks) { block = std::malloc(size); }
    static void* const end = std::malloc(size);
    benchmark::DoNotOptimize(end);
    std::for_each(blocks.begin(), blocks.end(), std::free);
}

// Runs the rows that `registerRows` adds for the subject that the first argument names. The other
// arguments are Google Benchmark's options. Returns the exit status.
template <typename RegisterRows>
int RunSubject(int argc, char** argv, const char* usage, RegisterRows registerRows) {
    const std::string option = "--subject=";
    const std::string first = argc > 1 ? argv[1] : "";
    if (first.compare(0, option.size(), option) != 0 ||
        !registerRows(first.substr(option.size()))) {
        std::cerr << "usage: " << usage << " [benchmark options]" << std::endl;
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

#endif
