// Death tests compare what a process writes on standard error. These helpers redirect standard
// output there, and replace the test's process by another program with an environment of its own.

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

enum class Captured { out, both };

// From now on the death test compares the output asked for; the rest is dropped.
inline void Capture(Captured streams) {
    dup2(STDERR_FILENO, STDOUT_FILENO);
    if (streams == Captured::out) { dup2(open("/dev/null", O_WRONLY), STDERR_FILENO); }
}

// Sets these variables of the library and no other.
inline void SetEnvironment(const Environment& environment) {
    for (const char* name : {"ON", "TRACE", "BUCKET_SIZE", "MAX_RECORD_SIZE", "MIN_RECORD_SIZE",
                             "DATA_ALIGNMENT", "KEEP_EMPTY_BUCKETS", "INFO"}) {
        unsetenv((std::string("NUV_OBR_MEMPOOL_") + name).c_str());
    }
    unsetenv("NUV_MEMPOOL_ON");
    for (const auto& [name, value] : environment) { setenv(name, value, 1); }
}

// The statement of a death test: the process becomes `program`.
[[noreturn]] inline void Run(Captured streams, const Environment& environment,
                             const char* program) {
    SetEnvironment(environment);
    Capture(streams);
    execl(program, program, nullptr);
    _exit(127);
}

}  // namespace Child

#endif
