// What the checked library does at each step of a block's life to report faults of the host. In
// that library (OBR_MEMPOOL_CHECKED) s/diagnostics/checked defines these functions. In the ordinary
// library they are empty and cost no instruction.
//
// The checked library gives each bucket one record of exactly the requested size, and releases the
// bucket when the record is freed, whatever the settings are. Each block is thus a heap block that
// ends where the data ends, so that tools which watch the heap see it.

#ifndef OBR_MEMPOOL_CHECKED_HPP
#define OBR_MEMPOOL_CHECKED_HPP

#include <cstdint>
#include <mutex>

#include "MemPool/Bucket.hpp"

namespace OBR::MemPool {

class BucketMgr;

namespace Checked {

#ifdef OBR_MEMPOOL_CHECKED

// Makes a new pool round no sizes, whatever the settings say, or round them up to a multiple of
// MEMPOOL_CHECK_ALIGNMENT if that variable is set.
void KeepSizesExact(BucketMgr& pool);

// A group's settings, instead of its pool's.
inline std::uint32_t BucketSize(std::uint32_t, std::uint32_t recDataSize) {
    return firstOffset + recDataSize + std::uint32_t{sizeof(RecHdr)};
}
inline bool KeepsEmptyBuckets(bool) {
    return false;
}

// Lives while an operation of the host runs on the pool. An operation of another thread at the same
// time is reported, once per pool, and waits for this one.
class Use {
public:
    explicit Use(const BucketMgr& bucketMgr);

    // The pool is being destroyed. Another one may be built at its address.
    void IsLast() const;

private:
    struct Pool;
    static Pool& Of(const BucketMgr& bucketMgr);

    Pool& pool;
    std::unique_lock<std::recursive_mutex> lock;
};

// Notes a block of `size` bytes that was taken from the pool, and returns it. If there is no memory
// for the note, frees the block and throws std::bad_alloc.
void* Taken(BucketMgr& pool, void* data, std::uint32_t size);

// Whether the pool may answer a query about a block, or may release it. Otherwise the operation of
// the host returns false. A refused release is reported. A damaged header is reported and repaired,
// so that the pool can use it.
bool MayAskAbout(const BucketMgr& pool, const void* data);
bool MayRelease(BucketMgr& pool, void* data);

// All blocks of the pool are about to be released: by Clear, or because the pool is destroyed. The
// latter reports the blocks still in use.
void BeforeClear(const BucketMgr& pool);
void BeforeEnd(const BucketMgr& pool);

// The process ends or the library is unloaded: reports the blocks in use of all pools.
void AtExit();

#else

inline void KeepSizesExact(BucketMgr&) {}
inline std::uint32_t BucketSize(std::uint32_t bucketSize, std::uint32_t) {
    return bucketSize;
}
inline bool KeepsEmptyBuckets(bool keeps) {
    return keeps;
}
struct Use {
    explicit Use(const BucketMgr&) {}
};
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
