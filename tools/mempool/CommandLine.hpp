// The command line of `mempool`: mempool [OPTIONS] SUBCOMMAND [OPTIONS] ARGUMENTS. A subcommand
// that runs a program ends in PROGRAM [ARGS...]. That part is cut off before the rest is parsed, so
// that an option of the program is never taken for one of mempool.

#ifndef OBR_TOOLS_MEMPOOL_COMMANDLINE_HPP
#define OBR_TOOLS_MEMPOOL_COMMANDLINE_HPP

#include <string>
#include <vector>

#include "mempool/Program.hpp"

namespace Tool {

// Reads `words`, the command line without the name of the tool, and sets Program::job. Returns
// false if there is nothing to do, because help was printed or an error reported; `status` is then
// the exit status.
bool ReadCommandLine(Program& program, std::vector<std::string> words, int& status);

// Declares that the subcommand runs a program, which its callback finds in Program::command.
void AddCommand(Program& program, CLI::App& subcommand);

// The whole number in the text. Any other text, or a number outside the bounds, is an error of the
// command line, reported under `name`.
unsigned int ParseNumber(const std::string& name, const std::string& text, unsigned int smallest,
                         unsigned int largest);

// Adds an option for a number within these bounds. Its default is the value of `place`.
CLI::Option& AddNumber(CLI::App& subcommand, const std::string& name, unsigned int& place,
                       unsigned int smallest, unsigned int largest, const std::string& help);

}  // namespace Tool

#endif
