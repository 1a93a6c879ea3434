// The file of a program: where it is, and whether a library can be loaded into the program.

#ifndef OBR_TOOLS_SYSTEM_PROGRAMFILE_HPP
#define OBR_TOOLS_SYSTEM_PROGRAMFILE_HPP

#include <string>

namespace System {

// The file of a program, looked up in PATH as a shell does; the name itself if there is none.
std::string FindProgram(const std::string& name);

// Refuses a program that no library can be preloaded into, so that it cannot be `done`. Returns the
// file that is executed: the program's, or the interpreter's of a script.
std::string CheckPreload(const std::string& name, const std::string& done);

// Whether the ELF file is built with AddressSanitizer.
bool IsAddressSanitized(const std::string& path);

}  // namespace System

#endif
