// `mempool replay` as its users run it. Compares the whole report with expected/replay.txt, which
// OBR_MEMPOOL_APPROVE rewrites. Times, and the allocator's rounding, vary and are compared with
// bounds.

#include <sys/wait.h>
#include <unistd.h>
#include <zlib.h>

#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <sstream>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "Child.hpp"
#include "Folder.hpp"
#include "TraceLines.hpp"

#if defined(__has_feature)
#if __has_feature(address_sanitizer)
#define CLANG_SANITIZES_ADDRESS
#endif
#endif

using testing::HasSubstr;
using testing::Not;

namespace {

// Writes a file and returns its name.
std::string File(const std::string& name, const std::string& content, const char* mode = "wbT") {
    const gzFile file = gzopen((FolderPath() + "/" + name).c_str(), mode);
    gzwrite(file, content.data(), static_cast<unsigned>(content.size()));
    EXPECT_EQ(gzclose(file), Z_OK);
    return name;
}

std::string Bytes(const std::string& name) {
    std::ifstream file(FolderPath() + "/" + name, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
}

// What a command writes on both streams, given that it returns `exitStatus`.
std::string Command(const std::string& command, int exitStatus) {
    std::FILE* const tool = popen(("cd " + FolderPath() + " && " + command + " 2>&1").c_str(), "r");
    std::string text;
    for (int c = std::fgetc(tool); c != EOF; c = std::fgetc(tool)) { text += static_cast<char>(c); }
    const int status = pclose(tool);
    EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == exitStatus) << text;
    return text;
}

std::string Tool(const std::string& arguments, int exitStatus = 0,
                 const Child::Environment& environment = {}) {
    Child::SetEnvironment(environment);
    return Command(MEMPOOL " replay " + arguments, exitStatus);
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
    const std::string pools = Lines(
        "reading input\n@c:P\n@a:P:X:40\nanswer? @f:P:X:\n@a:P:X:24\n@a:P:Y:40\n@f:P:Y:\n"
        "@d:P\n@c:P\n@c:Q\n@a:P:X:0\n@a:Q:X:40\n@a:Q:Y:24\n@f:Q:X:\n@d:Q");
    const std::string bad = Lines(
        "@c:P\n@a:P:X:100000\n@a:P:X:100000\n@f:P:Y:\n@a:P:Y:1073741824\n"
        "@a:P:Y:99999999999999999999\n@d:Q\n@a:Q:X:1\n@c:P\n"
        // None of these is taken for a good line.
        "@\n@b:P\n@c:\n@cQ\n@c:6a1300\n@c:Q0\n@c:g000000000000000\n@d:P \n@a:P\n@a:P:Y:\n"
        "@a:P:Y:-1\n@a:P:Y:8x\n@a:P:Y8\n@a:PY:8\n@x:P:\n@n:P\n@i:key\n@f:P:X\n@f:P:X:1\n@f:P:7f10:"
        "\n@f:P:X:\n");
    const std::string packed = File("packed", pools, "wb9");
    File("other", "reading\n");
    File("worse", "\n" + Lines("@d:P\n@c:\n"));
    const std::string files = "/nowhere /dev " + File("cut", Bytes(packed).substr(0, 12)) +
                              " other worse " + packed + " " +
                              File("plain", std::string(200000, 'x') + '\0' + pools + "\n") + " " +
                              File("bad", bad) + " " + File("idle", Lines("@c:P\n"));
    const std::string report = Tool("--rounds 2 " + files, 1);

    std::string text;
    std::istringstream lines(report);
    for (std::string line; std::getline(lines, line); text += line + "\n") {
        const bool isHeld = line.find("   bytes held") == 0;
        if (isHeld || line.find("   ns per event") == 0) {
            EXPECT_EQ(line.size(), 25U + 3 * 12) << line;
            const bool isOfNothing = isHeld && line.back() == '-';
            line.replace(25, std::string::npos, isOfNothing ? "  # # -" : "  # # #");
        }
        if (line.find("   spread") == 0) { line = "   spread  # #"; }
    }
    const std::string path = EXPECTED_DIR "/replay.txt";
    if (std::getenv("OBR_MEMPOOL_APPROVE") != nullptr) { std::ofstream(path) << text; }
    std::ifstream file(path);
    EXPECT_EQ(text, std::string(std::istreambuf_iterator<char>(file), {}));
    const Figures times = Find(report, "ns per event");
    EXPECT_TRUE(times.pool > 1 && times.pool < 1e7) << times.pool;
    EXPECT_TRUE(times.heap > 1 && times.heap < 1e7) << times.heap;
    const Figures idle = Find(report.substr(report.find("\nidle\n")), "ns per event");
    EXPECT_NE(idle.pool, idle.heap) << "A pool is built; the heap has nothing to do.";
}

TEST(Replay, RefusesAnInvalidCommandLine) {
    EXPECT_EQ(Tool("", 1), "mempool: TRACE is required\nSee 'mempool replay --help'.\n");
    EXPECT_THAT(Tool("--rounds 0 x", 1), HasSubstr("--rounds"));
    for (const char* option : {"--bucket-size 65536", "--max-record 32768", "--min-record 3",
                               "--alignment 0", "--alignment 65536"}) {
        EXPECT_THAT(Tool(std::string(option) + " x", 1), HasSubstr(" is not between "));
    }
    EXPECT_THAT(Tool("--layer arena x", 1), HasSubstr("--layer"));
}

// One step more or less, and the library would stop the process.
TEST(Replay, RefusesSettingsThatNoPoolCanHave) {
    const std::string path = File("one", Lines("@c:P\n"));
    for (const char* options :
         {"--bucket-size 1004", "--alignment 3 --bucket-size 1003", "--min-record 997",
          "--max-record 32767 --bucket-size 32768", "--max-record 4 --min-record 4"}) {
        EXPECT_THAT(Tool(options + (" --layer mgr --rounds 1 " + path)), HasSubstr("ns per event"))
            << options;
    }
    for (const char* options : {"--bucket-size 1003", "--alignment 3 --bucket-size 1003",
                                "--layer mgr --alignment 3 --bucket-size 1002", "--bucket-size 3",
                                "--min-record 1001", "--max-record 3"}) {
        EXPECT_THAT(Tool(options + (" " + path), 1),
                    HasSubstr("mempool: no pool can have these settings: "));
    }
    EXPECT_THAT(Tool(path, 1, {{"NUV_OBR_MEMPOOL_BUCKET_SIZE", "20"}}),
                HasSubstr("a maximum record size of 1000 needs a bucket size of at least 1004, "
                          "not 20\n"));
}

// The last line may lack digits, so it does not count.
TEST(Replay, ReplaysATruncatedTraceUpToItsLastLine) {
    const std::string whole = Bytes(File("stored", Lines("@c:P\n@a:P:X:24\n@a:P:Y:128\n"), "wb0"));
    File("cut", whole.substr(0, whole.find("128\n") + 2));
    const std::string report = Tool("--rounds 1 - <cut", 1);
    EXPECT_THAT(report, HasSubstr("mempool: standard input: unexpected end of file; the events "
                                  "before that were read\n"));
    EXPECT_THAT(report, HasSubstr("bytes at the peak               24 "));
    EXPECT_THAT(report, HasSubstr("   ns per event"));
}

// Memory runs out at 256 MB; the next trace still has its turn.
TEST(Replay, FailsWhereMemoryRunsOut) {
    const std::string files =
        File("large", Lines("@c:P\n@a:P:X:600000000\n")) + " " + File("small", Lines("@c:P\n"));
#if defined(__SANITIZE_ADDRESS__) || defined(CLANG_SANITIZES_ADDRESS)
    const std::string limit =
        "ASAN_OPTIONS=allocator_may_return_null=1:max_allocation_size_mb=256 ";
#else
    const std::string limit = "ulimit -v 262144; ";
#endif
    const std::string report = Command(limit + MEMPOOL " replay --rounds 1 " + files, 1);
    EXPECT_THAT(report, HasSubstr("mempool: large: out of memory\n"));
    EXPECT_THAT(report, HasSubstr("small\n   Bad lines: 0\n"));
}

// The block of 200 bytes is gone by the peak, that of 56 is yet to come. Sizes that the allocator
// does not round.
TEST(Replay, CountsWhatIsHeldAtThePeak) {
    const std::string path =
        File("held", Lines("@c:P\n@a:P:X:200\n@f:P:X:\n@a:P:X:1992\n@a:P:Y:24\n@f:P:X:\n") +
                         Lines("@a:P:X:5000\n@f:P:X:\n@a:P:X:56\n"));
    const auto held = [&](const std::string& options, const std::string& layer = "mgr") {
        return Find(Tool("--layer " + layer + " --rounds 1 " + options + path),
                    "bytes held at the peak");
    };
    const Figures figures = held("");
    EXPECT_NEAR(figures.heap, 5000 + 24 + 2 * 8, 16) << "A free block may be split off or not.";
    // A pool, its table, its first group, a heap record, a bucket; names and the like.
    EXPECT_NEAR(figures.pool, 88 + 249 * 8 + 40 + 5000 + 24 + 4000 + 250, 250);
    EXPECT_NEAR(held("--keep-empty ").pool, figures.pool + 4000, 200) << "The bucket of 200 bytes.";
    EXPECT_NEAR(held("--keep-empty ", "heap").pool, held("", "heap").pool + 4000, 200);
    EXPECT_NEAR(held("--bucket-size 1004 ").pool, figures.pool - 3000, 50);
}

TEST(Replay, BuildsPoolsByOptionsAndEnvironment) {
    const std::string path = File("dbg", Lines("@c:P\n@a:P:X:24\n@a:P:Y:10\n@f:P:X:\n"));
    EXPECT_THAT(Tool(path), Not(HasSubstr("MemPool::Mgr")));
    const std::string report =
        Tool("--layer mgr --dbg --bucket-size 600 --max-record 300 --min-record 16 " + path, 0,
             {{"NUV_OBR_MEMPOOL_TRACE", "1"},
              {"NUV_OBR_MEMPOOL_BUCKET_SIZE", "700"},
              {"NUV_OBR_MEMPOOL_KEEP_EMPTY_BUCKETS", ""},
              {"NUV_OBR_MEMPOOL_DATA_ALIGNMENT", "2"}});
    for (const char* line :
         {"MemPool::Mgr 00000000006a1200\n", "Bucket Size :              600\n",
          "Max Rec Sz  :              300\n", "Min Rec Sz  :               16\n",
          "Data Align  :                2\n", "Used Recs   :                2\n"}) {
        EXPECT_THAT(report, HasSubstr(line));
    }
    EXPECT_THAT(report, Not(HasSubstr("xmpt:")));
    EXPECT_THAT(Tool("--dbg --alignment 8 " + path), HasSubstr("Data Align  :                8\n"));
}

}  // namespace
