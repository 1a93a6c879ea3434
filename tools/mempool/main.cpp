// Reads the command line and does what the subcommand asks for.

#include <fcntl.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <exception>
#include <iostream>
#include <string>
#include <utility>
#include <vector>

#include "mempool/CommandLine.hpp"
#include "mempool/Program.hpp"
#include "system/Child.hpp"
#include "system/ExitStatus.hpp"

namespace {

// A standard stream that is closed would become the first file that is opened. In its place comes
// one that cannot be written, and that the programs that are run do not inherit.
void OccupyStandardStreams() {
    for (int stream = STDIN_FILENO; stream <= STDERR_FILENO; ++stream) {
        if (fcntl(stream, F_GETFD) < 0) { open("/dev/null", O_RDONLY | O_CLOEXEC); }
    }
}

// Checked before any work is done.
bool CanWriteOutput() {
    return (fcntl(STDOUT_FILENO, F_GETFL) & O_ACCMODE) != O_RDONLY;
}

// Whether all output has been written, which only a flush shows. C's stream is checked too: its
// errors do not change the state of std::cout.
bool IsOutputWritten() {
    std::cout.flush();
    return std::cout.good() && std::ferror(stdout) == 0;
}

int RunCommandLine(Tool::Program& program, std::vector<std::string> words) {
    Tool::AddRun(program);
    Tool::AddTry(program);
    Tool::AddRecord(program);
    Tool::AddReplay(program);
    Tool::AddReport(program);
    Tool::AddAdvise(program);
    Tool::AddText(program);
    Tool::AddCheck(program);

    int status = EXIT_SUCCESS;
    const bool isToRun = Tool::ReadCommandLine(program, std::move(words), status);
    // Where a program is run, the output is the program's.
    const bool canWrite = program.failure == System::ownFailure || CanWriteOutput();
    if (isToRun && canWrite) { status = program.job(); }
    if (canWrite && IsOutputWritten()) { return status; }
    std::cerr << "mempool: standard output cannot be written to\n";
    return program.failure;
}

int Run(std::vector<std::string> words) {
    Tool::Program program;
    try {
        return RunCommandLine(program, std::move(words));
    } catch (const System::Failure& failure) {
        std::cerr << "mempool: " << failure.what() << '\n';
        return program.failure == System::ownFailure ? failure.Status() : EXIT_FAILURE;
    } catch (const std::exception& error) {
        std::cerr << "mempool: " << error.what() << '\n';
        return program.failure;
    }
}

}  // namespace

int main(int argc, char** argv) {
    OccupyStandardStreams();
    System::SurviveFileSizeLimit();
    try {
        return Run(std::vector<std::string>(argv + 1, argv + argc));
    } catch (const std::exception& error) {
        std::cerr << "mempool: " << error.what() << '\n';
        return EXIT_FAILURE;
    }
}
