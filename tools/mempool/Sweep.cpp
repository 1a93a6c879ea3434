#include "mempool/Sweep.hpp"

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <future>
#include <map>
#include <stdexcept>
#include <string>
#include <utility>
#include <vector>

#include <fmt/ostream.h>

#include "advise/ForkedMeter.hpp"
#include "advise/Search.hpp"
#include "advise/Space.hpp"
#include "mempool/Table.hpp"
#include "trace/StepReader.hpp"

namespace Tool {

namespace {

using Advise::Figures;
using Advise::Measured;

// How many of the best the short table has, beside those that are named.
constexpr std::size_t numShown = 8;

std::string Percent(double share) {
    return fmt::format("{:.{}f} %", 100 * share, share < 0.1 ? 1 : 0);
}

double TimeRatio(const Advice& advice, const Figures& figures) {
    return figures.nsPerEvent / advice.findings.heap.nsPerEvent;
}
double BytesRatio(const Advice& advice, const Figures& figures) {
    return figures.bytesHeld / advice.findings.heap.bytesHeld;
}

std::string NamesOf(const Advice& advice, std::size_t index) {
    const Advise::Verdict& verdict = advice.verdict;
    std::string names;
    if (verdict.fastest == index) { names += ", fastest"; }
    if (verdict.smallest == index) { names += ", smallest"; }
    if (verdict.best == index) { names += ", best"; }
    if (verdict.advised == index) { names += ", advised"; }
    if (Advise::NumDifferences(advice.findings.settings[index].settings, Replay::PoolSettings()) ==
        0) {
        names += ", default";
    }
    return names.empty() ? "" : names.substr(2);
}

void AddRow(Table& table, const Advice& advice, std::vector<std::string> cells,
            const Figures& figures, const std::string& names) {
    cells.push_back(fmt::format("{:.1f}", figures.nsPerEvent));
    cells.push_back(figures.rounds > 1 ? fmt::format("{:.1f}", figures.nsSpread) : "-");
    cells.push_back(fmt::format("{:.2f}", TimeRatio(advice, figures)));
    cells.push_back(fmt::format("{:.0f}", figures.bytesHeld));
    cells.push_back(fmt::format("{:.2f}", BytesRatio(advice, figures)));
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

// Why the program as a whole would not notice what it gains, with the end of a line; or nothing.
std::string WhyNotNoticed(const Advice& advice, const Figures& pools) {
    constexpr std::uint64_t few = 1000;
    constexpr double littleTime = 0.01;
    if (advice.numEvents < few) {
        return "The program would not notice: " + std::to_string(advice.numEvents) +
               " events are few.\n";
    }
    if (!advice.allocationShare.has_value() || !advice.verdict.isFaster) { return ""; }
    const double saved = *advice.allocationShare * (1 - TimeRatio(advice, pools));
    if (saved >= littleTime) { return ""; }
    return (advice.verdict.isSmaller ? "The program would notice less memory, but not the time: "
                                     : "The program would not notice: ") +
           ("pools would save " + Percent(saved) + " of its time.\n");
}

// What the settings that are advised do.
std::string Sentences(const Advice& advice) {
    const Figures& heap = advice.findings.heap;
    const Figures& pools = advice.findings.settings[*advice.verdict.advised].figures;
    const bool isPaid = pools.nsPerEvent > heap.nsPerEvent || pools.bytesHeld > heap.bytesHeld;
    std::string text = WhyNotNoticed(advice, pools);
    if (text.empty()) {
        text = isPaid ? "Pools would help, at a price: they take " : "Pools would help: they take ";
    } else {
        text += "By themselves they take ";
    }
    text += fmt::format("{:.2f}", TimeRatio(advice, pools)) + " of the heap's time";
    if (!Advise::TimesDiffer(pools, heap)) { text += " (the same, within the spread of the runs)"; }
    return text + " and\n" + fmt::format("{:.2f}", BytesRatio(advice, pools)) +
           " of its bytes with these settings.";
}

void PrintShare(std::ostream& out, const Advice& advice, double ratio) {
    if (!advice.allocationShare.has_value()) {
        out << "The trace does not tell which share of the program's time its allocation calls "
               "take, "
               "and\nso what it can win as a whole.\n";
        return;
    }
    const double share = *advice.allocationShare;
    out << "Allocation takes " << Percent(share) << " of the program's processor time: at "
        << fmt::format("{:.2f}", ratio) << " of the heap's time the\nprogram would take "
        << Percent(Advise::TimeOfProgram(share, ratio)) << ", and if allocation cost nothing "
        << Percent(Advise::TimeOfProgram(share, 0)) << ".\n";
}

}  // namespace

Advice TakeAdvice(Trace::StepReader& reader, unsigned int seconds, const Progress& progress,
                  Pools pools) {
    // In a thread of its own, which has an arena of its own in the C library: the heap of this one,
    // which the replays inherit, stays as fresh as that of a program that starts.
    const auto read = [&] {
        Replay::Recording whole = Replay::ReadRecording(
            reader, [&](auto position) { progress.Show("event " + std::to_string(position)); },
            Advise::MaxSteps(seconds));
        if (pools == Pools::One) { Replay::MergePools(whole); }
        return whole;
    };
    const Replay::Recording recording = std::async(std::launch::async, read).get();
    if (recording.peakBlocks == 0) {
        progress.Clear();
        throw std::runtime_error(reader.Name() + ": no block was allocated");
    }
    Advice advice;
    advice.numEvents = recording.steps.size();
    advice.numLeftOut = recording.numLeftOut;
    const auto share = reader.Facts().find("allocation_share");
    if (share != reader.Facts().end()) { advice.allocationShare = Advise::ShareOf(share->second); }

    Advise::ForkedMeter meter(recording);
    advice.findings = Advise::Search(meter, seconds, [&](std::size_t numTried) {
        progress.Show(std::to_string(numTried) + " settings tried, " +
                      fmt::format("{:.0f}", meter.Elapsed()) + " s of at most " +
                      std::to_string(seconds));
    });
    progress.Clear();
    advice.verdict = Advise::Judge(advice.findings);
    return advice;
}

void AddSeconds(CLI::App& subcommand, unsigned int& seconds) {
    subcommand.add_option("--seconds", seconds, "How long to search, about")
        ->type_name("N")
        ->check(CLI::Range(1, 100000))
        ->capture_default_str();
}

void PrintTable(std::ostream& out, const Advice& advice, bool all) {
    const std::vector<Measured>& settings = advice.findings.settings;
    std::vector<std::size_t> order(settings.size());
    for (std::size_t i = 0; i < order.size(); ++i) { order[i] = i; }
    std::stable_sort(order.begin(), order.end(), [&](std::size_t a, std::size_t b) {
        const auto cost = [&](std::size_t i) {
            return Advise::Cost(settings[i].figures, advice.findings.heap, Advise::Aim::Both);
        };
        return cost(a) < cost(b);
    });

    out << "   Events: " << advice.numEvents;
    if (advice.numLeftOut != 0) {
        out << ", the first of " << advice.numEvents + advice.numLeftOut;
    }
    out << '\n';
    Table table({{"bucket\nsize"},
                 {"max\nrecord"},
                 {"min\nrecord"},
                 {"align-\nment"},
                 {"empty\nbuckets", 0, Align::Left},
                 {"ns an\nevent"},
                 {"spread"},
                 {"of\nheap"},
                 {"bytes\nheld"},
                 {"of\nheap"},
                 {"", 0, Align::Left}});
    AddRow(table, advice, {"heap", "", "", "", ""}, advice.findings.heap, "");
    std::size_t numLeftOut = 0;
    for (std::size_t place = 0; place < order.size(); ++place) {
        if (all || place < numShown || !NamesOf(advice, order[place]).empty()) {
            AddRow(table, advice, order[place]);
        } else {
            ++numLeftOut;
        }
    }
    table.Write(out);
    if (numLeftOut != 0) { out << "   and " << numLeftOut << " more settings that were tried\n"; }
    PrintGivenUp(out, advice);
}

void PrintVerdict(std::ostream& out, const Advice& advice) {
    if (advice.numLeftOut != 0) {
        out << "Judged by its start alone: " << advice.numLeftOut << " of "
            << advice.numEvents + advice.numLeftOut
            << " events were left out, the peak perhaps among\nthem. With more --seconds fewer "
               "are.\n";
    }
    if (!advice.verdict.advised.has_value()) {
        out << "Pools would not help: none of the settings gains anything that is more than the "
               "spread "
               "of the\nruns and more than it costs.\n";
        PrintShare(out, advice, 1);
        return;
    }
    const Measured& advised = advice.findings.settings[*advice.verdict.advised];
    out << Sentences(advice) << '\n';
    PrintShare(out, advice, TimeRatio(advice, advised.figures));
    out << "\n";
    for (const auto& [name, value] : Advise::EnvironmentOf(advised.settings)) {
        out << "    export " << name << '=' << value << '\n';
    }
    out << "\nor, in code:\n\n";
    for (const std::string& line : Advise::CodeOf(advised.settings)) {
        out << "    " << line << '\n';
    }
}

}  // namespace Tool
