// Requests that end the process: the exact output, the exit status, and that exit handlers and
// destructors run.

#include <sys/wait.h>
#include <unistd.h>

#include <MemPool>
#include <cstdio>
#include <cstdlib>
#include <iomanip>
#include <iostream>
#include <memory>
#include <sstream>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "Child.hpp"
#include "diagnostics/text/Messages.hpp"

using namespace OBR::MemPool;

namespace {

const std::string duplicate =
    "ERROR:../s/MemPool: 1645: Duplicate Obr_MemPool::Mgr name encountered ";

// `request` ends the process with status 1 and prints what is expected.
template <typename Request>
void ExpectStop(const testing::Matcher<const std::string&>& output, Request request) {
    const auto run = [&request] {
        Child::Capture(Child::Captured::out);
        request();
    };
    EXPECT_EXIT(run(), testing::ExitedWithCode(1), output);
}

TEST(Process, ASecondPoolOfOneNameStops) {
    ExpectStop(duplicate + "''\n", [] {
        const Mgr first("");
        const Mgr other("other");
        NUV_OBR_MEMPOOL_TRACE(true);  // A duplicate never becomes a pool.
        const Mgr second("");
    });
    ExpectStop(duplicate + "'__OBR_MEMPOOL_00002'\n", [] {
        const Mgr taken("__OBR_MEMPOOL_00002");
        const Mgr first;
        const Mgr second;
    });
}

TEST(Process, ASizeAboveTheLimitStops) {
    for (const bool isOn : {false, true}) {
        ExpectStop(
            "ERROR:../s/MemPool: 1711: Cannot allocate 1073741824 bytes, the maximum is "
            "1073741823\n",
            [isOn] {
                NUV_OBR_MEMPOOL_ON(isOn);
                Mgr("large").Alloc(1073741824);
            });
    }
}

// A disabled pool is refused like an enabled one, and each has traced its creation.
TEST(Process, SettingsThatCannotMakeAPoolStop) {
    const std::string tooLarge =
        "1988: Unexpected condition: the maximum record size is larger than the bucket size ";
    const std::string crossed =
        "1996: Unexpected condition: the min rec size is larger than the max rec size ";
    const struct {
        unsigned int bucketSize, alignment, max, min;
        std::string message;
    } rows[] = {
        {1003, 4, 1001, 8, tooLarge + "(1000>999) [1003]"},
        {4294967295, 4, 65532, 8, tooLarge + "(65532>65531) [65535]"},
        {3, 4, 1000, 8, tooLarge + "(1000>0) [3]"},
        {1000, 4, 997, 1004, crossed + "(1004>996)"},
        {4010, 4, 9, 9, crossed + "(12>8)"},
        {4010, 0, 7, 9, crossed + "(9>7)"},
        {3, 4, 0, 8, crossed + "(8>0)"},
        {100, 4, 100, 200, tooLarge + "(100>96) [100]"},  // Both: the first is reported.
    };
    for (const auto& row : rows) {
        const std::string line = "\nERROR:../s/MemPool: " + row.message + "\n";
        const auto traced = testing::AllOf(testing::StartsWith("xmpt:c:"), testing::EndsWith(line),
                                           testing::SizeIs(23 + line.size()));
        for (const bool isOn : {false, true}) {
            ExpectStop(traced, [row, isOn] {
                NUV_OBR_MEMPOOL_ON(isOn);
                NUV_OBR_MEMPOOL_TRACE(true);
                NUV_OBR_MEMPOOL_BUCKET_SIZE(row.bucketSize);
                NUV_OBR_MEMPOOL_DATA_ALIGNMENT(row.alignment);
                NUV_OBR_MEMPOOL_MAX_RECORD_SIZE(row.max);
                NUV_OBR_MEMPOOL_MIN_RECORD_SIZE(row.min);
                const Mgr pool("refused");
            });
        }
    }
}

// The number of a message has the stream's justification and fill. An exit handler may cause
// another message.
TEST(Process, ExitHandlersAndStaticDestructorsStillRun) {
    const std::string message =
        "ERROR:../s/MemPool:1645*: Duplicate Obr_MemPool::Mgr name encountered 'a'\n";
    ExpectStop(message + message + "exit handler\nstatic destroyed\n", [] {
        static const struct Farewell {
            ~Farewell() { std::puts("static destroyed"); }
        } farewell;
        std::atexit([] { std::puts("exit handler"); });
        static const Mgr pool("a");
        std::atexit([] { const Mgr third("a"); });
        std::cout << std::left << std::setfill('*');
        const Mgr second("a");
    });
}

// The host ends in the middle of a report, and an exit handler prints the whole report.
TEST(Process, MayEndInsideAReport) {
    NUV_OBR_MEMPOOL_ON(true);
    Mgr pool("reported");
    NUV_OBR_MEMPOOL_ON(false);
    pool.Alloc(10);
    std::ostringstream whole;
    std::streambuf* const screen = std::cout.rdbuf(whole.rdbuf());
    Dbg();
    std::cout.rdbuf(screen);
    const auto run = [] {
        Child::Capture(Child::Captured::out);
        static std::streambuf* const output = std::cout.rdbuf();
        static struct : std::stringbuf {
            int sync() override { std::exit(3); }
        } ending;
        std::atexit([] {
            std::cout.rdbuf(output);
            Dbg();
        });
        std::cout.rdbuf(&ending);
        Dbg();
    };
    EXPECT_EXIT(run(), testing::ExitedWithCode(3), testing::Eq(whole.str()));
}

// Each process continues with its own copies of all pools, and no line is written twice.
TEST(Process, MayForkWithPoolsThatLive) {
    const auto run = [] {
        Child::Capture(Child::Captured::out);
        NUV_OBR_MEMPOOL_TRACE(true);
        NUV_OBR_MEMPOOL_ON(true);
        auto pool = std::make_unique<Mgr>("forked");
        void* const block = pool->Alloc(10);
        const pid_t child = fork();
        int status = 0;
        if (child != 0) { waitpid(child, &status, 0); }
        if (status != 0 || !pool->Free(block)) { std::exit(1); }
        pool->Alloc(5000);
        pool.reset();
        std::exit(0);
    };
    const std::string end = "xmpt:f:[^\n]*\nxmpt:a:[^\n]*:5000\nxmpt:d:[^\n]*\n";
    EXPECT_EXIT(run(), testing::ExitedWithCode(0),
                testing::MatchesRegex("xmpt:c:[^\n]*\nxmpt:a:[^\n]*:10\n" + end + end));
}

TEST(Process, ABrokenAssumptionIsReportedWithItsPlace) {
    ExpectStop(
        "MYASSERT:Host.cpp:   42: no more symbols\n"
        "\tSet your debug breakpoint in ../s/MemPool at line 100.\n",
        [] { MYASSERT("no more symbols", "Host.cpp", 42); });
}

}  // namespace
