// A file that a command writes. It appears under its name once it is complete. Until then, and
// after a failure, an existing file of that name is unchanged. A pipe or a device is written to
// directly.

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
    // Opens the file before any work is done for it. Throws a Failure if it cannot be written or is
    // one of the inputs. "-" is the standard output, or input.
    OutputFile(const std::string& filePath, const std::vector<std::string>& inputs);
    OutputFile(const OutputFile&) = delete;
    OutputFile& operator=(const OutputFile&) = delete;
    ~OutputFile();  // Drops a file that was not committed.

    // The first error is kept for Check and Commit. Nothing is written after it.
    void Write(std::string_view bytes);

    // Throws a Failure if a write has failed.
    void Check() const;

    // The file is complete: gives it its name. Throws a Failure if that or a write has failed.
    void Commit();

    // The same, but replaces no file: if there is one of that name, the name gets a number.
    void CommitBeside();

    // Makes Commit keep what was written before an error, and say where.
    void KeepIfCutShort() { isKept = true; }

    std::uint64_t Size() const { return size; }  // Bytes written.

private:
    int Open(const std::vector<std::string>& inputs);

    const std::string path;
    std::string target;     // The path, or where it leads if it is a link.
    std::string temporary;  // In the same folder; empty if the target is written to directly.
    Descriptor file;
    int error = 0;
    std::uint64_t size = 0;
    bool isKept = false;
};

}  // namespace System

#endif
