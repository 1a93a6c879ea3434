// The public headers alone, with every operation of their templates, in each version of the
// language that a host may use. They are compiled and never run.

#include <MemPool>
#include <MemPoolHeap>

template struct OBR::vector<int>;
template struct OBR::vector<OBR::MemPool::Mgr*>;
template class OBR::MemPool::Allocator<double>;
#ifdef __cpp_lib_memory_resource
template class OBR::MemPool::Allocator<OBR::MemPool::Resource>;
#endif
