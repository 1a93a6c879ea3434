// What a program's file tells of the program before it runs.

#ifndef OBR_TOOLS_MEMPOOL_HOSTFILE_HPP
#define OBR_TOOLS_MEMPOOL_HOSTFILE_HPP

#include <string>

namespace Tool {

struct HostFile {
    bool isScript = false;      // Of the three below nothing is known then.
    bool isSanitized = false;   // Built with AddressSanitizer.
    bool namesLibrary = false;  // Names the shared library, to be loaded at the start or later.
    bool holdsLibrary = false;  // Has the archive in it.
};

// Throws std::system_error where the file cannot be read.
HostFile ReadHostFile(const std::string& path);

}  // namespace Tool

#endif
