// `mempool try` on small programs of any machine.

#include <sys/wait.h>

#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <nlohmann/json.hpp>

#include "Folder.hpp"

using nlohmann::json;
using testing::ContainsRegex;
using testing::HasSubstr;
using testing::MatchesRegex;
using testing::Not;
using testing::StartsWith;

namespace {

// What is written on the standard output; the errors are in a file.
std::string Try(const std::string& arguments, int exitStatus = 0, const std::string& under = "") {
    const std::string command =
        under + MEMPOOL " try --rounds 2 " + arguments + " 2>" + FolderPath() + "/errors";
    std::FILE* const tool = popen(command.c_str(), "r");
    std::string text;
    for (int c = std::fgetc(tool); c != EOF; c = std::fgetc(tool)) { text += static_cast<char>(c); }
    const int status = pclose(tool);
    EXPECT_EQ(WIFEXITED(status) ? WEXITSTATUS(status) : -1, exitStatus) << command;
    return text;
}

std::string Content(const std::string& name) {
    std::ifstream file(FolderPath() + "/" + name);
    return {std::istreambuf_iterator<char>(file), {}};
}

std::string Errors() {
    return Content("errors");
}

TEST(Try, ComparesMallocAndPools) {
    const std::string input = FolderPath() + "/input";
    std::ofstream(input) << "b\na\n";
    const json tried = json::parse(Try("--json --stdin " + input + " -- sort -r", 0));
    EXPECT_EQ(Errors(), "b\na\n") << "Shown once.";
    EXPECT_EQ(tried["rounds"], 2);
    EXPECT_EQ(tried["same_output"], true);
    EXPECT_THAT(tried["sentences"][0].get<std::string>(),
                MatchesRegex("On pools the program takes .* \\(too few rounds to compare\\) .*"));
    EXPECT_THAT(tried["sentences"].back().get<std::string>(), Not(HasSubstr("mimalloc gains")));
    const json& sides = tried["sides"];
    ASSERT_GE(sides.size(), 2U);
    EXPECT_EQ(sides[0]["name"], "malloc");
    EXPECT_EQ(sides[1]["name"], "pools");
    for (const json& side : sides) {
        EXPECT_EQ(side["cpu_ratio"],
                  side["cpu_seconds"].get<double>() / sides[0]["cpu_seconds"].get<double>());
        EXPECT_EQ(side["peak_ratio"],
                  side["peak_bytes"].get<double>() / sides[0]["peak_bytes"].get<double>());
        EXPECT_GT(side["wall_seconds"], 0);
        EXPECT_GE(side["cpu_spread"], 0);
        EXPECT_GT(side["peak_bytes"], 500000);
        EXPECT_GT(side["page_faults"], 50);
    }
}

TEST(Try, SaysWhereTheOutputDiffers) {
    const json own = json::parse(
        Try("--json --bucket-size 2010 -- sh -c 'echo $LD_PRELOAD $NUV_OBR_MEMPOOL_BUCKET_SIZE'"));
    EXPECT_EQ(own["same_output"], false);
    EXPECT_EQ(own["verdict"], "differs");
    EXPECT_THAT(own["sentences"][0].get<std::string>(),
                HasSubstr("differs; it ended with status 0."));
    Try("-- sh -c 'test -z \"$LD_PRELOAD\" || kill -KILL $$'");
    EXPECT_THAT(Errors(), ContainsRegex("\n   pools  .* - .* -  "));
    EXPECT_THAT(Errors(), HasSubstr("differs; it ended by signal Killed.\n"));
    EXPECT_THAT(Errors(), Not(HasSubstr("of malloc's time"))) << "Nor has mimalloc.";
    for (const char* program :
         {"echo $LD_PRELOAD >&2", "head -c 99999 /dev/zero; echo $LD_PRELOAD"}) {
        const json other = json::parse(Try(std::string("--json -- sh -c '") + program + "'"));
        EXPECT_EQ(other["same_output"], false) << program;
    }
    EXPECT_TRUE(json::parse(Try("--json sh -c 'echo $$'"))["same_output"].is_null());
    const json status = json::parse(Try("--json -- sh -c 'test -z \"$LD_PRELOAD\"'"));
    EXPECT_EQ(status["same_output"], false) << "The exit status counts too.";
    const json once = json::parse(Try("--json -- sh -c 'test -z \"$LD_PRELOAD\" || ! mkdir " +
                                      FolderPath() + "/once 2>/dev/null || echo more'"));
    EXPECT_EQ(once["same_output"], false) << "On pools in the first round only.";
}

// Each of two rounds begins with another side. Lines of mimalloc count only if they are wrong.
TEST(Try, SetsTheEnvironmentOfEachRun) {
    setenv("LD_PRELOAD", ":", 1);
    setenv("NUV_OBR_MEMPOOL_BUCKET_SIZE", "2010", 1);
    Try("-- sh -c 'echo ${LD_PRELOAD##*/} $NUV_OBR_MEMPOOL_ON $NUV_OBR_MEMPOOL_BUCKET_SIZE | "
        "grep -v mimalloc.so.2::.2010$ >>" +
        FolderPath() + "/runs; true'");
    unsetenv("LD_PRELOAD");
    unsetenv("NUV_OBR_MEMPOOL_BUCKET_SIZE");
    EXPECT_EQ(Content("runs"),
              ": 2010\nlibMallocOnPools.so:: 1 2010\n: 2010\n"
              ": 2010\nlibMallocOnPools.so:: 1 2010\n");
}

TEST(Try, EndsAsTheProgramDoes) {
    EXPECT_EQ(Try("sh -c 'echo once; echo wrong >&2; exit 3'", 3), "once\n");
    EXPECT_THAT(Errors(), StartsWith("wrong\n\n"));
    EXPECT_THAT(Errors(), HasSubstr("\n   Rounds: 2\n"));
    EXPECT_THAT(Errors(), HasSubstr("\n   pools "));
    Try("sh -c 'kill $$'; exit $?", 128 + 15);
    Try("/nowhere/program", 127);
    Try(STATIC_HOST, 126);
    Try("--bucket-size 100 true", 125);
    EXPECT_THAT(Errors(), HasSubstr("mempool: no pool can have these settings: "));
    Try("--stdin /nowhere true", 125);
}

TEST(Try, StopsInAnyRun) {
    const std::string none = "mempool: stopped before the end of the first round\n";
    Try("sleep 20", 128 + 2, "timeout --foreground --preserve-status -s INT 1 ");
    EXPECT_EQ(Errors(), none);
    // The second run on malloc is the last one of the first round.
    Try("sh -c 'test -n \"$LD_PRELOAD\" || mkdir " + FolderPath() + "/first || kill -INT $PPID'",
        125);
    EXPECT_THAT(Errors(), HasSubstr(none));
}

}  // namespace
