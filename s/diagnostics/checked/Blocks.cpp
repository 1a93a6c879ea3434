#include "diagnostics/checked/Blocks.hpp"

#include <algorithm>

namespace OBR::MemPool::Checked {

#define OBR_FIELD(start, Struct, name) \
    { (start) + offsetof(Struct, name), sizeof(Struct::name), #name }
const Layout bucketLayout = {
    Block::maxHeaderSize,
    offsetof(Bucket, next1),
    offsetof(Bucket, prev1),
    {{OBR_FIELD(0, Bucket, parent), OBR_FIELD(0, Bucket, next1), OBR_FIELD(0, Bucket, prev1),
      OBR_FIELD(0, Bucket, next2), OBR_FIELD(0, Bucket, prev2), OBR_FIELD(0, Bucket, size),
      OBR_FIELD(0, Bucket, recSize), OBR_FIELD(0, Bucket, freeHead), OBR_FIELD(0, Bucket, numFree),
      OBR_FIELD(sizeof(Bucket), RecHdr, link), OBR_FIELD(sizeof(Bucket), RecHdr, type),
      OBR_FIELD(sizeof(Bucket), RecHdr, guard)}}};
const Layout heapRecordLayout = {
    sizeof(ExtRec),
    offsetof(ExtRec, next),
    offsetof(ExtRec, prev),
    {{OBR_FIELD(0, ExtRec, next), OBR_FIELD(0, ExtRec, prev), OBR_FIELD(0, ExtRec, length),
      OBR_FIELD(offsetof(ExtRec, hdr), RecHdr, link),
      OBR_FIELD(offsetof(ExtRec, hdr), RecHdr, type),
      OBR_FIELD(offsetof(ExtRec, hdr), RecHdr, guard)}}};
#undef OBR_FIELD

Block* Blocks::Find(const void* data) {
    const auto found = blocks.find(static_cast<const char*>(data));
    return found == blocks.end() || found->second.pool == nullptr ? nullptr : &found->second;
}

const char* Blocks::Around(const void* address) const {
    const char* const place = static_cast<const char*>(address);
    const char* freed = nullptr;
    for (const auto& [data, block] : blocks) {
        if (place < data || place >= data + std::max<std::uint32_t>(block.size, 1)) { continue; }
        if (block.pool != nullptr) { return data; }
        freed = data;
    }
    return freed;
}

Block& Blocks::Add(const BucketMgr& pool, const char* data, std::uint32_t size) {
    const bool isHeapRecord = RecHdr::Of(data)->type == typeExt;
    const Layout& layout = isHeapRecord ? heapRecordLayout : bucketLayout;
    Block& block = blocks.insert_or_assign(data, Block{&pool, size, &layout, {}}).first->second;
    std::memcpy(block.header.data(), data - layout.size, layout.size);
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

}  // namespace OBR::MemPool::Checked
