// The layout of a pool's memory, written out again for the tests: none of these numbers comes from
// the library's headers, so that a change there is noticed.

#ifndef OBR_TESTS_LAYOUT_HPP
#define OBR_TESTS_LAYOUT_HPP

#include <cstdint>
#include <cstring>

namespace Layout {

constexpr std::uint32_t sizeAt = 40;      // Offset of a bucket's `size`,
constexpr std::uint32_t freeHeadAt = 44;  // `freeHead`,
constexpr std::uint32_t recsBase = 46;    // and `numFree`, from which offsets count.
constexpr std::uint32_t firstOffset = 2;  // Of the first record.
constexpr std::uint32_t recHdr = 4;       // Before a record's data: link, type, guard.
constexpr std::uint8_t typeFree = 0;
constexpr std::uint8_t typeUsed = 1;

constexpr std::uint32_t extRec = 24;    // Before a heap record's data.
constexpr std::uint32_t lengthAt = 16;  // Offset of its `length`; then comes:
constexpr std::uint8_t extRecHdr[recHdr] = {0xAA, 0xBB, 2, 0xCC};

inline std::uint8_t* Bytes(const void* start) {
    return static_cast<std::uint8_t*>(const_cast<void*>(start));
}

inline std::uint8_t* Record(const void* bucket, std::uint32_t offset) {
    return Bytes(bucket) + recsBase + offset;
}
inline std::uint8_t* Data(const void* bucket, std::uint32_t offset) {
    return Record(bucket, offset) + recHdr;
}
inline std::uint32_t Link(const std::uint8_t* record) {
    return record[0] + record[1] * 0x100u;
}
inline std::uint8_t Type(const std::uint8_t* record) {
    return record[2];
}
inline void SetHeader(std::uint8_t* record, std::uint8_t type, std::uint32_t link) {
    record[0] = static_cast<std::uint8_t>(link % 0x100);
    record[1] = static_cast<std::uint8_t>(link / 0x100);
    record[2] = type;
}

// Makes the block a heap record, on no list. Returns its data.
inline std::uint8_t* SetExtRec(std::uint8_t* block, std::uint32_t length) {
    std::memcpy(block + lengthAt, &length, sizeof length);
    std::memcpy(block + extRec - recHdr, extRecHdr, recHdr);
    return block + extRec;
}

}  // namespace Layout

#endif
