// The texts that messages, traces and reports share: indentation, addresses, and short texts built
// in place. They depend neither on the state of the stream that they are written to nor on a
// locale.

#ifndef OBR_DIAGNOSTICS_TEXT_HPP
#define OBR_DIAGNOSTICS_TEXT_HPP

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

namespace OBR::MemPool {

// Three blanks per level.
std::string Indent(std::uint32_t level);

// "0x" and 16 hexadecimal digits; 18 zeros for null.
std::string PtrText(const void* pointer);

// The 16 digits alone; 18 zeros for null. The library does not call it: kept for compatibility.
std::string BareHex(const void* pointer);

// A text of at most 127 characters, in an array instead of on the heap. Callers keep to that
// length.
class FixedText {
public:
    FixedText& Add(std::string_view piece);
    FixedText& AddNumber(std::uint32_t number);  // In decimal.
    FixedText& AddBareHex(const void* pointer);

    std::string_view View() const { return {text, length}; }
    const char* CString() const { return text; }

private:
    char text[128] = {};
    std::size_t length = 0;
};

}  // namespace OBR::MemPool

#endif
