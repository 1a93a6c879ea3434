// Reads the command line and does what the subcommand asks for.

#include <cstdlib>
#include <exception>
#include <iostream>
#include <string>

#include "mempool/Program.hpp"

namespace {

constexpr const char* description =
    R"(Tells from the trace of a program's allocations what memory pools would do for it.)";

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

    Tool::AddReplay(program);
    Tool::AddReport(program);
    Tool::AddText(program);

    const std::string first = argc > 1 ? argv[1] : "-";
    const auto isFirst = [&](const CLI::App* sub) { return sub->check_name(first); };
    if (first.substr(0, 1) != "-" && app.get_subcommands(isFirst).empty()) {
        std::cerr << "mempool: '" << first << "' is no subcommand\nSee 'mempool --help'.\n";
        return EXIT_FAILURE;
    }
    try {
        app.parse(argc, argv);
    } catch (const CLI::ParseError& error) {
        return app.exit(error) == 0 ? EXIT_SUCCESS : EXIT_FAILURE;
    }
    return program.job();
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
