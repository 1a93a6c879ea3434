// mempool run: records a program, then reports and advises.

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <exception>
#include <filesystem>
#include <iostream>
#include <memory>
#include <stdexcept>
#include <string>
#include <system_error>

#include "advise/Advice.hpp"
#include "mempool/AdviceText.hpp"
#include "mempool/Advise.hpp"
#include "mempool/CommandLine.hpp"
#include "mempool/Print.hpp"
#include "mempool/Progress.hpp"
#include "mempool/RecordCommand.hpp"
#include "mempool/Report.hpp"
#include "mempool/ReportText.hpp"
#include "mempool/Settings.hpp"
#include "report/Analysis.hpp"
#include "system/Child.hpp"
#include "system/Descriptor.hpp"
#include "system/ExitStatus.hpp"
#include "system/Interruption.hpp"
#include "system/ProgramFile.hpp"
#include "trace/OpenTrace.hpp"

namespace Tool {

namespace {

constexpr const char* description =
    "Run a program, and report where its memory is and whether it would gain from pools";

constexpr const char* notes =
    R"(The program runs as under 'mempool record'. After it ends, mempool prints the output of 'mempool
report' and 'mempool advise' for its trace to standard error. The program's own output and exit status
do not change. If recording fails or the page cannot be written, the status is 125, 126 or 127, as of
'mempool record'. The trace is in a file without a name in TMPDIR or /tmp, and is gone at the end.

The report is by caller by default. The advice is by default on the library that 'mempool try'
preloads, and ends with the command line that tries it.

Ctrl-C ends the program, and mempool reports on what was recorded. After that it ends the search for
settings, and mempool prints the report and what was measured.
)";

struct Options {
    Options() { order.by = Recorder::By::Caller; }

    Recorder::Order order;
    std::string html;
    unsigned int seconds = 15;
    Replay::Layer layer = Replay::Layer::Malloc;
};

// A file whose name is removed as soon as it is open, so that nothing is left however this process
// ends. The recorded program does not inherit it.
class NamelessFile {
public:
    NamelessFile()
        : name(std::filesystem::temp_directory_path() / "mempool.XXXXXX"),
          file(mkostemp(name.data(), O_CLOEXEC)) {
        if (!file.IsOpen()) { throw std::system_error(errno, std::generic_category(), name); }
        unlink(name.c_str());
    }

    // A path by which this process can open it.
    std::string Path() const { return "/proc/self/fd/" + std::to_string(file.Number()); }

    // The text of an error, with the file's former name instead of that path.
    std::string Named(std::string error) const {
        const std::string path = Path();
        const std::size_t place = error.find(path);
        if (place != std::string::npos) { error.replace(place, path.size(), name); }
        return error;
    }

private:
    std::string name;
    const System::Descriptor file;
};

Trace::StepReader Open(const NamelessFile& trace, const Options& options) {
    return {Trace::OpenTrace(trace.Path()), options.order.command.front()};
}

Report::Analysis ReportOn(const NamelessFile& trace, const Options& options) {
    Trace::StepReader reader = Open(trace, options);
    Report::Analysis analysis =
        AnalyseTrace(reader, trace.Path(), OBR::MemPool::PoolSettings(), {});
    std::cerr << '\n';
    PrintAnalysis(std::cerr, analysis, Extent::Short);
    return analysis;
}

// Returns the advice as JSON.
std::string AdviseOn(const NamelessFile& trace, const Options& options) {
    Trace::StepReader reader = Open(trace, options);
    const Progress progress("mempool");
    const Advise::Advice advice =
        Advise::TakeAdvice(reader, {options.layer, 0. + options.seconds},
                           [&](const std::string& text) { progress.Show(text); });
    progress.Clear();
    std::cerr << '\n';
    PrintTable(std::cerr, advice, false);
    std::cerr << '\n';
    PrintVerdict(std::cerr, advice);
    if (options.layer == Replay::Layer::Malloc && advice.verdict.advised.has_value()) {
        const auto& advised = advice.findings.settings[*advice.verdict.advised];
        std::cerr << "\nTo try it:\n\n    " << TryCommand(advised.settings, options.order.command)
                  << '\n';
    }
    return AdviceAsJson(advice);
}

int Run(Options options) {
    const auto page =
        OpenPage(options.html, {System::FindProgram(options.order.command.front()), "-"});
    const NamelessFile trace;
    options.order.tracePath = trace.Path();
    const System::Interruption interruption;  // Signals during the recording go to the program.
    Recorder::Outcome outcome;
    try {
        outcome = RecordAsOrdered(options.order);
    } catch (const System::Failure& failure) {
        throw System::Failure(failure.Status(), trace.Named(failure.what()));
    }
    const Report::Analysis analysis = ReportOn(trace, options);
    std::string advice = "null";
    try {
        if (!outcome.isCutByExec) { advice = AdviseOn(trace, options); }
    } catch (const std::exception& error) {
        std::cerr << "mempool: no advice: " << error.what() << '\n';
    }
    if (page != nullptr) { WritePage(*page, analysis, advice); }
    return System::EndLike(outcome.waitStatus);
}

}  // namespace

void AddRun(Program& program) {
    Subcommand run(program, "run", description, notes);
    run.AddCommand();
    const auto options = std::make_shared<Options>();
    AddRecordOptions(run, options->order);
    run.AddText("--html", options->html, "FILE",
                "Also write the report and the advice to FILE, as a page with charts");
    AddLayer(run, options->layer);
    AddSeconds(run, options->seconds);
    run.SetJob([&program, options] {
        options->order.command = program.command;
        return [options] { return Run(*options); };
    });
}

}  // namespace Tool
