// The four events of the trace. Each writes one line on standard output. With the trace off an
// event costs a call and a test of the setting.
//
// An event writes one whole line or nothing. It never fails, and never changes what the pool does.
// A line is built without the heap, and writing it neither uses nor changes the state of the
// stream, which the host may have set. A line that cannot be written is silently dropped.

#ifndef OBR_DIAGNOSTICS_TRACELINE_HPP
#define OBR_DIAGNOSTICS_TRACELINE_HPP

#include <cstdint>

namespace OBR::MemPool {

class BucketMgr;

namespace TraceLine {

void PoolCreated(const BucketMgr* pool) noexcept;
void BlockAllocated(const BucketMgr* pool, const void* data, std::uint32_t size) noexcept;
void BlockFreed(const BucketMgr* pool, const void* data) noexcept;
void PoolDestroyed(const BucketMgr* pool) noexcept;

}  // namespace TraceLine

}  // namespace OBR::MemPool

#endif
