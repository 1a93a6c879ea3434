// An advice from the trace to the text.

#include <cstdlib>
#include <sstream>
#include <string>

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
    const auto bytes = [](bool mergesGroups, Replay::Layer layer = Replay::Layer::Heap) {
        Trace::StepReader reader(ReadLines(Lines("@c:P\n@a:P:X:24\n@c:Q\n@a:Q:Y:24\n")), "trace");
        const auto advice =
            Advise::TakeAdvice(reader, {layer, mergesGroups, 1}, [](const std::string&) {});
        return advice.findings.settings.at(0).figures.bytes;
    };
    EXPECT_NEAR(bytes(false), 2 * bytes(true), 300);
    EXPECT_GT(bytes(true, Replay::Layer::Malloc), bytes(true) + 300000) << "With the preload.";
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
