// mempool record: runs a program and writes a trace of its allocations.

#include "mempool/RecordCommand.hpp"

#include <unistd.h>

#include <algorithm>
#include <iostream>
#include <map>
#include <memory>
#include <string>

#include "mempool/CommandLine.hpp"
#include "system/Child.hpp"
#include "system/ExitStatus.hpp"

namespace Tool {

namespace {

constexpr const char* description = "Run a program and write a trace of its allocations";

constexpr const char* notes =
    R"(The program runs unchanged, with a recorder loaded before its libraries. Its output, its
standard streams and its exit status are its own; if a signal kills it, mempool dies by the same.
Signals sent to mempool go on to the program. What the program becomes by exec is recorded too, what
it starts is not. A trace that was cut short, by Ctrl-C or a crash of the program, is a whole one.

Recorded are malloc, calloc, realloc (a release and an allocation), reallocarray, free, the aligned
forms, and operator new and delete, which call them. An allocator that is linked into the program
itself cannot be seen.

-o -          The trace goes to standard output, and what the program prints there to standard error.
--by caller   A group is a place that asks for memory: the first return address outside of the C and
              C++ run-time libraries and of functions that pass memory on, with the function's name
              if the file has symbols. Such a function is known by its exported symbol: it contains
              malloc, calloc, realloc, memalign, strdup or strndup, ends in alloc, or belongs to
              the C++ library. --skip names more of them, such as --skip 'new*'. Calls out of a
              function that takes stack by a size of its own count as that function's.
--by module   The program's file and each of its shared libraries is a group.
--pools       Records the pools of libObrMemPool in place of the heap, on or off, Mgr::Clear
              included. The program must use the shared library.

Facts in the trace (mempool text prints them): program, by, cpu_seconds (without the recorder's own
part), allocation_share (of that time, what the allocation calls take, from a sample), threads,
foreign_frees (blocks freed by another thread than their own).

Exit status: the program's own; 125 if recording fails, 126 if the program cannot be run or recorded
(it is statically linked or runs with other rights), 127 if it is not found.
)";

int Run(const Recorder::Order& order) {
    const Recorder::Outcome outcome = RecordAsOrdered(order);
    if (isatty(STDERR_FILENO) != 0) {
        std::cerr << "mempool: " << outcome.numEvents << " events of " << outcome.numThreads
                  << (outcome.numThreads == 1 ? " thread, " : " threads, ") << outcome.traceSize
                  << " bytes in " << order.tracePath << '\n';
    }
    return System::EndLike(outcome.waitStatus);
}

}  // namespace

void AddRecordOptions(CLI::App& subcommand, Recorder::Order& order) {
    static const std::map<std::string, Recorder::By> names = {{"all", Recorder::By::All},
                                                              {"caller", Recorder::By::Caller},
                                                              {"module", Recorder::By::Module},
                                                              {"thread", Recorder::By::Thread}};
    CLI::Option* const by = subcommand.add_option_function<std::string>(
        "--by", [&order](const std::string& name) { order.by = names.at(name); },
        "What makes a group, a traced pool of its own: all, caller, module or thread");
    by->type_name("GROUP")
        ->check(CLI::IsMember(names).description(""))
        ->default_str(std::find_if(names.begin(), names.end(), [&](const auto& each) {
                          return each.second == order.by;
                      })->first);
    subcommand
        .add_option("--skip", order.skipped,
                    "Take no function whose symbol matches PATTERN for a caller; may be repeated")
        ->type_name("PATTERN")
        ->allow_extra_args(false)
        ->check([](const std::string& pattern) {
            return std::string(pattern.empty() ? "the pattern is empty" : "");
        });
    subcommand.add_flag("--pools", order.pools, "Record the pools of libObrMemPool, not the heap")
        ->excludes(by);
}

Recorder::Outcome RecordAsOrdered(const Recorder::Order& order) {
    Recorder::Outcome outcome = Recorder::RecordProgram(order);
    if (order.pools && outcome.numEvents == 0) {
        std::cerr << "mempool: " << order.command.front()
                  << " has made no pool of the shared library, libObrMemPool.so\n";
    }
    if (outcome.isCutByExec) {
        std::cerr << "mempool: " << order.command.front()
                  << " has become a program that cannot be recorded: it is statically linked, or "
                     "runs with other rights\n";
    }
    if (outcome.isAddressSanitized) {
        std::cerr << "mempool: " << order.command.front()
                  << " is built with AddressSanitizer, which slows its allocations and delays its "
                     "frees: record another build\n";
    }
    return outcome;
}

void AddRecord(Program& program) {
    CLI::App& record = *program.commandLine.add_subcommand("record", description);
    record.footer(notes);
    AddCommand(program, record);
    const auto order = std::make_shared<Recorder::Order>();
    order->tracePath = "mempool.trace";
    record
        .add_option("-o,--output", order->tracePath,
                    "The trace to write, over what is there; - is standard output")
        ->type_name("FILE")
        ->capture_default_str();
    AddRecordOptions(record, *order);
    record.callback([&program, order] {
        order->command = program.command;
        if (order->command.empty()) { throw CLI::RequiredError("PROGRAM"); }
        program.job = [order] { return Run(*order); };
    });
}

}  // namespace Tool
