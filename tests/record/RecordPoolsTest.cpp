// `mempool record --pools`, compared with the trace that the library itself writes of the same run.

#include <regex>
#include <string>

#include <gtest/gtest.h>

#include "Shell.hpp"

namespace {

std::string Without(const std::string& lines, const char* pattern) {
    return std::regex_replace(lines, std::regex(pattern), "$1");
}

TEST(RecordPools, RecordsTheTraceOfTheLibraryAndMore) {
    const std::string library =
        Shell::Output("NUV_OBR_MEMPOOL_TRACE=1 " MEMPOOL " record --pools -o trace " HOST, 3);
    const std::string lines = Shell::Output(MEMPOOL " text trace");
    // The last release but one in the library's trace was refused.
    const std::size_t refused = library.rfind("xmpt:f");
    ASSERT_NE(refused, std::string::npos);
    EXPECT_EQ(Without(lines, "xmpt:[nxit]:.*\n"),
              library.substr(0, refused) + library.substr(library.find('\n', refused) + 1));

    const std::string named =
        Without(Without(lines, "xmpt:[acdft]:.*\n"), "(xmpt:[nx]:)[0-9a-f]{16}");
    EXPECT_EQ(named.substr(0, named.find("xmpt:i:cpu")),
              "xmpt:i:program:" HOST
              "\nxmpt:i:by:pools\n"
              "xmpt:n::a static one, with a long name\nxmpt:n::pool\nxmpt:x:\n"
              "xmpt:n::__OBR_MEMPOOL_00001\nxmpt:n::\n");
    EXPECT_EQ(Shell::Output(HOST, 3), "");
    EXPECT_EQ(Shell::Output(MEMPOOL " record --pools -o trace " HOST, 3), "");
    EXPECT_EQ(Shell::Output(MEMPOOL " record --pools -o trace true"),
              "mempool: true has made no pool of the shared library, libObrMemPool.so\n");
}

TEST(RecordPools, WaitsForRoomForAWholeEvent) {
    Shell::Output(MEMPOOL " record --pools -o trace " HOST
                          " fill & sleep 1; kill -CONT $!; wait $!");
    EXPECT_EQ(Shell::Output(MEMPOOL " text trace | grep -c '^xmpt:[af]:'"), "600000\n");
}

}  // namespace
