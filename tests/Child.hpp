// Death tests compare what a process writes on standard error. The helpers here lead the standard
// streams there, so that a test can ask for each of them alone and for both in their order, and
// turn the test's process into another program with an environment of its own.

#ifndef OBR_TESTS_CHILD_HPP
#define OBR_TESTS_CHILD_HPP

#include <fcntl.h>
#include <unistd.h>

#include <cstdlib>
#include <string>
#include <utility>
#include <vector>

namespace Child {

using Environment = std::vector<std::pair<const char*, const char*>>;

enum class Captured { out, err, both };

// From now on what the death test compares is the output asked for; the rest is dropped.
inline void Capture(Captured streams) {
    const int nowhere = open("/dev/null", O_WRONLY);
    dup2(streams == Captured::err ? nowhere : STDERR_FILENO, STDOUT_FILENO);
    if (streams == Captured::out) { dup2(nowhere, STDERR_FILENO); }
    close(nowhere);
}

// Sets these variables of the library and no other.
inline void SetEnvironment(const Environment& environment) {
    for (const char* name : {"NUV_OBR_MEMPOOL_ON", "NUV_MEMPOOL_ON", "NUV_OBR_MEMPOOL_TRACE",
                             "NUV_OBR_MEMPOOL_BUCKET_SIZE", "NUV_OBR_MEMPOOL_MAX_RECORD_SIZE",
                             "NUV_OBR_MEMPOOL_MIN_RECORD_SIZE", "NUV_OBR_MEMPOOL_DATA_ALIGNMENT",
                             "NUV_OBR_MEMPOOL_KEEP_EMPTY_BUCKETS", "NUV_OBR_MEMPOOL_INFO"}) {
        unsetenv(name);
    }
    for (const auto& [name, value] : environment) { setenv(name, value, 1); }
}

// The statement of a death test: the process becomes `program`.
[[noreturn]] inline void Run(Captured streams, const Environment& environment, const char* program,
                             const char* argument = nullptr) {
    SetEnvironment(environment);
    Capture(streams);
    execl(program, program, argument, nullptr);
    _exit(127);
}

}  // namespace Child

#endif
