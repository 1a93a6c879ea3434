// What the benchmark programs share: the choice of a subject, and the state of the heap that their
// rows begin with.

#ifndef OBR_MEMPOOL_BENCH_RUNSUBJECT_HPP
#define OBR_MEMPOOL_BENCH_RUNSUBJECT_HPP

#include <algorithm>
#include <cstddef>
#include <cstdlib>
#include <iostream>
#include <string>
#include <vector>

#include <benchmark/benchmark.h>

// Makes the heap as long as that of a host with other data, some of them at its end. Otherwise the
// C library hands the memory that a round has freed back to the system and asks for it again in the
// next, and that is what a row would measure.
inline void LengthenHeap() {
    constexpr std::size_t size = 65536;
    std::vector<void*> blocks(3000);
    for (void*& block : blocks) { block = std::malloc(size); }
    static void* const end = std::malloc(size);
    benchmark::DoNotOptimize(end);
    std::for_each(blocks.begin(), blocks.end(), std::free);
}

// Runs the rows of the subject that the first argument names and `registerRows` knows; the rest are
// Google Benchmark's own options. Returns the status to exit with.
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
