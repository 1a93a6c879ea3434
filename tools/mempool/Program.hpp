// The program `mempool`. Each subcommand adds itself to the command line and, if it is chosen, sets
// the job to do.

#ifndef OBR_TOOLS_MEMPOOL_PROGRAM_HPP
#define OBR_TOOLS_MEMPOOL_PROGRAM_HPP

#include <cstdlib>
#include <functional>
#include <memory>
#include <string>
#include <vector>

namespace CLI {
class App;
}

namespace Tool {

struct Program {
    Program();
    Program(const Program&) = delete;
    Program& operator=(const Program&) = delete;
    ~Program();

    const std::unique_ptr<CLI::App> commandLine;
    std::function<int()> job;              // Of the chosen subcommand; returns the exit status.
    int failure = EXIT_FAILURE;            // The exit status of a failure of the subcommand itself.
    std::vector<const CLI::App*> runners;  // The subcommands that run a program.
    std::vector<std::string> command;      // That program and its arguments.
};

// Each is in the file of its subcommand; main.cpp calls them in the order of the help.
void AddRun(Program& program);
void AddTry(Program& program);
void AddRecord(Program& program);
void AddReplay(Program& program);
void AddReport(Program& program);
void AddAdvise(Program& program);
void AddText(Program& program);
void AddCheck(Program& program);

}  // namespace Tool

#endif
