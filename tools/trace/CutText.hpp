// Cuts texts in UTF-8 between characters. Bytes that are not UTF-8 are cut anywhere.

#ifndef OBR_TOOLS_TRACE_CUTTEXT_HPP
#define OBR_TOOLS_TRACE_CUTTEXT_HPP

#include <cstddef>
#include <string>
#include <string_view>

namespace Trace {

// Whether a character begins at this place of the text.
constexpr bool IsCharacterAt(std::string_view text, std::size_t place) {
    return (static_cast<unsigned char>(text[place]) & 0xC0) != 0x80;
}

// The longest beginning of the text that has at most `bytes` bytes and ends with a whole character.
constexpr std::string_view WholeCharacters(std::string_view text, std::size_t bytes) {
    if (text.size() <= bytes) { return text; }
    while (bytes > 0 && !IsCharacterAt(text, bytes)) { --bytes; }
    return text.substr(0, bytes);
}

// The text; if it has more than `bytes` bytes, its beginning, "..." and its end, with at most
// `bytes` bytes together.
inline std::string CutText(std::string_view text, std::size_t bytes) {
    if (text.size() <= bytes) { return std::string(text); }
    constexpr std::string_view dots = "...";
    const std::size_t tail = (bytes - dots.size()) / 2;
    std::size_t start = text.size() - tail;
    while (start < text.size() && !IsCharacterAt(text, start)) { ++start; }
    return std::string(WholeCharacters(text, bytes - dots.size() - tail))
        .append(dots)
        .append(text.substr(start));
}

}  // namespace Trace

#endif
