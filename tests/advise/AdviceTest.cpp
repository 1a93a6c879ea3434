// An advice from the trace to the text.

#include <cstdlib>
#include <optional>
#include <sstream>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "TraceLines.hpp"
#include "mempool/AdviceText.hpp"

using testing::HasSubstr;
using testing::Not;

namespace {

// The heap takes 10 ns and 1000 bytes, pools 5 ns and as many bytes as given.
Advise::Advice Advice(double bytes) {
    Advise::Advice advice;
    advice.program = {1000, 500, {}};
    advice.findings = {{10, 0.1, 1000, 9}, {}, {{{506, 128, 8, 16, true}, {5, 0.1, bytes, 9}}}, {}};
    advice.verdict = Advise::Judge(advice.findings, advice.program);
    return advice;
}

std::string Verdict(const Advise::Advice& advice) {
    std::ostringstream text;
    Tool::PrintVerdict(text, advice);
    return text.str();
}

TEST(Advice, IsForOnePoolOrForThoseOfTheTrace) {
    const auto bytes = [](const std::string& by, Replay::Layer layer = Replay::Layer::Heap) {
        Trace::StepReader reader(
            ReadLines(Lines("@i:by:" + by + "\n@c:P\n@a:P:X:24\n@c:Q\n@a:Q:Y:24\n")), "trace");
        const auto advice = Advise::TakeAdvice(reader, {layer, 1}, [](const std::string&) {});
        return advice.findings.settings.at(0).figures.bytes;
    };
    EXPECT_NEAR(bytes("pools"), 2 * bytes("caller"), 300);
    EXPECT_GT(bytes("all", Replay::Layer::Malloc), bytes("caller") + 300000) << "With the preload.";
}

TEST(Advice, KnowsWhatTheTraceSaysAboutTheProgram) {
    Replay::Recording recording;
    recording.steps.resize(7);
    recording.numLeftOut = 5;
    const Advise::Program program = Advise::ProgramOf(recording,
                                                      {{"allocation_share", "0.25"},
                                                       {"allocation_share_error", "0.125"},
                                                       {"cpu_seconds", "1.5"},
                                                       {"threads", "3"}},
                                                      Replay::Layer::Malloc);
    EXPECT_EQ(program.numThreads, 3U);
    EXPECT_EQ(Advise::ProgramOf(recording, {{"by", "pools"}, {"threads", "3"}}, Replay::Layer::Heap)
                  .numThreads,
              1U);
    EXPECT_EQ(program.numEvents, 7U);
    EXPECT_EQ(program.numLeftOut, 5U);
    EXPECT_EQ(program.allocationShare, std::optional(0.25));
    EXPECT_EQ(program.shareError, std::optional(0.125));
    EXPECT_EQ(program.seconds, std::optional(1.5));
    EXPECT_EQ(program.startSeconds, Replay::secondsOfPreload);
    const Advise::Program unknown = Advise::ProgramOf(recording, {}, Replay::Layer::Heap);
    EXPECT_EQ(unknown.allocationShare, std::nullopt);
    EXPECT_EQ(unknown.seconds, std::nullopt);
    EXPECT_EQ(unknown.startSeconds, 0);
}

TEST(Advice, HasAPlanForGroupsThatDieTogether) {
#ifdef OBR_MEMPOOL_CHECKS
    GTEST_SKIP() << "The checks take longer than what a plan saves.";
#endif
    std::string lines = "@i:by:caller\n@c:P\n@n:P:tree\n@c:Q\n@n:Q:log\n@a:Q:X:24\n";
    for (const char kind : {'a', 'f'}) {
        for (int block = 100000; block < 120000; ++block) {
            lines += std::string("@") + kind + ":P:0000000000" + std::to_string(block) +
                     (kind == 'a' ? ":24\n" : ":\n");
        }
    }
    Advise::Advice advice;
    for (int attempt = 0; attempt < 5 && !advice.plan.has_value(); ++attempt) {
        Trace::StepReader reader(ReadLines(Lines(lines)), "trace");
        advice = Advise::TakeAdvice(reader, {Replay::Layer::Malloc, 1}, [](const std::string&) {});
    }
    Trace::StepReader again(ReadLines(Lines(lines)), "trace");
    EXPECT_FALSE(
        Advise::TakeAdvice(again, {Replay::Layer::Malloc, 1, false}, [](const auto&) {}).plan);
    ASSERT_TRUE(advice.plan.has_value());
    EXPECT_EQ(advice.plan->pools.at(0).groups, std::vector<std::string>{"tree"});
    EXPECT_LT(advice.plan->figures.time, advice.plan->onePool.time);
    EXPECT_TRUE(advice.program.hasPlan);
    EXPECT_THAT(advice.plan->sentence, HasSubstr("aligned to 8. A pool "));
    EXPECT_LT(advice.plan->onePool.bytes, advice.plan->heap.bytes + 300000)
        << "A Heap, not the preloaded library.";
}

TEST(Advice, PrintsAPlan) {
    Advise::Advice advice = Advice(2500);
    advice.plan = Advise::Plan{
        {{{"a", "b\n", "c", "d", "e"}, 3000, 12345, 2, 2000, 77}, {{"f"}, 9, 8, 1, 7, 6}},
        {},
        {},
        {},
        {},
        "A pool ..."};
    EXPECT_THAT(Verdict(advice),
                HasSubstr("\n\nA pool ...\n   Pool 1: one FreeAll for each 1,000 blocks, 2 in all, "
                          "the first at event 77, drops 2,000 of 3,000 blocks; peak 12.3 KB\n"
                          "      a\n      b\\n\n      c\n      d\n      and 1 more\n"
                          "   Pool 2: one FreeAll, at event 6, drops 7 of 9 blocks; peak 8 B \n"));
}

TEST(Advice, IsPrintedWithLinesToPasteIfPoolsHelp) {
    const std::string text = Verdict(Advice(900));
    EXPECT_THAT(text, HasSubstr("Pools would help: "));
    EXPECT_THAT(text, HasSubstr("\n    export NUV_OBR_MEMPOOL_BUCKET_SIZE=506\n"));
    EXPECT_THAT(text, HasSubstr("\n        .BucketSize(506)\n"));
    EXPECT_THAT(Verdict(Advice(2500)), Not(HasSubstr("BUCKET")));
    Advise::Advice preloaded = Advice(900);
    preloaded.layer = Replay::Layer::Malloc;
    EXPECT_THAT(Verdict(preloaded), Not(HasSubstr("in code")));

    std::ostringstream table;
    Tool::PrintTable(table, Advice(900), false);
    EXPECT_THAT(table.str(), HasSubstr("   Events: 1000, the first of 1500\n"));
    EXPECT_THAT(table.str(),
                HasSubstr(" 10.0     0.1  1.00   1000  1.00\n      506     128       8 "
                          "     16  kept        5.0     0.1  0.50    900  0.90  "
                          "fastest, smallest, best, advised\n"));
}

TEST(Advice, TableHasTheBestAndTheNamedSettings) {
    Advise::Advice advice = Advice(900);
    advice.findings.settings.push_back({{}, {20, 0.1, 1000, 9}});
    for (unsigned int i = 9; i > 0; --i) {
        advice.findings.settings.push_back({{2010, 500, i, 4, false}, {i + 10., 0, 1000, 1}});
    }
    advice.findings.givenUp = {{{}, "too slow"}, {{}, "out of memory"}, {{}, "too slow"}};
    advice.verdict = Advise::Judge(advice.findings, advice.program);
    std::ostringstream table;
    Tool::PrintTable(table, advice, false);
    EXPECT_THAT(table.str(),
                HasSubstr("advised\n     2010     500       1       4  released    "
                          "11.0       -  1.10   1000  1.00\n     2010     500       2 "));
    EXPECT_THAT(
        table.str(),
        HasSubstr(
            "  1.70   1000  1.00\n     4010    1000       8       4  released    20.0     0.1  "
            "2.00   1000  1.00  default\n   and 2 more settings that were tried\n"
            "   1 setting was given up: out of memory\n   2 settings were given up: too slow\n"));
}

TEST(Advice, EndsInACommandThatTriesIt) {
    EXPECT_EQ(Tool::TryCommand({2010, 500, 16, 8, true}, {"perl", "-e", "print 'x'", ""}),
              "mempool try --bucket-size 2010 --max-record 500 --min-record 16 --alignment 8 "
              "--keep-empty -- perl -e 'print '\\''x'\\''' ''");
    EXPECT_EQ(Tool::TryCommand({}, {"a"}), "mempool try -- a");
    setenv("NUV_OBR_MEMPOOL_KEEP_EMPTY_BUCKETS", "1", 1);
    EXPECT_EQ(Tool::TryCommand({}, {"a"}), "mempool try --keep-empty=false -- a");
    unsetenv("NUV_OBR_MEMPOOL_KEEP_EMPTY_BUCKETS");
}

}  // namespace
