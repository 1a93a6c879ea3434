// The registry's operations, and the exported functions that give hosts access to it.

#include "MemPool/MgrRegistry.hpp"

#include <algorithm>

namespace OBR::MemPool {

BucketMgr* MgrRegistry::Find(const std::string& name) const {
    const auto entry = pools.find(name);
    return entry == pools.end() ? nullptr : entry->second;
}

Mgr* MgrRegistry::HandleOf(const BucketMgr* pool) {
    Mgr* const handle = pool->mgr;
    return handle == nullptr || handle->GetBucketMgr() == nullptr ? nullptr : handle;
}

void MgrRegistry::AddSharer(Mgr* handle) {
    if (std::find(sharers.begin(), sharers.end(), handle) == sharers.end()) {
        sharers.push_back(handle);
    }
}

// The pools that the handle has left may still refer to it. Each of them has an entry until the
// exit step. After that step a pool can only be reached through another handle, which is a sharer.
void MgrRegistry::ForgetHandle(Mgr* handle) {
    const auto forget = [handle](BucketMgr* pool) {
        if (pool != nullptr && pool->mgr == handle) { pool->mgr = nullptr; }
    };
    for (const auto& entry : pools) { forget(entry.second); }
    for (const Mgr* sharer : sharers) { forget(sharer->GetBucketMgr()); }

    sharers.erase(std::remove(sharers.begin(), sharers.end(), handle), sharers.end());
    if (sharers.empty()) { sharers.shrink_to_fit(); }
}

namespace {

template <typename Vector>
void AppendHandles(Vector& mgrs) {
    mgrs.reserve(registry.All().size());
    registry.ForEachHandle([&mgrs](Mgr* handle) { mgrs.push_back(handle); });
}

}  // namespace

Mgr* GetMgr(const char* name) {
    const BucketMgr* const pool = registry.Find(name == nullptr ? "" : name);
    return pool == nullptr ? nullptr : MgrRegistry::HandleOf(pool);
}

void GetMgrs(OBR::vector<Mgr*, std::allocator<Mgr*>>& mgrs) {
    AppendHandles(mgrs);
}
void GetMgrs(std::vector<Mgr*, std::allocator<Mgr*>>& mgrs) {
    AppendHandles(mgrs);
}

unsigned int GetNumMgrs() {
    return static_cast<unsigned int>(registry.All().size());
}

}  // namespace OBR::MemPool
