// WordPools as its users run it. Compares the output, the standard error and the exit status of
// each command with expected/wordpools.txt, which OBR_MEMPOOL_APPROVE rewrites. Times and memory
// vary and are compared with bounds.

#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <sstream>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "Child.hpp"

using testing::ContainsRegex;
using testing::HasSubstr;
using testing::Not;

namespace {

std::string Content(const std::string& path) {
    std::ifstream file(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
}

class WordPools : public testing::Test {
protected:
    const std::string folder = testing::TempDir() + "WordPools." + std::to_string(getpid()) + "/";

    WordPools() {
        Child::SetEnvironment({});
        setenv("SCRIPTS", SOURCES "/scripts", 1);
        setenv("PATH", (WORD_POOLS_FOLDER ":" + std::string(std::getenv("PATH"))).c_str(), 1);
        std::filesystem::create_directory(folder);
        // Ties, capitals, the neighbours of letters and digits, and UTF-8 down to its lowest byte.
        Write("mixed",
              "Zebra zebra ZEBRA apple Apple\r\n@A[ `Z{ /0:9; q\x7fr\n\nit's a 3.14 b\u00c0 "
              "\u00dcber \u00fcber\na" +
                  std::string(1500, '-') + "no_last newline");
        Write("empty", "");
        std::string lines;
        for (int line = 0; line < 2500; ++line) { lines += std::string(999, '=') + '\n'; }
        Write("large", lines);
        Write("odd.runs",
              "on 1.4 .0004 3200\noff 1.5 .0010 2048\noff 1.3 .003 2048\n"
              "on 1.2 .0003 3072\non 1.1 .0005 3000\noff 1.6 .002 2100\n");
        Write("even.runs", "on 25 0 1024\non 15 0 1024\noff 9 0 1024\noff 11 0 1025\n");
    }
    ~WordPools() override { std::filesystem::remove_all(folder); }

    void Write(const std::string& name, const std::string& content) const {
        std::ofstream(folder + name, std::ios::binary) << content;
    }

    // The text with times, memory and addresses as #.
    std::string Masked(const std::string& text) const {
        Write("text", text);
        Run("sed -i -E 's/[0-9.]+ (s to|KiB)/# \\1/g; s/0x[0-9a-f]{16}/#/g' text");
        return Content(folder + "text");
    }

    // The command, all that it writes, and its exit status if that is not 0.
    std::string Run(const std::string& command) const {
        const std::string all = "cd " + folder + " && { " + command + "; } >out 2>err";
        const int status = std::system(all.c_str());
        std::string text = "$ " + command + "\n" + Content(folder + "out");
        const std::string errors = Content(folder + "err");
        if (!errors.empty()) { text += "--- standard error\n" + errors; }
        return text + (status == 0 ? "" : "--- exit " + std::to_string(WEXITSTATUS(status)) + "\n");
    }
};

TEST_F(WordPools, CountsWordsAndSaysWhatItCannotRead) {
    std::string text;
    for (const char* command :
         {"WordPools missing . /proc/self/mem mixed empty",
          "WordPools --heap --top 20 missing mixed empty . nowhere",
          "WordPools --top 0 - mixed - mixed mixed <mixed", "WordPools - <.", "WordPools",
          "WordPools --top -1 mixed", "WordPools --figures --report mixed",
          "WordPools mixed >/dev/full", "awk -f $SCRIPTS/demo-table.awk odd.runs",
          "awk -f $SCRIPTS/demo-table.awk even.runs"}) {
        text += Run(command);
    }
    text = Masked(text);
    const std::string path = SOURCES "/tests/expected/wordpools.txt";
    if (std::getenv("OBR_MEMPOOL_APPROVE") != nullptr) { std::ofstream(path) << text; }
    EXPECT_EQ(text, Content(path));
}

// docs/reading-reports.md shows the report of a text that every Debian has.
TEST_F(WordPools, HasTheRequestedDetail) {
    const std::string command = "WordPools /usr/share/common-licenses/BSD ";
    const std::string page = Content(SOURCES "/docs/reading-reports.md");
    const std::size_t start = page.find("\nMemPool::Mgr ");
    const std::string sample = page.substr(start, page.find("```", start) - start);
    EXPECT_THAT(Masked(Run(command + "--report")), HasSubstr(Masked(sample)));
    EXPECT_NE(Run(command + "--detailed").find("ALL RECORDS (501)"), std::string::npos);
}

TEST_F(WordPools, MeasuresItself) {
    EXPECT_THAT(Run("WordPools --figures large"), Not(HasSubstr("standard error")));
    std::istringstream figures(Content(folder + "out"));
    double reading = 0;
    double dropping = 0;
    double peak = 0;
    std::string rest;
    figures >> reading >> dropping >> peak;
    EXPECT_FALSE(figures >> rest) << rest;
    EXPECT_TRUE(dropping < reading && reading < 60 && 2500 < peak && peak < 1e6) << figures.str();
    EXPECT_THAT(Run("script -qec 'WordPools --figures large' /dev/null"),
                ContainsRegex("\n1 MB read\r\x1b\\[K2 MB read\r\x1b\\[K[0-9. ]+\r\n$"));
}

}  // namespace
