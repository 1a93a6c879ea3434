#include "diagnostics/checked/Blocks.hpp"

#include <algorithm>
#include <new>
#include <utility>

namespace OBR::MemPool::Checked {

Block* Blocks::Find(const void* data) {
    const auto found = living.find(static_cast<const char*>(data));
    return found == living.end() ? nullptr : &found->second;
}

const char* Blocks::Around(const void* address) const {
    const char* const place = static_cast<const char*>(address);
    const auto isAround = [&](const ByAddress::value_type& known) {
        const std::uint32_t size = std::max<std::uint32_t>(known.second.size, 1);
        return place >= known.first && place < known.first + size;
    };
    for (const ByAddress* const known : {&living, &freed}) {
        const auto found = std::find_if(known->begin(), known->end(), isAround);
        if (found != known->end()) { return found->first; }
    }
    return nullptr;
}

Block& Blocks::Add(const BucketMgr& pool, const char* data, std::uint32_t size) {
    const bool isHeapRecord = RecHdr::Of(data)->type == typeExt;
    const Layout& layout = isHeapRecord ? heapRecordLayout : bucketLayout;
    const char* const start = data - layout.size;
    Block& block = living.insert_or_assign(data, Block{&pool, size, &layout, {}}).first->second;
    freed.erase(data);
    std::memcpy(block.head.data(), start, layout.size);
    if (Block* const next = Find(block.Neighbour(layout.next))) {
        next->SetNeighbour(layout.prev, data);
    }
    return block;
}

void Blocks::Unlink(const Block& block) {
    const char* const next = block.Neighbour(block.layout->next);
    const char* const prev = block.Neighbour(block.layout->prev);
    if (Block* const below = Find(next)) { below->SetNeighbour(block.layout->prev, prev); }
    if (Block* const above = Find(prev)) { above->SetNeighbour(block.layout->next, next); }
}

void Blocks::Release(const char* data) {
    ByAddress::node_type block = living.extract(data);
    try {
        freed.insert(std::move(block));
    } catch (const std::bad_alloc&) {}  // The index of all of them did not find room to grow.
}

}  // namespace OBR::MemPool::Checked
