// The verdict on given figures.

#include "advise/Verdict.hpp"

#include <optional>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

using Index = std::optional<std::size_t>;
using testing::HasSubstr;
using testing::StartsWith;

namespace {

// The heap takes 10 ns and 1000 bytes, with a spread of 1 ns.
struct Setting {
    double ns;
    double bytes;
    double spread = 0.1;
    OBR::MemPool::PoolSettings settings = {4010, 1000, 8, 4, true};
};

Advise::Verdict Judge(const std::vector<Setting>& settings,
                      const Advise::Program& program = {1000, 0, {}}) {
    Advise::Findings findings{{10, 1, 1000, 9}, {}, {}, {}};
    for (const Setting& each : settings) {
        findings.settings.push_back({each.settings, {each.ns, each.spread, each.bytes, 9}});
    }
    return Advise::Judge(findings, program);
}

void Expect(const std::vector<Setting>& settings, Index best, Index advised, const char* name) {
    const Advise::Verdict verdict = Judge(settings);
    EXPECT_EQ(verdict.best, best) << name;
    EXPECT_EQ(verdict.advised, advised) << name;
    EXPECT_STREQ(verdict.Name(), name);
}

TEST(Verdict, NamesTheBestThatCostsNothing) {
    Expect({}, {}, {}, "none");
    Expect({{11.1, 900}, {5, 800}, {4, 1011}, {6, 500}}, 3, 3, "both");
    Expect({{7, 1000}, {5, 1000}}, 1, 1, "faster");
    Expect({{10, 700}, {9.5, 800}}, 0, 0, "smaller");
    Expect({{9.1, 995}}, 0, {}, "none");
    Expect({{10, 1000}}, 0, {}, "none");
    Expect({{9.5, 995}, {8, 1000}}, 1, 1, "faster");

    const Advise::Verdict verdict = Judge({{6, 700}, {5, 900}, {5, 800}, {7, 600}, {6, 600}});
    EXPECT_EQ(verdict.fastest, Index(2)) << "Of two that are as fast the smaller one.";
    EXPECT_EQ(verdict.smallest, Index(4)) << "And the other way round.";
    EXPECT_EQ(Judge({}).fastest, std::nullopt);
    EXPECT_EQ(Judge({}).smallest, std::nullopt);
}

TEST(Verdict, NeitherGainNorPriceIsWithinTheSpreadOfTheRuns) {
    Expect({{9.01, 1000}}, 0, {}, "none");
    Expect({{8.99, 1000}}, 0, 0, "faster");
    Expect({{8, 1000, 2.1}}, 0, {}, "none");
    Expect({{8, 1000, 1.9}}, 0, 0, "faster");
    Expect({{10.9, 500}}, 0, 0, "smaller");
    Expect({{5, 1009}}, 0, 0, "faster");
    EXPECT_STREQ(Judge({{10.9, 500}}).Price(), "none");
}

TEST(Verdict, APriceMustBeWorthIt) {
    Expect({{5, 1500}}, {}, 0, "faster");
    Expect({{5, 2100}}, {}, {}, "none");
    EXPECT_EQ(Judge(std::vector<Setting>{{5, 1060}}, {1000, 0, 0.1}).advised, std::nullopt)
        << "0.95 x 1.06.";
    Expect({{14, 700}}, {}, 0, "smaller");
    Expect({{14, 720}}, {}, {}, "none");
    Expect({{5, 1500}, {4, 1500}, {9, 1050}}, {}, 1, "faster");
    Expect({{2, 1100}, {8, 990}}, 1, 1, "faster");
    Expect({{9.5, 1000}, {5, 1500}}, 0, 1, "faster");
    EXPECT_STREQ(Judge({{5, 1500}}).Price(), "bytes");
    EXPECT_STREQ(Judge({{14, 700}}).Price(), "time");
}

TEST(Verdict, TheFewestChangesWinAmongEquals) {
    const OBR::MemPool::PoolSettings defaults = {4010, 1000, 8, 4, false};
    const OBR::MemPool::PoolSettings far = {2010, 500, 16, 8, true};
    Expect({{5, 1000, 0.5, far}, {5.4, 1000, 0.1, defaults}}, 1, 1, "faster");
    Expect({{5, 1000, 0.3, far}, {5.4, 1000, 0.1, defaults}}, 0, 0, "faster");
    const Advise::Findings findings = {
        {10, 1, 1000, 9}, {}, {{far, {5, 0.5, 900, 3}}, {defaults, {5, 0, 900, 2}}}, {}};
    EXPECT_EQ(Advise::Judge(findings, {1000}).advised, Index(0)) << "Not by two rounds.";
}

// The time of pools, their bytes, the share of the allocation calls: what the program gains, and
// the first words.
TEST(Verdict, CountsWhatTheProgramWouldNotice) {
    const auto expect = [](const Setting& pools, std::optional<double> share, const char* name,
                           const char* words, std::uint64_t numEvents = 1000) {
        const Advise::Verdict verdict = Judge({pools}, {numEvents, 0, share});
        EXPECT_STREQ(verdict.Name(), name) << words;
        EXPECT_THAT(verdict.sentences.front(), StartsWith(words));
        EXPECT_EQ(verdict.advised.has_value(), verdict.Name() != std::string("none"));
    };
    expect({5, 1000}, {}, "faster", "Pools would help: they take 0.50 of the heap's time and 1.00");
    expect({5, 1000}, 0.2, "faster", "Pools would help: they");
    expect({5, 1100}, 0.2, "faster", "Pools would help, at a price: they");
    expect({5, 1100}, 0.09, "none",
           "Allocation calls take an estimated 9.0 % of the program's time: pools "
           "might save 4.5 %, which is too little to promise.");
    EXPECT_STREQ(Judge({{5, 1000}}, {1000, 0, 0.4, 0.23}).Name(), "faster");
    EXPECT_STREQ(Judge({{5, 1000}}, {1000, 0, 0.4, 0.25}).Name(), "none") << "0.15 x 0.5.";
    expect({5, 969}, 0.09, "smaller",
           "Pools would help: they take 0.50 of the heap's time (too little to");
    expect({10, 971}, 0.09, "none", "Pools would not help: no settings gain more than the spread");
    expect({5, 1100}, 0.018, "none",
           "Allocation calls take an estimated 1.8 % of the program's time: it would "
           "not notice that pools save 0.9 %, unless");
    expect({5, 900}, 0.018, "smaller",
           "Pools would help: they take 0.50 of the heap's time (which the program would not");
    expect({12, 800}, 0.018, "smaller", "Pools would help: they take 1.20");
    expect({12, 800}, 0.2, "smaller", "Pools would help, at a price: they take 1.20");
    expect({9.5, 800}, 0.2, "smaller", "Pools would help: they take 0.95 of the heap's time (the");
    expect({9.5, 1000}, 0.2, "none", "Pools would not help: no settings gain more than the spread");
    expect({5, 2100}, 0.2, "none", "Pools would not help: no settings gain more than the spread");
    expect({5, 500}, 0.5, "none", "The program would not notice: it has only 999 events.", 999);
    EXPECT_EQ(Judge(std::vector<Setting>{{5, 500}}, {999, 0, {}}).best, std::nullopt);
}

TEST(Verdict, CountsLessWhereTheProgramItselfWasMeasured) {
    const Advise::Program measured = {1000, 0, 0.02, {}, {}, 0, Advise::leastMeasured};
    EXPECT_STREQ(Judge(std::vector<Setting>{{5, 989}}, measured).Name(), "both");
    EXPECT_STREQ(Judge(std::vector<Setting>{{5.2, 991}}, measured).Name(), "none");
}

TEST(Verdict, AdvisesNoPoolForSeveralThreads) {
    Advise::Program program = {1000, 0, 0.5};
    program.numThreads = 3;
    const Advise::Verdict verdict = Judge(std::vector<Setting>{{5, 1000}}, program);
    EXPECT_STREQ(verdict.Name(), "none");
    EXPECT_EQ(verdict.best, Index(0));
    EXPECT_THAT(verdict.sentences.at(0), StartsWith("Pools would not help: 3 threads of"));
}

// It takes a tenth of the program's time.
TEST(Verdict, ChargesTheStartOfThePreloadedLibrary) {
    const Advise::Program program = {1000, 0, 0.5, {}, 0.01, 0.001};
    const Advise::Verdict faster = Judge(std::vector<Setting>{{5, 1000}}, program);
    EXPECT_STREQ(faster.Name(), "faster");
    EXPECT_THAT(faster.sentences.at(1), HasSubstr("the program would take about 85 %,"));
    EXPECT_STREQ(Judge(std::vector<Setting>{{7.2, 1000}}, program).Name(), "none");
    EXPECT_EQ(Judge(std::vector<Setting>{{8.5, 1000}}, program).sentences.front(),
              "Pools would not help: they save no more than the start of the preloaded library "
              "takes, 10 % of the program's time.");
    const Advise::Verdict smaller = Judge(std::vector<Setting>{{10, 700}}, program);
    EXPECT_STREQ(smaller.Name(), "smaller");
    EXPECT_STREQ(smaller.Price(), "time");
}

TEST(Verdict, EstimatesTheShareOfAShortProgramFromItsReplay) {
    EXPECT_THAT(Judge({{5, 1000}}, {1000, 1000, {}, {}, 0.00005}).sentences.at(2),
                StartsWith("Allocation calls take an estimated 40 % of"));
    EXPECT_THAT(Judge({{5, 1000}}, {1000, 0, {}, {}, 0.000005}).sentences.at(1),
                StartsWith("Allocation calls take an estimated 100 % of"));
    EXPECT_THAT(Judge({{5, 1000}}, {1000, 0, {}, {}, 0}).sentences.at(1),
                StartsWith("The trace does not say"));
}

TEST(Verdict, SaysWhatTheFiguresMeanForTheProgram) {
    EXPECT_EQ(
        Judge({{5, 1000}}, {1000, 0, 0.24, 0.0361}).sentences.at(1),
        "Allocation calls take an estimated 24 % (+/- 3.6 %) of the program's time: with pools "
        "the program would take about 88 %, not counting what the places of its blocks "
        "change.");
    EXPECT_EQ(
        Judge({{10, 1000}}, {1000, 500, 0.05}).sentences,
        (std::vector<std::string>{
            "Pools would not help: no settings gain more than the spread of the runs and "
            "more than they cost.",
            "Only the first 1000 of 1500 events were replayed; a larger --seconds covers more.",
            "Allocation calls take an estimated 5.0 % of the program's time."}));
    EXPECT_THAT(Judge({}).sentences.front(), StartsWith("Too few replays for a verdict"));
    EXPECT_EQ(Advise::NumberIn("0.125", 1), std::optional(0.125));
    EXPECT_EQ(Advise::NumberIn("0", 1), std::optional(0.));
    EXPECT_EQ(Advise::NumberIn("1", 1), std::optional(1.));
    for (const char* text : {"", "x", "-0.1", "1.1", "0.5 ", "nan"}) {
        EXPECT_EQ(Advise::NumberIn(text, 1), std::nullopt) << text;
    }
}

TEST(Verdict, SaysWhenMimallocHelpsMore) {
    const auto helps = [](const Advise::Figures& mimalloc,
                          const std::vector<Advise::Measured>& pools) {
        const auto verdict = Advise::Judge({{10, 1, 1000, 9}, mimalloc, pools, {}}, {1000, 0, 0.5});
        const std::string helping = pools.empty() ? "Only preloaded mimalloc would help"
                                                  : "Preloaded mimalloc would help more";
        const bool isSaid = verdict.sentences.back() ==
                            helping + ": it takes 0.60 of the heap's time and 1.00 of its bytes.";
        EXPECT_EQ(isSaid, verdict.isMimallocBetter);
        return isSaid;
    };
    const std::vector<Advise::Measured> pools = {{{}, {7.9, 0.1, 1000, 9}}};
    EXPECT_TRUE(helps({6, 0.1, 1000, 9}, pools));
    EXPECT_TRUE(helps({6, 0.1, 1000, 9}, {}));
    EXPECT_FALSE(helps({6, 0.1, 900, 2}, pools)) << "Of two rounds.";
    EXPECT_FALSE(helps({6, 0.1, 1100, 9}, pools)) << "At a price.";
    EXPECT_FALSE(helps({6, 2.1, 1000, 9}, pools)) << "Within the spread.";
}

TEST(Quantile, LiesBetweenTheNearestTwo) {
    EXPECT_EQ(Advise::Quantile({4, 1, 3, 2}, 0.5), 2.5);
    EXPECT_EQ(Advise::Quantile({4, 1, 3, 2, 5}, 0.25), 2);
    EXPECT_EQ(Advise::Quantile({7}, 0.75), 7);
    EXPECT_EQ(Advise::Spread({8, 1, 3, 2, 5}), 3) << "5 - 2.";
}

TEST(Verdict, SettingsArePastedAsEnvironmentAndAsCode) {
    const OBR::MemPool::PoolSettings settings = {2010, 500, 16, 8, true};
    std::string variables;
    for (const auto& [name, value] : Advise::EnvironmentOf(settings)) {
        variables += name.substr(name.find("_ME")) + "=" + value + " ";
    }
    EXPECT_EQ(
        variables,
        "_MEMPOOL_ON=1 _MEMPOOL_BUCKET_SIZE=2010 _MEMPOOL_MAX_RECORD_SIZE=500 "
        "_MEMPOOL_MIN_RECORD_SIZE=16 _MEMPOOL_DATA_ALIGNMENT=8 _MEMPOOL_KEEP_EMPTY_BUCKETS=1 ");
    std::string code;
    for (const std::string& line : Advise::CodeOf(settings, Replay::Layer::Heap)) { code += line; }
    EXPECT_EQ(code,
              "OBR::MemPool::HeapSettings()    .On(true)    .BucketSize(2010)    "
              ".MaxRecordSize(500)    .MinRecordSize(16)    .DataAlignment(8)    "
              ".KeepEmptyBuckets(true)");
    EXPECT_EQ(Advise::CodeOf({4010, 1000, 8, 8, false}, Replay::Layer::Heap).back(),
              "    .DataAlignment(8)")
        << "The defaults are left out.";
    EXPECT_EQ(Advise::CodeOf(settings, Replay::Layer::Mgr).at(1),
              "OBR::MemPool::NUV_OBR_MEMPOOL_BUCKET_SIZE(2010);");
}

}  // namespace
