// The exit statuses of a command that runs another program, as env, nohup and timeout have them.
//
// Once the program has run, its exit status is that of the command; if a signal has killed it, the
// command dies by the same signal. Three statuses, which programs seldom use, are for what comes
// before that or fails beside it.

#ifndef OBR_TOOLS_SYSTEM_EXITSTATUS_HPP
#define OBR_TOOLS_SYSTEM_EXITSTATUS_HPP

#include <stdexcept>
#include <string>

namespace System {

constexpr int ownFailure = 125;  // The command itself has failed; its message says at what.
constexpr int cannotRun = 126;   // The program is there, and cannot be run or not as it should be.
constexpr int notFound = 127;    // There is no such program.

// A failure that ends the command with a status of its own.
class Failure final : public std::runtime_error {
public:
    Failure(int exitStatus, const std::string& text)
        : std::runtime_error(text), status(exitStatus) {}

    // "subject: " and what the error number means.
    Failure(int exitStatus, const std::string& subject, int error);

    int Status() const { return status; }

private:
    int status;
};

}  // namespace System

#endif
