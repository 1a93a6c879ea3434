// mempool-replay as its users run it: traces in files, the report on standard output. Times, and
// what the allocator makes of a request, are no fixed figures: they are held against bounds.

#include <sys/wait.h>
#include <zlib.h>

#include <MemPool>
#include <cstdio>
#include <iostream>
#include <random>
#include <regex>
#include <sstream>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "Child.hpp"

namespace {

// Pools and blocks of the traces below, and the lines of what happens to them.
const std::string p1 = "00000000006a1200";
const std::string p2 = "00000000006a1300";
const std::string x = "00007f0000000010";
const std::string y = "00007f0000000020";

std::string Created(const std::string& pool) {
    return "xmpt:c:" + pool + "\n";
}
std::string Destroyed(const std::string& pool) {
    return "xmpt:d:" + pool + "\n";
}
std::string Allocated(const std::string& pool, const std::string& data, const std::string& size) {
    return "xmpt:a:" + pool + ":" + data + ":" + size + "\n";
}
std::string Freed(const std::string& pool, const std::string& data) {
    return "xmpt:f:" + pool + ":" + data + ":\n";
}

// Two pools among other output, and a third one at the address of the first. The peak of 64 bytes
// comes twice, the second time with an empty block more.
const std::string traceOfPools =
    "Reading input.\n" + Created(p1) + Allocated(p1, x, "40") + "Answer? " + Freed(p1, x) +
    Allocated(p1, x, "24") + Allocated(p1, y, "40") + Freed(p1, y) + Destroyed(p1) + Created(p1) +
    Created(p2) + Allocated(p1, x, "0") + Allocated(p2, x, "40") + Allocated(p2, y, "24") +
    Freed(p2, x) + Destroyed(p2);
const std::string reportOnPools =
    "   Bad lines: 0\n"
    "                                   pool        heap   pool/heap\n"
    "   pools                              3           3\n"
    "   events                            14          14\n"
    "   blocks at the peak                 3           3\n"
    "   bytes at the peak                 64          64\n"
    "   blocks never freed                 3           3\n"
    "   bytes held at the peak             #           #           #\n"
    "   ns an event                        #           #           #\n";

// Writes a file of this test and returns its path.
std::string File(const std::string& name, const std::string& content, const char* mode = "wbT") {
    const std::string path = testing::TempDir() + "ReplayTest." + name;
    const gzFile file = gzopen(path.c_str(), mode);
    EXPECT_EQ(gzwrite(file, content.data(), static_cast<unsigned>(content.size())),
              static_cast<int>(content.size()));
    EXPECT_EQ(gzclose(file), Z_OK);
    return path;
}

// What the tool writes on both streams, given that it returns `exitStatus`.
std::string Tool(const std::string& arguments, int exitStatus = 0,
                 const Child::Environment& environment = {}) {
    Child::SetEnvironment(environment);
    std::FILE* const tool = popen((MEMPOOL_REPLAY " " + arguments + " 2>&1").c_str(), "r");
    std::string text;
    for (int c = std::fgetc(tool); c != EOF; c = std::fgetc(tool)) { text += static_cast<char>(c); }
    const int status = pclose(tool);
    EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == exitStatus) << text;
    return text;
}

// The report with "#" for the figures of its two lines that compare.
std::string Masked(const std::string& report) {
    static const std::regex figures(
        "( {3}(?:bytes held at the peak|ns an event {11}))( +[0-9.]+){3}\n");
    return std::regex_replace(report, figures, "$1             #           #           #\n");
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
    EXPECT_TRUE(rest) << report;
    EXPECT_NEAR(figures.ratio, figures.pool / figures.heap, 0.005 + 0.1 / figures.heap);
    return figures;
}

testing::AssertionResult Has(const std::string& text, const std::string& part) {
    if (text.find(part) != std::string::npos) { return testing::AssertionSuccess(); }
    return testing::AssertionFailure() << "no \"" << part << "\" in:\n" << text;
}

TEST(Replay, ReadsPoolsAmongOtherOutputPlainOrCompressed) {
    const std::string plain = File("pools", traceOfPools + "Done.");
    const std::string packed = File("pools.gz", traceOfPools, "wb9");
    EXPECT_EQ(Masked(Tool("--rounds 2 " + plain + " " + packed)),
              plain + "\n" + reportOnPools + packed + "\n" + reportOnPools);
    EXPECT_EQ(Masked(Tool(File("cut", traceOfPools.substr(0, traceOfPools.size() - 1)))),
              File("cut", traceOfPools) + "\n" + reportOnPools)
        << "The last line needs no end.";
    const std::string path = File("long", std::string(200000, 'x') + '\0' + traceOfPools);
    EXPECT_EQ(Masked(Tool(path)), path + "\n" + reportOnPools);
}

TEST(Replay, LeavesBadLinesOutAndTellsThem) {
    const std::string largest = Allocated(p1, x, "1073741823");
    const std::string trace = Created(p1) + largest + largest +                     // 1 to 3
                              Freed(p1, y) + Allocated(p1, y, "1073741824") +       // 4, 5
                              Allocated(p1, y, "99999999999999999999") +            // 6
                              Destroyed(p2) + Allocated(p2, x, "1") + Created(p1);  // 7 to 9
    // None of these is taken for a good line.
    std::string malformed;
    int numMalformed = 0;
    for (const std::string& line : std::initializer_list<std::string>{
             "", "b:" + p1, "c:", "c" + p2, "c:" + p2.substr(1), "c:" + p2 + "0", "c:" + p2 + ":",
             "c:g" + p2.substr(1), "d:" + p1 + " ", "a:" + p1, "a:" + p1 + ":" + y,
             "a:" + p1 + ":" + y + ":", "a:" + p1 + ":" + y + ":-1", "a:" + p1 + ":" + y + ":8x",
             "a:" + p1 + ":" + y + "8", "a:" + p1 + y + ":8", "f:" + p1 + ":" + x,
             "f:" + p1 + ":" + x + ":1", "f:" + p1 + ":" + x.substr(1) + ":"}) {
        malformed += "xmpt:" + line + "\n";
        ++numMalformed;
    }
    const std::string path = File("bad", trace + malformed + Freed(p1, x));
    const std::string report = Tool("--rounds 1 " + path);
    const std::string expected = path + "\n   Bad lines: " + std::to_string(numMalformed + 7) +
                                 "\n      " + std::to_string(numMalformed) +
                                 " x truncated or malformed\n"
                                 "      2 x size above 1073741823\n"
                                 "      2 x unknown pool\n"
                                 "      1 x pool created twice\n"
                                 "      1 x free of what was not allocated\n"
                                 "      1 x pointer allocated twice\n"
                                 "   " +
                                 path +
                                 ":3: pointer allocated twice\n"
                                 "   " +
                                 path +
                                 ":4: free of what was not allocated\n"
                                 "   " +
                                 path +
                                 ":5: size above 1073741823\n"
                                 "   " +
                                 path +
                                 ":6: size above 1073741823\n"
                                 "   " +
                                 path +
                                 ":7: unknown pool\n"
                                 "   and more\n";
    EXPECT_EQ(report.substr(0, expected.size()), expected);
    EXPECT_TRUE(Has(report, "events                             3           3\n"));
    EXPECT_TRUE(Has(report, "blocks at the peak                 1           1\n"));
    EXPECT_TRUE(Has(report, "bytes at the peak         1073741823  1073741823\n"));
    EXPECT_TRUE(Has(report, "blocks never freed                 0           0\n"));
}

TEST(Replay, GoesOnAfterAFileThatCannotBeRead) {
    const std::string packed = File("whole.gz", traceOfPools, "wb");
    ASSERT_EQ(std::system(("head -c 60 " + packed + " > " + packed + ".cut").c_str()), 0);
    const std::string plain = File("after", traceOfPools);
    EXPECT_EQ(Masked(Tool("/nowhere /dev " + packed + ".cut " + plain, 1)),
              "mempool-replay: /nowhere: No such file or directory\n"
              "mempool-replay: /dev: Is a directory\n"
              "mempool-replay: " +
                  packed + ".cut: unexpected end of file\n" + plain + "\n" + reportOnPools);
}

TEST(Replay, RefusesACommandLineThatMakesNoSense) {
    EXPECT_TRUE(Has(Tool("", 1), "TRACE is required"));
    EXPECT_TRUE(Has(Tool("--rounds 0 x", 1), "--rounds"));
    EXPECT_TRUE(Has(Tool("--alignment 65536 x", 1), "--alignment"));
    EXPECT_TRUE(Has(Tool("--bucket-size -1 x", 1), "--bucket-size"));
    EXPECT_TRUE(Has(Tool("--help"), "NUV_OBR_MEMPOOL_TRACE=1"));
}

TEST(Replay, CountsWhatIsHeldAtThePeak) {
    // The block of 200 bytes is gone by then, that of 56 is yet to come. Sizes that the allocator
    // does not round.
    const std::string path = File("held", Created(p1) + Allocated(p1, x, "200") + Freed(p1, x) +
                                              Allocated(p1, x, "5000") + Allocated(p1, y, "24") +
                                              Freed(p1, x) + Allocated(p1, x, "56"));
    const auto held = [&](const std::string& options) {
        return Find(Tool("--rounds 1 " + options + path), "bytes held at the peak");
    };
    const Figures figures = held("");
    EXPECT_EQ(figures.heap, 5000 + 24);
    // A pool, its table, its first group, a heap record, a bucket; names and the like.
    const double least = 88 + 249 * 8 + 40 + 5000 + 24 + 4000;
    EXPECT_GT(figures.pool, least);
    EXPECT_LT(figures.pool, least + 500);
    EXPECT_NEAR(held("--keep-empty ").pool, figures.pool + 4000, 200) << "The bucket of 200 bytes.";
    EXPECT_NEAR(held("--bucket-size 1004 ").pool, figures.pool - 3000, 50);
}

TEST(Replay, BuildsPoolsByOptionsAndEnvironment) {
    const std::string path =
        File("dbg", Created(p1) + Allocated(p1, x, "24") + Allocated(p1, y, "10") + Freed(p1, x));
    const auto setting = [](const char* label, unsigned int value) {
        char line[80];
        std::snprintf(line, sizeof line, "%s : %16u\n", label, value);
        return std::string(line);
    };
    EXPECT_FALSE(Has(Tool(path), "MemPool::Mgr"));
    const std::string report =
        Tool("--dbg --bucket-size 600 --max-record 300 --min-record 16 " + path, 0,
             {{"NUV_OBR_MEMPOOL_TRACE", "1"},
              {"NUV_OBR_MEMPOOL_BUCKET_SIZE", "700"},
              {"NUV_OBR_MEMPOOL_DATA_ALIGNMENT", "2"}});
    EXPECT_TRUE(Has(report, "MemPool::Mgr " + p1 + "\n"));
    EXPECT_TRUE(Has(report, setting("Bucket Size", 600)));
    EXPECT_TRUE(Has(report, setting("Max Rec Sz ", 300)));
    EXPECT_TRUE(Has(report, setting("Min Rec Sz ", 16)));
    EXPECT_TRUE(Has(report, setting("Data Align ", 2)));
    EXPECT_TRUE(Has(report, setting("Used Recs  ", 2)));
    EXPECT_FALSE(Has(report, "xmpt:"));
    EXPECT_TRUE(Has(Tool("--dbg --alignment 8 " + path), setting("Data Align ", 8)));
    EXPECT_TRUE(Has(Tool("--bucket-size 20 " + path, 1), "ERROR:../s/MemPool: 1988: "));
}

// A trace as the library writes it, of blocks that come and go in no order.
TEST(Replay, ReadsWhatTheLibraryWrites) {
    std::ostringstream trace;
    std::streambuf* const output = std::cout.rdbuf(trace.rdbuf());
    OBR::MemPool::NUV_OBR_MEMPOOL_ON(true);
    OBR::MemPool::NUV_OBR_MEMPOOL_TRACE(true);
    std::size_t numBlocks = 0;
    {
        OBR::MemPool::Mgr pool;
        std::vector<void*> blocks;
        std::minstd_rand random(1);
        for (int step = 0; step < 10000; ++step) {
            if (blocks.empty() || random() % 3 != 0) {
                blocks.push_back(pool.Alloc(static_cast<unsigned int>(random() % 1200)));
            } else {
                std::swap(blocks[random() % blocks.size()], blocks.back());
                pool.Free(blocks.back());
                blocks.pop_back();
            }
        }
        numBlocks = blocks.size();
    }
    OBR::MemPool::NUV_OBR_MEMPOOL_TRACE(false);
    std::cout.rdbuf(output);

    const std::string report = Tool(File("recorded", trace.str()));
    EXPECT_TRUE(Has(report, "Bad lines: 0\n"));
    char events[80];
    std::snprintf(events, sizeof events, "   %-24s%12d%12d\n", "events", 10002, 10002);
    EXPECT_TRUE(Has(report, events));
    char neverFreed[80];
    std::snprintf(neverFreed, sizeof neverFreed, "   %-24s%12zu%12zu\n", "blocks never freed",
                  numBlocks, numBlocks);
    EXPECT_TRUE(Has(report, neverFreed));
    const Figures times = Find(report, "ns an event");
    EXPECT_GT(times.pool, 1);
    EXPECT_GT(times.heap, 1);
    EXPECT_LT(times.pool, 5000);
    EXPECT_LT(times.heap, 5000);
}

}  // namespace
