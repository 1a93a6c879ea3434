// Names code addresses, from the files that the code was loaded from.

#ifndef OBR_TOOLS_RECORD_SYMBOLS_HPP
#define OBR_TOOLS_RECORD_SYMBOLS_HPP

#include <cstdint>
#include <memory>
#include <string>
#include <unordered_map>
#include <vector>

#include "record/Channel.hpp"

struct Dwfl;

namespace Recorder {

// The name of the file, without its folders.
std::string NameOf(const Module& module);

class Symbols {
public:
    // "function+0x1f (file)" for a return address, or "function+0x1f (file, source.c:12)" where
    // there is debug information. A function without a name has its place in the file instead,
    // "0x1230+0x4 (file)", if its start is known; if that is 0, the name is "file+0x1234". Names
    // are without template arguments, anonymous namespaces and return types; further functions with
    // the same name are "function#2" and so on.
    std::string Name(const Module& module, std::uint64_t address, std::uint64_t start);

    // The symbol of the function, or an empty text. Valid as long as this object.
    const char* Symbol(const Module& module, std::uint64_t address);

private:
    struct Function {
        std::uint64_t start;
        std::uint64_t size;  // 0 if it is unknown.
        int rank;            // Of functions at the same address, the one with the highest counts.
        const char* name;
    };
    struct File {
        std::unique_ptr<Dwfl, void (*)(Dwfl*)> handle;
        std::vector<Function> functions;  // By address.
    };

    const File& Open(const Module& module);
    const Function* Find(const Module& module, std::uint64_t address);
    std::string Distinct(const std::string& shortened, const std::string& symbol);

    std::unordered_map<const Module*, File> files;
    std::unordered_map<std::string, std::vector<std::string>> symbolsOf;  // By shortened names.
};

}  // namespace Recorder

#endif
