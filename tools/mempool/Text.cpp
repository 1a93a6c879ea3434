// mempool text: prints a trace of any form as lines.

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <iostream>
#include <memory>
#include <string>

#include "mempool/CommandLine.hpp"
#include "trace/Event.hpp"
#include "trace/OpenTrace.hpp"
#include "trace/TextWriter.hpp"

namespace Tool {

namespace {

constexpr const char* description = "Print a trace as lines of text";

constexpr const char* notes =
    R"(TRACE is a file of 'mempool record', or any text with trace lines among others, plain or compressed
by gzip. Only well-formed trace lines are printed:

xmpt:c:POOL              A pool is created.
xmpt:n:POOL:TEXT         Its name.
xmpt:a:POOL:BLOCK:SIZE   A block of SIZE requested bytes is allocated.
xmpt:f:POOL:BLOCK:       A block is freed.
xmpt:x:POOL              A pool drops all its blocks.
xmpt:d:POOL              A pool is destroyed, with all its blocks.
xmpt:i:KEY:TEXT          A fact about the whole recording.
xmpt:t:MILLISECONDS      The time of the following events, since the recording began.

POOL and BLOCK are addresses of 16 hexadecimal digits. The recording of a heap has a pool for each
group.
)";

int PrintTrace(const std::string& path) {
    const std::string name = path == "-" ? "standard input" : path;
    const auto source = Trace::OpenTrace(path);
    constexpr std::size_t enough = std::size_t{1} << 16;
    std::string lines;
    std::uint64_t numEvents = 0;
    std::uint64_t numMalformed = 0;
    Trace::Event event;
    while (std::cout && source->Next(event)) {
        ++(event.kind == Trace::Kind::Malformed ? numMalformed : numEvents);
        Trace::AppendLine(lines, event);
        if (lines.size() < enough) { continue; }
        std::cout << lines;
        lines.clear();
    }
    std::cout << lines << std::flush;
    if (!std::cout) { return EXIT_FAILURE; }  // The caller reports it.
    if (numMalformed != 0) {
        std::cerr << "mempool: " << name << ": " << numMalformed << " malformed lines ignored\n";
    }
    std::string problem = source->Warning();
    if (numEvents == 0 && problem.empty()) { problem = "not a trace"; }
    if (problem.empty()) { return EXIT_SUCCESS; }
    std::cerr << "mempool: " << name << ": " << problem << '\n';
    return EXIT_FAILURE;
}

}  // namespace

void AddText(Program& program) {
    Subcommand text(program, "text", description, notes);
    const auto path = std::make_shared<std::string>();
    text.AddTrace(*path, "The file to print; - is standard input");
    text.SetJob([path] { return [path] { return PrintTrace(*path); }; });
}

}  // namespace Tool
