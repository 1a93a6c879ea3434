// Reads the command line and does what the subcommand asks for.

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <exception>
#include <iostream>
#include <string>
#include <utility>
#include <vector>

#include "mempool/Command.hpp"
#include "mempool/Program.hpp"

namespace {

constexpr const char* description =
    R"(Tells what memory pools do, or would do, for a program: where its memory is, which settings suit it,
and the faults that it makes with them. 'mempool run PROGRAM' is where to start.)";

// Whether all that went to the standard output has got there, which only a flush can tell. The C
// streams are asked too: who writes through them does not change the state of the other.
bool IsOutputWritten() {
    std::cout.flush();
    return std::cout.good() && std::ferror(stdout) == 0;
}

// The status to end with: that of a failure, told in a line, if output is lost.
int Checked(int status, int failure) {
    if (IsOutputWritten()) { return status; }
    std::cerr << "mempool: standard output cannot be written to\n";
    return failure;
}

int Run(int argc, char** argv) {
    Tool::Program program;
    CLI::App& app = program.commandLine;
    app.name("mempool");
    app.description(description);
    app.set_version_flag("--version", "mempool " MEMPOOL_VERSION);
    app.require_subcommand(1);
    app.failure_message([](const CLI::App* whole, const CLI::Error& error) {
        std::string asked = "mempool";
        for (const CLI::App* sub : whole->get_subcommands()) { asked += " " + sub->get_name(); }
        return "mempool: " + std::string(error.what()) + "\nSee '" + asked + " --help'.\n";
    });

    Tool::AddRun(program);
    Tool::AddRecord(program);
    Tool::AddReplay(program);
    Tool::AddReport(program);
    Tool::AddAdvise(program);
    Tool::AddText(program);
    Tool::AddCheck(program);

    const std::string first = argc > 1 ? argv[1] : "-";
    const auto isFirst = [&](const CLI::App* sub) { return sub->check_name(first); };
    if (first.substr(0, 1) != "-" && app.get_subcommands(isFirst).empty()) {
        std::cerr << "mempool: '" << first << "' is no subcommand\nSee 'mempool --help'.\n";
        return EXIT_FAILURE;
    }
    std::vector<std::string> words(argv + 1, argv + argc);
    const int failure = Tool::CutCommand(program, words) ? Tool::ownFailure : EXIT_FAILURE;
    try {
        std::reverse(words.begin(), words.end());  // As the parser takes them.
        app.parse(std::move(words));
    } catch (const CLI::ParseError& error) {
        return Checked(app.exit(error) == 0 ? EXIT_SUCCESS : failure, failure);
    }
    return Checked(program.job(), failure);
}

}  // namespace

int main(int argc, char** argv) {
    try {
        return Run(argc, argv);
    } catch (const std::exception& error) {
        std::cerr << "mempool: " << error.what() << '\n';
        return EXIT_FAILURE;
    }
}
