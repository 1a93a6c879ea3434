// What the checked library does at each step of a block's life, to report a host's faults. There
// (OBR_MEMPOOL_CHECKED) s/diagnostics/checked defines these functions. In the ordinary library they
// are empty and cost no instruction.
//
// The checked library gives each bucket one record of exactly the size asked for and releases it
// when the record is freed, whatever the settings are: each block is a heap block of its own, which
// ends where the data end, and tools that watch the heap see it.

#ifndef OBR_MEMPOOL_CHECKED_HPP
#define OBR_MEMPOOL_CHECKED_HPP

#include <cstdint>
#include <mutex>

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

// While it lives, an operation of the host's runs on the pool. An operation of another thread at
// the same time is reported, once for each pool, and waits for this one.
class Use {
public:
    explicit Use(const BucketMgr& bucketMgr);

    // The pool ends. Another one may be built at its address.
    void IsLast() const;

private:
    struct Pool;
    static Pool& Of(const BucketMgr& bucketMgr);

    Pool& pool;
    std::unique_lock<std::recursive_mutex> lock;
};

// A block of `size` bytes was taken from the pool. Returns it. If there is no memory for the notes
// on it, gives it back and throws std::bad_alloc.
void* Taken(BucketMgr& pool, void* data, std::uint32_t size);

// Whether the pool may be asked about a block, or may release it; if not, the host's answer is
// false as well. A refused release is reported. A damaged header is reported and repaired, so that
// the pool can use it.
bool MayAskAbout(const BucketMgr& pool, const void* data);
bool MayRelease(BucketMgr& pool, void* data);

// All blocks of the pool are about to be released: by Clear, or at its end, where those still in
// use are reported.
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
