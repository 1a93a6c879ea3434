// The host's second file with a static pool.

#include <MemPool>

extern OBR::MemPool::Mgr otherPool;
extern char* const otherBlock;

OBR::MemPool::Mgr otherPool("other");
char* const otherBlock = static_cast<char*>(otherPool.Alloc(10));
