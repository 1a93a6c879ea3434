#include "preload/Trial.hpp"

#include <dlfcn.h>
#include <fcntl.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>
#include <cmath>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <memory>
#include <string_view>
#include <utility>

#include <fmt/format.h>

#include "advise/Verdict.hpp"
#include "system/Child.hpp"
#include "system/Descriptor.hpp"
#include "system/ExitStatus.hpp"
#include "system/Interruption.hpp"
#include "system/ProgramFile.hpp"

namespace Preload {

namespace {

// Whether the loader finds the library. Loads it in a child, since it may change the process.
bool IsInstalled(const char* library) {
    const pid_t child = fork();
    if (child == 0) { _exit(dlopen(library, RTLD_NOW) == nullptr ? 1 : 0); }
    int status = -1;
    waitpid(child, &status, 0);
    return status == 0;
}

// The output of one run on one stream, in a file without a name.
class Output {
public:
    Output() : file(std::tmpfile()) {
        if (file == nullptr) {
            throw System::Failure(System::ownFailure, "a temporary file", errno);
        }
    }
    Output(const Output&) = delete;
    Output& operator=(const Output&) = delete;
    ~Output() { std::fclose(file); }

    int Descriptor() const { return fileno(file); }

    // The next piece, empty at the end.
    std::string_view Read() {
        return {piece.data(), std::fread(piece.data(), 1, piece.size(), file)};
    }
    void Rewind() { std::rewind(file); }

    void Show(std::FILE* stream) {
        Rewind();
        for (std::string_view text = Read(); !text.empty(); text = Read()) {
            std::fwrite(text.data(), 1, text.size(), stream);
        }
        std::fflush(stream);
    }

    bool IsLike(Output& other) {
        Rewind();
        other.Rewind();
        while (true) {
            const std::string_view text = Read();
            if (text != other.Read()) { return false; }
            if (text.empty()) { return true; }
        }
    }

private:
    std::FILE* const file;
    std::array<char, 1 << 16> piece = {};
};

struct Run {
    Output output;
    Output errors;
    int status = 0;
    double cpuSeconds = 0;
    double wallSeconds = 0;
    double peakBytes = 0;
    double pageFaults = 0;
};

double Seconds(const timeval& time) {
    return static_cast<double>(time.tv_sec) + 1e-6 * static_cast<double>(time.tv_usec);
}

// Runs in the child, before the program.
void Prepare(const Order& order, const Side& side, int input, const Run& run) {
    dup2(input, STDIN_FILENO);
    dup2(run.output.Descriptor(), STDOUT_FILENO);
    dup2(run.errors.Descriptor(), STDERR_FILENO);
    if (side.library.empty()) { return; }
    for (const auto& [name, value] : Advise::EnvironmentOf(order.settings)) {
        if (side.name == "pools") { setenv(name.c_str(), value.c_str(), 1); }
    }
    const char* const present = std::getenv("LD_PRELOAD");
    const std::string others = present == nullptr ? "" : std::string(":") + present;
    setenv("LD_PRELOAD", (side.library + others).c_str(), 1);
}

std::unique_ptr<Run> RunOnce(const Order& order, const Side& side) {
    auto run = std::make_unique<Run>();
    const std::string path = order.input.empty() ? "/dev/null" : order.input;
    const System::Descriptor input(open(path.c_str(), O_RDONLY | O_CLOEXEC));
    if (!input.IsOpen()) { throw System::Failure(System::ownFailure, path, errno); }
    const auto start = std::chrono::steady_clock::now();
    const pid_t child =
        System::Start(order.command, [&] { Prepare(order, side, input.Number(), *run); });
    rusage used = {};
    while (wait4(child, &run->status, 0, &used) < 0 && errno == EINTR) {
        kill(child, System::Interruption::Signal());
    }
    const std::chrono::duration<double> taken = std::chrono::steady_clock::now() - start;
    run->wallSeconds = taken.count();
    run->cpuSeconds = Seconds(used.ru_utime) + Seconds(used.ru_stime);
    run->peakBytes = 1024 * static_cast<double>(used.ru_maxrss);
    run->pageFaults = static_cast<double>(used.ru_minflt);
    return run;
}

Advise::Figures FiguresOf(const Side& side, unsigned int rounds) {
    return {Advise::Quantile(side.cpuSeconds, 0.5), Advise::Spread(side.cpuSeconds),
            Advise::Quantile(side.peakBytes, 0.5), rounds};
}

std::string Compared(const std::string& who, const Result& result, const Result& malloc) {
    return fmt::format("{} the program takes {:.2f} of malloc's time{} and {:.2f} of its memory.",
                       who, result.timeRatio,
                       result.figures.rounds < Advise::leastRounds ? " (too few rounds to compare)"
                       : DifferInTime(result.figures, malloc.figures)
                           ? ""
                           : " (the same, within the spread of the runs)",
                       result.bytesRatio);
}

}  // namespace

Trial TryProgram(const Order& order,
                 const std::function<void(unsigned int round, const std::string& side)>& atRun) {
    Trial trial;
    const auto add = [&](const char* name, const std::string& library) {
        trial.sides.emplace_back();
        trial.sides.back().name = name;
        trial.sides.back().library = library;
    };
    add("malloc", "");
    add("pools", System::FindBesideTool(PRELOAD_PLACES, PRELOAD_NAME));
    if (IsInstalled("libmimalloc.so.2")) { add("mimalloc", "libmimalloc.so.2"); }

    const System::Interruption interruption;
    atRun(0, "malloc");
    const std::unique_ptr<Run> first = RunOnce(order, trial.sides.front());
    trial.waitStatus = first->status;
    first->output.Show(order.showsOnErrors ? stderr : stdout);
    first->errors.Show(stderr);
    for (unsigned int round = 1; round <= order.rounds; ++round) {
        std::vector<std::unique_ptr<Run>> runs(trial.sides.size());
        for (std::size_t i = 0; i < runs.size(); ++i) {
            const std::size_t place = (i + round) % runs.size();  // Each is first in turn.
            if (System::Interruption::Signal() != 0) { return trial; }
            atRun(round, trial.sides[place].name);
            runs[place] = RunOnce(order, trial.sides[place]);
        }
        if (System::Interruption::Signal() != 0) { return trial; }
        for (std::size_t i = 0; i < runs.size(); ++i) {
            Side& side = trial.sides[i];
            side.cpuSeconds.push_back(runs[i]->cpuSeconds);
            side.wallSeconds.push_back(runs[i]->wallSeconds);
            side.peakBytes.push_back(runs[i]->peakBytes);
            side.pageFaults.push_back(runs[i]->pageFaults);
            const bool isLike = runs[i]->status == first->status &&
                                first->output.IsLike(runs[i]->output) &&
                                first->errors.IsLike(runs[i]->errors);
            if (side.isSame && !isLike) { side.otherStatus = runs[i]->status; }
            side.isSame = side.isSame && isLike;
        }
        trial.rounds = round;
    }
    return trial;
}

Conclusion Conclude(const Trial& trial) {
    Conclusion conclusion;
    const bool isSteady = trial.sides.at(0).isSame;
    const Advise::Figures malloc = FiguresOf(trial.sides.at(0), trial.rounds);
    for (const Side& side : trial.sides) {
        const Advise::Figures figures = FiguresOf(side, trial.rounds);
        conclusion.results.push_back(
            {side.name, figures, Advise::Quantile(side.wallSeconds, 0.5),
             Advise::Quantile(side.pageFaults, 0.5), Cost(figures, malloc, Advise::Aim::Time),
             Cost(figures, malloc, Advise::Aim::Bytes), isSteady && !side.isSame});
    }
    // The whole program was measured, so the share is 1, its start is included, and the number of
    // events does not matter.
    Advise::Findings findings{malloc, {}, {{{}, conclusion.results.at(1).figures}}, {}};
    if (conclusion.results.size() > 2 && !conclusion.results[2].differs) {
        findings.mimalloc = conclusion.results[2].figures;
    }
    const Advise::Verdict verdict =
        Advise::Judge(findings, {1000000, 0, 1, {}, {}, 0, Advise::leastMeasured});
    conclusion.verdict = conclusion.results[1].differs ? "differs" : verdict.Name();
    const auto add = [&](const char* who, std::size_t side) {
        const Result& result = conclusion.results[side];
        conclusion.sentences.push_back(
            result.differs
                ? fmt::format("{} the program does not do the same, so its figures there mean "
                              "nothing: its output or exit status differs; it {}.",
                              who, System::HowEnded(trial.sides[side].otherStatus))
                : Compared(who, result, conclusion.results[0]));
    };
    add("On pools", 1);
    if (conclusion.results.size() > 2) {
        const bool isBetter = verdict.isMimallocBetter;
        add(!isBetter                     ? "With mimalloc"
            : verdict.advised.has_value() ? "Preloaded mimalloc gains more: with it"
                                          : "Only preloaded mimalloc gains: with it",
            2);
    }
    if (isSteady) {
        conclusion.sameOutput = trial.sides.at(1).isSame;
    } else {
        conclusion.sentences.emplace_back(
            "The output on malloc differs from run to run and was not compared.");
    }
    return conclusion;
}

}  // namespace Preload
