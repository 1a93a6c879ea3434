// How malloc of the GNU C library rounds a request on 64 bits: its chunks are multiples of 16
// bytes, at least 32, of which 8 are its own header. Very large requests may be rounded to whole
// pages, which is ignored here: it depends on earlier frees, and adds little to such a request.

#ifndef OBR_TOOLS_REPORT_MALLOCSIZES_HPP
#define OBR_TOOLS_REPORT_MALLOCSIZES_HPP

#include <algorithm>
#include <cstdint>

namespace Report {

// The bytes provided for a request, as returned by malloc_usable_size.
constexpr std::uint64_t MallocBytes(std::uint64_t size) {
    return std::max<std::uint64_t>((size + 8 + 15) / 16 * 16, 32) - 8;
}

// Bytes of malloc's header, per block.
constexpr std::uint64_t mallocHeader = 8;

}  // namespace Report

#endif
