// The program that is to be recorded, or checked: where it is, and whether a library can be loaded
// into it.

#ifndef OBR_TOOLS_RECORD_COMMAND_HPP
#define OBR_TOOLS_RECORD_COMMAND_HPP

#include <stdexcept>
#include <string>

namespace Record {

// Why nothing was recorded, with an exit status as env gives it: 125 for a failure of our own, 126
// for a program that cannot be run or recorded, 127 for one that is not found.
class Refusal final : public std::runtime_error {
public:
    Refusal(int exitStatus, const std::string& text)
        : std::runtime_error(text), status(exitStatus) {}
    int Status() const { return status; }

private:
    int status;
};

// The file of a program, found as a shell does: the name itself if there is none.
std::string FindProgram(const std::string& name);

// Refuses a program that no library can be loaded into, so that it cannot be `done`.
void CheckProgram(const std::string& name, const std::string& done = "recorded");

}  // namespace Record

#endif
