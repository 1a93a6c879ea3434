#include "CommandLine.hpp"

#include <cstdlib>

#include <CLI/CLI.hpp>

CommandLine::CommandLine(const char* program, const char* description)
    : app(std::make_unique<CLI::App>(description, program)) {}

CommandLine::~CommandLine() = default;

void CommandLine::Flag(const char* name, bool& place, const char* help) {
    app->add_flag(name, place, help);
}

void CommandLine::Number(const char* name, int& place, int smallest, int largest,
                         const char* help) {
    app->add_option(name, place, help)
        ->check(CLI::Range(smallest, largest))
        ->type_name("N")
        ->capture_default_str();
}

void CommandLine::Text(const char* name, std::string& place, const char* help) {
    app->add_option(name, place, help)->capture_default_str();
}

void CommandLine::File(const char* name, std::string& place, const char* help) {
    app->add_option(name, place, help)->required()->type_name("");
}

void CommandLine::Files(const char* name, std::vector<std::string>& places, const char* help) {
    app->add_option(name, places, help)->required()->type_name("");
}

void CommandLine::Exclude(const char* name, std::initializer_list<const char*> others) {
    for (const char* other : others) { app->get_option(name)->excludes(app->get_option(other)); }
}

bool CommandLine::Read(int argc, const char* const* argv, int& status) {
    try {
        app->parse(argc, argv);
        return true;
    } catch (const CLI::ParseError& error) {
        status = app->exit(error) == 0 ? EXIT_SUCCESS : EXIT_FAILURE;
        return false;
    }
}
