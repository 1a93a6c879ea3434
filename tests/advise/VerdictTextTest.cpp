// What is said of a verdict: its first sentence is about the program, not about a replay.

#include <optional>
#include <sstream>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "mempool/Sweep.hpp"

using testing::HasSubstr;
using testing::StartsWith;

namespace {

// The heap takes 10 ns and 1000 bytes, pools as told.
Tool::Advice Advice(double ns, double bytes, std::optional<double> share) {
    Tool::Advice advice;
    advice.numEvents = 1000;
    advice.findings = {{10, 0.1, 1000, 9}, {{{506, 128, 8, 16, true}, {ns, 0.1, bytes, 9}}}, {}};
    advice.verdict = Advise::Judge(advice.findings);
    advice.allocationShare = share;
    return advice;
}

std::string Verdict(const Tool::Advice& advice) {
    std::ostringstream text;
    PrintVerdict(text, advice);
    return text.str();
}

TEST(VerdictText, TellsFirstWhetherTheProgramWouldNotice) {
    EXPECT_THAT(Verdict(Advice(5, 1000, {})), StartsWith("Pools would help: they take 0.50 of"));
    EXPECT_THAT(Verdict(Advice(5, 1000, 0.02)), StartsWith("Pools would help: they"));
    EXPECT_THAT(Verdict(Advice(5, 1100, 0.02)), StartsWith("Pools would help, at a price: they"));
    EXPECT_THAT(Verdict(Advice(5, 1100, 0.018)),
                StartsWith("The program would not notice: pools would save 0.9 % of its time.\n"));
    EXPECT_THAT(Verdict(Advice(5, 900, 0.018)),
                StartsWith("The program would notice less memory, but not the time: "));
    EXPECT_THAT(Verdict(Advice(11, 800, 0.018)), StartsWith("Pools would help, at a price"));
    Tool::Advice few = Advice(5, 1000, 0.5);
    few.numEvents = 999;
    EXPECT_THAT(Verdict(few), StartsWith("The program would not notice: 999 events are few.\n"));
    EXPECT_THAT(Verdict(few), HasSubstr("BUCKET_SIZE=506"));
}

TEST(VerdictText, TellsWhatWasLeftOutAndMarksWhatIsAdvised) {
    Tool::Advice cut = Advice(5, 1100, {});
    cut.numLeftOut = 500;
    EXPECT_THAT(Verdict(cut), StartsWith("Judged by its start alone: 500 of 1500 events"));
    std::ostringstream table;
    PrintTable(table, cut, false);
    EXPECT_THAT(table.str(), HasSubstr("   Events: 1000, the first of 1500\n"));
    EXPECT_THAT(table.str(), HasSubstr(" fastest, smallest, advised\n"));
}

}  // namespace
