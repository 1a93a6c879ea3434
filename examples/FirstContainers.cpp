// Containers of std::pmr and of std in a heap. The README shows this program.

#include <MemPoolHeap>
#include <string>
#include <vector>

int main() {
    OBR::MemPool::Heap heap("words", OBR::MemPool::HeapSettings().On(true));
    OBR::MemPool::Resource resource(heap);
    std::pmr::vector<std::pmr::string> words({"pool", "bucket", "record"}, &resource);
    std::vector<double, OBR::MemPool::Allocator<double>> numbers({1.5, 2.5}, heap);
    numbers.push_back(static_cast<double>(words.size()));
}
