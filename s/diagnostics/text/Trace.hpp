// The four events of the trace, a line each, on standard output. An event that is not traced costs
// a call and a test of the setting.
//
// A traced event is one whole line or none, and none of them fails or changes what is done: a line
// takes nothing from the heap, and neither uses nor changes the state of the stream, which may hold
// what the host has set. Where a line cannot be written it is left out in silence.

#ifndef OBR_DIAGNOSTICS_TRACE_HPP
#define OBR_DIAGNOSTICS_TRACE_HPP

#include <cstdint>

namespace OBR::MemPool {

class BucketMgr;

namespace Trace {

void PoolCreated(const BucketMgr* pool) noexcept;
void BlockAllocated(const BucketMgr* pool, const void* data, std::uint32_t size) noexcept;
void BlockFreed(const BucketMgr* pool, const void* data) noexcept;
void PoolDestroyed(const BucketMgr* pool) noexcept;

}  // namespace Trace

}  // namespace OBR::MemPool

#endif
