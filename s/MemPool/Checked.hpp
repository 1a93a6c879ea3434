// The seam of the checked library, which tells a host its faults: the pool calls these at each step
// of a block's life. In that library (OBR_MEMPOOL_CHECKED) they lie in s/diagnostics/checked. In
// the ordinary one they are empty, and not one instruction comes of them.
//
// The checked library gives each bucket one record of exactly the size asked for and releases it
// when the record is freed, whatever the settings say: each block is a block of the heap, which
// ends where the block ends, and what watches the heap sees it.

#ifndef OBR_MEMPOOL_CHECKED_HPP
#define OBR_MEMPOOL_CHECKED_HPP

#include <cstdint>

#include "MemPool/Bucket.hpp"

namespace OBR::MemPool {

class BucketMgr;

namespace Checked {

#ifdef OBR_MEMPOOL_CHECKED

// A pool that is being built rounds no sizes, whatever the settings say; or to the multiple that
// the variable MEMPOOL_CHECK_ALIGNMENT says.
void KeepSizesExact(BucketMgr& pool);

// What a group gets in place of its pool's settings.
inline std::uint32_t BucketSize(std::uint32_t, std::uint32_t recDataSize) {
    return firstOffset + recDataSize + std::uint32_t{sizeof(RecHdr)};
}
inline bool KeepsEmptyBuckets(bool) {
    return false;
}

// A block of `size` bytes was taken from the pool. Returns it. If memory for the notes on it is
// exhausted, gives it back and throws.
void* Taken(BucketMgr& pool, void* data, std::uint32_t size);

// Whether the pool is to be asked about a block, or to release it. False is the answer to the host
// as well, and a refused release is told. A damaged header is told and mended, so that the pool can
// go by it.
bool MayAskAbout(const BucketMgr& pool, const void* data);
bool MayRelease(BucketMgr& pool, void* data);

// All blocks of the pool are about to be released: because the host asks for it, or at its end,
// where those that live are told.
void BeforeClear(const BucketMgr& pool);
void BeforeEnd(const BucketMgr& pool);

// The process ends, or the library is unloaded: what lives in any pool is told.
void AtExit();

#else

inline void KeepSizesExact(BucketMgr&) {}
inline std::uint32_t BucketSize(std::uint32_t bucketSize, std::uint32_t) {
    return bucketSize;
}
inline bool KeepsEmptyBuckets(bool keeps) {
    return keeps;
}
inline void* Taken(BucketMgr&, void* data, std::uint32_t) {
    return data;
}
inline bool MayAskAbout(const BucketMgr&, const void*) {
    return true;
}
inline bool MayRelease(BucketMgr&, void*) {
    return true;
}
inline void BeforeClear(const BucketMgr&) {}
inline void BeforeEnd(const BucketMgr&) {}
inline void AtExit() {}

#endif

}  // namespace Checked

}  // namespace OBR::MemPool

#endif
