// Requests that end the process: what stands on standard output, to the character, the exit status,
// and that the end is an orderly one.

#include <MemPool>
#include <cstdio>
#include <cstdlib>
#include <iomanip>
#include <iostream>
#include <new>
#include <string>

#include <gtest/gtest.h>

#include "Child.hpp"
#include "MemPool/BucketMgr.hpp"
#include "diagnostics/Messages.hpp"

using namespace OBR::MemPool;
using Child::Captured;
using testing::Eq;
using testing::ExitedWithCode;

namespace {

constexpr const char* duplicate =
    "ERROR:../s/MemPool: 1645: Duplicate Obr_MemPool::Mgr name encountered ";

// `request` ends the process with status 1 and prints this and nothing else, on either stream.
template <typename Request>
void ExpectStop(const std::string& output, Request request) {
    const auto run = [&request](Captured streams) {
        Child::Capture(streams);
        request();
    };
    EXPECT_EXIT(run(Captured::out), ExitedWithCode(1), Eq(output));
    EXPECT_EXIT(run(Captured::err), ExitedWithCode(1), Eq(""));
}

TEST(Process, ASecondPoolOfOneNameStops) {
    ExpectStop(std::string(duplicate) + "'symbols'\n", [] {
        const Mgr first("symbols");
        const Mgr other("symbolic");
        const Mgr second("symbols");
    });
    ExpectStop(std::string(duplicate) + "''\n", [] {
        const Mgr first("");
        const Mgr second("");
    });
    ExpectStop(std::string(duplicate) + "'__OBR_MEMPOOL_00002'\n", [] {
        const Mgr taken("__OBR_MEMPOOL_00002");
        const Mgr first;
        const Mgr second;
    });
}

// A request of the largest size goes on to the heap, which may refuse it.
TEST(Process, ASizeAboveTheLimitStops) {
    for (const bool isOn : {false, true}) {
        ExpectStop(
            "passed\n"
            "ERROR:../s/MemPool: 1711: Cannot allocate 1073741824 bytes, the maximum is "
            "1073741823\n",
            [isOn] {
                NUV_OBR_MEMPOOL_ON(isOn);
                Mgr pool("large");
                try {
                    pool.Free(pool.Alloc(1073741823));
                } catch (const std::bad_alloc&) {}
                std::puts("passed");
                pool.Alloc(1073741824);
            });
    }
    ExpectStop(
        "ERROR:../s/MemPool: 1711: Cannot allocate 4294967295 bytes, the maximum is "
        "1073741823\n",
        [] { Mgr("largest").Alloc(4294967295); });
}

void Store(unsigned int bucketSize, unsigned int alignment, unsigned int max, unsigned int min) {
    NUV_OBR_MEMPOOL_BUCKET_SIZE(bucketSize);
    NUV_OBR_MEMPOOL_DATA_ALIGNMENT(alignment);
    NUV_OBR_MEMPOOL_MAX_RECORD_SIZE(max);
    NUV_OBR_MEMPOOL_MIN_RECORD_SIZE(min);
}

// A pool that is switched off is refused like any other.
TEST(Process, SettingsThatCannotMakeAPoolStop) {
    const std::string tooLarge =
        "1988: Unexpected condition: the maximum record size is larger than the bucket size ";
    const std::string crossed =
        "1996: Unexpected condition: the min rec size is larger than the max rec size ";
    const struct {
        unsigned int bucketSize, alignment, max, min;
        std::string message;
    } rows[] = {
        {1000, 4, 1000, 8, tooLarge + "(1000>996) [1000]"},
        {1003, 4, 1001, 8, tooLarge + "(1000>999) [1003]"},
        {4294967295, 4, 65532, 8, tooLarge + "(65532>65531) [65535]"},
        {3, 4, 1000, 8, tooLarge + "(1000>0) [3]"},
        {0, 4, 4, 4, tooLarge + "(4>0) [0]"},
        {1000, 4, 997, 1004, crossed + "(1004>996)"},
        {4010, 4, 9, 9, crossed + "(12>8)"},
        {4010, 8, 5, 4, crossed + "(8>0)"},
        {4010, 0, 7, 9, crossed + "(9>7)"},
        {3, 4, 0, 8, crossed + "(8>0)"},
        {100, 4, 100, 200, tooLarge + "(100>96) [100]"},  // Both: the first test tells.
    };
    for (const auto& row : rows) {
        for (const bool isOn : {false, true}) {
            ExpectStop("ERROR:../s/MemPool: " + row.message + "\n", [row, isOn] {
                NUV_OBR_MEMPOOL_ON(isOn);
                Store(row.bucketSize, row.alignment, row.max, row.min);
                const Mgr pool("refused");
            });
        }
    }
}

TEST(Process, SettingsJustInsideTheBoundsMakeAPool) {
    NUV_OBR_MEMPOOL_ON(true);
    Store(1004, 4, 1001, 997);
    EXPECT_EQ(Mgr("exact").GetBucketMgr()->numGroups, 1u);
    Store(70000, 4, 65531, 8);
    EXPECT_EQ(Mgr("capped").GetBucketMgr()->maxRecordSize, 65528u);
    Store(4010, 0, 1000, 8);
    EXPECT_EQ(Mgr("unaligned").GetBucketMgr()->dataAlignment, 1u);
    EXPECT_EQ(NUV_OBR_MEMPOOL_DATA_ALIGNMENT(), 0u);
    Store(4010, 4, 1000, 8);
}

TEST(Process, ARefusedPoolHasTracedItsCreation) {
    const auto build = [] {
        Child::Capture(Captured::both);
        NUV_OBR_MEMPOOL_TRACE(true);
        Store(1000, 4, 1000, 8);
        const Mgr pool("refused");
    };
    EXPECT_EXIT(build(), ExitedWithCode(1),
                testing::MatchesRegex("xmpt:c:[0-9a-f]{16}\nERROR:../s/MemPool: 1988: [^\n]*\n"));
    // A duplicate never becomes a pool.
    ExpectStop(std::string(duplicate) + "'a'\n", [] {
        const Mgr first("a");
        NUV_OBR_MEMPOOL_TRACE(true);
        const Mgr second("a");
    });
}

struct Farewell {
    ~Farewell() { std::puts("static destroyed"); }
};

TEST(Process, ExitHandlersAndStaticDestructorsStillRun) {
    ExpectStop(std::string(duplicate) + "'a'\nexit handler\nstatic destroyed\n", [] {
        static const Farewell farewell;
        std::atexit([] { std::puts("exit handler"); });
        static const Mgr pool("a");
        const Mgr second("a");
    });
}

TEST(Process, ABrokenAssumptionIsToldWithItsPlace) {
    const std::string advice = "\tSet your debug breakpoint in ../s/MemPool at line 100.\n";
    ExpectStop("MYASSERT:Host.cpp:   42: no more symbols\n" + advice,
               [] { MYASSERT("no more symbols", "Host.cpp", 42); });
    ExpectStop("MYASSERT::123456: \n" + advice, [] { MYASSERT("", "", 123456); });
}

TEST(Process, TheNumberOfAMessageTakesTheStreamsJustificationAndFill) {
    ExpectStop("ERROR:../s/MemPool:1645*: Duplicate Obr_MemPool::Mgr name encountered 'a'\n", [] {
        std::cout << std::left << std::setfill('*');
        const Mgr first("a");
        const Mgr second("a");
    });
}

}  // namespace
