// What a program's file says about the program before it runs.

#ifndef OBR_TOOLS_MEMPOOL_HOSTFILE_HPP
#define OBR_TOOLS_MEMPOOL_HOSTFILE_HPP

#include <string>

namespace Tool {

struct HostFile {
    bool isScript = false;      // Then the other three are unknown.
    bool isSanitized = false;   // Built with AddressSanitizer.
    bool namesLibrary = false;  // Names the shared library, to be loaded at the start or later.
    bool holdsLibrary = false;  // Contains the archive.
};

// A file that cannot be read is a Failure.
HostFile ReadHostFile(const std::string& path);

}  // namespace Tool

#endif
