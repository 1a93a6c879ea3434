// How a bucket is made, with a header written for each of its records, and how it is destroyed.

#include "MemPool/Bucket.hpp"

#include <new>

namespace OBR::MemPool {

Bucket* Bucket::Create(Group* parent, std::uint32_t bucketSize, std::uint32_t recDataSize) {
    const std::uint32_t recSize = recDataSize + sizeof(RecHdr);
    const std::uint32_t totalRecs = RecsWithin(bucketSize, recSize);
    const std::uint32_t size = firstOffset + totalRecs * recSize;

    char* const block = static_cast<char*>(::operator new[](shift + baseDistance + size));
    auto* const bucket = reinterpret_cast<Bucket*>(block + shift);
    bucket->parent = parent;
    bucket->next1 = nullptr;
    bucket->prev1 = nullptr;
    bucket->next2 = nullptr;
    bucket->prev2 = nullptr;
    bucket->size = static_cast<std::uint16_t>(size);
    bucket->recSize = static_cast<std::uint16_t>(recSize);
    bucket->SetFreeState(totalRecs * oneFree + firstOffset);

    RecHdr* record = bucket->RecordAt(firstOffset);
    for (std::uint32_t next = firstOffset + recSize; next < size; next += recSize) {
        record->Format(static_cast<std::uint16_t>(next));
        record = bucket->RecordAt(next);
    }
    record->Format(0);
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
    ::operator delete[](reinterpret_cast<char*>(bucket) - shift);
}

}  // namespace OBR::MemPool
