// elfutils reads the symbol tables, including those in separate debug files.

#include "record/Symbols.hpp"

#include <cxxabi.h>
#include <elfutils/libdwfl.h>

#include <cstdlib>
#include <sstream>
#include <string_view>

namespace Recorder {

namespace {

std::string Hex(std::uint64_t number) {
    std::ostringstream text;
    text << "0x" << std::hex << number;
    return text.str();
}

// Removes template arguments, which can be very long, and the hash at the end of a Rust name.
std::string Shortened(std::string_view name) {
    constexpr std::size_t hashSize = std::string_view("::h0123456789abcdef").size();
    if (name.size() > hashSize && name.substr(name.size() - hashSize, 3) == "::h") {
        name.remove_suffix(hashSize);
    }
    std::string text;
    int depth = 0;
    for (std::size_t index = 0; index != name.size(); ++index) {
        const bool isOperator = name.substr(0, index).find("operator") != std::string_view::npos;
        if (isOperator && depth == 0) { return text.append(name.substr(index)); }
        depth += name[index] == '<' ? 1 : 0;
        if (depth == 0) { text += name[index]; }
        depth -= name[index] == '>' && depth > 0 ? 1 : 0;
    }
    return text;
}

std::string Demangled(const char* symbol) {
    int status = 0;
    const std::unique_ptr<char, void (*)(void*)> name(
        abi::__cxa_demangle(symbol, nullptr, nullptr, &status), std::free);
    return status == 0 ? Shortened(name.get()) : symbol;
}

// ", file.c:12" if there is debug information.
std::string Line(Dwfl_Module& module, std::uint64_t address) {
    int number = 0;
    Dwfl_Line* const line = dwfl_module_getsrc(&module, address);
    const char* const path = line == nullptr
                                 ? nullptr
                                 : dwfl_lineinfo(line, nullptr, &number, nullptr, nullptr, nullptr);
    if (path == nullptr) { return ""; }
    const std::string file = path;
    return ", " + file.substr(file.rfind('/') + 1) + ":" + std::to_string(number);
}

void Close(Dwfl* file) {
    if (file != nullptr) { dwfl_end(file); }
}

}  // namespace

std::string NameOf(const Module& module) {
    const std::string path = module.path;
    return path.substr(path.rfind('/') + 1);
}

std::string Symbols::Name(const Module& module, std::uint64_t address) {
    if (module.path[0] == '\0') { return Hex(address); }
    const std::string file = NameOf(module);
    if (Dwfl* const dwfl = Open(module)) {
        // A call may be the last instruction of a function, so look before the return address.
        if (Dwfl_Module* const found = dwfl_addrmodule(dwfl, address - 1)) {
            GElf_Off offset = 0;
            GElf_Sym symbol = {};
            const char* const name = dwfl_module_addrinfo(found, address - 1, &offset, &symbol,
                                                          nullptr, nullptr, nullptr);
            if (name != nullptr) {
                return Demangled(name) + "+" + Hex(offset + 1) + " (" + file +
                       Line(*found, address - 1) + ")";
            }
        }
    }
    return file + "+" + Hex(address - module.base);
}

Dwfl* Symbols::Open(const Module& module) {
    const auto [place, isNew] = files.try_emplace(&module, nullptr, Close);
    if (!isNew) { return place->second.get(); }
    static const Dwfl_Callbacks callbacks = {nullptr, dwfl_standard_find_debuginfo,
                                             dwfl_offline_section_address, nullptr};
    File file(dwfl_begin(&callbacks), Close);
    if (file == nullptr) { return nullptr; }
    dwfl_report_begin(file.get());
    if (dwfl_report_elf(file.get(), "", module.path, -1, module.base, false) == nullptr) {
        return nullptr;
    }
    dwfl_report_end(file.get(), nullptr, nullptr);
    place->second = std::move(file);
    return place->second.get();
}

}  // namespace Recorder
