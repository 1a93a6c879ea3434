// `mempool report` as its users run it. Compares the report on a small trace, whose figures can be
// worked out by hand, with expected/report.txt and expected/report.json, which OBR_MEMPOOL_APPROVE
// rewrites.

#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "Folder.hpp"

using testing::HasSubstr;

namespace {

std::string Path(const std::string& name) {
    return FolderPath() + "/" + name;
}

std::string Bytes(const std::string& path) {
    std::ifstream file(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
}

// What `mempool report` writes on both streams, given that it returns `exitStatus`.
std::string Tool(const std::string& arguments, int exitStatus = 0) {
    const std::string command = "cd " + Path("") + " && " MEMPOOL " report 2>&1 " + arguments;
    std::FILE* const tool = popen(command.c_str(), "r");
    std::string text;
    for (int c = std::fgetc(tool); c != EOF; c = std::fgetc(tool)) { text += static_cast<char>(c); }
    const int status = pclose(tool);
    EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == exitStatus) << text;
    return text;
}

// Two groups, of which one is cleared and the other not all freed. A name with everything that
// could be taken for something else, and a bad line.
const char* const trace =
    "output of the program\n"
    "xmpt:i:program:demo "
    "--fast\nxmpt:i:by:caller\nxmpt:i:allocation_share:0.25\nxmpt:i:allocation_share_error:0.05\n"
    "xmpt:i:threads:2\nxmpt:i:foreign_frees:3\nxmpt:i:cpu_seconds:1.5\n"
    "xmpt:c:0000000000000001\nxmpt:n:0000000000000001:nodes\n"
    "xmpt:c:0000000000000002\n"
    "xmpt:n:0000000000000002:</script>\xC3\xBC\x1B[31m\xC2\x9B\"\\\x80&\n"
    "xmpt:a:0000000000000001:0000000000000010:24\n"
    "xmpt:a:0000000000000001:0000000000000020:22\n"
    "xmpt:a:0000000000000002:0000000000000030:5000\n"
    "xmpt:f:0000000000000001:0000000000000010:\n"
    "xmpt:f:0000000000000001:0000000000000040:\n"
    "xmpt:a:0000000000000002:0000000000000050:100\n"
    "xmpt:x:0000000000000001\n"
    "xmpt:f:0000000000000002:0000000000000050:\n"
    "xmpt:f:0000000000000002:0000000000000030:\n"
    "xmpt:a:0000000000000002:0000000000000060:7\n";

void ExpectFile(const std::string& text, const std::string& name) {
    const std::string path = std::string(EXPECTED_DIR "/") + name;
    if (std::getenv("OBR_MEMPOOL_APPROVE") != nullptr) { std::ofstream(path) << text; }
    EXPECT_EQ(text, Bytes(path));
}

TEST(Report, ShowsTheFiguresOfASmallTrace) {
    std::ofstream(Path("small")) << trace;
    ExpectFile(Tool("small"), "report.txt");
    ExpectFile(Tool("--json small"), "report.json");
    EXPECT_EQ(Tool("- <small").substr(0, 15), "standard input\n");
    EXPECT_THAT(Tool("--alignment 16 --json small"), HasSubstr("\"padding\":39,"));
}

TEST(Report, IsAPageUnlessAllIsRequested) {
    std::ofstream file(Path("many"));
    const std::string longName = "<list<int>>" + std::string(80, 'n') + "-the-end";
    for (int group = 100; group < 150; ++group) {
        const std::string pool = ":0000000000000" + std::to_string(group);
        file << "xmpt:c" << pool << "\nxmpt:n" << pool << ':' << group << longName << "\nxmpt:a"
             << pool << ":0000000000000010:" << group << '\n';
    }
    const std::string last = ":0000000000000149:0000000000000020:";
    file << "xmpt:f:0000000000000100:0000000000000010:\nxmpt:f:0000000000000149:0000000000000010:\n"
         << "xmpt:a" << last << "999600\nxmpt:f" << last << '\n';
    file.close();
    const std::string page = Tool("many");
    EXPECT_LE(std::count(page.begin(), page.end(), '\n'), 45);
    EXPECT_THAT(page, HasSubstr("GROUPS LARGEST AT THE PEAK (7 of 50)"));
    EXPECT_THAT(page, HasSubstr("\n   1.00 MB  ")) << "999,600 bytes.";
    EXPECT_THAT(page, HasSubstr("SIZES WITH MOST BLOCKS (6 of 51)"));
    EXPECT_THAT(page, HasSubstr("\n   blocks  3.9 %  5.9 %  94.1 %\n"));
    EXPECT_THAT(page, HasSubstr("  149<..>nnnnnnnnnn...nnnnnnnn-the-end\n"));
    const std::string all = Tool("--all many");
    EXPECT_THAT(all, HasSubstr("149" + longName + "\n"));
    EXPECT_THAT(all, HasSubstr("100" + longName + "\n"));
    EXPECT_THAT(all, HasSubstr("\n            100            1 "));
}

TEST(Report, FoldsTheStacksOfThePeak) {
    const std::string pool = ":0000000000000001";
    std::ofstream(Path("stacks")) << "xmpt:i:by:stack\nxmpt:c" << pool << "\nxmpt:n" << pool
                                  << ":main+0x1 (p);list<int>::f(int)+0x2 (p, p.c:3)\nxmpt:a"
                                  << pool << ":0000000000000010:24\nxmpt:f" << pool
                                  << ":0000000000000010:\nxmpt:a" << pool
                                  << ":0000000000000010:99\n";
    EXPECT_EQ(Tool("--folded stacks"), "main;list<int>::f 99\n");
    std::ofstream(Path("small")) << trace;
    EXPECT_THAT(Tool("--folded small", 1), HasSubstr("small: has no call stacks"));
}

// Names are text in the page, and its data end where they should.
TEST(Report, WritesAPage) {
    std::ofstream(Path("small")) << trace;
    if (HAS_PAGE == 0) {
        EXPECT_THAT(Tool("--html page.html small", 1), HasSubstr("Debian package libjs-d3"));
        return;
    }
    const std::string text = Tool("--html page.html small");
    const std::string page = Bytes(Path("page.html"));
    ExpectFile(text, "report.txt");
    EXPECT_EQ(Tool("--html - small"), page);
    const std::string start = "<script type=\"application/json\" id=\"data\">";
    const std::size_t first = page.find(start) + start.size();
    std::string data = page.substr(first, page.find("</script>", first) - first);
    const std::string escape = "\\u003c";
    EXPECT_EQ(data.find('<'), std::string::npos);
    for (std::size_t place = data.find(escape); place != std::string::npos;
         place = data.find(escape)) {
        data.replace(place, escape.size(), "<");
    }
    EXPECT_EQ(data + "\n", Tool("--json small"));
    std::ofstream(Path("advice")) << R"({"sentences": ["</script>"], "settings": []})";
    EXPECT_THAT(
        Tool("--html - --advice advice small"),
        HasSubstr(R"(id="advice">{"sentences":["\u003c/script>"],"settings":[]}</script>)"));
    EXPECT_EQ(Tool("--html page.html --advice small small", 1),
              "mempool: small: is not the output of 'mempool advise --json'\n");
    EXPECT_EQ(Tool("--html page.html --advice lost small", 1),
              "mempool: lost: No such file or directory\n");
    EXPECT_EQ(Tool("--html advice --advice advice small", 1),
              "mempool: advice: input and output are the same file\n");
    EXPECT_EQ(Tool("--html no/where small", 1), "mempool: no/where: No such file or directory\n");
    EXPECT_EQ(Tool("--html small small", 1),
              "mempool: small: input and output are the same file\n");
    EXPECT_EQ(Tool("--html small - <small", 1),
              "mempool: small: input and output are the same file\n");
    EXPECT_EQ(Bytes(Path("small")), trace);
    EXPECT_THAT(Tool("--html /dev/full small", 1), HasSubstr("mempool: /dev/full: No space left"));
    for (const char* lost : {"small", "--json small", "--help"}) {
        EXPECT_EQ(Tool(std::string(lost) + " >/dev/full", 1),
                  "mempool: standard output cannot be written to\n");
    }
}

TEST(Report, SaysWhatIsWrongWithATrace) {
    std::ofstream(Path("other")) << "nothing of the kind\n";
    EXPECT_EQ(Tool("other", 1), "mempool: other: not a trace\n");
    EXPECT_EQ(Tool("/dev/null", 1), "mempool: /dev/null: not a trace\n");
    EXPECT_EQ(Tool("- <$(printf '\\0\\377' >bytes; echo bytes)", 1),
              "mempool: standard input: not a trace\n");
    EXPECT_EQ(Tool("/nowhere", 1), "mempool: /nowhere: No such file or directory\n");
    EXPECT_THAT(Tool("--bucket-size 1003 other", 1),
                HasSubstr("mempool: no pool can have these settings: "));
    std::ofstream(Path("small")) << trace;
    const std::string cutCommand =
        "$(gzip <small >whole.gz; head -c 200 whole.gz >cut.gz; echo cut.gz)";
    const std::string broken = Tool(cutCommand, 1);
    EXPECT_THAT(
        broken,
        HasSubstr("mempool: cut.gz: unexpected end of file; the events before that were read\n"));
    EXPECT_THAT(broken, HasSubstr("   blocks                "));
    EXPECT_THAT(Tool("--json cut.gz", 1),
                HasSubstr("\"warning\":\"cut.gz: unexpected end of file"));
}

}  // namespace
