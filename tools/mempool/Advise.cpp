// mempool advise: searches for the settings of the pools that suit a trace.

#include "mempool/Advise.hpp"

#include <cstdlib>
#include <iostream>
#include <memory>
#include <optional>
#include <string>

#include <nlohmann/json.hpp>

#include "advise/Advice.hpp"
#include "mempool/AdviceText.hpp"
#include "mempool/CommandLine.hpp"
#include "mempool/Print.hpp"
#include "mempool/Progress.hpp"
#include "mempool/Settings.hpp"
#include "system/Interruption.hpp"
#include "trace/StepReader.hpp"

namespace Tool {

namespace {

constexpr const char* description =
    "Find out whether a program would gain from pools, and with which settings";

constexpr const char* notes =
    R"(TRACE is as for 'mempool replay'. It is replayed on pools with many settings, in turns with the heap,
each time in a new process. 'mempool replay --help' says what is measured.

ns per event  The median of several replays. Each replay of pools is compared with the replays of the
              heap right before and after it.
spread        Between the lower and the upper quartile of the replays. A difference within it is
              neither a gain nor a price.
of heap       The figure divided by that of the heap.
events        If a trace has more than --seconds times 1,000,000 events, and more than 4,000,000,
              only the first ones are replayed. The verdict says so, and --json has the number of the
              others.
best          Of the settings that cost the program neither time nor bytes, those with the least
              time x bytes; among settings as good within the spread, those with the fewest changes.
at a price    No settings gain without a price, but some gain more than they cost: the program's time x
              the heap's bytes becomes less.
threads       No settings are advised if several threads of the program allocate from the heap, since a
              pool serves one at a time.
advised       The settings that the verdict is about, with lines to paste: the best, if they gain
              anything; else settings at a price, chosen in the same way.
the program   'mempool record' estimates which share of its time its allocation calls take, and how far
              off that can be. The start of the library of --layer malloc is charged too. A gain that may
              not come true does not count: docs/advisor.md has the limits.
plan          From groups, as of 'mempool record --by caller', a plan of up to five pools: groups whose
              blocks die together share a pool, so that one FreeAll replaces their frees, and all
              other blocks share another, and all keep their empty buckets. There is one if it gains
              more over the heap, and over one pool for all, than its median varies.
mimalloc      Replayed too where it is installed. The verdict says so if it gains more than the pools.
--seconds     Replays end at 1.4 times this at the latest. Ctrl-C or SIGTERM ends the search at once,
              and what was measured is printed.

A replay does not write to blocks, so it does not show that blocks which lie closer together can be
faster to use. docs/advisor.md describes the keys of --json.
)";

struct Options {
    std::string path;
    bool json = false;
    unsigned int seconds = 30;
    Replay::Layer layer = Replay::Layer::Heap;
};

template <typename Value>
nlohmann::ordered_json OrNull(const std::optional<Value>& value) {
    return value.has_value() ? nlohmann::ordered_json(*value) : nlohmann::ordered_json();
}

void AddFigures(nlohmann::ordered_json& object, const Advise::Figures& figures) {
    object["ns_per_event"] = figures.time;
    object["ns_spread"] = figures.spread;
    object["bytes_held"] = static_cast<std::int64_t>(figures.bytes);
}

nlohmann::ordered_json JsonOf(const OBR::MemPool::PoolSettings& settings) {
    nlohmann::ordered_json object;
    for (const auto& row : OBR::MemPool::SettingTable::all) {
        const unsigned int value = row.In(settings);
        if (row.IsFlag()) {
            object[row.key] = value != 0;
        } else {
            object[row.key] = value;
        }
    }
    return object;
}

nlohmann::ordered_json JsonOf(const Advise::Plan& plan) {
    nlohmann::ordered_json object = {{"sentence", plan.sentence},
                                     {"pools", nlohmann::ordered_json::array()},
                                     {"settings", JsonOf(plan.settings)}};
    for (const Advise::PlannedPool& pool : plan.pools) {
        object["pools"].push_back({{"groups", pool.groups},
                                   {"blocks", pool.numBlocks},
                                   {"peak_bytes", pool.peakBytes},
                                   {"free_alls", pool.numFreeAlls},
                                   {"first_free_all", pool.firstFreeAll},
                                   {"frees_replaced", pool.numReplaced}});
    }
    AddFigures(object["planned"], plan.figures);
    AddFigures(object["one_pool"], plan.onePool);
    AddFigures(object["heap"], plan.heap);
    return object;
}

nlohmann::ordered_json JsonOf(const Advise::Advice& advice) {
    using nlohmann::ordered_json;
    const auto& [layer, program, findings, verdict, plan, isStopped] = advice;
    ordered_json heap;
    AddFigures(heap, findings.heap);
    ordered_json mimalloc;
    if (findings.mimalloc.has_value()) { AddFigures(mimalloc, *findings.mimalloc); }
    ordered_json settings = ordered_json::array();
    for (const Advise::Measured& each : findings.settings) {
        AddFigures(settings.emplace_back(JsonOf(each.settings)), each.figures);
    }
    ordered_json environment = ordered_json::object();
    if (verdict.advised.has_value()) {
        const Advise::Measured& advised = findings.settings[*verdict.advised];
        for (const auto& [name, value] : Advise::EnvironmentOf(advised.settings)) {
            environment[name] = value;
        }
    }
    return {{"layer", NameOf(layer)},
            {"events", program.numEvents},
            {"events_left_out", program.numLeftOut},
            {"stopped", isStopped},
            {"heap", heap},
            {"mimalloc", mimalloc},
            {"settings", settings},
            {"fastest", OrNull(verdict.fastest)},
            {"smallest", OrNull(verdict.smallest)},
            {"best", OrNull(verdict.best)},
            {"advised", OrNull(verdict.advised)},
            {"verdict", verdict.Name()},
            {"price", verdict.Price()},
            {"sentences", verdict.sentences},
            {"environment", environment},
            {"plan", plan.has_value() ? JsonOf(*plan) : ordered_json()},
            {"allocation_share", OrNull(program.allocationShare)},
            {"allocation_share_error", OrNull(program.shareError)}};
}

int AdviseOn(const Options& options) {
    Trace::StepReader reader(options.path);
    const Progress progress(reader.Name());
    const System::Interruption interruption;
    const Advise::Advice advice =
        Advise::TakeAdvice(reader, {options.layer, 0. + options.seconds},
                           [&](const std::string& text) { progress.Show(text); });
    progress.Clear();
    if (options.json) {
        std::cout << AdviceAsJson(advice) << '\n';
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

std::string AdviceAsJson(const Advise::Advice& advice) {
    return JsonOf(advice).dump(2, ' ', false, nlohmann::json::error_handler_t::replace);
}

void AddAdvise(Program& program) {
    Subcommand advise(program, "advise", description, notes);
    const auto options = std::make_shared<Options>();
    advise.AddTrace(options->path, "File to replay; - is standard input");
    advise.AddFlag("--json", options->json, "Print all figures as JSON");
    AddLayer(advise, options->layer);
    AddSeconds(advise, options->seconds);
    advise.SetJob([options] { return [options] { return AdviseOn(*options); }; });
}

}  // namespace Tool
