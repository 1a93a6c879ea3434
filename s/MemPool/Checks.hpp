// The check that a build with OBR_MEMPOOL_CHECKS runs on the bucket touched after every record
// taken or given back. Other builds pay nothing for it.

#ifndef OBR_MEMPOOL_CHECKS_HPP
#define OBR_MEMPOOL_CHECKS_HPP

#include "MemPool/Bucket.hpp"

namespace OBR::MemPool {

#ifdef OBR_MEMPOOL_CHECKS
inline void CheckTouched(const Bucket& bucket) {
    bucket.CheckFreeList();
}
#else
inline void CheckTouched(const Bucket&) {}
#endif

}  // namespace OBR::MemPool

#endif
