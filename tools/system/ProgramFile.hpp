// The file of a program: where it is, and whether a library can be loaded into the program.

#ifndef OBR_TOOLS_SYSTEM_PROGRAMFILE_HPP
#define OBR_TOOLS_SYSTEM_PROGRAMFILE_HPP

#include <string>

namespace System {

// The file of a program, looked up in PATH as by a shell; the name itself if there is no such file.
std::string FindProgram(const std::string& name);

// Throws a Failure for a program into which no library can be preloaded, so that it "cannot be
// `done`". Returns the file that is executed: that of the program, or of a script's interpreter.
std::string CheckPreload(const std::string& name, const std::string& done);

// Whether the ELF file is built with AddressSanitizer.
bool IsAddressSanitized(const std::string& path);

// A file of an install, or of a build: in the first of the folders that has it. These are separated
// by ':' and relative to that of this tool. Throws a std::runtime_error if none has it.
std::string FindBesideTool(const std::string& folders, const std::string& name);

}  // namespace System

#endif
