// elfutils reads the symbol tables, including those in separate debug files.

#include "record/Symbols.hpp"

#include <elfutils/libdwfl.h>
#include <libiberty/demangle.h>

#include <algorithm>
#include <cctype>
#include <cstdlib>
#include <sstream>
#include <string_view>
#include <tuple>

namespace Recorder {

namespace {

std::string Hex(std::uint64_t number) {
    std::ostringstream text;
    text << "0x" << std::hex << number;
    return text.str();
}

bool IsPartOfName(char c) {
    return std::isalnum(static_cast<unsigned char>(c)) != 0 || c == '_' || c == ':';
}

// Removes template arguments, which can be very long. In names of Rust, angle brackets at the start
// of a part have the type of a method, which stays.
std::string Shortened(std::string_view name) {
    std::string text;
    int depth = 0;
    for (std::size_t index = 0; index != name.size(); ++index) {
        const bool isOperator = name.substr(0, index).find("operator") != std::string_view::npos;
        if (isOperator && depth == 0) { return text.append(name.substr(index)); }
        const char before = index == 0 ? ' ' : name[index - 1];
        const bool isArguments = name[index] == '<' && IsPartOfName(before);
        if (isArguments && depth == 0 && before == ':') { text.resize(text.size() - 2); }
        depth += isArguments || (name[index] == '<' && depth > 0) ? 1 : 0;
        if (depth == 0) { text += name[index]; }
        depth -= name[index] == '>' && before != '-' && depth > 0 ? 1 : 0;
    }
    return text;
}

std::string Demangled(const char* symbol) {
    const std::unique_ptr<char, void (*)(void*)> name(
        cplus_demangle(symbol, DMGL_AUTO | DMGL_PARAMS | DMGL_RET_DROP), std::free);
    if (name == nullptr) { return symbol; }
    std::string text = Shortened(name.get());
    constexpr std::string_view nameless = "(anonymous namespace)::";
    for (std::size_t place = 0; (place = text.find(nameless)) != std::string::npos;) {
        text.erase(place, nameless.size());
    }
    return text;
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

// A function without a size may be as long as this, and others may lie in one.
constexpr std::uint64_t farthest = 1U << 20;

void Close(Dwfl* file) {
    if (file != nullptr) { dwfl_end(file); }
}

}  // namespace

std::string NameOf(const Module& module) {
    const std::string path = module.path;
    return path.substr(path.rfind('/') + 1);
}

// A call may be the last instruction of a function, so this looks before the return address.
const Symbols::Function* Symbols::Find(const Module& module, std::uint64_t address) {
    if (module.path[0] == '\0') { return nullptr; }
    const std::vector<Function>& functions = Open(module).functions;
    auto place = std::upper_bound(
        functions.begin(), functions.end(), address - 1,
        [](std::uint64_t one, const Function& other) { return one < other.start; });
    while (place != functions.begin()) {
        const Function& function = *--place;
        if (function.size == 0 || address - 1 < function.start + function.size) {
            return &function;
        }
        if (address - function.start > farthest) { break; }
    }
    return nullptr;
}

std::string Symbols::Name(const Module& module, std::uint64_t address, std::uint64_t start) {
    if (module.path[0] == '\0') { return Hex(address); }
    const std::string file = NameOf(module);
    const Function* const function = Find(module, address);
    if (function == nullptr && start == 0) { return file + "+" + Hex(address - module.base); }
    if (function == nullptr) {
        return Hex(start - module.base) + "+" + Hex(address - start) + " (" + file + ")";
    }
    Dwfl* const handle = Open(module).handle.get();
    return Distinct(Demangled(function->name), function->name) + "+" +
           Hex(address - function->start) + " (" + file +
           Line(*dwfl_addrmodule(handle, address - 1), address - 1) + ")";
}

const char* Symbols::Symbol(const Module& module, std::uint64_t address) {
    const Function* const function = Find(module, address);
    return function == nullptr ? "" : function->name;
}

std::string Symbols::Distinct(const std::string& shortened, const std::string& symbol) {
    std::vector<std::string>& symbols = symbolsOf[shortened];
    const auto place = std::find(symbols.begin(), symbols.end(), symbol);
    const auto index = place - symbols.begin();
    if (place == symbols.end()) { symbols.push_back(symbol); }
    return index == 0 ? shortened : shortened + "#" + std::to_string(index + 1);
}

const Symbols::File& Symbols::Open(const Module& module) {
    const auto [place, isNew] = files.try_emplace(&module, File{{nullptr, Close}, {}});
    File& file = place->second;
    if (!isNew) { return file; }
    static const Dwfl_Callbacks callbacks = {nullptr, dwfl_standard_find_debuginfo,
                                             dwfl_offline_section_address, nullptr};
    file.handle.reset(dwfl_begin(&callbacks));
    if (file.handle == nullptr) { return file; }
    dwfl_report_begin(file.handle.get());
    Dwfl_Module* const found =
        dwfl_report_elf(file.handle.get(), "", module.path, -1, module.base, false);
    if (found == nullptr) { return file; }
    dwfl_report_end(file.handle.get(), nullptr, nullptr);
    // The library's own search for an address goes through all symbols.
    for (int index = dwfl_module_getsymtab(found) - 1; index > 0; --index) {
        GElf_Sym symbol = {};
        GElf_Addr address = 0;
        const char* const name =
            dwfl_module_getsym_info(found, index, &symbol, &address, nullptr, nullptr, nullptr);
        const auto type = GELF_ST_TYPE(symbol.st_info);
        const bool isCode = type == STT_FUNC || type == STT_GNU_IFUNC || type == STT_NOTYPE;
        if (name == nullptr || *name == '\0' || !isCode || symbol.st_shndx == SHN_UNDEF) {
            continue;
        }
        const auto binding = GELF_ST_BIND(symbol.st_info);
        const int rank = binding == STB_GLOBAL ? 2 : binding == STB_WEAK ? 1 : 0;
        file.functions.push_back({address, symbol.st_size, rank, name});
    }
    std::sort(file.functions.begin(), file.functions.end(), [](const auto& a, const auto& b) {
        return std::tie(a.start, a.rank) < std::tie(b.start, b.rank);
    });
    return file;
}

}  // namespace Recorder
