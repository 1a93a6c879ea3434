// The compact form of a trace: a few bytes an event, compressed block by block.
//
//     file    magic  block...  end             A file without the end breaks off.
//     block   packed size, plain size, zstd frame with a checksum
//     end     the two sizes of a block as 0    Sizes have 4 bytes, the low one first.
//
// A block unpacks to whole records. A record is a tag and its fields, which are *varints*: 7 bits a
// byte, the low ones first, the top bit set on all bytes but the last. A text is its size and its
// bytes. Pools are told by their index in the order of their Pool records; a block by how far it
// lies from the last one that was told, in units of 16 bytes where that is possible.

#ifndef OBR_TOOLS_TRACE_COMPACTFORM_HPP
#define OBR_TOOLS_TRACE_COMPACTFORM_HPP

#include <cstddef>
#include <cstdint>
#include <string_view>

namespace Trace {

constexpr std::string_view compactMagic("\x89MPT\r\n\x1a\x01", 8);
constexpr std::size_t blockHeaderSize = 8;

// A block is written once it has this many bytes. Since a text is cut at its largest size, none has
// twice as many.
constexpr std::size_t fullBlockSize = std::size_t{1} << 18;
constexpr std::size_t maxPlainSize = 2 * fullBlockSize;
constexpr std::size_t maxTextSize = 0xFFFF;

// What a record tells, in the low bits of its tag.
enum class Record : std::uint8_t {
    Pool,       // The address of a pool, which gets the next index.
    NoPools,    // Indices begin anew with 0.
    Created,    // Pool.
    Destroyed,  // Pool.
    Cleared,    // Pool.
    Allocated,  // Pool, block, size.
    Freed,      // Pool, block.
    Owned,      // From here on the reader knows each block's pool and thread, for Released.
    Released,   // Block: freed from the pool that it was allocated from. Nothing if there is none.
    Thread,     // The number of the thread that the records behind are of.
    Named,      // Pool, text.
    Info,       // Key and value, both texts.
};

constexpr std::uint8_t recordMask = 0x0F;
constexpr std::uint8_t samePool = 0x10;   // That of the last record with a pool; no field for it.
constexpr std::uint8_t inUnits = 0x20;    // The distance of the block is in units.
constexpr std::uint8_t backwards = 0x40;  // And towards lower addresses.
constexpr unsigned int unitShift = 4;
constexpr std::size_t maxPools = 1U << 16;  // Behind so many a writer begins anew.

}  // namespace Trace

#endif
