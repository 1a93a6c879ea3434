#include "mempool/AdviceText.hpp"

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <map>
#include <string>
#include <utility>
#include <vector>

#include <fmt/ostream.h>

#include "advise/Space.hpp"
#include "mempool/Readable.hpp"
#include "mempool/SafeText.hpp"
#include "mempool/Table.hpp"

namespace Tool {

namespace {

using Advise::Advice;
using Advise::Aim;
using Advise::Figures;
using Advise::Measured;

// The short table has this many of the best settings, and those that are named.
constexpr std::size_t numShown = 8;

std::string NamesOf(const Advice& advice, std::size_t index) {
    const Advise::Verdict& verdict = advice.verdict;
    std::string names;
    if (verdict.fastest == index) { names += ", fastest"; }
    if (verdict.smallest == index) { names += ", smallest"; }
    if (verdict.best == index) { names += ", best"; }
    if (verdict.advised == index) { names += ", advised"; }
    if (Advise::NumDifferences(advice.findings.settings[index].settings,
                               OBR::MemPool::PoolSettings()) == 0) {
        names += ", default";
    }
    return names.empty() ? "" : names.substr(2);
}

void AddRow(Table& table, const Advice& advice, std::vector<std::string> cells,
            const Figures& figures, const std::string& names) {
    cells.push_back(fmt::format("{:.1f}", figures.time));
    cells.push_back(figures.rounds > 1 ? fmt::format("{:.1f}", figures.spread) : "-");
    cells.push_back(fmt::format("{:.2f}", Cost(figures, advice.findings.heap, Aim::Time)));
    cells.push_back(fmt::format("{:.0f}", figures.bytes));
    cells.push_back(fmt::format("{:.2f}", Cost(figures, advice.findings.heap, Aim::Bytes)));
    cells.push_back(names);
    table.AddCells(std::move(cells));
}

void AddRow(Table& table, const Advice& advice, std::size_t index) {
    const auto& [settings, figures] = advice.findings.settings[index];
    AddRow(table, advice,
           {std::to_string(settings.bucketSize), std::to_string(settings.maxRecordSize),
            std::to_string(settings.minRecordSize), std::to_string(settings.dataAlignment),
            settings.keepEmptyBuckets ? "kept" : "released"},
           figures, NamesOf(advice, index));
}

void PrintGivenUp(std::ostream& out, const Advice& advice) {
    std::map<std::string, unsigned int> problems;
    for (const auto& each : advice.findings.givenUp) { ++problems[each.problem]; }
    for (const auto& [problem, number] : problems) {
        fmt::print(out, "   {} {} given up: {}\n", number,
                   number == 1 ? "setting was" : "settings were", problem);
    }
}

// A word, quoted for a shell.
std::string Quoted(const std::string& word) {
    const char* const plain =
        "abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ0123456789_-+=./:,@%";
    if (!word.empty() && word.find_first_not_of(plain) == std::string::npos) { return word; }
    std::string quoted = "'";
    for (const char c : word) { quoted += c == '\'' ? "'\\''" : std::string(1, c); }
    return quoted + "'";
}

void PrintLinesToPaste(std::ostream& out, const Advice& advice) {
    const Measured& advised = advice.findings.settings[*advice.verdict.advised];
    out << '\n';
    for (const auto& [name, value] : Advise::EnvironmentOf(advised.settings)) {
        fmt::print(out, "    export {}={}\n", name, value);
    }
    const std::vector<std::string> code = Advise::CodeOf(advised.settings, advice.layer);
    if (!code.empty()) { out << "\nor, in code:\n\n"; }
    for (const std::string& line : code) { fmt::print(out, "    {}\n", line); }
}

void PrintPlan(std::ostream& out, const Advise::Plan& plan) {
    constexpr std::size_t mostNames = 4;
    constexpr std::size_t nameBytes = 90;
    out << '\n' << plan.sentence << '\n';
    for (std::size_t i = 0; i < plan.pools.size(); ++i) {
        const Advise::PlannedPool& pool = plan.pools[i];
        const std::string each =
            pool.numFreeAlls == 1
                ? ","
                : fmt::format(" for each {} blocks, {} in all, the first",
                              Count(pool.numReplaced / pool.numFreeAlls), Count(pool.numFreeAlls));
        fmt::print(out, "   Pool {}: one FreeAll{} at event {}, drops {} of {} blocks; peak {}\n",
                   i + 1, each, Count(pool.firstFreeAll), Count(pool.numReplaced),
                   Count(pool.numBlocks), Bytes(pool.peakBytes));
        const std::size_t numNames = std::min(pool.groups.size(), mostNames);
        for (std::size_t name = 0; name < numNames; ++name) {
            fmt::print(out, "      {}\n", ShortName(SafeText(pool.groups[name]), nameBytes));
        }
        if (numNames < pool.groups.size()) {
            fmt::print(out, "      and {} more\n", pool.groups.size() - numNames);
        }
    }
}

}  // namespace

void PrintTable(std::ostream& out, const Advice& advice, bool all) {
    const std::vector<Measured>& settings = advice.findings.settings;
    std::vector<std::size_t> order(settings.size());
    for (std::size_t i = 0; i < order.size(); ++i) { order[i] = i; }
    std::stable_sort(order.begin(), order.end(), [&](std::size_t a, std::size_t b) {
        const auto cost = [&](std::size_t i) {
            return Cost(settings[i].figures, advice.findings.heap, Aim::Both);
        };
        return cost(a) < cost(b);
    });

    const Advise::Program& program = advice.program;
    fmt::print(out, "   Events: {}", program.numEvents);
    if (program.numLeftOut != 0) {
        fmt::print(out, ", the first of {}", program.numEvents + program.numLeftOut);
    }
    out << '\n';
    Table table({{"bucket\nsize"},
                 {"max\nrecord"},
                 {"min\nrecord"},
                 {"align-\nment"},
                 {"empty\nbuckets", 0, Align::Left},
                 {"ns per\nevent"},
                 {"spread"},
                 {"of\nheap"},
                 {"bytes\nheld"},
                 {"of\nheap"},
                 {"", 0, Align::Left}});
    AddRow(table, advice, {"heap", "", "", "", ""}, advice.findings.heap, "");
    if (advice.findings.mimalloc.has_value()) {
        AddRow(table, advice, {"mimalloc", "", "", "", ""}, *advice.findings.mimalloc, "");
    }
    std::size_t numHidden = 0;
    for (std::size_t place = 0; place < order.size(); ++place) {
        if (all || place < numShown || !NamesOf(advice, order[place]).empty()) {
            AddRow(table, advice, order[place]);
        } else {
            ++numHidden;
        }
    }
    table.Write(out);
    if (numHidden != 0) { fmt::print(out, "   and {} more settings that were tried\n", numHidden); }
    PrintGivenUp(out, advice);
    if (advice.isStopped) { out << "   The search was stopped; these are its results so far.\n"; }
}

void PrintVerdict(std::ostream& out, const Advice& advice) {
    for (const std::string& sentence : advice.verdict.sentences) { out << sentence << '\n'; }
    if (advice.verdict.advised.has_value()) { PrintLinesToPaste(out, advice); }
    if (advice.plan.has_value()) { PrintPlan(out, *advice.plan); }
}

std::string TryCommand(const OBR::MemPool::PoolSettings& settings,
                       const std::vector<std::string>& command) {
    std::string line = "mempool try";
    for (const auto& row : OBR::MemPool::SettingTable::all) {
        const unsigned int value = row.In(settings);
        const bool isUsual = value == row.In(OBR::MemPool::PoolSettings());
        if (isUsual && std::getenv(row.variable) == nullptr) { continue; }
        line += fmt::format(" {}", row.option);
        if (!row.IsFlag()) { line += fmt::format(" {}", value); }
        if (row.IsFlag() && value == 0) { line += "=false"; }
    }
    line += " --";
    for (const std::string& word : command) { line += " " + Quoted(word); }
    return line;
}

}  // namespace Tool
