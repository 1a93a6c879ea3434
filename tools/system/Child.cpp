#include "system/Child.hpp"

#include <fcntl.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstring>
#include <system_error>

#include "system/Descriptor.hpp"
#include "system/ExitStatus.hpp"

namespace System {

namespace {

using Handler = void (*)(int);
Handler handlerAtStart = SIG_DFL;  // Of SIGXFSZ.

// Returns the error number if the program cannot be run.
int Execute(const std::vector<std::string>& command) {
    std::vector<char*> words;
    words.reserve(command.size() + 1);
    for (const std::string& word : command) { words.push_back(const_cast<char*>(word.c_str())); }
    words.push_back(nullptr);
    const Handler handler = std::signal(SIGXFSZ, handlerAtStart);
    execvp(words.front(), words.data());
    const int error = errno;
    std::signal(SIGXFSZ, handler);
    return error;
}

[[noreturn]] void FailToRun(const std::string& program, int error) {
    throw Failure(error == ENOENT ? notFound : cannotRun, program, error);
}

}  // namespace

Failure::Failure(int exitStatus, const std::string& subject, int error)
    : Failure(exitStatus, subject + ": " + std::generic_category().message(error)) {}

void SurviveFileSizeLimit() {
    handlerAtStart = std::signal(SIGXFSZ, SIG_IGN);
}

void Become(const std::vector<std::string>& command) {
    FailToRun(command.front(), Execute(command));
}

pid_t Start(const std::vector<std::string>& command, const std::function<void()>& prepare) {
    // The child reports an error through the pipe, which closes if the program runs.
    int ends[2] = {};
    if (pipe2(ends, O_CLOEXEC) != 0) { throw Failure(ownFailure, "pipe", errno); }
    const Descriptor reading(ends[0]);
    Descriptor writing(ends[1]);
    const pid_t child = fork();
    if (child < 0) { throw Failure(ownFailure, "fork", errno); }
    if (child == 0) {
        prepare();
        const int error = Execute(command);
        [[maybe_unused]] const ssize_t written = write(ends[1], &error, sizeof(error));
        _exit(ownFailure);
    }
    writing.Close();
    int error = 0;
    if (read(reading.Number(), &error, sizeof(error)) == 0) { return child; }
    waitpid(child, nullptr, 0);
    FailToRun(command.front(), error);
}

std::string HowEnded(int waitStatus) {
    return WIFSIGNALED(waitStatus)
               ? std::string("ended by signal ") + strsignal(WTERMSIG(waitStatus))
               : "ended with status " + std::to_string(WEXITSTATUS(waitStatus));
}

int EndLike(int waitStatus) {
    if (WIFEXITED(waitStatus)) { return WEXITSTATUS(waitStatus); }
    const rlimit noCore = {0, 0};  // The program has dumped its own, if any.
    setrlimit(RLIMIT_CORE, &noCore);
    std::signal(WTERMSIG(waitStatus), SIG_DFL);
    std::raise(WTERMSIG(waitStatus));
    constexpr int shellsSignalBase = 128;
    return shellsSignalBase + WTERMSIG(waitStatus);
}

}  // namespace System
