// What follows from figures.

#include "advise/Verdict.hpp"

#include <optional>
#include <string>
#include <vector>

#include <gtest/gtest.h>

using Index = std::optional<std::size_t>;

namespace {

// The heap takes 10 ns and 1000 bytes, and strays by 1 ns.
struct Setting {
    double ns;
    double bytes;
    double spread = 0.1;
    Replay::PoolSettings settings = {4010, 1000, 8, 4, true};
};

Advise::Verdict Judge(const std::vector<Setting>& settings) {
    Advise::Findings findings{{10, 1, 1000, 9}, {}, {}};
    for (const Setting& each : settings) {
        findings.settings.push_back({each.settings, {each.ns, each.spread, each.bytes, 9}});
    }
    return Advise::Judge(findings);
}

void Expect(const std::vector<Setting>& settings, Index best, Index advised, const char* name) {
    const Advise::Verdict verdict = Judge(settings);
    EXPECT_EQ(verdict.best, best) << name;
    EXPECT_EQ(verdict.advised, advised) << name;
    EXPECT_STREQ(verdict.Name(), name);
}

TEST(Verdict, NamesTheBestThatCostsNothing) {
    Expect({}, {}, {}, "none");
    Expect({{11, 900}, {5, 800}, {4, 1001}, {6, 500}}, 3, 3, "both");
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

TEST(Verdict, NoGainIsWithinTheSpreadOfTheRuns) {
    Expect({{9.01, 1000}}, 0, {}, "none");
    Expect({{8.99, 1000}}, 0, 0, "faster");
    Expect({{8, 1000, 2.1}}, 0, {}, "none");
    Expect({{8, 1000, 1.9}}, 0, 0, "faster");
    Expect({{9.5, 500}}, 0, 0, "smaller");
}

TEST(Verdict, APriceMustBeWorthIt) {
    Expect({{5, 1500}}, {}, 0, "faster");
    Expect({{5, 2100}}, {}, {}, "none");
    Expect({{14, 700}}, {}, 0, "smaller");
    Expect({{14, 720}}, {}, {}, "none");
    Expect({{5, 1500}, {4, 1500}, {9, 1050}}, {}, 1, "faster");
    Expect({{2, 1100}, {8, 990}}, 1, 1, "faster");
    Expect({{9.5, 1000}, {5, 1500}}, 0, 1, "faster");
}

TEST(Verdict, TheFewestChangesWinAmongEquals) {
    const Replay::PoolSettings defaults = {4010, 1000, 8, 4, false};
    const Replay::PoolSettings far = {2010, 500, 16, 8, true};
    Expect({{5, 1000, 0.5, far}, {5.4, 1000, 0.1, defaults}}, 1, 1, "faster");
    Expect({{5, 1000, 0.3, far}, {5.4, 1000, 0.1, defaults}}, 0, 0, "faster");
}

TEST(Verdict, TheShareOfAllocationBoundsWhatAProgramCanWin) {
    EXPECT_DOUBLE_EQ(Advise::TimeOfProgram(0.12, 0.6), 0.952);
    EXPECT_EQ(Advise::ShareOf("0.125"), std::optional(0.125));
    for (const char* text : {"", "x", "-0.1", "1.1", "0.5 ", "nan"}) {
        EXPECT_EQ(Advise::ShareOf(text), std::nullopt) << text;
    }
}

TEST(Verdict, SettingsArePastedAsCode) {
    std::string code;
    for (const std::string& line : Advise::CodeOf({2010, 500, 16, 8, true})) { code += line; }
    EXPECT_EQ(code,
              "OBR::MemPool::HeapSettings()    .On(true)    .BucketSize(2010)    "
              ".MaxRecordSize(500)    .MinRecordSize(16)    .DataAlignment(8)    "
              ".KeepEmptyBuckets(true)");
}

}  // namespace
