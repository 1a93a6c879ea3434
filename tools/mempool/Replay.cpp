// mempool replay: replays traces on pools and on the heap, and compares.

#include <cstdint>
#include <cstdlib>
#include <exception>
#include <iostream>
#include <limits>
#include <memory>
#include <new>
#include <stdexcept>
#include <string>
#include <vector>

#include <MemPool>
#include <MemPoolSettings>

#include "advise/Advice.hpp"
#include "advise/ForkedMeter.hpp"
#include "mempool/AdviceText.hpp"
#include "mempool/CommandLine.hpp"
#include "mempool/Print.hpp"
#include "mempool/Progress.hpp"
#include "mempool/Settings.hpp"
#include "mempool/Table.hpp"
#include "replay/Measure.hpp"
#include "replay/Recording.hpp"
#include "system/Interruption.hpp"
#include "trace/StepReader.hpp"

namespace Tool {

namespace {

constexpr const char* description =
    "Replay traces of a program on pools and on the heap, and compare";

constexpr const char* notes =
    R"(TRACE is a file of 'mempool record', or the output of a program that ran with
NUV_OBR_MEMPOOL_TRACE=1, plain or compressed by gzip. In a text, only lines with "xmpt:" count.

Settings without an option on the command line come from their environment variables, such as
NUV_OBR_MEMPOOL_BUCKET_SIZE.

pool          --layer heap: an OBR::MemPool::Heap for each pool of the program, or one for all groups
              of a recorded heap, with blocks aligned to 8 bytes. mgr: the same with
              OBR::MemPool::Mgr, and blocks aligned to 4 bytes or less. malloc: the library that
              'mempool try' preloads, with one Heap for all, blocks aligned to 16 bytes, and larger
              blocks from the C library.
heap          operator new[] and delete[]. Blocks that a pool drops are freed one by one; that time
              does not count at the end of a pool. A replay does not write to blocks.
the peak      The moment with the most requested bytes.
bytes held    The bytes of operator new at the peak, as malloc_usable_size counts them, and the GNU C
              library's header of 8 bytes per block. A replay of its own counts them, without timing.
              In a timed replay the counters cost one test of a flag per heap request.
ns per event  Processor time, the median of all rounds. Each replay runs in a new process, so that
              the first use of memory counts, as in a program that starts.
spread        Between the lower and the upper quartile of the rounds.
--sweep       The search of 'mempool advise'. Prints all settings that were tried, those with the
              least time x bytes first.
bad lines     Left out of the replay. The library's own trace does not show Mgr::Clear: after one,
              expect pointers that are allocated twice.
)";

struct Options {
    bool sweep = false;
    unsigned int seconds = 30;
    Replay::Layer layer = Replay::Layer::Heap;
    OBR::MemPool::PoolSettings settings;
    std::vector<std::string> paths;
    unsigned int rounds = 11;
    bool dbg = false;
};

// A row of the table; a ratio only if there is one.
void AddRow(Table& table, const char* label, double pool, double heap, int digits) {
    table.AddRow(label, fmt::format("{:.{}f}", pool, digits), fmt::format("{:.{}f}", heap, digits),
                 heap > 0 ? fmt::format("{:.2f}", pool / heap) : "-");
}

// Returns the exit status.
int Compare(const std::string& path, const Options& options) {
    Trace::StepReader reader(path);
    const Progress progress(reader.Name());
    Replay::Recording recording = Replay::ReadRecording(
        reader, [&](auto position) { progress.Show(fmt::format("line {}", position)); });
    Replay::MergePools(recording);
    if (recording.steps.empty()) { throw std::runtime_error(reader.Name() + ": no event"); }

    constexpr double unlimited = std::numeric_limits<double>::infinity();
    Advise::ForkedMeter meter(recording, options.layer, unlimited, unlimited);
    const double poolBytes = meter.Held(options.settings).OrFail(reader.Name());
    const double heapBytes = meter.Held(Advise::Malloc()).OrFail(reader.Name());
    std::vector<double> pool;
    std::vector<double> heap;
    for (unsigned int round = 1; round <= options.rounds; ++round) {
        progress.Show(fmt::format("round {} of {}", round, options.rounds));
        pool.push_back(meter.Time(options.settings).OrFail(reader.Name()));
        heap.push_back(meter.Time(Advise::Malloc()).OrFail(reader.Name()));
    }
    progress.Clear();

    std::cout << reader.Name() << '\n';
    PrintBadLines(std::cout, reader.Name(), reader.Bad());
    if (options.dbg) {
        Replay::BytesHeld(recording, options.layer, [] { OBR::MemPool::Dbg(); });
    }
    Table table({{"", 0, Align::Left}, {"pool", 10}, {"heap", 10}, {"pool/heap", 10}});
    const auto addSame = [&](const char* label, std::uint64_t value) {
        table.AddRow(label, value, value);
    };
    addSame("pools", recording.pools.size());
    addSame("events", recording.steps.size());
    addSame("blocks at the peak", recording.peakBlocks);
    addSame("bytes at the peak", recording.peakBytes);
    addSame("blocks cleared", recording.numCleared);
    addSame("blocks never freed", recording.numNeverFreed);
    AddRow(table, "bytes held at the peak", poolBytes, heapBytes, 0);
    AddRow(table, "ns per event", Advise::Quantile(pool, 0.5), Advise::Quantile(heap, 0.5), 1);
    table.AddRow("spread", fmt::format("{:.1f}", Advise::Spread(pool)),
                 fmt::format("{:.1f}", Advise::Spread(heap)));
    table.Write(std::cout);
    std::cout << std::flush;
    return WarnOfBrokenTrace(reader);
}

// The same with the settings that a search tries.
int Sweep(const std::string& path, const Options& options) {
    Trace::StepReader reader(path);
    const Progress progress(reader.Name());
    const System::Interruption interruption;
    const Advise::Advice advice =
        Advise::TakeAdvice(reader, {options.layer, 0. + options.seconds, false},
                           [&](const std::string& text) { progress.Show(text); });
    progress.Clear();
    std::cout << reader.Name() << '\n';
    PrintBadLines(std::cout, reader.Name(), reader.Bad());
    PrintTable(std::cout, advice, true);
    std::cout << std::flush;
    return WarnOfBrokenTrace(reader);
}

int ReplayAll(const Options& options) {
    if (!options.sweep) {
        CheckSettings(Replay::InLayer(options.settings, options.layer));
        Replay::UsePools(options.settings);
    }
    int status = EXIT_SUCCESS;
    for (const std::string& path : options.paths) {
        try {
            const auto replay = options.sweep ? Sweep : Compare;
            if (replay(path, options) != EXIT_SUCCESS) { status = EXIT_FAILURE; }
        } catch (const std::bad_alloc&) {
            std::cerr << "mempool: " << path << ": out of memory\n";
            status = EXIT_FAILURE;
        } catch (const std::exception& error) {
            std::cerr << "mempool: " << error.what() << '\n';
            status = EXIT_FAILURE;
        }
    }
    return status;
}

// A sweep chooses its own settings, and only a sweep has --seconds.
void CheckSweep(const Subcommand& replay, bool isSweep) {
    std::vector<std::string> others = {"--rounds", "--dbg"};
    for (const auto& row : OBR::MemPool::SettingTable::all) { others.emplace_back(row.option); }
    for (const std::string& option : others) {
        if (isSweep && replay.IsGiven(option)) { throw UsageError("--sweep excludes " + option); }
    }
    if (!isSweep && replay.IsGiven("--seconds")) { throw UsageError("--seconds requires --sweep"); }
}

}  // namespace

void AddReplay(Program& program) {
    Subcommand replay(program, "replay", description, notes);
    const auto options = std::make_shared<Options>();
    replay.AddTraces(options->paths, "Files to replay, one after the other; - is standard input");
    AddLayer(replay, options->layer);
    AddSettings(replay, options->settings);
    replay.AddNumber("--rounds", options->rounds, 1, 1000000, "Timed replays of each side");
    replay.AddFlag("--dbg", options->dbg, "Print the report of each pool at the peak");
    replay.AddFlag("--sweep", options->sweep,
                   "Try many settings instead of one, and print a table of them");
    AddSeconds(replay, options->seconds);
    replay.SetJob([replay, options] {
        CheckSweep(replay, options->sweep);
        TakeEnvironment(replay, options->settings);
        return [options] { return ReplayAll(*options); };
    });
}

}  // namespace Tool
