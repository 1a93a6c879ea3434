// Replays in child processes: their figures are returned, or the reason why there are none.

#include <sys/resource.h>
#include <unistd.h>

#include <csignal>
#include <fstream>
#include <iostream>
#include <new>
#include <string>
#include <vector>

#include <gtest/gtest.h>
#include <MemPool>

#include "advise/ForkedMeter.hpp"
#include "advise/Space.hpp"
#include "replay/Clock.hpp"
#include "system/Interruption.hpp"

using Advise::InChild;

namespace {

std::string ProblemOf(const std::function<double()>& work, double seconds = 60) {
    const Advise::Outcome outcome = InChild(work, seconds);
    EXPECT_FALSE(outcome.figure.has_value());
    return outcome.problem;
}

TEST(InChild, BringsTheFigureBackAndNothingElse) {
    int number = 0;
    testing::internal::CaptureStdout();
    const Advise::Outcome outcome = InChild(
        [&] {
            std::cout << "noise" << std::endl;
            return ++number + 0.5;
        },
        60);
    EXPECT_EQ(testing::internal::GetCapturedStdout(), "");
    EXPECT_EQ(outcome.figure, std::optional(1.5));
    EXPECT_EQ(number, 0);
}

TEST(InChild, SaysWhatEndedTheChild) {
    EXPECT_EQ(ProblemOf([]() -> double { throw std::bad_alloc(); }), "out of memory");
    EXPECT_EQ(ProblemOf([]() -> double { throw "up"; }), "ended with status 1");
    EXPECT_EQ(ProblemOf([]() -> double { _exit(7); }), "ended with status 7");
    EXPECT_EQ(ProblemOf([] { return raise(SIGKILL) + 0.; }), "ended by signal Killed");
    const auto loop = []() -> double {
        for (volatile int i = 0;;) { i = i + 1; }
    };
    EXPECT_EQ(ProblemOf(loop, 0.05), "too slow");
    EXPECT_EQ(InChild(loop, 60, [] { return true; }).problem, "stopped");
    EXPECT_EQ(InChild([] { return usleep(200000) + 2.; }, 0.05).figure, std::optional(2.))
        << "To wait takes no time of the processor.";
}

// Blocks of 100 bytes. In buckets of 506 bytes there are 4 of them each.
TEST(ForkedMeter, ReplaysWithTheGivenSettings) {
    Replay::Recording recording;
    recording.pools.push_back({"P", ""});
    recording.steps.push_back({Trace::Kind::Created, 0, {}});
    for (std::uint32_t i = 0; i < 1000; ++i) {
        recording.steps.push_back({Trace::Kind::Allocated, 0, {i, 100}});
    }
    recording.numBlocks = 1000;
    recording.peakSteps = recording.steps.size();
    const OBR::MemPool::PoolSettings before = OBR::MemPool::PoolSettings::OfProcess();

    Advise::ForkedMeter meter(recording, Replay::Layer::Mgr, 60);
    EXPECT_NEAR(*meter.Held(Advise::Malloc()).figure, 112000, 8000);
    const auto held = [&](unsigned int bucketSize, unsigned int alignment) {
        return *meter.Held(OBR::MemPool::PoolSettings{bucketSize, 500, 8, alignment, false}).figure;
    };
    EXPECT_NEAR(held(506, 4), 250 * (4 * 104 + 56) + 1300, 2600);
    EXPECT_NEAR(held(65450, 4), 2 * 65500 + 1300, 1300);
    EXPECT_NEAR(held(65450, 64), 3 * 65500 + 500, 1500) << "128 bytes a block.";
    EXPECT_FALSE(meter.Time(OBR::MemPool::PoolSettings{20, 1000, 8, 4, false}).figure)
        << "No pool has these settings.";
    Replay::Recording few = recording;  // As a plan would have them.
    few.steps.resize(101);
    few.peakSteps = 101;
    const Advise::Planned planned = {&few, {4010, 500, 8, 4, false}};
    EXPECT_LT(*meter.Held(planned).figure, 15000);
    EXPECT_LT(*meter.Time(planned).figure, *meter.Time(planned.settings).figure / 2)
        << "Per event of the whole recording.";
    EXPECT_TRUE(Advise::ForkedMeter(recording, Replay::Layer::Mgr, 0).IsStopped());
    recording.steps.resize(2);  // So few that one measurement replays them many times.
    Advise::ForkedMeter brief(recording, Replay::Layer::Mgr, 60);
    for (const Advise::Side& side : {Advise::Side(), Advise::Side(OBR::MemPool::PoolSettings())}) {
        const double ns = brief.Time(side).figure.value_or(0);
        EXPECT_TRUE(ns > 0.5 && ns < 1e5) << ns;
    }
    EXPECT_GT(meter.Elapsed(), 0);
    EXPECT_FALSE(meter.IsStopped());
    const System::Interruption interruption;
    raise(SIGTERM);
    EXPECT_TRUE(meter.IsStopped());
    EXPECT_EQ(OBR::MemPool::PoolSettings::OfProcess().bucketSize, before.bucketSize);
    EXPECT_FALSE(OBR::MemPool::NUV_OBR_MEMPOOL_ON());
}

TEST(Clock, CountsTheTimeOfTheSystemToo) {
    const auto used = [](const timeval& time) {
        return 1e9 * static_cast<double>(time.tv_sec) + 1e3 * static_cast<double>(time.tv_usec);
    };
    rusage before = {};
    rusage after = {};
    getrusage(RUSAGE_SELF, &before);
    const double start = Replay::ProcessorNanoseconds();
    std::vector<char> buffer(1 << 20);
    std::ifstream zeros("/dev/zero", std::ios::binary);
    zeros.rdbuf()->pubsetbuf(nullptr, 0);
    do {
        zeros.read(buffer.data(), static_cast<std::streamsize>(buffer.size()));
        getrusage(RUSAGE_SELF, &after);
    } while (used(after.ru_stime) < used(before.ru_stime) + 5e7);
    const double system = used(after.ru_stime) - used(before.ru_stime);
    const double user = used(after.ru_utime) - used(before.ru_utime);
    EXPECT_NEAR(Replay::ProcessorNanoseconds() - start, system + user, 2e7);
}

}  // namespace
