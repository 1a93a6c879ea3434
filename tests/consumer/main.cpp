// A host that leaves it to its environment to switch the pools on.

#include <MemPool>
#include <cstring>

int main() {
    OBR::MemPool::Mgr pool("consumer");
    char* const block = static_cast<char*>(pool.Alloc(10));
    std::memset(block, 1, 10);
    OBR::vector<OBR::MemPool::Mgr*> pools;
    OBR::MemPool::GetMgrs(pools);
    const bool isListed = pools.size == 1 && pools[0] == &pool;
    const bool isRecord = pool.IsEnabled() && pool.Contains(block) && pool.GetSize(block) == 12;
    return isListed && isRecord && pool.Free(block) ? 0 : 1;
}
