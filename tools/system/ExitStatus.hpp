// The exit statuses of a command that runs another program, as of env, nohup and timeout.
//
// Once the program has run, its exit status is that of the command; if a signal has killed it, the
// command ends by the same signal. Three statuses, which programs rarely use, are for failures
// before that and for failures of the command itself.

#ifndef OBR_TOOLS_SYSTEM_EXITSTATUS_HPP
#define OBR_TOOLS_SYSTEM_EXITSTATUS_HPP

#include <stdexcept>
#include <string>

namespace System {

constexpr int ownFailure = 125;  // The command itself has failed.
constexpr int cannotRun = 126;   // The program exists, but cannot be run as requested.
constexpr int notFound = 127;    // The program does not exist.

// A failure that ends the command with one of these statuses.
class Failure final : public std::runtime_error {
public:
    Failure(int exitStatus, const std::string& text)
        : std::runtime_error(text), status(exitStatus) {}

    // The text is "subject: " and the meaning of the error number.
    Failure(int exitStatus, const std::string& subject, int error);

    int Status() const { return status; }

private:
    int status;
};

}  // namespace System

#endif
