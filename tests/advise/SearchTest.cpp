// The search on a meter with made-up costs, which knows the optimum. Time advances by one unit per
// replay.

#include "advise/Search.hpp"

#include <cmath>
#include <functional>
#include <random>
#include <set>
#include <stdexcept>
#include <string>
#include <tuple>
#include <vector>

#include <gtest/gtest.h>
#include <MemPoolHeap>

#include "advise/Space.hpp"
#include "advise/Verdict.hpp"

using Advise::Outcome;
using Advise::Side;
using OBR::MemPool::PoolSettings;

namespace {

const PoolSettings fastest = {16298, 500, 16, 16, true};
const PoolSettings smallest = {2010, 1000, 24, 4, false};

// Steps of doubling between two settings.
double Distance(const PoolSettings& a, const PoolSettings& b) {
    const auto steps = [](unsigned int x, unsigned int y) {
        return std::abs(std::log2(static_cast<double>(x) / y));
    };
    return steps(a.bucketSize, b.bucketSize) + steps(a.maxRecordSize, b.maxRecordSize) +
           steps(a.minRecordSize, b.minRecordSize) + steps(a.dataAlignment, b.dataAlignment) +
           (a.keepEmptyBuckets != b.keepEmptyBuckets ? 1 : 0);
}

// Null for malloc and mimalloc.
const PoolSettings* Pools(const Side& side) {
    return std::get_if<PoolSettings>(&side);
}

double Cost(const Side& side, double malloc, double mimalloc, double best,
            const PoolSettings& optimum) {
    if (Pools(side) != nullptr) { return best + Distance(*Pools(side), optimum); }
    return std::holds_alternative<Advise::Malloc>(side) ? malloc : mimalloc;
}

class MadeMeter final : public Advise::Meter {
public:
    Outcome Time(const Side& side) override {
        const double noise = 1 + strays(random);
        const double drift = ++numReplays > 100 ? 2 : 1;  // The machine becomes slower halfway.
        return Answer(side, drift * noise * Cost(side, 14, 12, 10, fastest));
    }
    Outcome Held(const Side& side) override {
        return Answer(side, 100 * Cost(side, 13, 12, 10, smallest));
    }
    double Elapsed() const override { return seconds; }
    bool IsStopped() const override { return seconds >= mostSeconds; }

    std::function<bool(const Side&)> fails = [](const Side&) { return false; };
    double secondsPerReplay = 0.01;
    double mostSeconds = 1e9;
    std::uniform_real_distribution<double> strays{-0.04, 0.04};

private:
    Outcome Answer(const Side& side, double figure) {
        seconds += secondsPerReplay;
        if (IsStopped()) { return {std::nullopt, "stopped"}; }
        return fails(side) ? Outcome{std::nullopt, "made to fail"} : Outcome{figure, ""};
    }

    double seconds = 0;
    unsigned int numReplays = 0;
    std::minstd_rand random{1};
};

auto Key(const PoolSettings& s) {
    return std::tuple(s.bucketSize, s.maxRecordSize, s.minRecordSize, s.dataAlignment,
                      s.keepEmptyBuckets);
}

Advise::Findings Find(MadeMeter& meter, double seconds) {
    std::size_t numTried = 0;
    auto findings = Advise::Search(meter, seconds, [&](std::size_t n) { numTried = n; });
    EXPECT_EQ(numTried, findings.settings.size() + findings.givenUp.size());
    std::set<decltype(Key({}))> tried;
    for (const auto& each : findings.settings) {
        EXPECT_TRUE(tried.insert(Key(each.settings)).second) << "No setting comes twice.";
        EXPECT_NEAR(each.figures.bytes, 1000 + 100 * Distance(each.settings, smallest), 1e-6);
    }
    return findings;
}

TEST(Search, FindsTheOptimaWithoutTryingAll) {
    MadeMeter meter;
    const Advise::Findings findings = Find(meter, 1000);
    const Advise::Verdict verdict = Advise::Judge(findings, {1000, 0, {}});
    const auto& best = findings.settings.at(*verdict.fastest);
    EXPECT_LT(Distance(best.settings, fastest), 0.5) << "Noise is as much as half a step.";
    EXPECT_EQ(Key(findings.settings.at(*verdict.smallest).settings), Key(smallest));
    EXPECT_EQ(Key(findings.settings.front().settings), Key(PoolSettings()));
    EXPECT_LT(findings.settings.size(), 120U) << "Of thousands.";
    // The machine is twice as slow for most of the time, but for the settings as for the heap.
    EXPECT_NEAR(findings.heap.time, 28, 1);
    for (const auto& each : findings.settings) {
        EXPECT_NEAR(each.figures.time, 2 * (10 + Distance(each.settings, fastest)), 2.5);
        EXPECT_GE(each.figures.rounds, 3U);
        EXPECT_TRUE(each.figures.spread > 0 && each.figures.spread < 7);
    }
    EXPECT_TRUE(findings.heap.spread > 0.85 && findings.heap.spread < 3);
    EXPECT_GE(best.figures.rounds, 15U);
    EXPECT_GE(findings.heap.rounds, 15U);
    EXPECT_NEAR(findings.mimalloc.value().time, 24, 2);
    EXPECT_EQ(findings.mimalloc->bytes, 1200);
}

TEST(Search, KeepsToItsTime) {
    for (const double seconds : {5., 10., 30., 200.}) {
        MadeMeter meter;
        meter.secondsPerReplay = 1;
        meter.strays = std::uniform_real_distribution<double>(0, 1e-9);
        meter.mostSeconds = 1.4 * seconds;
        const Advise::Findings findings = Find(meter, seconds);
        EXPECT_LE(meter.Elapsed(), 1.4 * seconds + 5) << "What is begun when time is out.";
        EXPECT_GT(meter.Elapsed(), 0.9 * seconds);
        EXPECT_TRUE(findings.givenUp.empty());
        const Advise::Verdict verdict = Advise::Judge(findings, {1000, 0, {}});
        EXPECT_GE(findings.settings.front().figures.rounds, seconds < 10 ? 1U : 3U) << seconds;
        if (seconds < 30) {
            EXPECT_EQ(findings.settings.size(), 1U) << "The time is for rounds of the defaults.";
            continue;
        }
        EXPECT_GE(findings.settings.at(*verdict.fastest).figures.rounds, 3U) << seconds;
        EXPECT_GE(findings.settings.at(*verdict.smallest).figures.rounds, 3U) << seconds;
    }
}

TEST(Search, TakesLongTracesWhole) {
    EXPECT_GE(Advise::MaxSteps(15), 8000000U);
    EXPECT_GE(Advise::MaxSteps(1), 4000000U);
}

TEST(Search, GivesUpWhatFails) {
    MadeMeter meter;
    meter.fails = [](const Side& side) { return Pools(side) && Pools(side)->keepEmptyBuckets; };
    const Advise::Findings findings = Find(meter, 1000);
    EXPECT_FALSE(findings.givenUp.empty());
    for (const auto& each : findings.settings) { EXPECT_FALSE(each.settings.keepEmptyBuckets); }
    for (const auto& each : findings.givenUp) { EXPECT_EQ(each.problem, "made to fail"); }

    // The last one to lead fails in a later round, when all others have failed.
    MadeMeter late;
    unsigned int number = 0;
    late.fails = [&](const Side& side) { return Pools(side) && ++number > 40; };
    EXPECT_TRUE(Find(late, 1000).settings.empty());

    MadeMeter heapless;
    heapless.fails = [](const Side& side) { return !Pools(side); };
    EXPECT_THROW(Find(heapless, 1000), std::runtime_error);

    MadeMeter stopped;
    stopped.mostSeconds = stopped.secondsPerReplay;
    try {
        Find(stopped, 1000);
        FAIL() << "There is no figure of the heap.";
    } catch (const std::runtime_error& error) {
        EXPECT_EQ(std::string(error.what()).find("the search ended before the heap"), 0U);
    }
}

// All settings that can be reached from the defaults. Settings that no pool can have would end the
// process, as would a minimum from the environment that is not below the maximum.
TEST(Space, HasOnlySettingsThatCanBeSet) {
    std::set<decltype(Key({}))> known;
    std::vector<PoolSettings> open = Advise::CoarseGrid();
    unsigned int largestBucket = 0;
    unsigned int largestRecord = 0;
    while (!open.empty()) {
        const PoolSettings settings = open.back();
        open.pop_back();
        if (!known.insert(Key(settings)).second) { continue; }
        const OBR::MemPool::Heap heap("tried", OBR::MemPool::HeapSettings()
                                                   .On(true)
                                                   .BucketSize(settings.bucketSize)
                                                   .MaxRecordSize(settings.maxRecordSize)
                                                   .MinRecordSize(settings.minRecordSize)
                                                   .DataAlignment(settings.dataAlignment));
        EXPECT_LT(settings.minRecordSize, settings.maxRecordSize);
        largestBucket = std::max(largestBucket, settings.bucketSize);
        largestRecord = std::max(largestRecord, settings.maxRecordSize);
        for (const PoolSettings& next : Advise::Neighbours(settings)) { open.push_back(next); }
    }
    EXPECT_GT(known.size(), 1000U);
    EXPECT_EQ(largestBucket, 65450U);
    EXPECT_EQ(largestRecord, 32000U);

    const std::vector<PoolSettings> next = Advise::Neighbours({1010, 1000, 8, 4, false});
    EXPECT_EQ(Key(next.at(0)), Key({506, 500, 8, 4, false})) << "The largest record that fits.";
    EXPECT_EQ(Key(next.at(3)), Key({2010, 2000, 8, 4, false})) << "The smallest bucket for it.";
}

}  // namespace
