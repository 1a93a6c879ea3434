// The sections of the report, in the order of the page.

#include "mempool/ReportText.hpp"

#include <algorithm>
#include <array>
#include <cstddef>
#include <ostream>
#include <sstream>
#include <utility>
#include <vector>

#include <fmt/format.h>

#include "mempool/Print.hpp"
#include "mempool/Readable.hpp"
#include "mempool/SafeText.hpp"
#include "mempool/Table.hpp"

namespace Tool {

namespace {

using Report::Analysis;
using Report::Tally;

std::string Percent(std::uint64_t part, std::uint64_t whole) {
    if (whole == 0) { return "-"; }
    return fmt::format("{:.1f} %", 100 * static_cast<double>(part) / static_cast<double>(whole));
}

// The released blocks that lived for at most 100 events.
std::uint64_t ShortLived(const Tally& tally) {
    return tally.lifetimes[0] + tally.lifetimes[1];
}

std::string Fact(const Analysis& analysis, const char* key) {
    const auto fact = analysis.facts.find(key);
    return fact == analysis.facts.end() ? "" : SafeText(fact->second);
}

// Two columns without headings: a label and a text.
Table Labelled() {
    return Table({{"", 20, Align::Left}, {"", 0, Align::Left}});
}

void PrintFacts(std::ostream& out, const Analysis& analysis) {
    Table facts = Labelled();
    const auto add = [&](const char* label, const char* before, const char* key,
                         const char* after) {
        const std::string text = Fact(analysis, key);
        if (!text.empty()) { facts.AddRow(label, before + text + after); }
    };
    add("program", "", "program", "");
    add("groups", "by ", "by", "");
    add("threads", "", "threads", "");
    add("freed elsewhere", "", "foreign_frees", " blocks, by another thread");
    double seconds = 0;
    if (std::istringstream(Fact(analysis, "cpu_seconds")) >> seconds) {
        facts.AddRow("processor time", fmt::format("{:.3g} s", seconds));
    }
    double share = 0;
    if (std::istringstream(Fact(analysis, "allocation_share")) >> share) {
        double error = 0;
        const bool isKnown =
            !!(std::istringstream(Fact(analysis, "allocation_share_error")) >> error);
        facts.AddRow("allocation calls",
                     fmt::format("{:.1f} % of it{}", 100 * share,
                                 isKnown ? fmt::format(" (+/- {:.1f} %)", 100 * error) : ""));
    }
    facts.Write(out);
}

void PrintTotals(std::ostream& out, const Analysis& analysis) {
    const Tally& total = analysis.total;
    const std::uint64_t blocks = total.all.blocks;
    Table totals = Labelled();
    totals.AddRow("events", Count(analysis.events));
    totals.AddRow("blocks", fmt::format("{} of {} in all, {} of them temporary; {} of {} leaked",
                                        Count(blocks), Bytes(total.all.bytes),
                                        Percent(total.temporary, blocks), Count(total.never.blocks),
                                        Bytes(total.never.bytes)));
    totals.AddRow("in records",
                  fmt::format("{} of the blocks, {} of the bytes; rounding adds {} to them",
                              Percent(total.inRecords.blocks, blocks),
                              Percent(total.inRecords.bytes, total.all.bytes),
                              Percent(total.padding, total.inRecords.bytes)));
    totals.AddRow(
        "die together",
        fmt::format("{} of the blocks; a Clear could replace the frees of {} (runs: {})",
                    Percent(analysis.runs.together, blocks),
                    Percent(analysis.runs.clearable, blocks), Count(analysis.runs.numClears)));
    totals.AddRow("peak", fmt::format("{} in {} blocks, at event {}", Bytes(analysis.peak.asked),
                                      Count(analysis.peak.blocks), Count(analysis.peak.event)));
    totals.Write(out);

    Table held({{"BYTES HELD", 20, Align::Left}, {"at the peak"}, {"of heap"}, {"most ever", 9}});
    const auto add = [&](const char* label, std::uint64_t Report::Moment::*figure) {
        held.AddRow(label, Bytes(analysis.peak.*figure),
                    Percent(analysis.peak.*figure, analysis.peak.chunks),
                    Bytes(analysis.most.*figure));
    };
    add("requested", &Report::Moment::asked);
    add("pools, one per group", &Report::Moment::pools);
    add("one pool for all", &Report::Moment::onePool);
    add("heap (malloc)", &Report::Moment::chunks);
    add("without its headers", &Report::Moment::heap);
    out << '\n';
    held.Write(out);
}

void PrintGraph(std::ostream& out, const Analysis& analysis) {
    constexpr std::size_t width = 60;
    constexpr std::uint64_t height = 5;
    std::array<std::uint64_t, width> columns = {};
    for (const Report::Point& point : analysis.timeline) {
        // In a short trace an event has several columns.
        const std::uint64_t end = point.most.event * width / analysis.events;
        std::size_t column = (point.most.event - 1) * width / analysis.events;
        do {
            columns.at(column) = std::max(columns.at(column), point.most.asked);
        } while (++column < end);
    }
    out << "\n   BYTES REQUESTED OVER THE TRACE\n";
    for (std::uint64_t line = height; line > 0; --line) {
        std::string text;
        for (const std::uint64_t bytes : columns) {
            // A line is marked from its middle on, the lowest one from the first byte on.
            const bool isMarked =
                2 * height * static_cast<double>(bytes) >=
                    static_cast<double>(2 * line - 1) * static_cast<double>(analysis.peak.asked) ||
                line == 1;
            text += bytes > 0 && isMarked ? '#' : ' ';
        }
        out << fmt::format("   {:>9} |{}\n", line == height ? Bytes(analysis.peak.asked) : "",
                           text.substr(0, text.find_last_not_of(' ') + 1));
    }
    out << fmt::format("   {:9} +{:->{}}\n", "", "", width);
}

// "(3 of 12)", or nothing if all are shown.
std::string Shown(std::size_t shown, std::size_t all) {
    return shown == all ? "" : " (" + Count(shown) + " of " + Count(all) + ")";
}

void PrintSizes(std::ostream& out, const Analysis& analysis, Extent extent) {
    const bool all = extent == Extent::All;
    const std::size_t most = extent == Extent::Short ? 4 : 6;
    std::vector<const Report::SizeRow*> rows;
    for (const Report::SizeRow& row : analysis.sizes) { rows.push_back(&row); }
    if (!all && rows.size() > most) {
        std::stable_sort(rows.begin(), rows.end(), [](const auto* a, const auto* b) {
            return a->tally.all.blocks > b->tally.all.blocks;
        });
        rows.resize(most);
    }
    out << "\n   SIZES" << (rows.size() < analysis.sizes.size() ? " WITH MOST BLOCKS" : "")
        << Shown(rows.size(), analysis.sizes.size()) << '\n';
    Table table({{"bytes", 12},
                 {"blocks", 11},
                 {"share", 7},
                 {"at peak", 7},
                 {"records", 7},
                 {"padding", 7},
                 {"short", 7},
                 {"never", 7}});
    for (const Report::SizeRow* row : rows) {
        const Tally& tally = row->tally;
        const std::uint64_t blocks = tally.all.blocks;
        table.AddRow(
            row->smallest == row->largest ? fmt::format("{}", row->smallest)
                                          : fmt::format("{}-{}", row->smallest, row->largest),
            Count(blocks), Percent(blocks, analysis.total.all.blocks), Bytes(tally.atPeak.bytes),
            Percent(tally.inRecords.blocks, blocks), Bytes(tally.padding),
            Percent(ShortLived(tally), blocks), Percent(tally.never.blocks, blocks));
    }
    table.Write(out);
}

void PrintLifetimes(std::ostream& out, const Analysis& analysis) {
    const Tally& total = analysis.total;
    std::size_t last = Report::numLifetimes - 1;
    while (last > 0 && total.lifetimes.at(last) == 0) { --last; }
    std::vector<Column> columns = {{"events"}};
    std::vector<std::string> cells = {"blocks"};
    std::uint64_t within = 0;
    for (std::size_t bin = 0; bin <= last; ++bin) {
        const bool isLast = bin + 1 == Report::numLifetimes;
        columns.push_back({isLast ? "longer" : fmt::format("10^{}", bin + 1)});
        within += total.lifetimes.at(bin);
        cells.push_back(Percent(within, total.all.blocks));
    }
    columns.push_back({"never"});
    cells.push_back(Percent(total.never.blocks, total.all.blocks));
    out << "\n   LIFETIMES (blocks freed within so many events)\n";
    Table table(std::move(columns));
    table.AddCells(std::move(cells));
    table.Write(out);
}

void PrintGroups(std::ostream& out, const Analysis& analysis, Extent extent) {
    const std::size_t most = extent == Extent::Short ? 5 : 7;
    const std::size_t shown =
        extent == Extent::All ? analysis.groups.size() : std::min(analysis.groups.size(), most);
    out << "\n   GROUPS" << (shown < analysis.groups.size() ? " LARGEST AT THE PEAK" : "")
        << Shown(shown, analysis.groups.size()) << '\n';
    Table table({{"at peak", 7},
                 {"in blocks", 9},
                 {"all blocks", 10},
                 {"temporary"},
                 {"leaked", 7},
                 {"together"},
                 {"clear"},
                 {"name", 0, Align::Left}});
    for (std::size_t i = 0; i < shown; ++i) {
        const Report::GroupRow& group = analysis.groups[i];
        const Tally& tally = group.tally;
        const std::uint64_t blocks = tally.all.blocks;
        const std::string name = SafeText(group.name);
        table.AddRow(Bytes(tally.atPeak.bytes), Count(tally.atPeak.blocks), Count(blocks),
                     Percent(tally.temporary, blocks), Bytes(tally.never.bytes),
                     Percent(group.runs.together, blocks), Percent(group.runs.clearable, blocks),
                     extent == Extent::All ? name : ShortName(name, 36));
    }
    table.Write(out);
}

}  // namespace

void PrintFolded(std::ostream& out, const Analysis& analysis) {
    for (const Report::StackRow& stack : analysis.stacks) {
        if (stack.atPeak.bytes == 0) { continue; }
        std::string line;
        for (const std::string& frame : stack.frames) {
            line += (line.empty() ? "" : ";") + Report::FunctionOf(frame);
        }
        out << SafeText(line) << ' ' << stack.atPeak.bytes << '\n';
    }
}

void PrintAnalysis(std::ostream& out, const Analysis& analysis, Extent extent) {
    out << SafeText(analysis.trace) << '\n';
    if (extent != Extent::Short) { PrintBadLines(out, analysis.trace, analysis.badLines); }
    PrintFacts(out, analysis);
    PrintTotals(out, analysis);
    if (extent != Extent::Short) { PrintGraph(out, analysis); }
    PrintGroups(out, analysis, extent);
    PrintSizes(out, analysis, extent);
    if (extent != Extent::Short) { PrintLifetimes(out, analysis); }
}

}  // namespace Tool
