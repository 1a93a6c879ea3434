// Runs other programs.

#ifndef OBR_TOOLS_SYSTEM_CHILD_HPP
#define OBR_TOOLS_SYSTEM_CHILD_HPP

#include <sys/types.h>

#include <functional>
#include <string>
#include <vector>

namespace System {

// From now on a write above the limit of file sizes fails in this process instead of ending it. The
// programs that it runs do not notice.
void SurviveFileSizeLimit();

// Turns this process into the program, which is looked up in PATH. `command` is its name and its
// arguments. A program that cannot be run is a Failure.
[[noreturn]] void Become(const std::vector<std::string>& command);

// Starts the program as a child, in which `prepare` runs first, and returns its process number.
pid_t Start(const std::vector<std::string>& command, const std::function<void()>& prepare);

// Ends this process as a child has ended, by its signal or by the exit status that this returns.
int EndLike(int waitStatus);

}  // namespace System

#endif
