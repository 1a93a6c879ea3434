// Finds the blocks of a group that die together. A *run* is a series of releases without an
// allocation of that group in between. The blocks of a run of two or more die together. If the run
// leaves no block of the group alive, one Clear of a pool for the group would replace it.

#ifndef OBR_TOOLS_REPORT_RUNS_HPP
#define OBR_TOOLS_REPORT_RUNS_HPP

#include <algorithm>
#include <array>
#include <cstddef>
#include <cstdint>

namespace Report {

// Bins for runs of 2 to 9 blocks, of 10 to 99, and so on; the last one has all longer runs.
constexpr std::size_t numLengths = 7;
constexpr std::size_t LengthBin(std::uint64_t numBlocks) {
    std::size_t bin = 0;
    for (std::uint64_t bound = 10; numBlocks >= bound && bin + 1 < numLengths; bound *= 10) {
        ++bin;
    }
    return bin;
}

class Runs {
public:
    void Release() { ++current; }

    // Called at the next allocation and at the end, with the number of live blocks of the group.
    // Returns the number of blocks that one Clear would drop in place of the run, or 0.
    std::uint64_t End(std::uint64_t numLive) {
        const std::uint64_t cleared = current >= 2 && numLive == 0 ? current : 0;
        if (current >= 2) {
            ++numRuns;
            together += current;
            byLength[LengthBin(current)] += current;
            longest = std::max(longest, current);
        }
        if (cleared != 0) { ++numClears; }
        clearable += cleared;
        current = 0;
        return cleared;
    }

    // Adds the runs of another group, all of which have ended.
    void Add(const Runs& other) {
        numRuns += other.numRuns;
        together += other.together;
        for (std::size_t bin = 0; bin < numLengths; ++bin) { byLength[bin] += other.byLength[bin]; }
        longest = std::max(longest, other.longest);
        numClears += other.numClears;
        clearable += other.clearable;
    }

    std::uint64_t numRuns = 0;                            // With two blocks or more.
    std::uint64_t together = 0;                           // Their blocks.
    std::uint64_t longest = 0;                            // Blocks of the longest.
    std::array<std::uint64_t, numLengths> byLength = {};  // Blocks by the length of their run.
    std::uint64_t numClears = 0;                          // Those that leave no block alive.
    std::uint64_t clearable = 0;                          // Their blocks.

private:
    std::uint64_t current = 0;  // Blocks of the run that has not ended.
};

}  // namespace Report

#endif
