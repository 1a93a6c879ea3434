// Call stacks, from the names of the pools in a trace that was recorded by stack: "main+0x1f
// (prog);f+0x2 (prog)", the innermost frame last.

#ifndef OBR_TOOLS_REPORT_STACK_HPP
#define OBR_TOOLS_REPORT_STACK_HPP

#include <string>
#include <vector>

#include "report/Tally.hpp"

namespace Report {

struct StackRow {
    std::vector<std::string> frames;  // The outermost first.
    BlockSum all;
    BlockSum atPeak;
};

std::vector<std::string> FramesOf(const std::string& name);

// The function of a frame without its arguments, "file+0x1230" if it has no name, or the frame
// itself if it is unknown.
std::string FunctionOf(const std::string& frame);

// Names and patterns of functions that only pass memory on, in addition to those known as such.
using Skipped = std::vector<std::string>;

// The index of the innermost frame that does more than pass memory on, or of the outermost.
std::size_t CallerIn(const std::vector<std::string>& frames, const Skipped& skipped);

// Further functions that pass memory on: each that serves 90 % of the blocks of its module to three
// functions or more, and all those of a module that together serve a third of its blocks if each
// allocates in one place, for four functions or more that ask for different sizes.
Skipped FindPassingOn(const std::vector<StackRow>& stacks, const Skipped& skipped);

}  // namespace Report

#endif
