// A host that is linked to the library. It does not use the standard streams of C++, so that only
// the library initialises them.

#include <MemPool>
#include <cstdio>

int main() {
    std::puts(OBR::MemPool::NUV_OBR_MEMPOOL_ON() ? "on" : "off");
}
