// A file that a command writes. It appears under its name once it is whole; until then, and if
// something fails, what was there before stays there. A pipe or a device is written to as it is.

#ifndef OBR_TOOLS_SYSTEM_OUTPUTFILE_HPP
#define OBR_TOOLS_SYSTEM_OUTPUTFILE_HPP

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "system/Descriptor.hpp"

namespace System {

class OutputFile {
public:
    // Opens the file, so that one that cannot be written is a Failure before any work is done for
    // it. So is one that is also an input. "-" is the standard output, or input.
    OutputFile(const std::string& filePath, const std::vector<std::string>& inputs);
    OutputFile(const OutputFile&) = delete;
    OutputFile& operator=(const OutputFile&) = delete;
    ~OutputFile();  // Drops what was not committed.

    // The first error is kept for Check and Commit. Nothing is written after it.
    void Write(std::string_view bytes);

    // Throws a Failure if a write has failed.
    void Check() const;

    // The file is whole: gives it its name. A Failure if that or a write has failed.
    void Commit();

    // What was written before an error stays, and Commit says where.
    void KeepIfCutShort() { isKept = true; }

    std::uint64_t Size() const { return size; }  // Bytes written.

private:
    int Open(const std::vector<std::string>& inputs);

    const std::string path;
    std::string target;     // Where the path leads to.
    std::string temporary;  // Beside it; empty for what is written to as it is.
    Descriptor file;
    int error = 0;
    std::uint64_t size = 0;
    bool isKept = false;
};

}  // namespace System

#endif
