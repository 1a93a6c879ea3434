// How the shared texts are written.

#include "diagnostics/text/Text.hpp"

#include <iomanip>
#include <locale>
#include <sstream>

namespace OBR::MemPool {

std::string Indent(std::uint32_t level) {
    return std::string(std::size_t{3} * level, ' ');
}

std::string PtrText(const void* pointer) {
    if (pointer == nullptr) { return std::string(18, '0'); }
    std::ostringstream text;
    text.imbue(std::locale::classic());
    text << "0x" << std::hex << std::setfill('0') << std::setw(16)
         << reinterpret_cast<std::uintptr_t>(pointer);
    return text.str();
}

std::string BareHex(const void* pointer) {
    const std::string text = PtrText(pointer);
    return text.compare(0, 2, "0x") == 0 ? text.substr(2) : text;
}

const char* RecKindName(std::uint8_t type) {
    constexpr const char* names[] = {"FREE", "USED", "EXT"};
    return type < 3 ? names[type] : "UNKN";
}

}  // namespace OBR::MemPool
