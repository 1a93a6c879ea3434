// A temporary folder for one test run, so that two runs at once do not interfere.

#ifndef OBR_TESTS_FOLDER_HPP
#define OBR_TESTS_FOLDER_HPP

#include <cstdlib>
#include <filesystem>
#include <string>

#include <gtest/gtest.h>

class Folder {
public:
    Folder() : path(testing::TempDir() + "mempool.XXXXXX") {
        if (mkdtemp(path.data()) == nullptr) { std::abort(); }
    }
    Folder(const Folder&) = delete;
    Folder& operator=(const Folder&) = delete;
    ~Folder() { std::filesystem::remove_all(path); }

    std::string path;
};

// Of this process.
inline const std::string& FolderPath() {
    static const Folder folder;
    return folder.path;
}

#endif
