// Runs an unchanged program on malloc, on pools and on mimalloc, in turns, and compares.

#ifndef OBR_TOOLS_PRELOAD_TRIAL_HPP
#define OBR_TOOLS_PRELOAD_TRIAL_HPP

#include <functional>
#include <optional>
#include <string>
#include <vector>

#include <MemPoolSettings>
#include "advise/Figures.hpp"

namespace Preload {

struct Order {
    std::vector<std::string> command;  // The program and its arguments.
    std::string input;                 // The file for its standard input; empty for none.
    OBR::MemPool::PoolSettings settings;
    unsigned int rounds = 9;
    bool showsOnErrors = false;  // Shows all output of the program on standard error.
};

// A way to serve the program's blocks.
struct Side {
    std::string name;                // "malloc", "pools" or "mimalloc".
    std::string library;             // The preloaded library; empty for malloc.
    std::vector<double> cpuSeconds;  // User and system time, a value for each round.
    std::vector<double> wallSeconds;
    std::vector<double> peakBytes;   // Resident memory.
    std::vector<double> pageFaults;  // Without those that read from a disk.
    bool isSame = true;              // Output and exit status were the same as in the first run.
    int otherStatus = 0;             // Of the first run that differed, from waitpid.
};

struct Trial {
    std::vector<Side> sides;  // malloc is the first one.
    unsigned int rounds = 0;  // Complete rounds.
    int waitStatus = 0;       // Of the first run.
};

// Runs the program. The first run is not measured: its output is shown, and the other runs are
// compared with it. Calls `atRun` before each run. SIGINT or SIGTERM ends the program and the
// trial, which then has the complete rounds. Throws a std::exception if the program cannot be run
// or a library is not installed.
Trial TryProgram(const Order& order,
                 const std::function<void(unsigned int round, const std::string& side)>& atRun);

// The medians of a side, and their ratios to malloc.
struct Result {
    std::string name;
    Advise::Figures figures;  // The time is seconds of the processor.
    double wallSeconds;
    double pageFaults;
    double timeRatio;
    double bytesRatio;
    bool differs;  // It did not do what it does on malloc, so its figures mean nothing.
};

// The result of a trial.
struct Conclusion {
    std::vector<Result> results;     // Of each side.
    std::optional<bool> sameOutput;  // None if malloc's own runs differ.
    std::string verdict;             // "faster", "smaller", "both", "none" or "differs".
    std::vector<std::string> sentences;
};

// There must be a round.
Conclusion Conclude(const Trial& trial);

}  // namespace Preload

#endif
