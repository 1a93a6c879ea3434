// One bucket: a heap block of a header and equal records, with a free list of offsets. Record.hpp
// draws it. A Group (Group.hpp) makes and releases buckets and links them into its lists.
//
// Words: a bucket is empty when no record is in use, and full when none is free.

#ifndef OBR_MEMPOOL_BUCKET_HPP
#define OBR_MEMPOOL_BUCKET_HPP

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <iosfwd>
#include <map>

#include <MemPool>

#include "MemPool/Record.hpp"

namespace OBR::MemPool {

class Group;

// How many blocks there are of each data size.
using SizeCounts = std::map<std::uint32_t, std::uint32_t>;

// Invariants: used + numFree == TotalRecs(), size == 2 + TotalRecs() * recSize, and the free list
// that starts at freeHead has numFree records.
//
// Packed, since a shifted bucket lies 4 bytes beside the multiples of 8.
class __attribute__((packed, aligned(4))) Bucket {
public:
    // In the order of memory. Reports and gdb read them as they are.
    Group* parent;           // The group that owns the bucket; null once it is destroyed.
    Bucket* next1;           // Next in the group's list of all buckets, null at the end.
    Bucket* prev1;           // Previous one, null at the front.
    Bucket* next2;           // Next in its list of buckets with a free record. Stale while full.
    Bucket* prev2;           // Previous one, null at the front, and while full: see Group.
    std::uint16_t size;      // Bytes of the records and of numFree; 0 once it is destroyed.
    std::uint16_t recSize;   // Bytes of a record, its header included.
    std::uint16_t freeHead;  // Offset of the first free record, 0 when none is.
    std::uint16_t numFree;   // Free records. recsBase is the address of this field.

    static constexpr std::uint32_t baseDistance = 46;  // From the bucket's address to recsBase.

    // Bytes from the start of the heap block to the bucket. It is 0, and a heap block the bucket
    // alone, unless a program that contains the library sets it, while it has no bucket. With 12
    // the data of all records whose size is a multiple of 16 lie at multiples of 16.
    static inline std::uint32_t shift = 0;

    Bucket() = delete;

    // The number of records in a bucket of at most `bucketSize` bytes of offsets.
    static std::uint32_t RecsWithin(std::uint32_t bucketSize, std::uint32_t recSize) {
        return (bucketSize - firstOffset) / recSize;
    }

    // Makes a bucket of at most `bucketSize` bytes of offsets, which is at most 65535 and leaves
    // room for a record. It is on no list. All records are FREE, in the order of their addresses.
    static Bucket* Create(Group* parent, std::uint32_t bucketSize, std::uint32_t recDataSize);

    // Releases a bucket's memory. Until the heap reuses those bytes, the header shows that there is
    // no bucket.
    static void Destroy(Bucket* bucket);

    // The number of records, which is not stored; 0 if the header is so damaged that it has room
    // for none.
    std::int32_t TotalRecs() const {
        if (recSize == 0 || size < firstOffset) { return 0; }
        return (std::int32_t{size} - std::int32_t{firstOffset}) / std::int32_t{recSize};
    }
    std::uint32_t DataSize() const { return recSize - std::uint32_t{sizeof(RecHdr)}; }

    // Addresses and offsets of records.
    char* RecsBase() { return reinterpret_cast<char*>(this) + baseDistance; }
    const char* RecsBase() const { return reinterpret_cast<const char*>(this) + baseDistance; }
    const char* RecsEnd() const { return RecsBase() + size; }
    RecHdr* RecordAt(std::uint32_t offset) {
        return reinterpret_cast<RecHdr*>(RecsBase() + offset);
    }
    const RecHdr* RecordAt(std::uint32_t offset) const {
        return reinterpret_cast<const RecHdr*>(RecsBase() + offset);
    }
    std::uint16_t OffsetOf(const RecHdr* record) const {
        return static_cast<std::uint16_t>(reinterpret_cast<const char*>(record) - RecsBase());
    }

    // Takes the first free record; there must be one. Returns its data.
    void* TakeRecord() {
        const std::uint32_t state = FreeState();
        const auto offset = static_cast<std::uint16_t>(state);
        RecHdr* const record = RecordAt(offset);
        const std::uint32_t hdr = record->Word();
        record->SetWord(RecHdr::Marked(hdr, typeUsed, offset));
        SetFreeState(((state - oneFree) & numFreeMask) | RecHdr::LinkOf(hdr));
        __builtin_prefetch(RecordAt(RecHdr::LinkOf(hdr)));  // The next one may be cold.
        return record->Data();
    }

    // For a bucket whose first free record is taken next and may be cold.
    void PrefetchFirstFree() const { __builtin_prefetch(RecordAt(freeHead)); }

    // Puts the used record with these data in front of the free list.
    void ReturnRecord(void* data) {
        const std::uint32_t state = FreeState();
        RecHdr* const record = RecHdr::Of(data);
        const std::uint32_t hdr = record->Word();
        record->SetWord(RecHdr::Marked(hdr, typeFree, static_cast<std::uint16_t>(state)));
        SetFreeState(((state + oneFree) & numFreeMask) | RecHdr::LinkOf(hdr));
    }

    // The bucket that the link of a used record leads to. For a foreign pointer it is any address.
    static Bucket* Holding(void* data, std::uint16_t offset) {
        return reinterpret_cast<Bucket*>(static_cast<char*>(data) - sizeof(RecHdr) - offset -
                                         baseDistance);
    }

    // The owner that this header names, or null if it is not a bucket's: after a foreign pointer it
    // may be any bytes.
    OBR_READS_FOREIGN const Group* Owner() const {
        const Group* group;
        std::memcpy(&group, &parent, sizeof group);
        if (group == nullptr) { return nullptr; }
        std::uint16_t extent;
        std::memcpy(&extent, &size, sizeof extent);
        return extent == 0 ? nullptr : group;
    }

    // Reports, all read-only and exact to the character, defined in s/diagnostics/reports. Each
    // `level` indents by three blanks. `number` counts buckets from 1.
    void DbgBucket(std::ostream& stream, std::uint32_t number, std::uint32_t level,
                   bool showRecords, bool showFreeList) const;
    void DbgAllRecords(std::ostream& stream, std::uint32_t level) const;
    void DbgUsedHistogram(std::ostream& stream, std::uint32_t level) const;
    void DbgFreeList(std::ostream& stream, std::uint32_t level) const;
    void DbgRecordMap(std::ostream& stream) const;

    // Adds each used record to the count of its data size.
    void AddUsedRecords(SizeCounts& counts) const;

    // The lines of the record map, of `n` boxes each, from the record at index `first` on.
    using Records = OBR::vector<const RecHdr*>;
    void DbgMapRule(std::ostream& stream, std::uint16_t n) const;
    void DbgMapKinds(std::ostream& stream, std::uint16_t n, std::uint16_t first,
                     const Records& records) const;
    void DbgMapOffsets(std::ostream& stream, std::uint16_t n, std::uint16_t first,
                       const Records& records) const;
    void DbgMapSizes(std::ostream& stream, std::uint16_t n, std::uint16_t first) const;
    void DbgMapValues(std::ostream& stream, std::uint16_t n, std::uint16_t first,
                      const Records& records) const;

    // Stops the process at the first fault of the free list.
    void CheckFreeList() const;

private:
    // freeHead and numFree in one load or store, for store-to-load forwarding as with RecHdr.
    std::uint32_t FreeState() const {
        std::uint32_t state;
        std::memcpy(&state, RecsBase() - sizeof freeHead, sizeof state);
        return state;
    }
    void SetFreeState(std::uint32_t state) {
        std::memcpy(RecsBase() - sizeof freeHead, &state, sizeof state);
    }
    static constexpr std::uint32_t oneFree = 0x10000;
    static constexpr std::uint32_t numFreeMask = 0xFFFF0000;
};
static_assert(sizeof(Bucket) == 48, "The first record starts 48 bytes after the bucket's start.");
static_assert(offsetof(Bucket, size) == 40 && offsetof(Bucket, recSize) == 42 &&
                  offsetof(Bucket, freeHead) == 44,
              "The four counts follow the five links.");
static_assert(offsetof(Bucket, numFree) == Bucket::baseDistance &&
                  Bucket::baseDistance + firstOffset == sizeof(Bucket),
              "Offsets count from numFree, so that 0 is never a record.");

}  // namespace OBR::MemPool

#endif
