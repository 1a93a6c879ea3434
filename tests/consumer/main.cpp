// A host that leaves it to its environment to switch the pools on, and that has a static pool here
// and in another file. Which of the two is constructed first depends on the order of linking.

#include <MemPool>
#include <cstring>

using OBR::MemPool::Mgr;

extern Mgr otherPool;
extern char* const otherBlock;

static Mgr pool("consumer");
static char* const block = static_cast<char*>(pool.Alloc(10));

static bool IsRecord(const Mgr& owner, char* data) {
    std::memset(data, 1, 10);
    return owner.IsEnabled() && owner.Contains(data) && owner.GetSize(data) == 12;
}

// Destroyed when the statics are gone already, and the library's own with an archive.
static Mgr* last = new Mgr("last");
__attribute__((destructor)) static void DestroyLast() {
    delete last;
}

int main() {
    OBR::vector<Mgr*> pools;
    OBR::MemPool::GetMgrs(pools);
    const bool areListed = pools.size == 3 && pools[0] == &pool && pools[1] == last;
    return areListed && IsRecord(pool, block) && IsRecord(otherPool, otherBlock) &&
                   IsRecord(*last, static_cast<char*>(last->Alloc(10))) && pool.Free(block)
               ? 0
               : 1;
}
