// Runs a program with the recorder preloaded, from its start to its end.

#ifndef OBR_TOOLS_RECORD_SESSION_HPP
#define OBR_TOOLS_RECORD_SESSION_HPP

#include <cstdint>
#include <string>

#include "record/Order.hpp"

namespace Recorder {

struct Outcome {
    int waitStatus = 0;  // How the program ended, from waitpid.
    std::uint64_t numEvents = 0;
    std::uint64_t numThreads = 0;
    std::uint64_t traceSize = 0;
    std::uint64_t numChildren = 0;      // Child processes that are recorded.
    std::uint64_t numLostChildren = 0;  // Those of the program that are not,
    std::string lostNames;              // some of the programs that they executed,
    double lostSeconds = 0;             // and the processor time of all descendants.
    bool isCutByExec = false;           // The program was replaced by one that cannot be recorded.
    bool isAddressSanitized = false;    // The program is built with AddressSanitizer.
};

// Records the program. Signals sent to this process are forwarded to the program. Throws a
// System::Failure before the program starts, or after its end if a trace could not be written. No
// existing file is replaced, except that of the program's trace.
Outcome RecordProgram(const Order& order);

}  // namespace Recorder

#endif
