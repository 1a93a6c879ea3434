// Keeps recording when a program replaces itself through exec: the calls here add the recorder to
// the environment of the new program, where RestoreEnvironment removes it again. Children are
// recorded in the same way, or counted.
//
// They may be called in a signal handler or while other threads hold any lock, so all memory that
// they need is on the stack.

#include <alloca.h>
#include <dlfcn.h>
#include <spawn.h>
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

// Calls `execute` with an environment that has the recorder in it.
template <typename Execute>
int WithRecorder(Words environment, Execute execute) {
    Dl_info own = {};
    if (dladdr(reinterpret_cast<const void*>(&Attach), &own) == 0) { return execute(environment); }
    const char* preloaded = "";
    const std::size_t number = environment == nullptr ? 0 : Count(environment);
    auto** const variables = static_cast<char**>(alloca((number + 3) * sizeof(char*)));
    const std::size_t nameSize = std::strlen(channelVariable);
    std::size_t kept = 0;
    for (std::size_t index = 0; index != number; ++index) {
        if (std::strncmp(environment[index], "LD_PRELOAD=", 11) == 0) {
            preloaded = environment[index] + 11;
        } else if (std::strncmp(environment[index], channelVariable, nameSize) != 0) {
            variables[kept++] = environment[index];
        }
    }
    const std::size_t pathSize = std::strlen(own.dli_fname);
    if (std::strncmp(preloaded, own.dli_fname, pathSize) == 0) {  // It is there already.
        preloaded += pathSize + (preloaded[pathSize] == ':' ? 1 : 0);
    }
    const std::size_t size = pathSize + std::strlen(preloaded) + 16;
    auto* const preload = static_cast<char*>(alloca(size));
    std::snprintf(preload, size, "LD_PRELOAD=%s%s%s", own.dli_fname, *preloaded == '\0' ? "" : ":",
                  preloaded);
    char variable[96];
    std::snprintf(variable, sizeof(variable), "%s=%s", channelVariable, channelPath);
    variables[kept++] = preload;
    variables[kept++] = variable;
    variables[kept] = nullptr;
    return execute(variables);
}

bool RecordsChildren() {
    return known != nullptr && known->recordsChildren != 0;
}

// Notes the file of a program that a child executes which is not recorded.
void NoteName(const char* path) {
    const std::uint32_t place = known->numNamed.fetch_add(1);
    if (place >= numChildNames || path == nullptr) { return; }
    const char* const slash = std::strrchr(path, '/');
    std::strncpy(known->childNames[place], slash == nullptr ? path : slash + 1, childNameSize - 1);
}

// Counts a child that is not recorded. The name of its program may be null.
void CountChild(const char* name, bool isStarted) {
    if (!isStarted || known == nullptr || RecordsChildren()) { return; }
    ++known->numLost;
    if (name != nullptr) { NoteName(name); }
}

// Executes a program, which is recorded if this process is, or if all children are. Returns only
// after a failure. A child may share the memory of its parent, as after vfork.
template <typename Execute>
int Follow(const char* name, Words environment, Execute execute) {
    Channel* const channel = ActiveChannel();
    if (channel != nullptr && channel->pid == getpid()) {
        return WithRecorder(environment, [&](Words with) {
            ++channel->numExecs;
            channel->isTaken = 0;
            const int result = execute(with);
            const int error = errno;
            channel->isTaken = 1;
            --channel->numExecs;
            errno = error;
            return result;
        });
    }
    if (known == nullptr) { return execute(environment); }
    if (RecordsChildren()) { return WithRecorder(environment, execute); }
    const std::uint32_t numNew = channel != nullptr ? 1 : 0;  // After fork it is counted already.
    known->numLost += numNew;
    NoteName(name);
    const int result = execute(environment);
    known->numLost -= numNew;
    --known->numNamed;
    return result;
}

int ExecutePath(const char* path, Words arguments, Words environment) {
    static auto* const next = Next<int(const char*, Words, Words)>("execve");
    return Follow(path, environment, [=](Words with) { return next(path, arguments, with); });
}

int ExecuteFile(const char* file, Words arguments, Words environment) {
    static auto* const next = Next<int(const char*, Words, Words)>("execvpe");
    return Follow(file, environment, [=](Words with) { return next(file, arguments, with); });
}

// The functions posix_spawn and posix_spawnp.
int Spawn(const char* function, pid_t* child, const char* file,
          const posix_spawn_file_actions_t* actions, const posix_spawnattr_t* attributes,
          Words arguments, Words environment) {
    auto* const next = Next<decltype(posix_spawn)>(function);
    const auto spawn = [&](Words with) {
        return next(child, file, actions, attributes, arguments, with);
    };
    const int error = RecordsChildren() ? WithRecorder(environment, spawn) : spawn(environment);
    CountChild(file, error == 0);
    return error;
}

}  // namespace

RECORDER_API pid_t fork() noexcept {
    static auto* const next = Next<pid_t()>("fork");
    const pid_t child = next();
    CountChild(nullptr, child > 0);
    return child;
}
RECORDER_API int posix_spawn(pid_t* child, const char* path,
                             const posix_spawn_file_actions_t* actions,
                             const posix_spawnattr_t* attributes, Words arguments,
                             Words environment) {
    return Spawn("posix_spawn", child, path, actions, attributes, arguments, environment);
}
RECORDER_API int posix_spawnp(pid_t* child, const char* file,
                              const posix_spawn_file_actions_t* actions,
                              const posix_spawnattr_t* attributes, Words arguments,
                              Words environment) {
    return Spawn("posix_spawnp", child, file, actions, attributes, arguments, environment);
}

// The C library starts the shells of these two itself.
RECORDER_API int system(const char* command) {
    static auto* const next = Next<int(const char*)>("system");
    const int status = next(command);
    CountChild("sh", command != nullptr && status != -1);
    return status;
}
RECORDER_API std::FILE* popen(const char* command, const char* mode) {
    static auto* const next = Next<std::FILE*(const char*, const char*)>("popen");
    std::FILE* const stream = next(command, mode);
    CountChild("sh", stream != nullptr);
    return stream;
}

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
    return Follow(nullptr, environment, [=](Words with) { return next(file, arguments, with); });
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
