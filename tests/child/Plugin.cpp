// A plugin of a host that does not know the library: it links the library, holds a pool of its own
// in a static, and builds, shares and destroys pools for the host.

#include <MemPool>
#include <cstdio>
#include <new>
#include <vector>

using namespace OBR::MemPool;

static const Mgr own("own");

// The pool that a handle has left, so that a leak checker still knows it.
const void* abandoned = nullptr;

extern "C" {

// A pool with blocks of each kind, in the host's memory.
void Build(void* place, const char* name) {
    Mgr* const pool = new (place) Mgr(name);
    pool->Alloc(10);
    pool->Alloc(5000);
}

void Share(void* left, const void* right) {
    if (abandoned == nullptr) { abandoned = static_cast<Mgr*>(left)->GetBucketMgr(); }
    *static_cast<Mgr*>(left) = *static_cast<const Mgr*>(right);
}

void Destroy(void* pool) {
    static_cast<Mgr*>(pool)->~Mgr();
}

// Prints the registry through each of its functions.
void ShowPools(const char* name) {
    std::vector<Mgr*> handles;
    OBR::vector<Mgr*> compact;
    GetMgrs(handles);
    GetMgrs(compact);
    std::printf("%u pools, %zu and %u handles, %s '%s'\n", GetNumMgrs(), handles.size(),
                compact.size, GetMgr(name) != nullptr ? "with" : "without", name);
}

}  // extern "C"
