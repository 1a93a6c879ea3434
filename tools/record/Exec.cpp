// Keeps recording when a program replaces itself through exec: the calls here add the recorder to
// the environment of the new program, where RestoreEnvironment removes it again.
//
// They may be called in a signal handler or while other threads hold any lock, so all memory that
// they need is on the stack.

#include <alloca.h>
#include <dlfcn.h>
#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstdarg>
#include <cstddef>
#include <cstdio>
#include <cstring>

#include "record/Recorder.hpp"

namespace Recorder {

namespace {

using Words = char* const*;

std::size_t Count(Words words) {
    std::size_t number = 0;
    while (words[number] != nullptr) { ++number; }
    return number;
}

template <typename Function>
Function* Next(const char* name) {
    void* const address = dlsym(RTLD_NEXT, name);
    Function* function = nullptr;
    std::memcpy(&function, &address, sizeof(function));
    return function;
}

// Calls `execute`, with an environment that has the recorder in it if this process is recorded. A
// child that shares the memory of a recorded process, as after vfork, is not recorded.
template <typename Execute>
int Follow(Words environment, Execute execute) {
    Channel* const channel = ActiveChannel();
    Dl_info own = {};
    if (channel == nullptr || channel->pid != getpid() ||
        dladdr(reinterpret_cast<const void*>(&Attach), &own) == 0) {
        return execute(environment);
    }
    char path[64];
    std::snprintf(path, sizeof(path), "/proc/%d/fd/%d", channel->parentPid, channel->descriptor);
    const int descriptor = open(path, O_RDWR);

    const char* preloaded = "";
    const std::size_t number = environment == nullptr ? 0 : Count(environment);
    auto** const variables = static_cast<char**>(alloca((number + 3) * sizeof(char*)));
    std::size_t kept = 0;
    for (std::size_t index = 0; index != number; ++index) {
        if (std::strncmp(environment[index], "LD_PRELOAD=", 11) == 0) {
            preloaded = environment[index] + 11;
        } else {
            variables[kept++] = environment[index];
        }
    }
    const std::size_t size = std::strlen(own.dli_fname) + std::strlen(preloaded) + 16;
    auto* const preload = static_cast<char*>(alloca(size));
    std::snprintf(preload, size, "LD_PRELOAD=%s%s%s", own.dli_fname, *preloaded == '\0' ? "" : ":",
                  preloaded);
    char variable[64];
    std::snprintf(variable, sizeof(variable), "%s=%d", channelVariable, descriptor);
    variables[kept++] = preload;
    variables[kept++] = variable;
    variables[kept] = nullptr;

    ++channel->numExecs;
    channel->isTaken = 0;
    const int result = execute(variables);
    const int error = errno;
    channel->isTaken = 1;
    --channel->numExecs;
    close(descriptor);
    errno = error;
    return result;
}

int ExecutePath(const char* path, Words arguments, Words environment) {
    static auto* const next = Next<int(const char*, Words, Words)>("execve");
    return Follow(environment, [=](Words with) { return next(path, arguments, with); });
}

int ExecuteFile(const char* file, Words arguments, Words environment) {
    static auto* const next = Next<int(const char*, Words, Words)>("execvpe");
    return Follow(environment, [=](Words with) { return next(file, arguments, with); });
}

}  // namespace

RECORDER_API int execve(const char* path, Words arguments, Words environment) noexcept {
    return ExecutePath(path, arguments, environment);
}
RECORDER_API int execv(const char* path, Words arguments) noexcept {
    return ExecutePath(path, arguments, environ);
}
RECORDER_API int execvpe(const char* file, Words arguments, Words environment) noexcept {
    return ExecuteFile(file, arguments, environment);
}
RECORDER_API int execvp(const char* file, Words arguments) noexcept {
    return ExecuteFile(file, arguments, environ);
}
RECORDER_API int fexecve(int file, Words arguments, Words environment) noexcept {
    static auto* const next = Next<int(int, Words, Words)>("fexecve");
    return Follow(environment, [=](Words with) { return next(file, arguments, with); });
}

// Collects the arguments of a variadic call, from `first` to the null after them, in `words` on the
// stack. `list` is then positioned after that null.
#define COLLECT_WORDS                                                               \
    std::va_list list;                                                              \
    std::size_t number = 1;                                                         \
    va_start(list, first);                                                          \
    while (va_arg(list, char*) != nullptr) { ++number; }                            \
    va_end(list);                                                                   \
    auto** const words = static_cast<char**>(alloca((number + 1) * sizeof(char*))); \
    words[0] = const_cast<char*>(first);                                            \
    va_start(list, first);                                                          \
    for (std::size_t index = 1; index <= number; ++index) { words[index] = va_arg(list, char*); }

RECORDER_API int execl(const char* path, const char* first, ...) noexcept {
    COLLECT_WORDS
    va_end(list);
    return ExecutePath(path, words, environ);
}
RECORDER_API int execlp(const char* file, const char* first, ...) noexcept {
    COLLECT_WORDS
    va_end(list);
    return ExecuteFile(file, words, environ);
}
RECORDER_API int execle(const char* path, const char* first, ...) noexcept {
    COLLECT_WORDS
    auto* const environment = va_arg(list, char**);
    va_end(list);
    return ExecutePath(path, words, environment);
}

}  // namespace Recorder
