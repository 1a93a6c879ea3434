// The pools that are proposed for made-up heaps, and when measuring them makes a plan.

#include "advise/Plan.hpp"

#include <deque>
#include <set>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "replay/Measure.hpp"

using testing::ElementsAre;
using Trace::Kind;

namespace {

// A heap whose groups have blocks of 10 bytes. Each group frees its oldest blocks first.
class Heap {
public:
    explicit Heap(const std::vector<std::string>& names) : blocks(names.size()) {
        for (std::uint32_t group = 0; group < names.size(); ++group) {
            recording.pools.push_back({"", names[group]});
            recording.steps.push_back({Kind::Created, group, {}});
        }
    }
    void Allocate(std::uint32_t group, unsigned int number) {
        for (; number != 0; --number) {
            blocks[group].push_back(recording.numBlocks);
            recording.steps.push_back({Kind::Allocated, group, {recording.numBlocks++, 10}});
        }
    }
    void Free(std::uint32_t group, std::size_t number) {
        for (; number != 0; --number) {
            recording.steps.push_back({Kind::Freed, group, {blocks[group].front(), 10}});
            blocks[group].pop_front();
        }
    }

    Replay::Recording recording;

private:
    std::vector<std::deque<std::uint32_t>> blocks;
};

// Carries the steps out on sets. Returns the blocks that are left.
std::set<std::uint32_t> Left(const Replay::Recording& recording) {
    std::vector<std::set<std::uint32_t>> pools(recording.pools.size());
    for (const Trace::Step& step : recording.steps) {
        std::set<std::uint32_t>& pool = pools.at(step.pool);
        if (step.kind == Kind::Allocated) { EXPECT_TRUE(pool.insert(step.block.index).second); }
        if (step.kind == Kind::Freed) { EXPECT_EQ(pool.erase(step.block.index), 1U); }
        if (step.kind == Kind::Cleared) { pool.clear(); }
    }
    std::set<std::uint32_t> left;
    for (const auto& pool : pools) { left.insert(pool.begin(), pool.end()); }
    return left;
}

TEST(Plan, PutsLifetimesThatNestIntoOnePool) {
    Heap heap({"node", "scratch", "argument", "log", "pair", ""});
    heap.recording.pools.back().address = "0x10";
    for (const unsigned int numNodes : {100U, 100U, 20U, 100U}) {
        heap.Allocate(0, numNodes);
        heap.Allocate(1, 70);
        heap.Allocate(2, numNodes / 2);
        heap.Allocate(3, 1);
        heap.Free(1, 50);
        heap.Allocate(1, 1);
        heap.Free(2, 5);
        heap.Free(0, numNodes / 2);
        heap.Free(2, numNodes / 2 - 5);
        heap.Free(1, 21);
        heap.Allocate(5, 100);
        heap.Free(0, numNodes / 2);
        for (unsigned int pair = 0; pair < 10; ++pair) {
            heap.Allocate(4, 2);
            heap.Free(4, 2);
        }
    }
    const Advise::Proposal proposal = Advise::ProposePools(heap.recording);
    ASSERT_EQ(proposal.pools.size(), 1U);
    const Advise::PlannedPool& pool = proposal.pools[0];
    EXPECT_THAT(pool.groups, ElementsAre("node", "argument"));
    EXPECT_EQ(pool.numBlocks, 480U);
    EXPECT_EQ(pool.numFreeAlls, 3U) << "Not for the run of 30.";
    EXPECT_EQ(pool.numReplaced, 3 * 150U);
    EXPECT_EQ(pool.firstFreeAll, 6U + 100 + 70 + 50 + 1 + 50 + 1 + 100 + 21 + 100 + 50);
    EXPECT_EQ(pool.peakBytes, 1500U);

    const Replay::Recording& planned = proposal.recording;
    EXPECT_EQ(Left(planned), Left(heap.recording));
    // Two pools are created for six groups, and a run of 150 becomes one step.
    EXPECT_EQ(planned.steps.size(), heap.recording.steps.size() - 4 - 3 * std::size_t{149});
    EXPECT_EQ(planned.peakBytes, 10 * (150 + 4 + 400U)) << "At the end of the last run.";
    EXPECT_EQ(planned.peakBlocks, 150 + 4 + 400U);
    EXPECT_EQ(planned.peakSteps, planned.steps.size() - 1 - 10 * std::size_t{4});
    EXPECT_GT(Replay::BytesHeld(planned, Replay::Layer::Heap), 5540);
    EXPECT_GT(Replay::NanosecondsPerEvent(planned, Replay::Layer::Heap), 0);
}

TEST(Plan, SeparatesWhatWouldKeepTheOtherAlive) {
    Heap heap({"line", "page"});
    for (unsigned int page = 0; page < 10; ++page) {
        heap.Allocate(1, 200);
        for (unsigned int line = 0; line < 2; ++line) {
            heap.Allocate(0, 101);
            heap.Free(0, 101);
        }
        heap.Free(1, 200);
    }
    const Advise::Proposal proposal = Advise::ProposePools(heap.recording);
    ASSERT_EQ(proposal.pools.size(), 2U);
    EXPECT_THAT(proposal.pools[0].groups, ElementsAre("line"));
    EXPECT_EQ(proposal.pools[0].numFreeAlls, 20U);
    EXPECT_THAT(proposal.pools[1].groups, ElementsAre("page"));
    EXPECT_EQ(proposal.pools[1].numFreeAlls, 10U);
}

// Each group ends while all others live.
std::size_t NumPools(std::uint32_t numGroups, unsigned int numBlocks) {
    Heap heap(std::vector<std::string>(numGroups, ""));
    for (std::uint32_t group = 0; group < numGroups; ++group) {
        heap.recording.pools[group].address = std::to_string(group);
        heap.Allocate(group, numBlocks);
    }
    for (std::uint32_t turn = 0; turn < 5 * numGroups; ++turn) {
        heap.Free(turn % numGroups, numBlocks);
        heap.Allocate(turn % numGroups, numBlocks);
    }
    const Advise::Proposal proposal = Advise::ProposePools(heap.recording);
    EXPECT_EQ(proposal.recording.steps.empty(), proposal.pools.empty());
    return proposal.pools.size();
}

TEST(Plan, HasAtMostFivePoolsOfLongRuns) {
    EXPECT_EQ(NumPools(6, 100), 5U);
    EXPECT_EQ(NumPools(40, 100), 5U) << "More groups than are looked at.";
    EXPECT_EQ(NumPools(3, 100), 3U);
    EXPECT_EQ(NumPools(3, 50), 0U);
    Heap heap({"many", "few"});
    heap.Allocate(0, 10000);
    heap.Allocate(1, 100);
    heap.Free(1, 100);
    EXPECT_TRUE(Advise::ProposePools(heap.recording).pools.empty()) << "Less than 1 %.";
}

// Figures of a plan, and what limits their measurement.
struct Made {
    double time;
    double bytes = 1000;
    double timeInOddRounds = time;
    double seconds = 1000;
    std::optional<double> share = {};
    double mostReplays = 1000;
};

// The heap takes 10 ns per event, one pool 8 ns, and both 1000 bytes. In odd rounds the machine is
// half as fast.
class MadeMeter final : public Advise::Meter {
public:
    explicit MadeMeter(const Made& figures) : made(figures) {}
    Advise::Outcome Time(const Advise::Side& side) override {
        const bool isOdd = static_cast<int>(numReplays) / 3 % 2 != 0;
        const double slowness = isOdd ? 2 : 1;
        if (numReplays++ == made.mostReplays) { return {std::nullopt, "stopped"}; }
        if (std::holds_alternative<Advise::Malloc>(side)) { return {10 * slowness, ""}; }
        if (!std::holds_alternative<Advise::Planned>(side)) { return {8 * slowness, ""}; }
        return {(isOdd ? made.timeInOddRounds : made.time) * slowness, ""};
    }
    Advise::Outcome Held(const Advise::Side& side) override {
        return {std::holds_alternative<Advise::Planned>(side) ? made.bytes : 1000, ""};
    }
    double Elapsed() const override { return numReplays; }
    bool IsStopped() const override { return numReplays > made.mostReplays; }

private:
    const Made made;
    double numReplays = 0;
};

std::optional<Advise::Plan> Measure(const Made& made) {
    MadeMeter meter(made);
    return Advise::MeasurePlan({{{{"node"}, 200, 10, 2, 100, 300}}, {}}, {2010, 500, 8, 8, false},
                               {1000, 0, made.share}, meter, made.seconds);
}

TEST(Plan, GainsOverTheHeapAndOverOnePool) {
    const auto plan = Measure({5, 1100});
    ASSERT_TRUE(plan.has_value());
    EXPECT_EQ(plan->settings.bucketSize, 2010U);
    EXPECT_TRUE(plan->settings.keepEmptyBuckets);
    EXPECT_EQ(plan->pools.at(0).numReplaced, 100U);
    EXPECT_EQ(plan->figures.rounds, 15U);
    EXPECT_EQ(plan->heap.rounds, 15U);
    EXPECT_EQ(plan->sentence,
              "A pool for blocks that die together, and one more for the rest, would take 0.50 of "
              "the heap's time and 1.10 of its bytes; one pool for all takes 0.80 and 1.00.");
    EXPECT_TRUE(Measure({5, 1000, 8})) << "The spread is large, but of many rounds.";
    EXPECT_FALSE(Measure({5, 1000, 13})) << "Within the spread.";
    EXPECT_FALSE(Measure({8})) << "As one pool.";
    EXPECT_FALSE(Measure({5, 1700})) << "Not worth its bytes.";
    EXPECT_FALSE(Measure({5, 1000, 5, 1000, 0.01})) << "The program would not notice.";
    EXPECT_EQ(Measure({5, 1000, 5, 0})->figures.rounds, 3U) << "As few as show a difference.";
    EXPECT_FALSE(Measure({5, 1000, 5, 1000, {}, 8})) << "Of two rounds.";
}

}  // namespace
