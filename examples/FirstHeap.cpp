// A heap with calls like those of C. The README shows this program.

#include <MemPoolHeap>

int main() {
    OBR::MemPool::Heap heap("nodes", OBR::MemPool::HeapSettings().On(true));
    void* block = heap.Malloc(24);  // As malloc, aligned to 8 bytes.
    block = heap.Realloc(block, 400);
    heap.Free(block);
    heap.FreeAll();  // Drops all remaining blocks at once.
}
