// The command line of `mempool`, whatever the subcommand.

#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "Shell.hpp"

using testing::HasSubstr;

namespace {

const std::string mempool = MEMPOOL " ";

TEST(CommandLine, HasHelp) {
    EXPECT_EQ(Shell::Output("for sub in '' run record replay report advise text check help; do " +
                            mempool + "help $sub | grep Usage; done"),
              "Usage: mempool [OPTIONS] SUBCOMMAND\n"
              "Usage: mempool run [OPTIONS] PROGRAM [ARGS...]\n"
              "Usage: mempool record [OPTIONS] PROGRAM [ARGS...]\n"
              "Usage: mempool replay [OPTIONS] TRACE...\n"
              "Usage: mempool report [OPTIONS] TRACE\n"
              "Usage: mempool advise [OPTIONS] TRACE\n"
              "Usage: mempool text [OPTIONS] TRACE\n"
              "Usage: mempool check [OPTIONS] PROGRAM [ARGS...]\n"
              "Usage: mempool help [OPTIONS] SUBCOMMAND\n");
    EXPECT_EQ(Shell::Output(mempool + "help record"), Shell::Output(mempool + "record -h"));
    EXPECT_THAT(Shell::Output(mempool + "help record"),
                HasSubstr("\nOptions:\n"
                          "  -h, --help                  Print this help\n"
                          "  -o, --output FILE           The trace to write"));
    EXPECT_THAT(
        Shell::Output(mempool + "help run"),
        HasSubstr(
            "\n  --seconds N                 Approximate time of the search [default: 15]\n"));
    EXPECT_EQ(Shell::Output(mempool + "-V"), Shell::Output(mempool + "--version"));
    EXPECT_THAT(Shell::Output(mempool + "-V"), testing::ContainsRegex("^mempool [0-9.]+\n$"));
}

TEST(CommandLine, SuggestsWhatWasMeant) {
    const auto refused = [](const std::string& words, int status = 1) {
        const std::string text = Shell::Output(mempool + words, status);
        return text.substr(0, text.find("\nSee 'mempool "));
    };
    EXPECT_EQ(Shell::Output(mempool + "reprt x", 1),
              "mempool: reprt: unknown subcommand; did you mean 'report'?\n"
              "See 'mempool --help'.\n");
    EXPECT_EQ(refused("--hlep"), "mempool: --hlep: unknown option; did you mean '--help'?");
    EXPECT_EQ(refused("help rnu"), "mempool: rnu: unknown subcommand; did you mean 'run'?");
    EXPECT_EQ(refused("tzzt"), "mempool: tzzt: unknown subcommand");
    EXPECT_EQ(refused("''"), "mempool: : unknown subcommand");
    EXPECT_EQ(refused(""), "mempool: A subcommand is required");
    EXPECT_EQ(refused("report --jsno=1"),
              "mempool: --jsno: unknown option; did you mean '--json'?");
    EXPECT_EQ(refused("report -x t"), "mempool: -x: unknown option");
    EXPECT_EQ(refused("report a b"), "mempool: b: unexpected argument");
    EXPECT_EQ(refused("record --outptu t true", 125),
              "mempool: --outptu: unknown option; did you mean '--output'?");
    EXPECT_EQ(refused("run --seconds 4k true", 125), "mempool: --seconds: '4k' is not a number");
    EXPECT_EQ(refused("advise --seconds 0 t"), "mempool: --seconds: 0 is not between 1 and 100000");
    EXPECT_EQ(refused("advise --seconds 99999999999999999999 t"),
              "mempool: --seconds: 99999999999999999999 is not between 1 and 100000");
    EXPECT_EQ(refused("record --pools --by all true", 125), "mempool: --by excludes --pools");
}

// Of the settings in the environment some subcommands take what their options do not set, and say
// so. What else is there is the program's alone.
TEST(CommandLine, TakesOnlyTheNamedSettingsFromTheEnvironment) {
    Shell::WriteFile("trace",
                     "xmpt:c:0000000000000001\nxmpt:a:0000000000000001:0000000000000010:8\n");
    const auto report = [](const std::string& environment, const std::string& options = "",
                           int status = 0) {
        return Shell::Output(
            "env " + environment + " " + mempool + "report --json trace " + options, status);
    };
    const std::string plain = report("");
    EXPECT_EQ(report("NUV_OBR_MEMPOOL_INFO=1 NUV_OBR_MEMPOOL_TRACE=1"), plain);
    EXPECT_EQ(Shell::Output("NUV_OBR_MEMPOOL_MAX_RECORD_SIZE=0 " + mempool + "report --help"),
              Shell::Output(mempool + "report --help"));
    EXPECT_EQ(report("NUV_OBR_MEMPOOL_BUCKET_SIZE=2000 NUV_OBR_MEMPOOL_KEEP_EMPTY_BUCKETS=1"),
              report("", "--bucket-size 2000 --keep-empty"));
    EXPECT_EQ(report("NUV_OBR_MEMPOOL_MIN_RECORD_SIZE=4"), report("", "--min-record 4"));
    EXPECT_EQ(report("NUV_OBR_MEMPOOL_BUCKET_SIZE=no", "--bucket-size 4010"), plain);
    EXPECT_EQ(report("NUV_OBR_MEMPOOL_MIN_RECORD_SIZE=3", "", 1),
              "mempool: NUV_OBR_MEMPOOL_MIN_RECORD_SIZE: 3 is not between 4 and 65535\n"
              "See 'mempool report --help'.\n");
}

TEST(CommandLine, ReportsAnUnwritableOutputBeforeTheWork) {
    const std::string lost = "mempool: standard output cannot be written to\n";
    EXPECT_EQ(Shell::Output(mempool + "report /lost >&-", 1), lost);
    EXPECT_EQ(Shell::Output(mempool + "--help >&-", 1), lost);
    EXPECT_EQ(Shell::Output(mempool + "record -o trace sh -c 'echo x; exit 3' >&- 2>/dev/null", 3),
              "");
    EXPECT_EQ(Shell::Output("ulimit -f 1; " + mempool + "record -o trace true", 125),
              "mempool: shared memory: File too large\n");
}

}  // namespace
