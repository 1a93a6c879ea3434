// The public header alone, with every operation of its template, in each version of the language
// that a host may use. It is compiled and never run.

#include <MemPool>

template struct OBR::vector<int>;
template struct OBR::vector<OBR::MemPool::Mgr*>;
