// Numbers and names as people read them.

#ifndef OBR_TOOLS_MEMPOOL_READABLE_HPP
#define OBR_TOOLS_MEMPOOL_READABLE_HPP

#include <array>
#include <cstddef>
#include <cstdint>
#include <string>

#include <fmt/format.h>

#include "trace/CutText.hpp"

namespace Tool {

// 1234567 as 1,234,567.
inline std::string Count(std::uint64_t number) {
    std::string text = std::to_string(number);
    for (std::size_t end = text.size(); end > 3; end -= 3) { text.insert(end - 3, ","); }
    return text;
}

// Three digits and a unit, which is a power of 1000.
inline std::string Bytes(std::uint64_t bytes) {
    constexpr std::array units = {"B ", "KB", "MB", "GB", "TB", "PB", "EB"};
    auto value = static_cast<double>(bytes);
    std::size_t unit = 0;
    while (value >= 999.5 && unit + 1 < units.size()) {
        value /= 1000;
        ++unit;
    }
    const int digits = unit == 0 || value >= 99.95 ? 0 : value >= 9.995 ? 1 : 2;
    return fmt::format("{:.{}f} {}", value, digits, units.at(unit));
}

// A name; if it is too long, with "<..>" for template arguments, and then without its middle.
inline std::string ShortName(std::string name, std::size_t bytes) {
    while (name.size() > bytes) {
        const std::size_t end = name.find('>');
        const std::size_t begin = end == std::string::npos ? end : name.rfind('<', end);
        if (begin == std::string::npos) { break; }
        name.replace(begin, end + 1 - begin, 1, '\0');
    }
    for (std::size_t place = 0; (place = name.find('\0', place)) != std::string::npos;) {
        name.replace(place, 1, "<..>");
    }
    return Trace::CutText(name, bytes);
}

}  // namespace Tool

#endif
