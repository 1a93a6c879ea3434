// What malloc makes of a request: the rule of the C library of Linux on 64 bits. Its chunks are
// multiples of 16 bytes, 32 at least, of which 8 are its own. That very large requests may come as
// whole pages is left out: it depends on what has been freed before, and is little beside them.

#ifndef OBR_TOOLS_REPORT_MALLOCSIZES_HPP
#define OBR_TOOLS_REPORT_MALLOCSIZES_HPP

#include <algorithm>
#include <cstdint>

namespace Report {

// The bytes lent for a request, as malloc_usable_size tells them.
constexpr std::uint64_t MallocBytes(std::uint64_t size) {
    return std::max<std::uint64_t>((size + 8 + 15) / 16 * 16, 32) - 8;
}

// What each block takes besides.
constexpr std::uint64_t mallocHeader = 8;

}  // namespace Report

#endif
