// Names code addresses, from the files that the code was loaded from.

#ifndef OBR_TOOLS_RECORD_SYMBOLS_HPP
#define OBR_TOOLS_RECORD_SYMBOLS_HPP

#include <cstdint>
#include <memory>
#include <string>
#include <unordered_map>

#include "record/Channel.hpp"

struct Dwfl;

namespace Recorder {

// The name of the file, without its folders.
std::string NameOf(const Module& module);

class Symbols {
public:
    // "function+0x1f (file)" for a return address, "function+0x1f (file, source.c:12)" where there
    // is debug information, or "file+0x1234" where the function has no name.
    std::string Name(const Module& module, std::uint64_t address);

private:
    using File = std::unique_ptr<Dwfl, void (*)(Dwfl*)>;

    Dwfl* Open(const Module& module);

    std::unordered_map<const Module*, File> files;
};

}  // namespace Recorder

#endif
