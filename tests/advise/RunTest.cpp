// `mempool run` on small programs of any machine: standard output has only their output, their exit
// statuses are kept, and the trace leaves no file.

#include <sys/wait.h>

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
using testing::Not;
using testing::StartsWith;

namespace {

struct Ended {
    int status;
    std::string output;
    std::string errors;
};

std::string Content(const std::string& path) {
    std::ifstream file(path);
    return {std::istreambuf_iterator<char>(file), {}};
}

// With an empty folder for traces, which is empty again after the run.
Ended Mempool(const std::string& arguments, const std::string& ahead = "") {
    const std::string folder = FolderPath() + "/traces";
    const std::string errors = FolderPath() + "/errors";
    std::filesystem::create_directory(folder);
    const std::string command =
        "export TMPDIR=" + folder + "; " + ahead + " " MEMPOOL " run --seconds 1 " + arguments;
    std::FILE* const tool = popen(("(" + command + ") 2>" + errors).c_str(), "r");
    std::string output;
    for (int c = std::fgetc(tool); c != EOF; c = std::fgetc(tool)) {
        output += static_cast<char>(c);
    }
    const int status = pclose(tool);
    EXPECT_TRUE(std::filesystem::is_empty(folder)) << command;
    return {WIFEXITED(status) ? WEXITSTATUS(status) : -1, output, Content(errors)};
}

TEST(Run, ReportsAfterAProgramThatRunsUnchanged) {
    const std::string page = FolderPath() + "/page.html";
    const Ended sorted =
        Mempool((HAS_PAGE ? "--html " + page : "") + " sort -r", "printf 'a\\nb\\n' |");
    EXPECT_EQ(sorted.status, 0);
    EXPECT_EQ(sorted.output, "b\na\n");
    for (const char* text : {"   program               sort -r\n", "by caller\n", "\n   SIZES",
                             "BYTES HELD", " heap  ", " would "}) {
        EXPECT_THAT(sorted.errors, HasSubstr(text));
    }
    if (HAS_PAGE) { EXPECT_THAT(Content(page), HasSubstr("id=\"advice\">{")); }
    EXPECT_EQ(Mempool("-- sh -c 'ls -A $TMPDIR'").output, "") << "Nor has it a name meanwhile.";
}

TEST(Run, EndsAsTheProgramDoes) {
    EXPECT_EQ(Mempool("sh -c 'exit 3'").status, 3);
    EXPECT_EQ(Mempool("sh -c 'kill -TERM $$'; exit $?").status, 128 + 15);
    const Ended missing = Mempool("/nowhere/program");
    EXPECT_EQ(missing.status, 127);
    EXPECT_THAT(missing.errors, HasSubstr("mempool: /nowhere/program: "));
    const Ended interrupted = Mempool("sleep 20; exit $?", "timeout --foreground -s INT 1");
    EXPECT_EQ(interrupted.status, 124);
    EXPECT_THAT(interrupted.errors, HasSubstr("   program               sleep 20\n"));
    const Ended late = Mempool("sh -c '(while kill -0 $$; do :; done; kill -INT $PPID) 2>&- &'");
    EXPECT_EQ(late.status, 0) << "Interrupted during the report.";
    const Ended cut = Mempool("sh -c 'exec " STATIC_HOST "'");
    EXPECT_THAT(cut.errors, HasSubstr("   SIZES"));
    EXPECT_THAT(cut.errors, Not(HasSubstr("   Events: ")));
    const Ended full = Mempool(
        "sh -c 'prlimit --fsize=400 --pid $PPID; "
        "exec awk \"BEGIN { while (++i < 99999) a[i] = i }\"'");
    EXPECT_EQ(full.status, 125);
    EXPECT_THAT(full.errors, StartsWith("mempool: " + FolderPath() + "/traces/mempool."));
}

TEST(Run, RunsNothingIfThePageCannotBeWritten) {
    const Ended refused = Mempool("--html /nowhere/page echo ran");
    EXPECT_EQ(refused.status, 125);
    EXPECT_EQ(refused.output, "");
    if (HAS_PAGE) {
        EXPECT_EQ(refused.errors, "mempool: /nowhere/page: No such file or directory\n");
    }
    EXPECT_EQ(Mempool("").status, 125);
}

}  // namespace
