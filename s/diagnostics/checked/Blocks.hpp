// The blocks of all pools, by the address of their data: the living ones, each with its header as
// the library left it, and the freed ones. The memory of a block is read only when it is added.

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

// The header before a block's data: that of a bucket and of its one record, or that of a heap
// record. Either starts a block of the heap and has links to two neighbours.
struct Layout {
    struct Field {
        std::size_t offset;
        std::size_t size;  // 0 if there is no such field.
        const char* name;
    };
    std::size_t size;  // Of the header.
    std::size_t next;  // Offsets of the links in it.
    std::size_t prev;
    std::array<Field, 12> fields;
};
extern const Layout bucketLayout;
extern const Layout heapRecordLayout;

struct Block {
    static constexpr std::size_t maxHeaderSize = sizeof(Bucket) + sizeof(RecHdr);

    const BucketMgr* pool;                            // Null once the block is freed.
    std::uint32_t size;                               // Requested bytes.
    const Layout* layout;                             // One of the two above.
    std::array<unsigned char, maxHeaderSize> header;  // What the header must be.

    bool IsHeapRecord() const { return layout == &heapRecordLayout; }

    // The data of a neighbour in the pool's list, or null.
    const char* Neighbour(std::size_t link) const {
        const char* start = nullptr;
        std::memcpy(&start, &header[link], sizeof start);
        return start == nullptr ? nullptr : start + layout->size;
    }
    void SetNeighbour(std::size_t link, const char* data) {
        const char* const start = data == nullptr ? nullptr : data - layout->size;
        std::memcpy(&header[link], &start, sizeof start);
    }
};

class Blocks {
public:
    using ByAddress = std::unordered_map<const char*, Block>;

    // Including the freed ones.
    const ByAddress& All() const { return blocks; }

    // The living block whose data start there, or null.
    Block* Find(const void* data);

    // The start of the living block that contains the address, or else of a freed one that did; or
    // null. Searches all of them.
    const char* Around(const void* address) const;

    // Adds a block that was just taken; its header says what it is.
    Block& Add(const BucketMgr& pool, const char* data, std::uint32_t size);

    // Marks a living block as freed. Its address stays known until another block starts there.
    static void Release(Block& block) { block.pool = nullptr; }

    // Removes a block from its neighbours' links, before it alone is released.
    void Unlink(const Block& block);

private:
    ByAddress blocks;
};

}  // namespace OBR::MemPool::Checked

#endif
