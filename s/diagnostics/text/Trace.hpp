// The four lines of the trace, a line an event, on standard output. An event that is not traced
// costs one test of the setting.

#ifndef OBR_DIAGNOSTICS_TRACE_HPP
#define OBR_DIAGNOSTICS_TRACE_HPP

#include <cstdint>

#include "MemPool/Settings.hpp"

namespace OBR::MemPool {

class BucketMgr;

namespace Trace {

void WriteCreated(const BucketMgr* pool);
void WriteAllocated(const BucketMgr* pool, const void* data, std::uint32_t size);
void WriteFreed(const BucketMgr* pool, const void* data);
void WriteDestroyed(const BucketMgr* pool);

inline void PoolCreated(const BucketMgr* pool) {
    if (Settings::trace) { WriteCreated(pool); }
}
inline void BlockAllocated(const BucketMgr* pool, const void* data, std::uint32_t size) {
    if (Settings::trace) { WriteAllocated(pool, data, size); }
}
inline void BlockFreed(const BucketMgr* pool, const void* data) {
    if (Settings::trace) { WriteFreed(pool, data); }
}
inline void PoolDestroyed(const BucketMgr* pool) {
    if (Settings::trace) { WriteDestroyed(pool); }
}

}  // namespace Trace

}  // namespace OBR::MemPool

#endif
