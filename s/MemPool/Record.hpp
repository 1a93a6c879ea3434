// The memory of a pool, byte by byte: the layout of a record and of a heap record, and how a data
// pointer leads to its header. Only this file and Bucket compute addresses within a block.
//
//   Bucket, one heap block                              ExtRec ("heap record"), one heap block
//
//   bucket      +----------------------------+          block       +----------------------------+
//               | parent next1 prev1 next2   |                      | next prev                  |
//               | prev2 size recSize freeHead|                      | length                     |
//   recsBase +0 | numFree (2 bytes)          |          block   +20 | RecHdr: AA BB 02 CC        |
//            +2 +----------------------------+          block   +24 +----------------------------+
//               | RecHdr | data              |  record 0            | data (length bytes)        |
//   +2+recSize  +----------------------------+                      +----------------------------+
//               | RecHdr | data              |  record 1
//               :                            :          RecHdr, 4 bytes
//   recsEnd     +----------------------------+
//    = recsBase + size                                  link (2, low byte first) | type | guard
//
// An offset is the 16-bit distance of a record from recsBase, the last two bytes of the bucket's
// header. The first record thus has offset 2, and offset 0 means none.
//
// Words: a record is FREE or USED. The link of a FREE record is the offset of the next free record,
// 0 at the end of the list; that of a USED record is its own offset, which leads from its data back
// to the bucket. EXT marks a heap record.

#ifndef OBR_MEMPOOL_RECORD_HPP
#define OBR_MEMPOOL_RECORD_HPP

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <new>

#define OBR_UNLIKELY(condition) __builtin_expect(static_cast<bool>(condition), 0)
#define OBR_NOINLINE __attribute__((noinline))

// For code that reads the bytes before a pointer that may be foreign. A sanitizer does not check
// these reads.
#define OBR_READS_FOREIGN __attribute__((no_sanitize("address", "alignment", "object-size")))

namespace OBR::MemPool {

// Keeps the stores to a block that is about to be released. An optimiser would drop them as dead,
// but they let the pool recognise a pointer that is freed again after its block is gone.
inline void KeepStores(const void* block) {
    __asm__ volatile("" : : "r"(block) : "memory");
}

// The offset of a bucket's first record.
constexpr std::uint16_t firstOffset = 2;

// Plain bytes, not an enumeration: the header of damaged memory can hold any other value.
constexpr std::uint8_t typeFree = 0;
constexpr std::uint8_t typeUsed = 1;
constexpr std::uint8_t typeExt = 2;
constexpr std::uint8_t typeUnknown = 0xFF;  // Stands for a header that is not in the bucket.

// The name of a `type` in reports and messages.
constexpr const char* RecKindName(std::uint8_t type) {
    switch (type) {
        case typeFree:
            return "FREE";
        case typeUsed:
            return "USED";
        case typeExt:
            return "EXT";
        default:
            return "UNKN";
    }
}

// A record's header. A record may start at any address, so its header is copied as bytes, with the
// low byte of the link first; the compiler makes one load or store of a copy. All four bytes are
// copied at once for speed: a header is often read soon after it was written, and store-to-load
// forwarding needs a load of the bytes that were stored together.
struct RecHdr {
    std::uint8_t link[2];  // FREE: offset of the next free record; USED: own offset; EXT: AA BB.
    std::uint8_t type;     // typeFree, typeUsed or typeExt.
    std::uint8_t guard;    // EXT: CC. In a bucket it is never written.

    OBR_READS_FOREIGN std::uint32_t Word() const {
        std::uint32_t word;
        std::memcpy(&word, this, sizeof word);
        return word;
    }
    void SetWord(std::uint32_t word) { std::memcpy(this, &word, sizeof word); }

    static std::uint16_t LinkOf(std::uint32_t word) { return static_cast<std::uint16_t>(word); }
    static constexpr std::uint32_t Marked(std::uint32_t word, std::uint8_t type,
                                          std::uint16_t link) {
        return (word & 0xFF000000) + ((std::uint32_t{type} << 16) + link);
    }

    // Whether a word is USED and its link can be an offset.
    static bool IsUsed(std::uint32_t word) {
        const std::uint32_t unguarded = word & 0x00FFFFFF;
        return unguarded >= Marked(0, typeUsed, firstOffset) &&
               unguarded <= Marked(0, typeUsed, 0xFFFF);
    }

    std::uint16_t Link() const {
        std::uint16_t offset;
        std::memcpy(&offset, link, sizeof offset);
        return offset;
    }

    // Makes raw memory a FREE record. Two stores are faster than one of all four bytes, which would
    // have to read the guard first.
    void Format(std::uint16_t newLink) {
        std::memcpy(link, &newLink, sizeof link);
        type = typeFree;
    }

    // The caller's data follow the header directly.
    void* Data() { return this + 1; }
    static RecHdr* Of(void* data) { return static_cast<RecHdr*>(data) - 1; }
    static const RecHdr* Of(const void* data) { return static_cast<const RecHdr*>(data) - 1; }
};
static_assert(sizeof(RecHdr) == 4, "The data of every record start 4 bytes after its header.");
static_assert(alignof(RecHdr) == 1, "A record may start at any address.");
static_assert(__BYTE_ORDER__ == __ORDER_LITTLE_ENDIAN__,
              "A copied word has the link's low byte first.");

// The header of a heap record. It does not say which pool the record belongs to.
struct ExtRec {
    ExtRec* next;          // Next in the pool's list, null at the end.
    ExtRec* prev;          // Previous one, null at the front.
    std::uint32_t length;  // Requested bytes, not rounded. With 0 no test recognises the record.
    RecHdr hdr;            // In the place of a record's header: the 4 bytes before the data.

    // Makes a heap record that is on no list.
    static ExtRec* Create(std::uint32_t length) {
        auto* const extRec = static_cast<ExtRec*>(::operator new[](sizeof(ExtRec) + length));
        *extRec = {nullptr, nullptr, length, {{0xAA, 0xBB}, typeExt, 0xCC}};
        return extRec;
    }

    void* Data() { return this + 1; }
    const void* Data() const { return this + 1; }
    static ExtRec* Of(void* data) { return static_cast<ExtRec*>(data) - 1; }

    // The length of the heap record with these data, or 0 if they are not a heap record's.
    OBR_READS_FOREIGN static std::uint32_t LengthAt(const void* data) {
        const RecHdr* const hdr = RecHdr::Of(data);
        if (hdr->link[0] != 0xAA || hdr->link[1] != 0xBB || hdr->type != typeExt ||
            hdr->guard != 0xCC) {
            return 0;
        }
        std::uint32_t length;  // Copied: a foreign pointer may lie anywhere.
        std::memcpy(&length, hdr - 1, sizeof length);
        return length;
    }
};
static_assert(sizeof(ExtRec) == 24, "A heap record costs 24 bytes.");
static_assert(offsetof(ExtRec, length) == 16 && offsetof(ExtRec, hdr) == 20,
              "The length is 8 bytes before the data, the header 4.");

}  // namespace OBR::MemPool

#endif
