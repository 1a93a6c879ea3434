// mempool try: runs a program on malloc and on pools, and compares.

#include <sys/wait.h>

#include <cstdint>
#include <iostream>
#include <memory>
#include <string>

#include <fmt/ostream.h>
#include <nlohmann/json.hpp>

#include "mempool/CommandLine.hpp"
#include "mempool/Progress.hpp"
#include "mempool/Settings.hpp"
#include "mempool/Table.hpp"
#include "preload/Trial.hpp"
#include "system/Child.hpp"
#include "system/ExitStatus.hpp"
#include "system/ProgramFile.hpp"

namespace Tool {

namespace {

constexpr const char* description = "Run a program on malloc and on pools, in turns, and compare";

constexpr const char* notes =
    R"(The program runs unchanged, in turns on malloc, on pools and, if it is installed, on mimalloc. For
pools a library is preloaded that serves blocks up to the largest record from one Heap, aligned to 16
bytes as malloc's. The first run is not measured; only its output is shown. The figures go to standard
error.

Settings without an option on the command line come from their environment variables, such as
NUV_OBR_MEMPOOL_BUCKET_SIZE.

cpu s         User and system time, the median of the rounds.
spread        Between the lower and the upper quartile. A difference within it, or of less than 1 %,
              is neither a gain nor a price.
peak MB       The peak of resident memory, including the program's code. Below 3 MB it may be that of
              mempool itself, from which the program is started.
page faults   Pages that were made resident. One that was given back to the system and is used again
              counts again. A replay does not show these.

Standard input is empty unless --stdin names a file. Ctrl-C ends the trial and shows the complete
rounds.

Exit status: that of the program's first run, or its signal; 125 if nothing was tried, 126 if the
program cannot be run, 127 if it is not found.
)";

struct Options {
    Preload::Order order;
    bool json = false;
};

nlohmann::ordered_json JsonOf(unsigned int rounds, const Preload::Conclusion& conclusion) {
    nlohmann::ordered_json sides = nlohmann::ordered_json::array();
    for (const Preload::Result& each : conclusion.results) {
        sides.push_back({{"name", each.name},
                         {"cpu_seconds", each.figures.time},
                         {"cpu_spread", each.figures.spread},
                         {"cpu_ratio", each.timeRatio},
                         {"wall_seconds", each.wallSeconds},
                         {"peak_bytes", static_cast<std::int64_t>(each.figures.bytes)},
                         {"peak_ratio", each.bytesRatio},
                         {"page_faults", static_cast<std::int64_t>(each.pageFaults)}});
    }
    nlohmann::ordered_json same;
    if (conclusion.sameOutput.has_value()) { same = *conclusion.sameOutput; }
    return {{"rounds", rounds},
            {"sides", sides},
            {"same_output", same},
            {"verdict", conclusion.verdict},
            {"sentences", conclusion.sentences}};
}

void Print(unsigned int rounds, const Preload::Conclusion& conclusion) {
    Table table({{"", 0, Align::Left},
                 {"cpu s"},
                 {"spread"},
                 {"of malloc"},
                 {"wall s"},
                 {"peak MB"},
                 {"of malloc"},
                 {"page faults"}});
    for (const Preload::Result& each : conclusion.results) {
        const auto ratio = [&](double value) {
            return each.differs ? "-" : fmt::format("{:.2f}", value);
        };
        table.AddRow(each.name, fmt::format("{:.3f}", each.figures.time),
                     fmt::format("{:.3f}", each.figures.spread), ratio(each.timeRatio),
                     fmt::format("{:.3f}", each.wallSeconds),
                     fmt::format("{:.1f}", each.figures.bytes / 1e6), ratio(each.bytesRatio),
                     fmt::format("{:.0f}", each.pageFaults));
    }
    fmt::print(std::cerr, "\n   Rounds: {}\n", rounds);
    table.Write(std::cerr);
    std::cerr << '\n';
    for (const std::string& sentence : conclusion.sentences) { std::cerr << sentence << '\n'; }
}

int Try(const Options& options) {
    CheckSettings(Replay::InLayer(options.order.settings, Replay::Layer::Malloc));
    System::CheckPreload(options.order.command.front(), "tried");
    const Progress progress("mempool");
    const Preload::Trial trial =
        Preload::TryProgram(options.order, [&](unsigned int round, const std::string& side) {
            progress.Clear();
            if (round == 0) { return; }  // The output of the program comes next.
            progress.Show(fmt::format("round {} of {}, on {}", round, options.order.rounds, side));
        });
    progress.Clear();
    if (trial.rounds == 0) {
        std::cerr << "mempool: stopped before the end of the first round\n";
        return WIFEXITED(trial.waitStatus) ? System::ownFailure : System::EndLike(trial.waitStatus);
    }
    const Preload::Conclusion conclusion = Preload::Conclude(trial);
    if (options.json) {
        std::cout << JsonOf(trial.rounds, conclusion).dump(2) << std::endl;
    } else {
        Print(trial.rounds, conclusion);
    }
    return System::EndLike(trial.waitStatus);
}

}  // namespace

void AddTry(Program& program) {
    Subcommand sub(program, "try", description, notes);
    sub.AddCommand();
    const auto options = std::make_shared<Options>();
    sub.AddNumber("--rounds", options->order.rounds, 1, 1000, "Measured runs of each side");
    AddSettings(sub, options->order.settings);
    sub.AddText("--stdin", options->order.input, "FILE", "The program's standard input");
    sub.AddFlag("--json", options->json,
                "Print the figures as JSON on standard output, and the output of the program on "
                "standard error");
    sub.SetJob([&program, sub, options] {
        options->order.command = program.command;
        options->order.showsOnErrors = options->json;
        TakeEnvironment(sub, options->order.settings);
        return [options] { return Try(*options); };
    });
}

}  // namespace Tool
