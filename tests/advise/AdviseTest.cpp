// `mempool advise` and `mempool replay --sweep` as their users run them, on a trace of a few
// thousand blocks. Which settings win depends on the machine; the figures, the verdict and the
// lines to paste must agree.

#include <sys/wait.h>

#include <cstdio>
#include <fstream>
#include <set>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <nlohmann/json.hpp>

#include "Folder.hpp"
#include "TraceLines.hpp"

using nlohmann::json;
using testing::HasSubstr;
using testing::Not;

namespace {

std::string Command(const std::string& command, int exitStatus = 0) {
    std::FILE* const tool = popen(command.c_str(), "r");
    std::string text;
    for (int c = std::fgetc(tool); c != EOF; c = std::fgetc(tool)) { text += static_cast<char>(c); }
    const int status = pclose(tool);
    EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == exitStatus) << command << text;
    return text;
}

std::string TraceFile(const std::string& name, const std::string& lines) {
    std::string path = FolderPath() + "/" + name;
    std::ofstream(path) << Lines(lines);
    return path;
}

// A pool with blocks of many sizes, half of which go again.
std::string Blocks(const std::string& more, int number = 4000) {
    std::string lines = "@c:P\n" + more;
    for (int i = 0; i < number; ++i) {
        const std::string address = "0000000000" + std::to_string(100000 + i);
        lines += "@a:P:" + address + ":" + std::to_string(i % 90 * 3) + "\n";
        if (i % 2 == 0) { lines += "@f:P:" + address + ":\n"; }
    }
    return lines;
}

TEST(Advise, TextFiguresVerdictAndEnvironmentAgree) {
    const std::string path = TraceFile("shared", Blocks("@i:allocation_share:0.25\n"));
    const json advice = json::parse(Command(MEMPOOL " advise --json --seconds 4 " + path));

    std::set<std::string> keys;
    for (const auto& [key, value] : advice.items()) { keys.insert(key); }
    EXPECT_EQ(keys,
              (std::set<std::string>{"layer", "events", "events_left_out", "heap", "settings",
                                     "fastest", "smallest", "advised", "best", "verdict", "price",
                                     "sentences", "environment", "allocation_share",
                                     "allocation_share_error", "mimalloc", "stopped", "plan"}));
    EXPECT_EQ(advice["layer"], "heap");
    EXPECT_EQ(advice["events"], 6001);
    EXPECT_EQ(advice["events_left_out"], 0);
    EXPECT_EQ(advice["stopped"], false);
    EXPECT_EQ(advice["allocation_share"], 0.25);
    const json& settings = advice["settings"];
    ASSERT_GE(settings.size(), 2U);
    EXPECT_EQ(advice["heap"].size(), 3U);
    const json& fastest = settings[advice["fastest"].get<std::size_t>()];
    const json& smallest = settings[advice["smallest"].get<std::size_t>()];
    for (const json& each : settings) {
        EXPECT_EQ(each.size(), 8U);
        EXPECT_GT(each["ns_per_event"], 0);
        EXPECT_GE(each["ns_spread"], 0);
        EXPECT_NE(each["ns_spread"], each["ns_per_event"]);
        EXPECT_LE(fastest["ns_per_event"], each["ns_per_event"]);
        EXPECT_LE(smallest["bytes_held"], each["bytes_held"]);
    }
    const bool helps = advice["verdict"] != "none";
    EXPECT_EQ(advice["advised"].is_null(), !helps) << advice;
    EXPECT_EQ(advice["environment"].size(), helps ? 6U : 0U) << advice;
    const std::string sentence = advice["sentences"][0];
    EXPECT_EQ(sentence.find("Pools would help") == 0, helps);
    EXPECT_EQ(sentence.find("at a price") != std::string::npos, advice["price"] != "none");
    if (helps) {
        const json& advised = settings[advice["advised"].get<std::size_t>()];
        EXPECT_EQ(std::to_string(advised["bucket_size"].get<unsigned int>()),
                  advice["environment"]["NUV_OBR_MEMPOOL_BUCKET_SIZE"]);
    }
}

TEST(Advise, PrintsWhatItHasWhenItIsStopped) {
    const std::string path = TraceFile("long", Blocks("", NUM_BLOCKS));
    const json advice = json::parse(
        Command("timeout -s TERM 8 " MEMPOOL " advise --json --seconds 60 " + path, 124));
    EXPECT_EQ(advice["stopped"], true);
    EXPECT_GE(advice["settings"].size(), 1U);
}

TEST(Advise, SweepsSeveralTraces) {
    const std::string path = TraceFile("plain", Blocks(""));
    const std::string sweep = Command(MEMPOOL " replay --sweep --seconds 1 " + path + " " + path);
    EXPECT_THAT(sweep, HasSubstr("/plain\n   Bad lines: 0\n   Events: 6001\n"));
    EXPECT_NE(sweep.find("Events", sweep.find("fastest")), std::string::npos);
    EXPECT_THAT(sweep, Not(HasSubstr("Pools would")));
    EXPECT_THAT(sweep, Not(HasSubstr("that were tried")));
    EXPECT_THAT(Command(MEMPOOL " replay --sweep --dbg x 2>&1", 1), HasSubstr("excludes"));
}

TEST(Advise, RefusesOtherFilesAndReadsABrokenTraceUpToTheDamage) {
    const std::string pool = TraceFile("pool", "@c:P\n");
    EXPECT_THAT(Command(MEMPOOL " advise " + pool + " 2>&1", 1),
                HasSubstr("/pool: no block was allocated\n"));
    for (const std::string lost : {"advise --seconds 1 ", "replay --rounds 1 "}) {
        EXPECT_EQ(
            Command(MEMPOOL " " + lost + TraceFile("lost", Blocks("")) + " 2>&1 >/dev/full", 1),
            "mempool: standard output cannot be written to\n");
    }
    const std::string cut =
        "gzip -c " + TraceFile("whole", Blocks("")) + " | head -c 5000 | " MEMPOOL;
    const std::string advice = Command(cut + " advise --json --seconds 1 - 2>&1", 1);
    EXPECT_THAT(advice, HasSubstr("; the events before that were read\n"));
    EXPECT_THAT(advice, HasSubstr("\"verdict\""));
}

}  // namespace
