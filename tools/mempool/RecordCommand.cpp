// mempool record: runs a program and writes a trace of its allocations.

#include "mempool/RecordCommand.hpp"

#include <unistd.h>

#include <iostream>
#include <map>
#include <memory>
#include <string>

#include <fmt/format.h>

#include "mempool/CommandLine.hpp"
#include "system/Child.hpp"
#include "system/ExitStatus.hpp"

namespace Tool {

namespace {

constexpr const char* description = "Run a program and write a trace of its allocations";

constexpr const char* notes =
    R"(The program runs unchanged, with a recorder that is loaded before its libraries. Its standard streams
and its exit status do not change; if a signal kills it, mempool ends by the same signal. Signals sent
to mempool are forwarded to the program. A program that replaces this one through exec is recorded
too; child processes are not, unless --children is given. The trace is complete even if Ctrl-C or a
crash ends the program.

Recorded are malloc, calloc, realloc (a release and an allocation), reallocarray, free, the aligned
forms, and operator new and delete, which call them. An allocator that is linked into the program
itself is not recorded.

-o -          The trace goes to standard output, and the program's standard output to standard error.
--by caller   A group is a call site: the first return address outside of the C and C++ run-time
              libraries and of functions that only pass memory on, with the name of the function if
              the file has symbols. A function passes memory on if its symbol contains malloc,
              calloc, realloc, memalign, strdup or strndup, ends in alloc, or belongs to the C++
              library. If the symbol is not exported, 'mempool' has to look it up, and the
              function's blocks of the first milliseconds stay in its name. --skip names more such
              functions by their exported symbols, for example --skip 'new*'. A function whose
              stack frame varies in size (alloca) is shown instead of its callers.
--stacks      A group is a call stack: the innermost 32 frames, or DEPTH frames, at most 64. A stack
              ends at a function whose stack frame varies in size.
--by module   The program's file and each of its shared libraries are a group.
--children    Records each child process, and their children, into a file of its own: FILE with the
              number of the process, as in mempool.trace.4711. If there is such a file, the name gets
              a further number. A child without an event leaves no file. The trace of a child that
              only forks begins there: blocks of its parent are not in it. Recording ends with the
              program, even if children are still running. LD_PRELOAD and MEMPOOL_RECORD_CHANNEL stay
              in the environment of the program, for its children to find.
--pools       Records the pools of libObrMemPool instead of the heap, enabled or not, including
              Mgr::Clear. The program must use the shared library.

Facts in the trace, which 'mempool text' prints: program, by, cpu_seconds (without the recorder's own
part), allocation_share (the share of that time that allocation calls take, estimated from samples),
allocation_share_error (how far off that can be), threads, foreign_frees (blocks freed by another
thread than the one that allocated them).

Exit status: the program's own; 125 if recording fails, 126 if the program cannot be run or recorded
(it is statically linked or runs with other rights), 127 if it is not found.
)";

int Run(const Recorder::Order& order) {
    const Recorder::Outcome outcome = RecordAsOrdered(order);
    if (isatty(STDERR_FILENO) != 0) {
        std::cerr << "mempool: " << outcome.numEvents << " events of " << outcome.numThreads
                  << (outcome.numThreads == 1 ? " thread, " : " threads, ") << outcome.traceSize
                  << " bytes in " << order.tracePath;
        if (order.children) {
            std::cerr << "; " << outcome.numChildren << " child processes in " << order.tracePath
                      << ".PID";
        }
        std::cerr << '\n';
    }
    return System::EndLike(outcome.waitStatus);
}

}  // namespace

void AddRecordOptions(Subcommand& subcommand, Recorder::Order& order) {
    static const std::map<std::string, Recorder::By> names = {{"all", Recorder::By::All},
                                                              {"caller", Recorder::By::Caller},
                                                              {"module", Recorder::By::Module},
                                                              {"thread", Recorder::By::Thread}};
    subcommand.AddChoice(
        "--by", names, order.by, "GROUP",
        "What makes a group, a traced pool of its own: all, caller, module or thread");
    subcommand.AddPatterns(
        "--skip", order.skipped,
        "Functions whose symbols match PATTERN are not callers; may be repeated");
    subcommand.AddOptionalValue(
        "--stacks", "[=DEPTH]", "Make a group of each call stack, of its innermost DEPTH frames",
        [&order](const std::string& depth) {
            order.by = Recorder::By::Stack;
            if (!depth.empty()) {
                order.depth = ParseNumber("--stacks", depth, 1, Recorder::maxDepth);
            }
        });
    subcommand.Exclude("--stacks", {"--by", "--skip"});
    subcommand.AddFlag("--pools", order.pools, "Record the pools of libObrMemPool, not the heap");
    subcommand.Exclude("--pools", {"--by", "--stacks"});
}

Recorder::Outcome RecordAsOrdered(const Recorder::Order& order) {
    Recorder::Outcome outcome = Recorder::RecordProgram(order);
    const auto warn = [&](const std::string& what) {
        std::cerr << "mempool: " << order.command.front() << ' ' << what << '\n';
    };
    if (order.pools && outcome.numEvents == 0) {
        warn("has made no pool of the shared library, libObrMemPool.so");
    }
    if (outcome.isCutByExec) {
        warn(
            "has become a program that cannot be recorded: it is statically linked, or runs with "
            "other rights");
    }
    if (outcome.numLostChildren != 0) {
        const bool isOne = outcome.numLostChildren == 1;
        warn(fmt::format(
            "has started {} child process{}{}, which {} not recorded{}", outcome.numLostChildren,
            isOne ? "" : "es", outcome.lostNames.empty() ? "" : " (" + outcome.lostNames + ")",
            isOne ? "was" : "were",
            order.children
                ? ": too many were running"
                : fmt::format(
                      " ({:.2f} s of processor time); 'mempool record --children' records them",
                      outcome.lostSeconds)));
    }
    if (outcome.isAddressSanitized) {
        warn(
            "is built with AddressSanitizer, which slows its allocations and delays its frees: "
            "record another build");
    }
    return outcome;
}

void AddRecord(Program& program) {
    Subcommand record(program, "record", description, notes);
    record.AddCommand();
    const auto order = std::make_shared<Recorder::Order>();
    order->tracePath = "mempool.trace";
    record.AddText("-o,--output", order->tracePath, "FILE",
                   "The trace to write, replacing the file; - is standard output");
    AddRecordOptions(record, *order);
    record.AddFlag("--children", order->children,
                   "Record each child process too, in a file of its own");
    record.SetJob([&program, order] {
        order->command = program.command;
        return [order] { return Run(*order); };
    });
}

}  // namespace Tool
