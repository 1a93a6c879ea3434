// `mempool record` on a program that does everything that makes recording hard. The test reads the
// trace as text: "+70001" for an allocated block, "-70001" for a freed one.

#include <cstdlib>
#include <ctime>
#include <map>
#include <sstream>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "Shell.hpp"
#include "trace/StepReader.hpp"

using testing::ContainsRegex;
using testing::HasSubstr;

namespace {

struct Recorded {
    std::string story;  // The events of the program's own blocks.
    std::map<std::string, std::string> facts;
    std::map<std::string, int> numBlocks;  // Of its own, by the names of the pools.
    std::uint64_t numEvents = 0;
    std::uint64_t milliseconds = 0;  // When the last ones happened.
};

Recorded ReadTrace(const std::string& name) {
    Trace::StepReader reader(FolderPath() + "/" + name);
    Recorded recorded;
    std::ostringstream story;
    Trace::Step step = {};
    while (reader.Next(step)) {
        ++recorded.numEvents;
        const bool isOwn = step.block.size >= 70000 && step.block.size < 71000;
        if (!isOwn) { continue; }
        if (step.kind == Trace::Kind::Allocated) {
            story << '+' << step.block.size << ' ';
            ++recorded.numBlocks[reader.Blocks().Pools().at(step.pool).name];
        }
        if (step.kind == Trace::Kind::Freed) { story << '-' << step.block.size << ' '; }
    }
    EXPECT_EQ(reader.Bad().Total(), 0U);
    EXPECT_EQ(reader.Warning(), "");
    recorded.story = story.str();
    recorded.facts = reader.Facts();
    recorded.milliseconds = reader.Milliseconds().value_or(0);
    return recorded;
}

Recorded Record(const std::string& what, const std::string& options = "", int exitStatus = 0) {
    const std::string host = "./Host ";
    Shell::Output("ln -sf " HOST " Host");
    EXPECT_EQ(
        Shell::Output(MEMPOOL " record -o trace " + options + " -- " + host + what, exitStatus),
        "");
    return ReadTrace("trace");
}

TEST(Record, RecordsTheMallocFamily) {
    const Recorded recorded = Record("family");
    EXPECT_EQ(recorded.story.substr(0, recorded.story.find("+70005")),
              "+70000 +70001 -70001 +70007 -70007 +70002 -70002 +70003 -70003 +70004 -70004 +70008 "
              "-70008 ");
    EXPECT_THAT(recorded.story,
                HasSubstr("+70005 -70005 +70016 -70016 +70007 -70007 +70009 -70009 +70010 -70010 "
                          "-70000 "));
    EXPECT_EQ(recorded.facts.at("program"), "./Host family");
    EXPECT_EQ(recorded.facts.at("by"), "all");
    EXPECT_EQ(recorded.facts.at("threads"), "1");
    EXPECT_EQ(recorded.facts.at("foreign_frees"), "0");
    EXPECT_EQ(recorded.facts.count("allocation_share"), 0U) << "Of few calls it would be a guess.";
}

TEST(Record, RecordsEachBlockOfOperatorNewOnce) {
    EXPECT_EQ(Record("operators").story,
              "+70000 +70001 -70001 +70002 -70002 +70003 -70003 +70004 -70004 +70016 -70016 "
              "+70016 -70016 ");
}

// If the order is kept, no block is allocated twice, and none is freed that is not allocated.
TEST(Record, KeepsTheOrderOfThreads) {
    const Recorded recorded = Record("threads", "--by thread");
    EXPECT_EQ(recorded.facts.at("threads"), "6");
    EXPECT_EQ(recorded.numBlocks.size(), 6U);
    EXPECT_EQ(recorded.numBlocks.at("thread 2"), 20000);
    EXPECT_EQ(std::stoi(recorded.facts.at("foreign_frees")) > 0, true);
    EXPECT_GT(recorded.numEvents, 160000U);
}

TEST(Record, LeavesChildrenAloneAndCountsThem) {
    Shell::Output("ln -sf " HOST " Host");
    const auto record = [](const std::string& command) {
        const std::string text = Shell::Output(MEMPOOL " record -o trace " + command);
        EXPECT_THAT(text, ContainsRegex("^mempool: .* \\([0-9.]+ s of processor time\\); 'mempool "
                                        "record --children' records them\n$"));
        return text.substr(9, text.find(" not recorded") - 9) + ": " + ReadTrace("trace").story;
    };
    EXPECT_EQ(record("./Host fork"),
              "./Host has started 1 child process, which was: +70000 +70001 -70001 +70003 -70003 ");
    EXPECT_EQ(record("./Host vfork"),
              "./Host has started 1 child process (sh), which was: +70000 +70001 -70001 ");
    EXPECT_EQ(record("./Host spawn"),
              "./Host has started 1 child process (sh), which was: +70000 +70001 -70001 ");
    EXPECT_EQ(record("bash -c './Host exit; /usr/bin/true; ls >/dev/null; ls >/dev/null'"),
              "bash has started 4 child processes (Host, true, ls), which were: ");
    EXPECT_EQ(Shell::Output(MEMPOOL " record -o trace sh -c './Host spin; true' 2>&1 | grep -c ' "
                                    "(0[.][1-9]. s of'"),
              "1\n");
}

TEST(Record, KeepsTheTracesOfChildrenApart) {
    Shell::Output("ln -sf " HOST " Host");
    const auto record = [](const std::string& command) {
        EXPECT_EQ(Shell::Output("rm -f trace*; " MEMPOOL " record --children -o trace " + command),
                  "");
        std::multimap<std::string, std::string> stories;
        std::istringstream files(Shell::Output("ls | grep '^trace[.]' | cat"));
        for (std::string file; std::getline(files, file);) {
            const Recorded child = ReadTrace(file);
            stories.emplace(child.facts.at("program"), child.story);
        }
        return stories;
    };
    const auto is = [](const std::string& program, const std::string& story) {
        return testing::Pair(program, story);
    };
    const std::string exits = "+70000 +70001 -70001 ";
    EXPECT_THAT(record("./Host fork"), testing::ElementsAre(is("./Host fork", "+70002 -70002 ")));
    EXPECT_EQ(ReadTrace("trace").story, "+70000 +70001 -70001 +70003 -70003 ");
    EXPECT_THAT(record("./Host spawn").count("./Host family"), 1U);
    const auto many = record("sh -c 'for i in $(seq 100); do env -i ./Host exit & done; wait'");
    EXPECT_THAT(many.count("./Host exit"), 100U);
    for (const auto& [program, story] : many) {
        EXPECT_EQ(story, program == "./Host exit" ? exits : "") << program;
    }
    // Of a program that cannot be recorded nothing is left, and no file is replaced.
    EXPECT_TRUE(record("sh -c '" STATIC_HOST "; true'").empty());
    Shell::Output("echo 'echo mine >trace.$$; exec ./Host exit' >script");
    EXPECT_THAT(Shell::Output(MEMPOOL " record --children -o trace sh -c 'sh script; true'; "
                                      "grep -l mine trace.*"),
                ContainsRegex("^trace[.][0-9]+\n$"));
    EXPECT_EQ(Shell::Output("mv $(ls trace.*.2) trace; ls trace.*.2 2>/dev/null | wc -l"), "0\n");
    EXPECT_EQ(ReadTrace("trace").story, exits);
    EXPECT_THAT(Shell::Output(MEMPOOL " record --children -o - true", 125),
                HasSubstr("mempool: -: --children needs the name of a file"));
}

// The blocks of the old program are gone, and the callers are those of the new one.
TEST(Record, FollowsAProgramThatBecomesAnother) {
    const Recorded exec = Record("exec", "--by caller");
    EXPECT_THAT(exec.story, testing::StartsWith("+70000 +70001 -70001 +70000 +70001 "));
    EXPECT_THAT(exec.numBlocks, testing::Contains(testing::Key(ContainsRegex("^FirstCaller"))));
    Record("execs 40");  // Some threads are between taking a slot and filling it.
    const auto record = [](const std::string& command, int status) {
        const std::string text = Shell::Output(MEMPOOL " record -o trace " + command, status);
        return text + ReadTrace("trace").story;
    };
    const std::string story = "+70000 +70001 -70001 ";
    EXPECT_EQ(record("env X=1 ./Host exit", 7), story);
    EXPECT_EQ(ReadTrace("trace").facts.at("threads"), "1");
    EXPECT_EQ(record("sh -c 'exec ./lost; exit 1' 2>/dev/null", 127), "");
    const std::string lost =
        "bash -c 'shopt -s execfail; exec ./lost 2>/dev/null; echo /proc/self/fd/*'";
    EXPECT_EQ(record(lost, 0), Shell::Output(lost));
    EXPECT_EQ(record("env LD_PRELOAD=libz.so.1 sh -c 'echo $LD_PRELOAD; exec ./Host exit'", 7),
              "libz.so.1\n" + story);
    EXPECT_EQ(record("env " STATIC_HOST, 0),
              "mempool: env has become a program that cannot be recorded: it is statically linked, "
              "or runs with other rights\n");
}

TEST(Record, FollowsTheProgramToItsEnd) {
    EXPECT_EQ(Record("load").story, "+70000 +70001 -70001 +70002 -70002 ");
    EXPECT_THAT(Record("signals").story, ContainsRegex("^.70000 (.70001 -70001 )+$"));
    EXPECT_EQ(Record("exit", "", 7).story, "+70000 +70001 -70001 ");
    EXPECT_EQ(
        Shell::Output("exec 2>/dev/null; ulimit -c 0; " MEMPOOL " record -o trace ./Host abort; "
                      "kill -l $?"),
        "ABRT\n");
    EXPECT_EQ(ReadTrace("trace").story, "+70000 +70001 -70001 ");
}

// A signal to mempool is forwarded to the program, and mempool ends in the same way.
TEST(Record, DiesByTheSignalOfTheProgram) {
    Shell::Output("ln -sf " HOST " Host");
    for (const std::string signal : {"TERM", "HUP", "USR1", "USR2"}) {
        EXPECT_EQ(Shell::Output(MEMPOOL " record -o trace ./Host run >out & "
                                        "until grep -qs ready out; do sleep 0.01; done; "
                                        "kill -" +
                                signal + " $!; wait $! 2>/dev/null; kill -l $?; rm out"),
                  signal + "\n");
        EXPECT_EQ(ReadTrace("trace").story, "+70000 +70001 -70001 ");
    }
}

TEST(Record, NamesTheGroups) {
    const auto byCaller = Record("callers", "--by caller").numBlocks;
    ASSERT_EQ(byCaller.size(), 5U);
    for (const char* name :
         {"^FirstCaller\\(\\)\\+0x[0-9a-f]+ \\(RecordHost[,)]",
          "^Second::Caller\\+0x[0-9a-f]+ \\(RecordHost[,)]", "^ThirdCaller\\(\\)\\+0x"}) {
        EXPECT_THAT(byCaller, testing::Contains(testing::Key(ContainsRegex(name))));
    }
    const std::string after =
        Shell::Output("objdump -d --prefix-addresses " HOST
                      " | grep -A1 '<_Z11FirstCallerv.*call .*malloc' | "
                      "sed -n 's/.*_Z11FirstCallerv\\(+0x[0-9a-f]*\\)>.*/\\1/p' | tail -1");
    EXPECT_THAT(byCaller, testing::Contains(testing::Key(HasSubstr(
                              "FirstCaller()" + after.substr(0, after.size() - 1) + " ("))));
    EXPECT_EQ(Record("callers", "--by module").numBlocks,
              (std::map<std::string, int>{{"RecordHost", 5}}));
    const auto skipped = Record("callers", "--by caller --skip no --skip '*Caller*'").numBlocks;
    EXPECT_THAT(skipped, testing::Contains(testing::Key(ContainsRegex("^main\\+0x"))));
    EXPECT_THAT(skipped, testing::Not(testing::Contains(testing::Key(HasSubstr("Caller()")))));
    EXPECT_THAT(Record("exit", "--by caller", 7).numBlocks,
                testing::Contains(testing::Key(ContainsRegex("^Use\\(unsigned long\\)"))));
    const auto local = Record("local", "--by caller").numBlocks;
    EXPECT_THAT(local, testing::Contains(testing::Pair(ContainsRegex("^local_alloc"), 1)));
    EXPECT_THAT(local, testing::Contains(testing::Pair(ContainsRegex("^FifthCaller"), 2)));
}

TEST(Record, NamesFunctionsWithoutASymbolByTheirPlace) {
    Shell::Output("strip -o Stripped " HOST "; " MEMPOOL
                  " record -o trace --by caller ./Stripped family");
    const std::string start =
        Shell::Output("nm " HOST " | sed -n 's/^0*\\(.*\\) t _GLOBAL__sub_I_.*/\\1/p'");
    EXPECT_THAT(
        ReadTrace("trace").numBlocks,
        testing::Contains(testing::Key(ContainsRegex("^0x" + start.substr(0, start.size() - 1) +
                                                     "[+]0x[0-9a-f]{1,2} [(]Stripped[)]$"))));
    Shell::Output(MEMPOOL " record -o trace --by caller " BARE_HOST);
    EXPECT_THAT(
        ReadTrace("trace").numBlocks,
        testing::Contains(testing::Key(ContainsRegex("^RecordBareHost[+]0x[0-9a-f]{1,5}$"))));
}

TEST(Record, NamesFunctionsOfRust) {
    const auto names = Record("names", "--by caller").numBlocks;
    for (const char* name :
         {"demo::parse::node", "demo::grow", "demo::grow#2", "<demo::Tree as demo::Walk>::step"}) {
        EXPECT_THAT(
            names, testing::Contains(testing::Key(testing::StartsWith(std::string(name) + "+0x"))));
    }
}

TEST(Record, KeepsStacks) {
    const auto isStack = [](const std::string& pattern) {
        return testing::Contains(testing::Key(ContainsRegex(pattern)));
    };
    const std::string third = ";main\\+[^;]*;ThirdCaller\\(\\)\\+[^;]*;pass_Alloc\\+[^;]*$";
    EXPECT_THAT(Record("callers", "--stacks").numBlocks, isStack("^_start\\+.*" + third));
    const auto cut = Record("exec", "--stacks=2").numBlocks;
    EXPECT_THAT(cut, isStack("^main\\+[^;]*;FirstCaller\\(\\)\\+[^;]*$"));
    EXPECT_THAT(cut, isStack("^ThirdCaller\\(\\)\\+[^;]*;pass_Alloc\\+[^;]*$"));
    EXPECT_THAT(Record("alloca", "--stacks").numBlocks,
                isStack("^FourthCaller\\([^;]*;FirstCaller\\(\\)\\+[^;]*$"));
}

TEST(Record, EstimatesTheShareOfTheAllocations) {
    const auto spin = Record("spin", "--by caller").facts;
    const Recorded allocate = Record("allocate");
    const double share = std::stod(allocate.facts.at("allocation_share"));
    EXPECT_LT(std::stod(spin.at("allocation_share")), share / 3);
    // A program that shares its core with another one takes longer for its other work.
    EXPECT_GT(std::stod(spin.at("cpu_seconds")), 0.07);
    EXPECT_LT(std::stod(spin.at("cpu_seconds")), 0.2);
    EXPECT_GT(share, 0.5) << "The recorder's time does not count.";
    const double error = std::stod(allocate.facts.at("allocation_share_error"));
    EXPECT_GT(error, 0.25 * share);
    EXPECT_LT(error, 2 * share);
    EXPECT_GT(std::stod(Record("clear").facts.at("allocation_share")), 0.5) << "In few calls.";
    EXPECT_GE(allocate.numEvents, 2000000U);
    const auto cpuSeconds = std::stod(allocate.facts.at("cpu_seconds"));
    const double whole = std::stod(Shell::FileBytes("ticks")) / CLOCKS_PER_SEC;
    EXPECT_LT(cpuSeconds, 0.9 * whole) << "The recorder's part is in it.";
    const auto byStack = std::stod(Record("allocate", "--stacks").facts.at("cpu_seconds"));
    EXPECT_LT(byStack, 0.75 * std::stod(Shell::FileBytes("ticks")) / CLOCKS_PER_SEC);
    EXPECT_GT(static_cast<double>(allocate.milliseconds), 500 * cpuSeconds);
    EXPECT_LT(allocate.milliseconds, 60'000U);
}

TEST(Record, LeavesTheEnvironmentAsItWas) {
    Shell::Output("ln -sf " HOST " Host");
    const std::string record = MEMPOOL " record -o trace ";
    for (const std::string set :
         {"env -i A=1 ", "env -i LD_PRELOAD=libz.so.1 ASAN_OPTIONS=verify_asan_link_order=0 "}) {
        EXPECT_EQ(Shell::Output(set + record + "./Host environment"),
                  Shell::Output(set + "./Host environment"));
    }
    EXPECT_THAT(
        Shell::Output(record + SANITIZED_HOST),
        ContainsRegex("^mempool: " SANITIZED_HOST " is built with AddressSanitizer[^\n]*\n$"));
    EXPECT_EQ(Shell::Output(record + "grep Sig[BI] /proc/self/status"),
              Shell::Output("grep Sig[BI] /proc/self/status"));
    EXPECT_EQ(
        Shell::Output("echo in | " + record + "sh -c 'read x; echo $x; echo err >&2; exit 9'", 9),
        "in\nerr\n");
    EXPECT_EQ(Shell::Output(record + "-- sh -c 'echo \"$@\"' sh -o --by -- [x,y] ''"),
              "-o --by -- [x,y] \n");
}

// The program waits for room in a full channel, but not for a process that has ended.
TEST(Record, WaitsForRoom) {
    Shell::Output("ln -sf " HOST " Host; rm -f trace*");
    const std::string start = MEMPOOL " record -o trace ./Host stop >out & sleep 1; cat out; ";
    EXPECT_EQ(Shell::Output(start + "kill -CONT $!; wait $!; cat out"), "done\n");
    EXPECT_GE(ReadTrace("trace").numEvents, 2000000U);
    EXPECT_EQ(Shell::Output("exec 2>/dev/null; " + start +
                            "kill -KILL $!; until grep done out; do sleep 0.01; done"),
              "done\n");
}

TEST(Record, PassesAnInterruptOnOnce) {
    Shell::Output("ln -sf " HOST " Host");
    EXPECT_THAT(Shell::Output("mkfifo keys; exec 3<>keys; script -qec '" MEMPOOL
                              " record -o trace ./Host interrupts' log <keys >out & "
                              "until grep -qs ready out; do sleep 0.01; done; "
                              "printf '\\3' >keys; wait $!; cat out"),
                HasSubstr("^C1\r\n"));
}

// A killed recorder leaves a trace in the same folder.
TEST(Record, LosesLittleWhenItIsKilled) {
    Shell::Output("ln -sf " HOST " Host; rm -f trace*");
    Shell::Output("exec 2>/dev/null; " MEMPOOL
                  " record -o trace ./Host run >out & "
                  "until grep -qs ready out; do sleep 0.01; done; sleep 0.8; "
                  "host=$(cat /proc/$!/task/$!/children); kill -KILL $!; kill $host");
    EXPECT_EQ(
        Shell::Output("ls trace; " MEMPOOL " text trace.* 2>/dev/null | grep -c ':7000[01]$'"),
        "ls: cannot access 'trace': No such file or directory\n2\n");
}

// A new file is written in the same folder and then renamed, with the permissions of the old one.
TEST(Record, WritesTheTraceWholeOrNotAtAll) {
    Shell::Output("ln -sf " HOST
                  " Host; rm -f trace*; echo old >trace; chmod 640 trace; ln -s trace link");
    const std::string record = MEMPOOL " record -o link ";
    EXPECT_EQ(
        Shell::Output("exec 2>/dev/null; " + record + "sh -c 'cat trace; kill -9 $PPID'", 137),
        "old\n");
    EXPECT_EQ(Shell::Output("cat trace; rm trace.*; " + record + "./Host exit", 7), "old\n");
    EXPECT_EQ(Shell::Output("find trace* -printf '%f %m\n'"), "trace 640\n");
    EXPECT_EQ(ReadTrace("link").story, "+70000 +70001 -70001 ");
    EXPECT_EQ(Shell::Output("umask 027; " MEMPOOL " record -o new true; stat -c %a new"), "640\n");
    // What was written before a write fails is kept. The program lowers the limit on files.
    EXPECT_THAT(Shell::Output(MEMPOOL " record -o cut sh -c 'prlimit --fsize=1000 --pid $PPID; "
                                      "sleep 0.6; exec ./Host threads'",
                              125),
                ContainsRegex("^mempool: cut: File too large; what was written before that is in "
                              "[^ ]*cut[.]......\n$"));
    EXPECT_EQ(Shell::Output(MEMPOOL " text cut.* 2>/dev/null | sed -n 2p"), "xmpt:i:by:all\n");
    EXPECT_EQ(Shell::Output(MEMPOOL " record -o - sh -c 'echo out' 2>err | " MEMPOOL
                                    " text - | head -1; cat err"),
              "xmpt:i:program:sh -c echo out\nout\n");
}

TEST(Record, RefusesWhatCannotBeRecorded) {
    const std::string record = MEMPOOL " record ";
    Shell::Output(
        "ln -sf " HOST
        " Host; echo >plain; mkdir -p folder; echo >folder/tool; "
        "printf '#!/lost/sh\\n' >inner; printf '#!./inner\\n' >script; chmod +x inner script");
    const auto refused = [&](const std::string& command, int status) {
        return Shell::Output(record + command, status);
    };
    EXPECT_EQ(refused("-o trace lost", 127), "mempool: lost: No such file or directory\n");
    EXPECT_EQ(refused("-o trace ./lost/it", 127),
              "mempool: ./lost/it: No such file or directory\n");
    EXPECT_EQ(refused("-o trace ./plain", 126), "mempool: ./plain: Permission denied\n");
    EXPECT_EQ(refused("-o trace ./folder", 126), "mempool: ./folder: Is a directory\n");
    EXPECT_EQ(Shell::Output("PATH=folder:$PATH " + record + "-o trace tool", 126),
              "mempool: tool: Permission denied\n");
    EXPECT_EQ(refused("-o trace ./script", 127),
              "mempool: ./script: /lost/sh: No such file or directory\n");
    EXPECT_EQ(refused("-o lost/trace ./Host", 125),
              "mempool: lost/trace: No such file or directory\n");
    EXPECT_EQ(refused("-o /dev/full echo on", 125),
              "mempool: /dev/full: No space left on device\n");
    EXPECT_EQ(refused("-o trace --skip $(printf %1024d 1 | tr ' ' x) ./Host", 125),
              "mempool: --skip: the patterns are too long\n");
    EXPECT_EQ(refused("-o trace --skip '' ./Host", 125),
              "mempool: --skip: the pattern is empty\nSee 'mempool record --help'.\n");
    EXPECT_EQ(refused("-o /dev/full", 125),
              "mempool: PROGRAM is required\nSee 'mempool record --help'.\n");
    EXPECT_EQ(refused("--by size ./Host", 125),
              "mempool: --by: size not in {all,caller,module,thread}\n"
              "See 'mempool record --help'.\n");
    EXPECT_EQ(refused("-o trace " STATIC_HOST, 126),
              "mempool: " STATIC_HOST ": is statically linked: cannot be recorded\n");
    Shell::Output(
        "head -c 3000 Host >cut; chmod +x cut; cp Host kept; chmod 750 kept; echo >folder/kept; "
        "(head -c 18 Host; printf '\\3\\0'; tail -c +21 Host) >other; chmod +x other");
    EXPECT_EQ(refused("-o trace ./other", 126),
              "mempool: ./other: is a program for another kind of machine: cannot be recorded\n");
    EXPECT_EQ(refused("-o trace ./cut", 126),
              "mempool: ./cut: is damaged or cut short: cannot be recorded\n");
    // The trace is in none of the files that are read.
    EXPECT_EQ(refused("-o kept ./kept", 125),
              "mempool: kept: input and output are the same file\n");
    EXPECT_EQ(refused("-o kept ./Host <kept", 125),
              "mempool: kept: input and output are the same file\n");
    EXPECT_EQ(Shell::Output("PATH=folder:: " MEMPOOL " record -o ./kept kept", 125),
              "mempool: ./kept: input and output are the same file\n");
    EXPECT_EQ(Shell::Output("cmp Host kept && ls kept*"), "kept\n");
    // A failure on the way is reported after the end of the program, which is not affected.
    EXPECT_THAT(refused("-o >(head -c 9 >/dev/null) sh -c 'sleep 0.2; echo on'", 125),
                ContainsRegex("^on\nmempool: /dev/fd/[0-9]*: Broken pipe\n$"));
    if (geteuid() == 0) {
        Shell::Output("cp " HOST " other && chown 12345 other && chmod u+s other");
        EXPECT_EQ(refused("-o trace ./other", 126),
                  "mempool: ./other: runs with the rights of another user or group: cannot be "
                  "recorded\n");
    }
}

}  // namespace
