// A host that lets the environment enable the pools, and that has a static pool here and in another
// file. Which of the two is constructed first depends on the order of linking.

#include <MemPool>
#include <cstring>

using OBR::MemPool::Mgr;

extern Mgr otherPool;
extern char* const otherBlock;

// Before all statics without a priority.
__attribute__((init_priority(102))) static Mgr early("ahead");

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
    const bool areListed =
        pools.size == 4 && pools[0] == &early && pools[1] == &pool && pools[2] == last;
    return areListed && early.IsEnabled() && IsRecord(pool, block) &&
                   IsRecord(otherPool, otherBlock) &&
                   IsRecord(*last, static_cast<char*>(last->Alloc(10))) && pool.Free(block)
               ? 0
               : 1;
}
