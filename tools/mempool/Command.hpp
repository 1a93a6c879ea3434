// The command line of a program that a subcommand runs: [OPTIONS] [--] PROGRAM [ARGS...]. It is cut
// off before ours is read, so that no option of the program is taken for one of ours.

#ifndef OBR_TOOLS_MEMPOOL_COMMAND_HPP
#define OBR_TOOLS_MEMPOOL_COMMAND_HPP

#include <string>
#include <vector>

#include "mempool/Program.hpp"

namespace Tool {

// The exit status for our own failures in place of 1, where 1 may be the program's.
constexpr int ownFailure = 125;

// Declares that the subcommand runs a program, which its callback finds in Program::command.
void AddCommand(Program& program, CLI::App& subcommand);

// If the words begin with a subcommand that runs a program, moves what belongs to that program from
// their end to Program::command, and returns true.
bool CutCommand(Program& program, std::vector<std::string>& words);

}  // namespace Tool

#endif
