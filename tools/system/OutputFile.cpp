#include "system/OutputFile.hpp"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <filesystem>

#include "system/ExitStatus.hpp"

namespace System {

namespace {

bool IsInput(const struct stat& output, const std::string& input) {
    struct stat status = {};
    const int result = input == "-" ? fstat(STDIN_FILENO, &status) : stat(input.c_str(), &status);
    return result == 0 && status.st_dev == output.st_dev && status.st_ino == output.st_ino;
}

// The permissions of a new file.
mode_t UsualMode() {
    const mode_t mask = umask(0);
    umask(mask);
    return 0666 & ~mask;
}

}  // namespace

OutputFile::OutputFile(const std::string& filePath, const std::vector<std::string>& inputs)
    : path(filePath), file(Open(inputs)) {
    if (!file.IsOpen()) { throw Failure(ownFailure, path, errno); }
}

// Returns a descriptor, or -1 with errno set.
int OutputFile::Open(const std::vector<std::string>& inputs) {
    if (path == "-") { return fcntl(STDOUT_FILENO, F_DUPFD_CLOEXEC, STDERR_FILENO + 1); }
    std::error_code none;
    target = std::filesystem::is_symlink(path, none)
                 ? std::filesystem::weakly_canonical(path, none).string()
                 : path;
    struct stat status = {};
    const bool isThere = stat(path.c_str(), &status) == 0;
    // A file may have no name left, and only be open as a descriptor.
    const bool isReplaced = !isThere || (S_ISREG(status.st_mode) && status.st_nlink != 0);
    if (!isReplaced) { return open(path.c_str(), O_WRONLY | O_TRUNC | O_CLOEXEC); }
    if (isThere) {
        for (const std::string& input : inputs) {
            if (!IsInput(status, input)) { continue; }
            throw Failure(ownFailure, path + ": input and output are the same file");
        }
        if (access(path.c_str(), W_OK) != 0) { return -1; }
    }
    temporary = target + ".XXXXXX";
    const int descriptor = mkostemp(temporary.data(), O_CLOEXEC);
    if (descriptor < 0) {
        temporary.clear();
    } else {
        fchmod(descriptor, isThere ? status.st_mode : UsualMode());
    }
    return descriptor;
}

OutputFile::~OutputFile() {
    if (!temporary.empty()) { unlink(temporary.c_str()); }
}

void OutputFile::Write(std::string_view bytes) {
    while (!bytes.empty() && error == 0) {
        const ssize_t number = write(file.Number(), bytes.data(), bytes.size());
        if (number < 0) {
            if (errno != EINTR) { error = errno; }
            continue;
        }
        bytes.remove_prefix(static_cast<std::size_t>(number));
        size += static_cast<std::uint64_t>(number);
    }
}

void OutputFile::Check() const {
    if (error != 0) { throw Failure(ownFailure, path, error); }
}

void OutputFile::Commit() {
    if (file.Close() != 0 && error == 0) { error = errno; }
    if (error == 0 && !temporary.empty() && std::rename(temporary.c_str(), target.c_str()) != 0) {
        error = errno;
    }
    if (error == 0) {
        temporary.clear();
    } else if (isKept && size != 0 && !temporary.empty()) {
        const std::string kept = std::exchange(temporary, "");
        throw Failure(ownFailure, path + ": " + std::generic_category().message(error) +
                                      "; what was written before that is in " + kept);
    }
    Check();
}

void OutputFile::CommitBeside() {
    const std::string name = target;
    const std::string first = temporary;
    for (int number = 2; error == 0 && link(first.c_str(), target.c_str()) != 0 && errno == EEXIST;
         ++number) {
        target = name + "." + std::to_string(number);
    }
    Commit();  // Renaming does nothing if both are names of the same file.
    unlink(first.c_str());
}

}  // namespace System
