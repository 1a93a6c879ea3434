// The exact text of each traced event.

#include "diagnostics/text/Trace.hpp"

#include <iostream>

#include "diagnostics/text/Text.hpp"

namespace OBR::MemPool::Trace {

void WriteCreated(const BucketMgr* pool) {
    std::cout << "xmpt:"
              << "c:" << BareHex(pool) << std::endl;
}

void WriteAllocated(const BucketMgr* pool, const void* data, std::uint32_t size) {
    std::cout << "xmpt:"
              << "a:" << BareHex(pool) << ":" << BareHex(data) << ":" << size << std::endl;
}

void WriteFreed(const BucketMgr* pool, const void* data) {
    std::cout << "xmpt:"
              << "f:" << BareHex(pool) << ":" << BareHex(data) << ":" << std::endl;
}

void WriteDestroyed(const BucketMgr* pool) {
    std::cout << "xmpt:"
              << "d:" << BareHex(pool) << std::endl;
}

}  // namespace OBR::MemPool::Trace
