// The command line of `mempool`: mempool [OPTIONS] SUBCOMMAND [OPTIONS] ARGUMENTS. A subcommand
// that runs a program ends in PROGRAM [ARGS...], which is cut off before ours is read, so that no
// option of the program is taken for one of ours.

#ifndef OBR_TOOLS_MEMPOOL_COMMANDLINE_HPP
#define OBR_TOOLS_MEMPOOL_COMMANDLINE_HPP

#include <string>
#include <vector>

#include "mempool/Program.hpp"

namespace Tool {

// Reads `words`, the command line without the name of the tool, which leaves in Program::job what
// is to be done. Returns false if nothing is: help was printed, or an error reported, and `status`
// is the exit status.
bool ReadCommandLine(Program& program, std::vector<std::string> words, int& status);

// Declares that the subcommand runs a program, which its callback finds in Program::command.
void AddCommand(Program& program, CLI::App& subcommand);

// The whole number in the text. Any other text, or a number beyond the bounds, is an error of the
// command line, reported under `name`.
unsigned int ParseNumber(const std::string& name, const std::string& text, unsigned int smallest,
                         unsigned int largest);

// Adds an option that takes a number within these bounds, and has the value of `place` as default.
CLI::Option& AddNumber(CLI::App& subcommand, const std::string& name, unsigned int& place,
                       unsigned int smallest, unsigned int largest, const std::string& help);

}  // namespace Tool

#endif
