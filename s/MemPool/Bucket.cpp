// How a bucket is made and how it ends.

#include "MemPool/Bucket.hpp"

#include <new>

namespace OBR::MemPool {

Bucket* Bucket::Create(Group* parent, std::uint32_t bucketSize, std::uint32_t recDataSize) {
    const std::uint32_t recSize = recDataSize + sizeof(RecHdr);
    const std::uint32_t totalRecs = (bucketSize - firstOffset) / recSize;
    const std::uint32_t size = firstOffset + totalRecs * recSize;

    auto* const bucket = static_cast<Bucket*>(::operator new[](baseDistance + size));
    bucket->parent = parent;
    bucket->next1 = nullptr;
    bucket->prev1 = nullptr;
    bucket->next2 = nullptr;
    bucket->prev2 = nullptr;
    bucket->size = static_cast<std::uint16_t>(size);
    bucket->recSize = static_cast<std::uint16_t>(recSize);
    bucket->freeHead = firstOffset;
    bucket->numFree = static_cast<std::uint16_t>(totalRecs);

    std::uint32_t offset = firstOffset;
    for (std::uint32_t next = offset + recSize; next < size; next += recSize) {
        bucket->RecordAt(offset)->Mark(typeFree, static_cast<std::uint16_t>(next));
        offset = next;
    }
    bucket->RecordAt(offset)->Mark(typeFree, 0);
    return bucket;
}

void Bucket::Destroy(Bucket* bucket) {
    if (bucket->recSize == 0) { return; }
    bucket->parent = nullptr;
    bucket->size = 0;
    bucket->recSize = 0;
    bucket->next1 = nullptr;
    bucket->prev1 = nullptr;
    bucket->next2 = nullptr;
    bucket->prev2 = nullptr;
    KeepStores(bucket);
    ::operator delete[](bucket);
}

}  // namespace OBR::MemPool
