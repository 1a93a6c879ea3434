// Runs other programs.

#ifndef OBR_TOOLS_SYSTEM_CHILD_HPP
#define OBR_TOOLS_SYSTEM_CHILD_HPP

#include <sys/types.h>

#include <functional>
#include <string>
#include <vector>

namespace System {

// From now on a write above the limit of file sizes fails in this process instead of ending it. The
// programs that it runs are not affected.
void SurviveFileSizeLimit();

// Replaces this process by the program, which is looked up in PATH. `command` is its name and its
// arguments. Throws a Failure if the program cannot be run.
[[noreturn]] void Become(const std::vector<std::string>& command);

// Starts the program as a child, in which `prepare` runs first, and returns its process id.
pid_t Start(const std::vector<std::string>& command, const std::function<void()>& prepare);

// The wait status in words, such as "ended by signal Aborted".
std::string HowEnded(int waitStatus);

// Ends this process by the signal that ended a child, or else returns the child's exit status.
int EndLike(int waitStatus);

}  // namespace System

#endif
