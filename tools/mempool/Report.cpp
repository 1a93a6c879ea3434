// mempool report: reports on the memory of a program from its trace.

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

#include <nlohmann/json.hpp>

#include "mempool/CommandLine.hpp"
#include "mempool/Print.hpp"
#include "mempool/Progress.hpp"
#include "mempool/ReportText.hpp"
#include "mempool/Settings.hpp"
#include "report/Analysis.hpp"
#include "report/Json.hpp"
#include "report/Page.hpp"
#include "system/ExitStatus.hpp"
#include "trace/OpenTrace.hpp"
#include "trace/StepReader.hpp"

namespace Tool {

namespace {

constexpr const char* description =
    "Show where a program's memory is, from a trace: by group, size and lifetime";

constexpr const char* notes =
    R"(The trace is read once and not replayed: the bytes that pools and the heap would hold are computed by
the rules of the library and of the C library's malloc.

event         An allocation, a release, a Clear, or the creation or the destruction of a pool.
group         What the recording traced as one pool. Pools with the same name are one group, and so are
              the call stacks of one caller: the innermost frame whose function does more than pass
              memory on. A function only passes memory on by its name (see 'mempool record --help'),
              by --skip, or if at least three functions ask it for at least 90 % of the blocks that
              its file asks for.
the peak      The first moment with the most requested bytes.
bytes held    By pools: buckets, heap records and tables. By the heap: blocks as malloc rounds them,
              with its header of 8 bytes per block; the last line is without headers. Unused memory
              between blocks does not count.
records       The share of blocks that fit into a bucket. The others are heap records.
padding       Bytes that rounding adds to those.
temporary     The share of blocks that the next event of their thread frees.
short         The share of blocks that are freed within 100 events.
leaked        Bytes that are not freed before their pool or the trace ends.
never         The share of blocks that are leaked.
together      The share of blocks that die in a series of two or more releases, without an
              allocation of their group in between.
clear         The share of blocks in those series that leave no block of the group alive: one Clear
              of a pool would replace such a series.

--json has the exact figures; docs/report.md lists its keys. Settings without an option on the
command line come from their environment variables, such as NUV_OBR_MEMPOOL_BUCKET_SIZE.
)";

struct Options {
    std::string path;
    Report::Skipped skipped;  // Patterns of functions that are not callers.
    OBR::MemPool::PoolSettings settings;
    bool all = false;
    bool json = false;  // Instead of the text.
    bool folded = false;
    std::string html;  // The file of the page; "-" writes only the page, to standard output. Empty
                       // for no page.
    std::string advice;  // The file with the advice for the page; empty for none.
};

// The JSON of an advice from its file.
std::string ReadAdvice(const std::string& path) {
    if (path.empty()) { return "null"; }
    std::ifstream file(path);
    if (!file) { throw System::Failure(EXIT_FAILURE, path, errno); }
    const auto advice = nlohmann::ordered_json::parse(file, nullptr, false);
    if (!advice.is_object() || !advice.contains("sentences") || !advice.contains("settings")) {
        throw std::runtime_error(path + ": is not the output of 'mempool advise --json'");
    }
    return advice.dump();
}

// Returns the exit status.
int WriteReport(Trace::StepReader& reader, const Options& options, const std::string& advice,
                System::OutputFile* page) {
    CheckSettings(options.settings);
    const Report::Analysis analysis =
        AnalyseTrace(reader, options.path, options.settings, options.skipped);
    if (options.folded && analysis.stacks.empty()) {
        throw std::runtime_error(reader.Name() + ": has no call stacks: record it with --stacks");
    }
    if (options.html == "-") {
        WritePage(*page, analysis, advice);
        return WarnOfBrokenTrace(reader);
    }
    if (options.folded) {
        PrintFolded(std::cout, analysis);
    } else if (options.json) {
        std::cout << Report::ToJson(analysis) << '\n';
    } else {
        PrintAnalysis(std::cout, analysis, options.all ? Extent::All : Extent::Page);
    }
    std::cout << std::flush;
    if (page != nullptr) { WritePage(*page, analysis, advice); }
    return WarnOfBrokenTrace(reader);
}

int ReportOn(const Options& options) {
    try {
        Trace::StepReader reader(options.path);
        const std::string advice = ReadAdvice(options.advice);
        const auto page = OpenPage(options.html, {options.path, options.advice});
        return WriteReport(reader, options, advice, page.get());
    } catch (const std::bad_alloc&) {
        std::cerr << "mempool: " << options.path << ": out of memory\n";
    }
    return EXIT_FAILURE;
}

}  // namespace

Report::Analysis AnalyseTrace(Trace::StepReader& reader, const std::string& path,
                              const OBR::MemPool::PoolSettings& settings, Report::Skipped skipped) {
    while (true) {
        const Progress progress(reader.Name());
        Report::Analysis analysis = Report::Analyse(
            reader, settings,
            [&](auto position) { progress.Show("line " + std::to_string(position)); }, skipped);
        progress.Clear();
        if (analysis.passingOn.empty() || path == "-") { return analysis; }
        skipped.insert(skipped.end(), analysis.passingOn.begin(), analysis.passingOn.end());
        reader = Trace::StepReader(Trace::OpenTrace(path), reader.Name());
    }
}

std::unique_ptr<System::OutputFile> OpenPage(const std::string& path,
                                             const std::vector<std::string>& inputs) {
    if (path.empty()) { return nullptr; }
    Report::CheckCanMakePage();
    return std::make_unique<System::OutputFile>(path, inputs);
}

void WritePage(System::OutputFile& file, const Report::Analysis& analysis,
               const std::string& advice) {
    file.Write(Report::MakePage(analysis, advice));
    file.Commit();
}

void AddReport(Program& program) {
    Subcommand report(program, "report", description, notes);
    const auto options = std::make_shared<Options>();
    report.AddTrace(options->path, "File to report on; - is standard input");
    report.AddFlag("--json", options->json, "Print all figures as JSON");
    report.AddText(
        "--html", options->html, "FILE",
        "Also write a page with charts to FILE; - writes only the page, to standard output");
    report.AddText("--advice", options->advice, "FILE",
                   "Show the advice in FILE, from 'mempool advise --json', on the page");
    report.AddFlag("--folded", options->folded,
                   "Print the call stacks at the peak for flame graph tools");
    report.Exclude("--folded", {"--json"});
    report.AddPatterns("--skip", options->skipped,
                       "Functions that match PATTERN are not callers of stacks; may be repeated");
    report.AddFlag("--all", options->all, "Print every size and every group");
    AddSettings(report, options->settings);
    report.SetJob([report, options] {
        if (report.IsGiven("--advice") && !report.IsGiven("--html")) {
            throw UsageError("--advice requires --html");
        }
        TakeEnvironment(report, options->settings);
        return [options] { return ReportOn(*options); };
    });
}

}  // namespace Tool
