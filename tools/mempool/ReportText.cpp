// The sections of the page, from the top down.

#include "mempool/ReportText.hpp"

#include <algorithm>
#include <array>
#include <cstddef>
#include <iomanip>
#include <ostream>
#include <sstream>
#include <vector>

#include "mempool/SafeText.hpp"
#include "trace/CutText.hpp"

namespace Tool {

namespace {

using Report::Analysis;
using Report::Tally;

// 1234567 as 1,234,567.
std::string Count(std::uint64_t number) {
    std::string text = std::to_string(number);
    for (std::size_t end = text.size(); end > 3; end -= 3) { text.insert(end - 3, ","); }
    return text;
}

// Three digits and a unit, which are powers of 1000.
std::string Bytes(std::uint64_t bytes) {
    constexpr std::array units = {"B ", "KB", "MB", "GB", "TB", "PB", "EB"};
    auto value = static_cast<double>(bytes);
    std::size_t unit = 0;
    while (value >= 999.5 && unit + 1 < units.size()) {
        value /= 1000;
        ++unit;
    }
    std::ostringstream text;
    const int digits = unit == 0 || value >= 99.95 ? 0 : value >= 9.995 ? 1 : 2;
    text << std::fixed << std::setprecision(digits) << value << ' ' << units[unit];
    return text.str();
}

std::string Percent(std::uint64_t part, std::uint64_t whole) {
    if (whole == 0) { return "-"; }
    std::ostringstream text;
    text << std::fixed << std::setprecision(1)
         << 100 * static_cast<double>(part) / static_cast<double>(whole) << " %";
    return text.str();
}

// Without the blank, for narrow columns.
std::string Tight(std::uint64_t part, std::uint64_t whole) {
    const std::string percent = Percent(part, whole);
    return whole == 0 ? percent : percent.substr(0, percent.size() - 2) + "%";
}

// Right-aligned cells.
class Row {
public:
    explicit Row(std::ostream& stream) : out(stream) { out << std::right << "  "; }
    Row(const Row&) = delete;
    Row& operator=(const Row&) = delete;
    ~Row() { out << '\n'; }

    Row& Cell(const std::string& text, int width) {
        out << ' ' << std::setw(width) << text;
        return *this;
    }

private:
    std::ostream& out;
};

void Label(std::ostream& out, const char* label) {
    out << "   " << std::left << std::setw(22) << label << std::right;
}

std::string Fact(const Analysis& analysis, const char* key) {
    const auto fact = analysis.facts.find(key);
    return fact == analysis.facts.end() ? "" : SafeText(fact->second);
}

void PrintFacts(std::ostream& out, const Analysis& analysis) {
    const auto print = [&](const char* label, const std::string& before, const char* key,
                           const char* behind) {
        const std::string text = Fact(analysis, key);
        if (text.empty()) { return; }
        Label(out, label);
        out << before << text << behind << '\n';
    };
    print("program", "", "program", "");
    print("groups", "by ", "by", "");
    print("threads", "", "threads", "");
    print("freed elsewhere", "", "foreign_frees", " blocks, by another thread");
    print("processor time", "", "cpu_seconds", " s");
    const std::string share = Fact(analysis, "allocation_share");
    std::istringstream number(share);
    double value = 0;
    if (!share.empty() && number >> value) {
        Label(out, "allocation calls");
        out << std::fixed << std::setprecision(1) << 100 * value << " % of it\n";
    }
}

void PrintTotals(std::ostream& out, const Analysis& analysis) {
    const Tally& total = analysis.total;
    Label(out, "events");
    out << Count(analysis.events) << '\n';
    Label(out, "blocks");
    out << Count(total.all.blocks) << " of " << Bytes(total.all.bytes) << " in all, "
        << Percent(total.never, total.all.blocks) << " never freed\n";
    Label(out, "in records");
    out << Percent(total.inRecords.blocks, total.all.blocks) << " of the blocks, "
        << Percent(total.inRecords.bytes, total.all.bytes) << " of the bytes; rounding adds "
        << Percent(total.padding, total.inRecords.bytes) << " to them\n";
    Label(out, "die together");
    out << Percent(analysis.runs.together, total.all.blocks)
        << " of the blocks; one Clear would do for "
        << Percent(analysis.runs.clearable, total.all.blocks)
        << " (runs: " << Count(analysis.runs.numClears) << ")\n";
    Label(out, "peak");
    out << Bytes(analysis.peak.asked) << " in " << Count(analysis.peak.blocks)
        << " blocks, at event " << Count(analysis.peak.event) << "\n\n";

    struct Line {
        const char* label;
        std::uint64_t Report::Moment::*figure;
    };
    constexpr std::array<Line, 5> lines = {{{"asked for", &Report::Moment::asked},
                                            {"pools, one a group", &Report::Moment::pools},
                                            {"one pool for all", &Report::Moment::onePool},
                                            {"heap (malloc)", &Report::Moment::heap},
                                            {"heap with headers", &Report::Moment::chunks}}};
    Label(out, "BYTES HELD");
    Row(out).Cell("at the peak", 11).Cell("of heap", 10).Cell("most ever", 12);
    for (const Line& line : lines) {
        Label(out, line.label);
        const std::uint64_t held = analysis.peak.*line.figure;
        Row(out)
            .Cell(Bytes(held), 11)
            .Cell(Percent(held, analysis.peak.heap), 10)
            .Cell(Bytes(analysis.most.*line.figure), 12);
    }
}

void PrintGraph(std::ostream& out, const Analysis& analysis) {
    constexpr std::size_t width = 60;
    constexpr std::uint64_t height = 5;
    std::array<std::uint64_t, width> columns = {};
    for (const Report::Point& point : analysis.timeline) {
        // An event of a short trace has several columns.
        const std::uint64_t behind = point.most.event * width / analysis.events;
        std::size_t column = (point.most.event - 1) * width / analysis.events;
        do {
            columns.at(column) = std::max(columns.at(column), point.most.asked);
        } while (++column < behind);
    }
    out << "\n   BYTES ASKED FOR OVER THE TRACE\n";
    for (std::uint64_t line = height; line > 0; --line) {
        out << "   " << std::setw(9) << (line == height ? Bytes(analysis.peak.asked) : "") << " |";
        std::string text;
        for (const std::uint64_t bytes : columns) {
            // From the middle of a line on it is marked, and the lowest by anything at all.
            const bool isMarked =
                2 * height * static_cast<double>(bytes) >=
                    static_cast<double>(2 * line - 1) * static_cast<double>(analysis.peak.asked) ||
                line == 1;
            text += bytes > 0 && isMarked ? '#' : ' ';
        }
        out << text.substr(0, text.find_last_not_of(' ') + 1) << '\n';
    }
    out << "   " << std::setw(9) << ""
        << " +" << std::string(width, '-') << '\n';
}

// "3 of 12" or nothing, if all are shown.
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
    Row(out)
        .Cell("bytes", 15)
        .Cell("blocks", 13)
        .Cell("share", 7)
        .Cell("at peak", 8)
        .Cell("records", 8)
        .Cell("padding", 8)
        .Cell("short", 7)
        .Cell("never", 7);
    for (const Report::SizeRow* row : rows) {
        const Tally& tally = row->tally;
        const std::string size =
            row->smallest == row->largest
                ? std::to_string(row->smallest)
                : std::to_string(row->smallest) + '-' + std::to_string(row->largest);
        const std::uint64_t shortLived = tally.lifetimes[0] + tally.lifetimes[1];
        Row(out)
            .Cell(size, 15)
            .Cell(Count(tally.all.blocks), 13)
            .Cell(Percent(tally.all.blocks, analysis.total.all.blocks), 7)
            .Cell(Bytes(tally.atPeak.bytes), 8)
            .Cell(Percent(tally.inRecords.blocks, tally.all.blocks), 8)
            .Cell(Bytes(tally.padding), 8)
            .Cell(Percent(shortLived, tally.all.blocks), 7)
            .Cell(Percent(tally.never, tally.all.blocks), 7);
    }
}

void PrintLifetimes(std::ostream& out, const Analysis& analysis) {
    const Tally& total = analysis.total;
    std::size_t last = Report::numLifetimes - 1;
    while (last > 0 && total.lifetimes.at(last) == 0) { --last; }
    out << "\n   LIFETIMES (blocks freed within so many events)\n";
    {
        Row row(out);
        row.Cell("events", 6);
        for (std::size_t bin = 0; bin <= last; ++bin) {
            row.Cell(bin + 1 == Report::numLifetimes ? "longer" : "10^" + std::to_string(bin + 1),
                     6);
        }
        row.Cell("never", 7);
    }
    Row row(out);
    row.Cell("blocks", 6);
    std::uint64_t within = 0;
    for (std::size_t bin = 0; bin <= last; ++bin) {
        within += total.lifetimes.at(bin);
        row.Cell(Tight(within, total.all.blocks), 6);
    }
    row.Cell(Tight(total.never, total.all.blocks), 7);
}

void PrintGroups(std::ostream& out, const Analysis& analysis, Extent extent) {
    const std::size_t most = extent == Extent::Short ? 5 : 7;
    const std::size_t shown =
        extent == Extent::All ? analysis.groups.size() : std::min(analysis.groups.size(), most);
    out << "\n   GROUPS" << (shown < analysis.groups.size() ? " LARGEST AT THE PEAK" : "")
        << Shown(shown, analysis.groups.size()) << '\n';
    out << "    at peak      blocks     bytes  short  never together  clear  name\n";
    for (std::size_t i = 0; i < shown; ++i) {
        const Report::GroupRow& group = analysis.groups[i];
        const Tally& tally = group.tally;
        const std::uint64_t blocks = tally.all.blocks;
        out << "   " << std::setw(8) << Bytes(tally.atPeak.bytes) << std::setw(12) << Count(blocks)
            << std::setw(10) << Bytes(tally.all.bytes) << std::setw(7)
            << Tight(tally.lifetimes[0] + tally.lifetimes[1], blocks) << std::setw(7)
            << Tight(tally.never, blocks) << std::setw(9) << Tight(group.runs.together, blocks)
            << std::setw(7) << Tight(group.runs.clearable, blocks) << "  "
            << (extent == Extent::All ? SafeText(group.name)
                                      : Trace::CutText(SafeText(group.name), 36))
            << '\n';
    }
}

}  // namespace

void PrintAnalysis(std::ostream& out, const Analysis& analysis, Extent extent,
                   const std::string& heading) {
    out << SafeText(analysis.trace) << '\n' << heading;
    PrintFacts(out, analysis);
    PrintTotals(out, analysis);
    if (extent != Extent::Short) { PrintGraph(out, analysis); }
    PrintSizes(out, analysis, extent);
    if (extent != Extent::Short) { PrintLifetimes(out, analysis); }
    PrintGroups(out, analysis, extent);
}

}  // namespace Tool
