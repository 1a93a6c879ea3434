// Runs commands as users do, in a temporary folder.

#ifndef OBR_TESTS_RECORD_SHELL_HPP
#define OBR_TESTS_RECORD_SHELL_HPP

#include <sys/wait.h>

#include <cstdio>
#include <fstream>
#include <iterator>
#include <string>

#include <gtest/gtest.h>

#include "Folder.hpp"

namespace Shell {

inline void WriteFile(const std::string& name, const std::string& bytes) {
    std::ofstream(FolderPath() + "/" + name, std::ios::binary) << bytes;
}

inline std::string FileBytes(const std::string& name) {
    std::ifstream file(FolderPath() + "/" + name, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
}

// What a command writes on both streams, given that it returns `exitStatus`. A command that hangs
// returns 124.
inline std::string Output(const std::string& command, int exitStatus = 0) {
    WriteFile("command", "cd " + FolderPath() + "\n" + command + "\n");
    std::FILE* const shell =
        popen(("exec timeout 60 bash " + FolderPath() + "/command 2>&1").c_str(), "r");
    std::string text;
    for (int c = std::fgetc(shell); c != EOF; c = std::fgetc(shell)) {
        text += static_cast<char>(c);
    }
    const int status = pclose(shell);
    EXPECT_TRUE(WIFEXITED(status)) << command;
    EXPECT_EQ(WEXITSTATUS(status), exitStatus) << command << '\n' << text;
    return text;
}

}  // namespace Shell

#endif
