// The search for settings as several subcommands run and print it.

#ifndef OBR_TOOLS_MEMPOOL_SWEEP_HPP
#define OBR_TOOLS_MEMPOOL_SWEEP_HPP

#include <cstdint>
#include <iostream>
#include <optional>

#include <CLI/CLI.hpp>

#include "advise/Figures.hpp"
#include "advise/Verdict.hpp"
#include "mempool/Progress.hpp"
#include "replay/Recording.hpp"

namespace Tool {

// A search, what it is based on, and what it found.
struct Advice {
    std::uint64_t numEvents = 0;   // Replayed ones,
    std::uint64_t numLeftOut = 0;  // and those behind them, which were too many.
    Advise::Findings findings;
    Advise::Verdict verdict;
    std::optional<double> allocationShare;  // Of the program's processor time, if the trace tells.
};

// Reads the trace, and searches for that many seconds. Shows progress, which it leaves empty. A
// trace without an allocation is a std::runtime_error.
enum class Pools : std::uint8_t { AsTraced, One };  // One for all groups of a heap.
Advice TakeAdvice(Trace::StepReader& reader, unsigned int seconds, const Progress& progress,
                  Pools pools = Pools::AsTraced);

// Adds --seconds.
void AddSeconds(CLI::App& subcommand, unsigned int& seconds);

// A line for the heap and a line a setting, the best first: all, or those that matter.
void PrintTable(std::ostream& out, const Advice& advice, bool all);

// Whether pools would help, what the program as a whole can win, and the lines to paste.
void PrintVerdict(std::ostream& out, const Advice& advice);

}  // namespace Tool

#endif
