// mempool text: prints a trace of any form as lines.

#include <cerrno>
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <iostream>
#include <memory>
#include <stdexcept>
#include <string>
#include <system_error>

#include "mempool/Program.hpp"
#include "trace/Event.hpp"
#include "trace/OpenTrace.hpp"
#include "trace/TextWriter.hpp"

namespace Tool {

namespace {

constexpr const char* description = "Print a trace as lines of text";

constexpr const char* notes =
    R"(TRACE is what mempool record has written, or any text with trace lines among others, plain or
compressed by gzip. Only the trace lines are printed, those that are malformed left out:

xmpt:c:POOL              A pool begins.
xmpt:n:POOL:TEXT         What it is called.
xmpt:a:POOL:BLOCK:SIZE   A block is allocated; SIZE bytes were asked for.
xmpt:f:POOL:BLOCK:       A block is freed.
xmpt:x:POOL              A pool drops all its blocks.
xmpt:d:POOL              A pool ends, with all its blocks.
xmpt:i:KEY:TEXT          A fact about the whole recording.

POOL and BLOCK are addresses of 16 hexadecimal digits. A recorded heap has a pool for each group.
)";

[[noreturn]] void FailAtOutput() {
    throw std::runtime_error("standard output: " + std::generic_category().message(errno));
}

void Print(std::string& lines) {
    if (std::fwrite(lines.data(), 1, lines.size(), stdout) != lines.size()) { FailAtOutput(); }
    lines.clear();
}

int PrintTrace(const std::string& path) {
    const std::string name = path == "-" ? "standard input" : path;
    const auto source = Trace::OpenTrace(path);
    constexpr std::size_t enough = std::size_t{1} << 16;
    std::string lines;
    std::uint64_t numEvents = 0;
    std::uint64_t numMalformed = 0;
    Trace::Event event;
    while (source->Next(event)) {
        ++(event.kind == Trace::Kind::Malformed ? numMalformed : numEvents);
        Trace::AppendLine(lines, event);
        if (lines.size() > enough) { Print(lines); }
    }
    Print(lines);
    if (std::fflush(stdout) != 0) { FailAtOutput(); }
    if (numMalformed != 0) {
        std::cerr << "mempool: " << name << ": " << numMalformed << " malformed lines left out\n";
    }
    std::string problem = source->Problem();
    if (!problem.empty()) { problem += "; read as far as it goes"; }
    if (numEvents == 0 && problem.empty()) { problem = "no trace line"; }
    if (problem.empty()) { return EXIT_SUCCESS; }
    std::cerr << "mempool: " << name << ": " << problem << '\n';
    return EXIT_FAILURE;
}

}  // namespace

void AddText(Program& program) {
    CLI::App& text = *program.commandLine.add_subcommand("text", description);
    text.footer(notes);
    const auto path = std::make_shared<std::string>();
    text.add_option("TRACE", *path, "The file to print; - is standard input")
        ->required()
        ->type_name("");
    text.callback([&program, path] { program.job = [path] { return PrintTrace(*path); }; });
}

}  // namespace Tool
