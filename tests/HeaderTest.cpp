// The public headers alone, with every operation of their templates and the forms in which a handle
// can be made, in each version of the language that a host may use. Compiled and never run.

#include <MemPoolHeap.h>
#include <MemPool>
#include <MemPoolHeap>
#include <MemPoolSettings>

template struct OBR::vector<int>;
template struct OBR::vector<OBR::MemPool::Mgr*>;
template class OBR::MemPool::Allocator<double>;
#ifdef __cpp_lib_memory_resource
template class OBR::MemPool::Allocator<OBR::MemPool::Resource>;
#endif

void Use(const OBR::MemPool::Mgr& pool);
void Use(const OBR::MemPool::Mgr (&pools)[3]);

void MakeHandles();
void MakeHandles() {
    const struct {
        int number;
        OBR::MemPool::Mgr pool;
    } aggregate = {1, {"in an aggregate"}};
    OBR::MemPool::Mgr several[3] = {};
    Use("for the time of the call");
    Use(aggregate.pool);
    Use(several);
}
