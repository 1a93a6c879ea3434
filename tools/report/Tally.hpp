// The figures of a set of blocks: all of them, those of one size, or those of one group.

#ifndef OBR_TOOLS_REPORT_TALLY_HPP
#define OBR_TOOLS_REPORT_TALLY_HPP

#include <array>
#include <cstddef>
#include <cstdint>

namespace Report {

struct BlockSum {
    std::uint64_t blocks = 0;
    std::uint64_t bytes = 0;  // Requested.

    void Add(std::uint32_t size) {
        ++blocks;
        bytes += size;
    }
    void Remove(std::uint32_t size) {
        --blocks;
        bytes -= size;
    }
    void Add(const BlockSum& other) {
        blocks += other.blocks;
        bytes += other.bytes;
    }
};

// Bins for lifetimes, in events from the allocation to the release: up to 10, up to 100, and so on;
// the last one has all longer lifetimes.
constexpr std::size_t numLifetimes = 10;
constexpr std::size_t LifetimeBin(std::uint64_t events) {
    std::size_t bin = 0;
    for (std::uint64_t bound = 10; events > bound && bin + 1 < numLifetimes; bound *= 10) { ++bin; }
    return bin;
}

struct Tally {
    BlockSum all;
    BlockSum inRecords;         // Those that go into buckets. The others are heap records.
    std::uint64_t padding = 0;  // Bytes that rounding adds to those.
    BlockSum live;
    std::array<std::uint64_t, numLifetimes> lifetimes = {};  // Of released blocks.
    std::uint64_t dropped = 0;    // Released blocks that a Clear of their pool dropped.
    std::uint64_t temporary = 0;  // Released blocks that the next event of their thread freed.
    BlockSum never;               // Alive when their pool was destroyed, or at the end.

    BlockSum atPeak;  // Alive at the peak of the trace. Set by Finish.

    // Called before each change of `live`, with the event of the change and that of the peak so
    // far. The first change after a peak keeps the blocks that were alive at it, so that a new peak
    // costs nothing.
    void Change(std::uint64_t event, std::uint64_t peak) {
        if (changed <= peak) { atPeak = live; }
        changed = event;
    }

    // Called at the end of the trace.
    void Finish(std::uint64_t peak) {
        if (changed <= peak) { atPeak = live; }
        never.Add(live);
    }

    void Add(const Tally& other);

private:
    std::uint64_t changed = 0;  // The event of the last change.
};

inline void Tally::Add(const Tally& other) {
    all.Add(other.all);
    inRecords.Add(other.inRecords);
    padding += other.padding;
    live.Add(other.live);
    for (std::size_t bin = 0; bin < numLifetimes; ++bin) { lifetimes[bin] += other.lifetimes[bin]; }
    dropped += other.dropped;
    temporary += other.temporary;
    never.Add(other.never);
    atPeak.Add(other.atPeak);
}

}  // namespace Report

#endif
