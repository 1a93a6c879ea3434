// Runs a program with the recorder preloaded, from its start to its end.

#ifndef OBR_TOOLS_RECORD_SESSION_HPP
#define OBR_TOOLS_RECORD_SESSION_HPP

#include <cstdint>
#include <string>
#include <vector>

#include "record/Channel.hpp"
#include "record/Command.hpp"

namespace Record {

struct Order {
    std::vector<std::string> command;  // The program and its arguments.
    std::string tracePath;
    By by = By::All;
    bool pools = false;  // The calls of Mgr in place of the heap's.
};

struct Outcome {
    int exitStatus = 0;
    int signal = 0;  // That the program died by, or 0.
    std::uint64_t numEvents = 0;
    std::uint64_t numThreads = 0;
    std::uint64_t traceSize = 0;
};

// Records the program. Signals sent to this process meanwhile go on to the program. A Refusal is
// thrown ahead of the program's start, or behind its end if the trace could not be written.
Outcome RecordProgram(const Order& order);

}  // namespace Record

#endif
