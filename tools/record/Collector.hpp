// Drains the channel of a recorded program into a trace.

#ifndef OBR_TOOLS_RECORD_COLLECTOR_HPP
#define OBR_TOOLS_RECORD_COLLECTOR_HPP

#include <chrono>
#include <cstdint>
#include <set>
#include <string>
#include <unordered_map>
#include <vector>

#include "record/Channel.hpp"
#include "record/Symbols.hpp"
#include "trace/CompactWriter.hpp"

namespace Recorder {

class Collector {
public:
    // Collects the events of the library's pools, or of the heap.
    Collector(Channel& fromChannel, Trace::CompactWriter& toWriter, bool ofPools);

    // Writes the events in the channel, a few thousand at most, and returns whether there were any.
    // At the end of the program, slots that were taken but never filled are skipped.
    bool Drain(bool atEnd = false);

    std::uint64_t NumEvents() const { return numEvents; }

private:
    void WriteTime();
    void Write(std::uint64_t& index, std::uint64_t where, std::uint64_t what);
    void WritePoolEvent(std::uint64_t& index, std::uint64_t pool, std::uint64_t what);
    const Slot& NextData(std::uint64_t& index) const;
    std::uint64_t PoolOf(std::uint64_t group, std::uint64_t thread);
    std::uint64_t NumberOfPool(std::uint64_t group, std::uint64_t thread) const;
    void EndPools();
    void PassOver(Caller& caller);
    const std::string& NameOfCaller(std::uint64_t number);
    std::string NameOfPool(std::uint64_t group, std::uint64_t pool);

    Channel& channel;
    Trace::CompactWriter& writer;
    Symbols symbols;
    std::unordered_map<std::uint64_t, std::string> callerNames;
    const bool isOfPools;
    std::vector<bool> knownPools;   // Groups of the heap that have a pool.
    std::set<std::uint64_t> pools;  // These pools, or the live ones of the library.
    const std::chrono::steady_clock::time_point start = std::chrono::steady_clock::now();
    std::chrono::milliseconds nextTime{0};  // When to write the time next.
    std::uint64_t lastThread = 0;
    std::uint64_t numEvents = 0;
};

}  // namespace Recorder

#endif
