// The texts that reports, messages and traces share. They take nothing from the stream that they
// end up on, nor from the process's locale.

#ifndef OBR_DIAGNOSTICS_TEXT_HPP
#define OBR_DIAGNOSTICS_TEXT_HPP

#include <cstdint>
#include <string>

namespace OBR::MemPool {

// Three blanks a level.
std::string Indent(std::uint32_t level);

// "0x" and 16 hexadecimal digits; 18 zeros for null.
std::string PtrText(const void* pointer);

// The 16 digits alone; 18 zeros for null, which has no "0x" to lose.
std::string BareHex(const void* pointer);

// The name of a record header's `type`: "FREE", "USED", "EXT", or "UNKN" for any other value.
const char* RecKindName(std::uint8_t type);

}  // namespace OBR::MemPool

#endif
