// mempool report: what a trace says about the memory of its program.

#include "mempool/Report.hpp"

#include <cerrno>
#include <cstdlib>
#include <exception>
#include <fstream>
#include <iostream>
#include <memory>
#include <new>
#include <stdexcept>
#include <string>
#include <system_error>

#include "mempool/Print.hpp"
#include "mempool/Program.hpp"
#include "mempool/Progress.hpp"
#include "mempool/Settings.hpp"
#include "report/Analysis.hpp"
#include "report/Json.hpp"
#include "report/Page.hpp"

namespace Tool {

namespace {

constexpr const char* description =
    "Show from a trace where the memory of a program is: by group, size and lifetime";

constexpr const char* notes =
    R"(Nothing is run: the trace is read once, and what pools and the heap would hold is computed by the
rules of the library and of the C library's malloc.

event         An allocation, a release, a Clear, or the creation or the destruction of a pool.
group         What the recording traced as one pool. Those of one name count as one.
the peak      The first moment with the most bytes asked for.
bytes held    By pools: buckets, heap records and tables. By the heap: its blocks as malloc rounds
              them, with its own headers, 8 bytes per block; the last line is without them. Unused
              memory between blocks is not counted.
records       The share of blocks that fit into a bucket. The others are heap records.
padding       Bytes that rounding adds to those.
temporary     The share of blocks that the next event of their thread frees.
short         The share of blocks that are freed within 100 events.
leaked        Bytes that are not freed until their pool or the trace ends; never: their share.
together      The share of blocks that die in a series of two or more releases, without an
              allocation of their group in between.
clear         Of these, the series that leave no block of the group alive: one Clear of a pool
              would replace them.

--json has the exact figures; docs/report.md lists its keys.
)";

struct Options {
    ReportOptions report;
    std::string path;
    bool all = false;
};

void WriteFile(const std::string& path, const std::string& text) {
    std::ofstream file(path, std::ios::binary);
    file << text;
    file.close();
    if (!file) { throw std::system_error(errno, std::generic_category(), path); }
}

int ReportOn(const Options& options) {
    ReportOptions report = options.report;
    if (options.all) { report.extent = Extent::All; }
    try {
        Trace::StepReader reader(options.path);
        return WriteReport(reader, report);
    } catch (const std::bad_alloc&) {
        std::cerr << "mempool: " << options.path << ": out of memory\n";
    }
    return EXIT_FAILURE;
}

}  // namespace

int WriteReport(Trace::StepReader& reader, const ReportOptions& options) {
    CheckSettings(options.settings);
    if (!options.html.empty()) { Report::CheckCanMakePage(); }
    const Progress progress(reader.Name());
    const Report::Analysis analysis = Report::Analyse(reader, options.settings, [&](auto position) {
        progress.Show("line " + std::to_string(position));
    });
    progress.Clear();

    if (options.html == "-") {
        std::cout << Report::MakePage(analysis);
        return WarnOfBrokenTrace(reader);
    }
    if (options.json) {
        std::cout << Report::ToJson(analysis) << '\n';
    } else {
        PrintAnalysis(std::cout, analysis, options.extent);
    }
    std::cout << std::flush;
    if (!options.html.empty()) { WriteFile(options.html, Report::MakePage(analysis)); }
    return WarnOfBrokenTrace(reader);
}

void AddReport(Program& program) {
    CLI::App& report = *program.commandLine.add_subcommand("report", description);
    report.footer(notes);
    const auto options = std::make_shared<Options>();
    report.add_option("TRACE", options->path, "File to report on; - is standard input")
        ->required()
        ->type_name("");
    report.add_flag("--json", options->report.json, "Print all figures as JSON");
    report
        .add_option(
            "--html", options->report.html,
            "Also write a page with charts to FILE; - is standard output, with the page alone")
        ->type_name("FILE");
    report.add_flag("--all", options->all, "Print every size and every group");
    AddSettings(report, options->report.settings);
    report.callback(
        [&program, options] { program.job = [options] { return ReportOn(*options); }; });
}

}  // namespace Tool
