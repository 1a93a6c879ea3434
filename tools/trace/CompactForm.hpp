// The compact form of a trace: a few bytes per event, compressed chunk by chunk.
//
//     file    magic  chunk...  end             A file without the end is incomplete.
//     chunk   packed size, plain size, zstd frame with a checksum
//     end     the two sizes of a chunk as 0    Sizes have 4 bytes, the low one first.
//
// A chunk decompresses to whole entries. An entry is a tag and its fields, which are *varints*: 7
// bits per byte, the low ones first, the top bit set on all bytes but the last. A text is its size
// and its bytes. A pool is given by its index in the order of the Pool entries; a block by its
// distance from the last block given, in units of 16 bytes where that is possible.

#ifndef OBR_TOOLS_TRACE_COMPACTFORM_HPP
#define OBR_TOOLS_TRACE_COMPACTFORM_HPP

#include <cstddef>
#include <cstdint>
#include <string_view>

namespace Trace {

constexpr std::string_view compactMagic("\x89MPT\r\n\x1a\x01", 8);
constexpr std::size_t chunkHeaderSize = 8;

// A chunk is written once it has this many bytes. Since texts are cut at their largest size, none
// has twice as many.
constexpr std::size_t fullChunkSize = std::size_t{1} << 18;
constexpr std::size_t maxPlainSize = 2 * fullChunkSize;
constexpr std::size_t maxTextSize = 0xFFFF;

// The kind of an entry, in the low bits of its tag, with its fields.
enum class Entry : std::uint8_t {
    Pool,       // The address of a pool, which gets the next index.
    NoPools,    // Indices start again from 0.
    Created,    // Pool.
    Destroyed,  // Pool.
    Cleared,    // Pool.
    Allocated,  // Pool, block, size.
    Freed,      // Pool, block.
    Owned,      // From here on the reader keeps each block's pool and thread, for Released. Blocks
                // from before are forgotten.
    Released,   // Block: freed from the pool it was allocated from. Ignored if there is none.
    Thread,     // The number of the thread of the following entries.
    Named,      // Pool, text.
    Info,       // Key and value, both texts.
    Time,       // Milliseconds since the recording began.
};

constexpr std::uint8_t entryMask = 0x0F;
constexpr std::uint8_t samePool = 0x10;   // That of the last entry with a pool; it has no field.
constexpr std::uint8_t inUnits = 0x20;    // The distance of the block is in units,
constexpr std::uint8_t backwards = 0x40;  // and towards lower addresses.
constexpr unsigned int unitShift = 4;
constexpr std::size_t maxPools = 1U << 16;  // After so many a writer starts again from index 0.

}  // namespace Trace

#endif
