// mempool advise: searches for the settings of the pools that suit a trace.

#include <cstdlib>
#include <iostream>
#include <memory>
#include <optional>
#include <string>

#include <nlohmann/json.hpp>

#include "mempool/Print.hpp"
#include "mempool/Program.hpp"
#include "mempool/Progress.hpp"
#include "mempool/Sweep.hpp"
#include "trace/StepReader.hpp"

namespace Tool {

namespace {

constexpr const char* description =
    "Tell whether a program would gain from pools, and with which settings";

constexpr const char* notes =
    R"(A TRACE is what 'mempool replay' takes. It is replayed through pools with many settings, in turns
with the heap, each time in a process of its own. See 'mempool replay --help' for what counts.

ns an event   The median of some replays. A time of pools is taken beside those of the heap right
              before and after it.
spread        Between the lower and the upper quartile of the replays. A gain within it is none.
of heap       The figure divided by that of the heap.
events        A trace of more than --seconds times 1,000,000 events, at least 4,000,000, is judged by
              its start. The verdict says so then, and --json how many are left out.
best          Of the settings that are neither slower nor larger than the heap the one with the least
              time x bytes; of those as good within its spread that with the fewest changes.
at a price    There is no such gain, but one that is greater than what it costs: time x bytes is less
              than that of the heap.
advised       What the verdict is about, with the lines to paste: the best, if it gains anything. At
              a price it is chosen like the best, among those that gain more than they cost.
the program   What it can win as a whole is bounded by the share of its time that its allocation
              calls take. 'mempool record' estimates that and writes it into the trace.

No block is written to: what it costs to use blocks that lie elsewhere in memory is not measured. The
pools are those of Mgr, with blocks aligned to 4 bytes; a Heap takes 4 to 8 bytes a block more.
)";

struct Options {
    std::string path;
    bool json = false;
    unsigned int seconds = 30;
};

nlohmann::ordered_json IndexOrNull(const std::optional<std::size_t>& index) {
    return index.has_value() ? nlohmann::ordered_json(*index) : nlohmann::ordered_json();
}

void AddFigures(nlohmann::ordered_json& object, const Advise::Figures& figures) {
    object["ns_per_event"] = figures.nsPerEvent;
    object["ns_spread"] = figures.nsSpread;
    object["bytes_held"] = static_cast<std::int64_t>(figures.bytesHeld);
}

nlohmann::ordered_json JsonOf(const Advice& advice) {
    using nlohmann::ordered_json;
    ordered_json heap;
    AddFigures(heap, advice.findings.heap);
    ordered_json settings = ordered_json::array();
    for (const Advise::Measured& each : advice.findings.settings) {
        ordered_json& row = settings.emplace_back();
        for (const auto& setting : OBR::MemPool::SettingTable::all) {
            const unsigned int value = setting.In(each.settings);
            row[setting.key] = setting.IsFlag() ? ordered_json(value != 0) : ordered_json(value);
        }
        AddFigures(row, each.figures);
    }
    ordered_json environment = ordered_json::object();
    if (advice.verdict.advised.has_value()) {
        const Advise::Measured& advised = advice.findings.settings[*advice.verdict.advised];
        for (const auto& [name, value] : Advise::EnvironmentOf(advised.settings)) {
            environment[name] = value;
        }
    }
    ordered_json share;
    if (advice.allocationShare.has_value()) { share = *advice.allocationShare; }
    return {{"events", advice.numEvents},
            {"events_left_out", advice.numLeftOut},
            {"heap", heap},
            {"settings", settings},
            {"fastest", IndexOrNull(advice.verdict.fastest)},
            {"smallest", IndexOrNull(advice.verdict.smallest)},
            {"best", IndexOrNull(advice.verdict.best)},
            {"advised", IndexOrNull(advice.verdict.advised)},
            {"verdict", advice.verdict.Name()},
            {"environment", environment},
            {"allocation_share", share}};
}

int AdviseOn(const Options& options) {
    Trace::StepReader reader(options.path);
    const Progress progress(reader.Name());
    const Advice advice = TakeAdvice(reader, options.seconds, progress);
    if (options.json) {
        std::cout << JsonOf(advice).dump(2) << '\n';
    } else {
        std::cout << reader.Name() << '\n';
        PrintBadLines(std::cout, reader.Name(), reader.Bad());
        PrintTable(std::cout, advice, false);
        std::cout << '\n';
        PrintVerdict(std::cout, advice);
    }
    std::cout << std::flush;
    return WarnOfBrokenTrace(reader);
}

}  // namespace

void AddAdvise(Program& program) {
    CLI::App& advise = *program.commandLine.add_subcommand("advise", description);
    advise.footer(notes);
    const auto options = std::make_shared<Options>();
    advise.add_option("TRACE", options->path, "File to replay; - is standard input")
        ->required()
        ->type_name("");
    advise.add_flag("--json", options->json, "Print all figures as JSON");
    AddSeconds(advise, options->seconds);
    advise.callback(
        [&program, options] { program.job = [options] { return AdviseOn(*options); }; });
}

}  // namespace Tool
