// Cuts texts in UTF-8 between characters. What is not UTF-8 is cut anywhere.

#ifndef OBR_TOOLS_TRACE_CUTTEXT_HPP
#define OBR_TOOLS_TRACE_CUTTEXT_HPP

#include <cstddef>
#include <string>
#include <string_view>

namespace Trace {

// The longest beginning of the text that has at most `bytes` bytes and ends with a whole character.
constexpr std::string_view WholeCharacters(std::string_view text, std::size_t bytes) {
    if (text.size() <= bytes) { return text; }
    while (bytes > 0 && (static_cast<unsigned char>(text[bytes]) & 0xC0) == 0x80) { --bytes; }
    return text.substr(0, bytes);
}

// The text, or if it has more than `bytes` bytes, its beginning and "...", together at most as
// many.
inline std::string CutText(std::string_view text, std::size_t bytes) {
    if (text.size() <= bytes) { return std::string(text); }
    return std::string(WholeCharacters(text, bytes - 3)) + "...";
}

}  // namespace Trace

#endif
