// What is to be recorded, and how.

#ifndef OBR_TOOLS_RECORD_ORDER_HPP
#define OBR_TOOLS_RECORD_ORDER_HPP

#include <string>
#include <vector>

#include "record/Channel.hpp"

namespace Recorder {

struct Order {
    std::vector<std::string> command;  // The program and its arguments.
    std::string tracePath;             // "-" is the standard output.
    By by = By::All;
    unsigned int depth = 32;           // The most frames of a stack.
    std::vector<std::string> skipped;  // Patterns of functions that are not callers.
    bool pools = false;                // Records the calls of Mgr instead of the heap's.
    bool children = false;             // Records each child in a file "tracePath.PID".
};

}  // namespace Recorder

#endif
