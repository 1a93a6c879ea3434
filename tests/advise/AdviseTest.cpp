// `mempool advise` and `mempool replay --sweep` as their users run them, on a trace of a few
// thousand blocks. Which settings win is the machine's affair; that the figures, what is said of
// them and the lines to paste agree is not.

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
std::string Blocks(const std::string& more) {
    std::string lines = "@c:P\n" + more;
    for (int i = 0; i < 4000; ++i) {
        const std::string address = "0000000000" + std::to_string(100000 + i);
        lines += "@a:P:" + address + ":" + std::to_string(i % 90 * 3) + "\n";
        if (i % 2 == 0) { lines += "@f:P:" + address + ":\n"; }
    }
    return lines;
}

TEST(Advise, FiguresVerdictAndEnvironmentAgree) {
    const std::string path = TraceFile("shared", Blocks("@i:allocation_share:0.25\n"));
    const json advice = json::parse(Command(MEMPOOL " advise --json --seconds 1 " + path));

    std::set<std::string> keys;
    for (const auto& [key, value] : advice.items()) { keys.insert(key); }
    EXPECT_EQ(keys, (std::set<std::string>{"events", "events_left_out", "heap", "settings",
                                           "fastest", "smallest", "advised", "best", "verdict",
                                           "environment", "allocation_share"}));
    EXPECT_EQ(advice["events"], 6001);
    EXPECT_EQ(advice["events_left_out"], 0);
    EXPECT_EQ(advice["allocation_share"], 0.25);
    const json& heap = advice["heap"];
    const json& settings = advice["settings"];
    ASSERT_GE(settings.size(), 2U);
    EXPECT_EQ(heap.size(), 3U);
    const json& fastest = settings[advice["fastest"].get<std::size_t>()];
    const json& smallest = settings[advice["smallest"].get<std::size_t>()];
    bool anyCostsNothing = false;
    const auto costsNothing = [&](const json& each) {
        return each["ns_per_event"] <= heap["ns_per_event"] &&
               each["bytes_held"] <= heap["bytes_held"];
    };
    for (const json& each : settings) {
        EXPECT_EQ(each.size(), 8U);
        EXPECT_GT(each["ns_per_event"], 0);
        EXPECT_GE(each["ns_spread"], 0);
        EXPECT_LE(fastest["ns_per_event"], each["ns_per_event"]);
        EXPECT_LE(smallest["bytes_held"], each["bytes_held"]);
        anyCostsNothing = anyCostsNothing || costsNothing(each);
    }
    EXPECT_EQ(advice["best"].is_null(), !anyCostsNothing);
    if (anyCostsNothing) { EXPECT_TRUE(costsNothing(settings[advice["best"].get<std::size_t>()])); }

    // With the environment that is advised a pool has the settings of one of the rows.
    ASSERT_EQ(advice["environment"].empty(), advice["verdict"] == "none") << advice;
    ASSERT_EQ(advice["advised"].is_null(), advice["verdict"] == "none") << advice;
    if (advice["verdict"] == "none") { return; }
    std::string variables = "env";
    for (const auto& [name, value] : advice["environment"].items()) {
        variables += " " + name + "=" + value.get<std::string>();
    }
    const std::string report = Command(variables + " " MEMPOOL " replay --rounds 1 --dbg " + path);
    const auto value = [&](const std::string& label) {
        return std::stoul(report.substr(report.find(label + " :") + label.size() + 2));
    };
    unsigned int numMatches = 0;
    for (const json& each : settings) {
        const auto alignment = each["data_alignment"].get<unsigned int>();
        const auto rounded = each["max_record_size"].get<unsigned int>() / alignment * alignment;
        const bool keeps = advice["environment"]["NUV_OBR_MEMPOOL_KEEP_EMPTY_BUCKETS"] == "1";
        if (each["bucket_size"] == value("Bucket Size") && rounded == value("Max Rec Sz ") &&
            alignment == value("Data Align ") && each["keep_empty_buckets"] == keeps &&
            std::to_string(each["min_record_size"].get<unsigned int>()) ==
                advice["environment"]["NUV_OBR_MEMPOOL_MIN_RECORD_SIZE"]) {
            ++numMatches;
            EXPECT_EQ(&each, &settings[advice["advised"].get<std::size_t>()]);
            const bool isFaster = each["ns_per_event"] < heap["ns_per_event"];
            const bool isSmaller = each["bytes_held"] < heap["bytes_held"];
            EXPECT_TRUE(advice["verdict"] == "smaller" || isFaster) << advice;
            EXPECT_TRUE(advice["verdict"] == "faster" || isSmaller) << advice;
        }
    }
    EXPECT_EQ(numMatches, 1U) << report << advice;
}

TEST(Advise, PrintsATableAndAVerdict) {
    const std::string path = TraceFile("plain", Blocks("@i:allocation_share:0.25\n"));
    const std::string advice = Command(MEMPOOL " advise --seconds 1 " + path);
    EXPECT_THAT(advice, HasSubstr("\n     heap "));
    EXPECT_THAT(advice, HasSubstr("\nPools would "));
    EXPECT_THAT(advice, HasSubstr("Allocation takes 25 % of the program's processor time"));
    EXPECT_THAT(advice, HasSubstr("if allocation cost nothing 75 %"));
    for (const char* name : {"fastest", "smallest", "default\n"}) {
        EXPECT_THAT(advice, HasSubstr(name));
    }

    const std::string unknown = TraceFile("unknown", Blocks(""));
    const std::string sweep =
        Command(MEMPOOL " replay --sweep --seconds 1 " + unknown + " " + path);
    EXPECT_THAT(sweep, HasSubstr("/unknown\n   Bad lines: 0\n   Events: 6001\n"));
    EXPECT_THAT(sweep, HasSubstr("/plain\n"));
    EXPECT_THAT(sweep, Not(HasSubstr("Pools would")));
    EXPECT_THAT(Command(MEMPOOL " replay --sweep --dbg x 2>&1", 1), HasSubstr("excludes"));
    const std::string shares = Command(MEMPOOL " advise --json --seconds 1 - <" + unknown);
    EXPECT_TRUE(json::parse(shares)["allocation_share"].is_null());
}

TEST(Advise, RefusesWhatIsNoTraceAndGoesAsFarAsABrokenOneDoes) {
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
    EXPECT_THAT(advice, HasSubstr("read as far as it goes\n"));
    EXPECT_THAT(advice, HasSubstr("\"verdict\""));
}

}  // namespace
