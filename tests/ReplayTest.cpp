// `mempool replay` as its users run it: traces in files, the report on standard output, all of it
// against expected/replay.txt. Times, and what the allocator makes of a request, are no fixed
// figures: they are held against bounds. OBR_MEMPOOL_APPROVE makes the test write the text anew.

#include <sys/wait.h>
#include <zlib.h>

#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <iterator>
#include <map>
#include <sstream>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "Child.hpp"

using testing::HasSubstr;
using testing::Not;

namespace {

// A trace from a shorthand, in which the pools are P and Q, the addresses of blocks X and Y.
std::string Trace(const std::string& shorthand) {
    const std::map<char, const char*> meanings = {{'@', "xmpt:"},
                                                  {'P', "00000000006a1200"},
                                                  {'Q', "00000000006a1300"},
                                                  {'X', "00007f0000000010"},
                                                  {'Y', "00007f0000000020"}};
    std::string text;
    for (const char letter : shorthand) {
        const auto meaning = meanings.find(letter);
        text += meaning != meanings.end() ? meaning->second : std::string(1, letter);
    }
    return text;
}

// Writes a trace and returns its name.
std::string File(const std::string& suffix, const std::string& content, const char* mode = "wbT") {
    const gzFile file = gzopen((testing::TempDir() + "ReplayTest." + suffix).c_str(), mode);
    gzwrite(file, content.data(), static_cast<unsigned>(content.size()));
    EXPECT_EQ(gzclose(file), Z_OK);
    return "ReplayTest." + suffix;
}

// What the tool writes on both streams, given that it returns `exitStatus`.
std::string Tool(const std::string& arguments, int exitStatus = 0,
                 const Child::Environment& environment = {}) {
    Child::SetEnvironment(environment);
    const std::string command = "cd " + testing::TempDir() + " && " MEMPOOL " replay " + arguments;
    std::FILE* const tool = popen((command + " 2>&1").c_str(), "r");
    std::string text;
    for (int c = std::fgetc(tool); c != EOF; c = std::fgetc(tool)) { text += static_cast<char>(c); }
    const int status = pclose(tool);
    EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == exitStatus) << text;
    return text;
}

struct Figures {
    double pool = 0;
    double heap = 0;
    double ratio = 0;
};

Figures Find(const std::string& report, const std::string& label) {
    std::istringstream rest(report.substr(report.find("   " + label) + 3 + label.size()));
    Figures figures;
    rest >> figures.pool >> figures.heap >> figures.ratio;
    const double ratio = figures.pool / figures.heap;  // Of two times that were rounded to 0.1.
    EXPECT_NEAR(figures.ratio, ratio, 0.0051 + 0.05 * (1 + ratio) / figures.heap) << report;
    return figures;
}

// Two pools among other output, and a third one at the address of the first. The peak of 64 bytes
// comes twice, the second time with an empty block more. The last line needs no end.
TEST(Replay, ReportsOnEachTrace) {
    const std::string pools = Trace(
        "reading input\n@c:P\n@a:P:X:40\nanswer? @f:P:X:\n@a:P:X:24\n@a:P:Y:40\n@f:P:Y:\n"
        "@d:P\n@c:P\n@c:Q\n@a:P:X:0\n@a:Q:X:40\n@a:Q:Y:24\n@f:Q:X:\n@d:Q");
    const std::string bad = Trace(
        "@c:P\n@a:P:X:1073741823\n@a:P:X:1073741823\n@f:P:Y:\n@a:P:Y:1073741824\n"
        "@a:P:Y:99999999999999999999\n@d:Q\n@a:Q:X:1\n@c:P\n"
        // None of these is taken for a good line.
        "@\n@b:P\n@c:\n@cQ\n@c:6a1300\n@c:Q0\n@c:g000000000000000\n@d:P \n@a:P\n@a:P:Y:\n"
        "@a:P:Y:-1\n@a:P:Y:8x\n@a:P:Y8\n@a:PY:8\n@f:P:X\n@f:P:X:1\n@f:P:7f10:\n@f:P:X:\n");
    const std::string packed = File("packed", pools, "wb9");
    std::ifstream whole(testing::TempDir() + packed, std::ios::binary);
    std::string head(60, '\0');
    whole.read(head.data(), 60);
    const std::string files =
        "/nowhere /dev " + File("cut", head) + " " + File("empty", "") + " " + packed + " " +
        File("plain", std::string(200000, 'x') + '\0' + pools + "\n") + " " + File("bad", bad);
    const std::string report = Tool("--rounds 2 " + files, 1);

    std::string text;
    std::istringstream lines(report);
    for (std::string line; std::getline(lines, line); text += line + "\n") {
        const bool compares = line.find("   bytes held") == 0 || line.find("   ns an event") == 0;
        if (compares && line.back() != '-') { line.replace(27, std::string::npos, "# # #"); }
    }
    const std::string path = EXPECTED_DIR "/replay.txt";
    if (std::getenv("OBR_MEMPOOL_APPROVE") != nullptr) { std::ofstream(path) << text; }
    std::ifstream file(path);
    EXPECT_EQ(text, std::string(std::istreambuf_iterator<char>(file), {}));
    const Figures times = Find(report, "ns an event");
    EXPECT_TRUE(times.pool > 1 && times.pool < 50000) << times.pool;
    EXPECT_TRUE(times.heap > 1 && times.heap < 50000) << times.heap;
}

TEST(Replay, RefusesACommandLineThatMakesNoSense) {
    EXPECT_THAT(Tool("", 1), HasSubstr("TRACE is required"));
    EXPECT_THAT(Tool("--rounds 0 x", 1), HasSubstr("--rounds"));
    EXPECT_THAT(Tool("--alignment 65536 x", 1), HasSubstr("--alignment"));
    EXPECT_THAT(Tool("--help"), HasSubstr("NUV_OBR_MEMPOOL_TRACE=1"));
}

// The block of 200 bytes is gone by the peak, that of 56 is yet to come. Sizes that the allocator
// does not round.
TEST(Replay, CountsWhatIsHeldAtThePeak) {
    const std::string path =
        File("held", Trace("@c:P\n@a:P:X:200\n@f:P:X:\n@a:P:X:1992\n@a:P:Y:24\n@f:P:X:\n") +
                         Trace("@a:P:X:5000\n@f:P:X:\n@a:P:X:56\n"));
    const auto held = [&](const std::string& options) {
        return Find(Tool("--rounds 1 " + options + path), "bytes held at the peak");
    };
    const Figures figures = held("");
    EXPECT_EQ(figures.heap, 5000 + 24);
    // A pool, its table, its first group, a heap record, a bucket; names and the like.
    EXPECT_NEAR(figures.pool, 88 + 249 * 8 + 40 + 5000 + 24 + 4000 + 250, 250);
    EXPECT_NEAR(held("--keep-empty ").pool, figures.pool + 4000, 200) << "The bucket of 200 bytes.";
    EXPECT_NEAR(held("--bucket-size 1004 ").pool, figures.pool - 3000, 50);
}

TEST(Replay, BuildsPoolsByOptionsAndEnvironment) {
    const std::string path = File("dbg", Trace("@c:P\n@a:P:X:24\n@a:P:Y:10\n@f:P:X:\n"));
    EXPECT_THAT(Tool(path), Not(HasSubstr("MemPool::Mgr")));
    const std::string report =
        Tool("--dbg --bucket-size 600 --max-record 300 --min-record 16 " + path, 0,
             {{"NUV_OBR_MEMPOOL_TRACE", "1"},
              {"NUV_OBR_MEMPOOL_BUCKET_SIZE", "700"},
              {"NUV_OBR_MEMPOOL_DATA_ALIGNMENT", "2"}});
    for (const char* line :
         {"MemPool::Mgr 00000000006a1200\n", "Bucket Size :              600\n",
          "Max Rec Sz  :              300\n", "Min Rec Sz  :               16\n",
          "Data Align  :                2\n", "Used Recs   :                2\n"}) {
        EXPECT_THAT(report, HasSubstr(line));
    }
    EXPECT_THAT(report, Not(HasSubstr("xmpt:")));
    EXPECT_THAT(Tool("--dbg --alignment 8 " + path), HasSubstr("Data Align  :                8\n"));
    EXPECT_THAT(Tool("--bucket-size 20 " + path, 1), HasSubstr("ERROR:../s/MemPool: 1988: "));
}

}  // namespace
