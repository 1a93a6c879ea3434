// How malloc rounds a request, by the rule of the GNU C library on 64 bits: its chunks are
// multiples of 16 bytes, at least 32, of which 8 are its own header. Very large requests may become
// whole pages. That is left out: it depends on what was freed before, and is little compared with
// them.

#ifndef OBR_TOOLS_REPORT_MALLOCSIZES_HPP
#define OBR_TOOLS_REPORT_MALLOCSIZES_HPP

#include <algorithm>
#include <cstdint>

namespace Report {

// The bytes lent for a request, as malloc_usable_size gives them.
constexpr std::uint64_t MallocBytes(std::uint64_t size) {
    return std::max<std::uint64_t>((size + 8 + 15) / 16 * 16, 32) - 8;
}

// Bytes of malloc's own per block.
constexpr std::uint64_t mallocHeader = 8;

}  // namespace Report

#endif
