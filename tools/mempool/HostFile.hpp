// Facts about a program from its file, before it runs.

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

// Throws a Failure if the file cannot be read.
HostFile ReadHostFile(const std::string& path);

}  // namespace Tool

#endif
