// A bare pool. The README shows this program.

#include <MemPool>
#include <iostream>

int main() {
    OBR::MemPool::NUV_OBR_MEMPOOL_ON(true);  // For pools that are built from now on.
    OBR::MemPool::Mgr symbols("symbols");

    void* name = symbols.Alloc(10);
    void* table = symbols.Alloc(5000);
    std::cout << symbols.GetSize(name) << " and " << symbols.GetSize(table) << " bytes\n";

    symbols.Free(name);
    symbols.Clear();  // Drops all remaining blocks at once.
}
