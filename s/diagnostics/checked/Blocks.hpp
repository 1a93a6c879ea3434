// The blocks of all pools, by the address of their data: those that live, each with its header as
// the library left it, and those that were freed. It reads a block's memory once, as it is taken.

#ifndef OBR_DIAGNOSTICS_BLOCKS_HPP
#define OBR_DIAGNOSTICS_BLOCKS_HPP

#include <array>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <unordered_map>

#include "MemPool/Bucket.hpp"
#include "MemPool/BucketMgr.hpp"
#include "MemPool/Record.hpp"

namespace OBR::MemPool::Checked {

// What lies ahead of a block's data: the header of a bucket and that of its one record, or that of
// a heap record. Both begin the block of the heap, and both have two links to their neighbours.
struct Layout {
    std::size_t size;  // Of the header.
    std::size_t next;  // Where in it the links stand.
    std::size_t prev;
};
inline constexpr Layout bucketLayout = {sizeof(Bucket) + sizeof(RecHdr), offsetof(Bucket, next1),
                                        offsetof(Bucket, prev1)};
inline constexpr Layout heapRecordLayout = {sizeof(ExtRec), offsetof(ExtRec, next),
                                            offsetof(ExtRec, prev)};

// A living block.
struct Block {
    const BucketMgr* pool;
    std::uint32_t size;                                 // Bytes asked for.
    const Layout* layout;                               // One of the two above.
    std::array<unsigned char, bucketLayout.size> head;  // What the header must be.

    bool IsHeapRecord() const { return layout == &heapRecordLayout; }

    // The data of a neighbour in the pool's list, or null.
    const char* Neighbour(std::size_t link) const {
        const char* start = nullptr;
        std::memcpy(&start, &head[link], sizeof start);
        return start == nullptr ? nullptr : start + layout->size;
    }
    void SetNeighbour(std::size_t link, const char* data) {
        const char* const start = data == nullptr ? nullptr : data - layout->size;
        std::memcpy(&head[link], &start, sizeof start);
    }
};

class Blocks {
public:
    using ByAddress = std::unordered_map<const char*, Block>;

    const ByAddress& Living() const { return living; }

    // The living block whose data begin there, or null.
    Block* Find(const void* data);

    // The data of the living block, or else of the freed one, that the address lies in; or null. It
    // is a search through all of them.
    const char* Around(const void* address) const;

    // Enters a block that was just taken; its header says what it is.
    Block& Add(const BucketMgr& pool, const char* data, std::uint32_t size);

    // Moves a living block to the freed ones, or forgets it where memory is exhausted.
    void Release(const char* data);

    // Takes it out of its neighbours' links, ahead of that.
    void Unlink(const Block& block);

private:
    ByAddress living;
    ByAddress freed;  // Until another block has the address.
};

}  // namespace OBR::MemPool::Checked

#endif
