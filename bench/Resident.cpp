// Measures what a live block costs in memory. A process measures one subject and one size:
//
//     Resident pool|heap|boost|pmr SIZE
//
// It prints the resident bytes per block and, for the pool, the bytes per block that it has
// allocated from the heap. heap is malloc or, with LD_PRELOAD, the allocator that replaces it. All
// blocks are written completely, and together they are large compared with the rest of the process.

#include <MemPool>

#include <cstdlib>
#include <cstring>
#include <fstream>
#include <iostream>
#include <memory_resource>
#include <new>
#include <string>
#include <vector>

#if __has_include(<boost/pool/pool.hpp>)
#include <boost/pool/pool.hpp>
#define HAS_BOOST
#endif

namespace {

std::size_t askedInArrayForm = 0;  // The library allocates its buckets in this form.

std::size_t ResidentBytes() {
    std::ifstream smaps("/proc/self/smaps_rollup");  // Exact to the page; statm is not.
    std::string word;
    while (smaps >> word && word != "Rss:") {}
    std::size_t kilobytes = 0;
    smaps >> kilobytes;
    return kilobytes * 1024;
}

template <typename Alloc>
void Measure(unsigned size, bool showHeld, Alloc alloc) {
    const std::size_t number = std::size_t{64} * 1024 * 1024 / size;
    std::memset(alloc(), 1, size);  // The first block makes the subject allocate its own tables.
    const std::size_t before = ResidentBytes();
    askedInArrayForm = 0;
    for (std::size_t i = 0; i < number; ++i) { std::memset(alloc(), 1, size); }
    const auto blocks = static_cast<double>(number);
    std::cout << static_cast<double>(ResidentBytes() - before) / blocks;
    if (showHeld) { std::cout << ' ' << static_cast<double>(askedInArrayForm) / blocks; }
    std::cout << std::endl;
}

}  // namespace

void* operator new[](std::size_t size) {
    askedInArrayForm += size;
    return ::operator new(size);
}
void operator delete[](void* block) noexcept {
    ::operator delete(block);
}
void operator delete[](void* block, std::size_t) noexcept {
    ::operator delete(block);
}

int main(int argc, char** argv) {
    const std::string subject = argc == 3 ? argv[1] : "";
    const auto size = static_cast<unsigned>(argc == 3 ? std::strtoul(argv[2], nullptr, 10) : 0);
    if (size == 0) {
        std::cerr << "usage: Resident pool|heap|boost|pmr SIZE" << std::endl;
        return 2;
    }
    if (subject == "pool") {
        OBR::MemPool::NUV_OBR_MEMPOOL_ON(true);
        OBR::MemPool::Mgr pool;
        Measure(size, true, [&] { return pool.Alloc(size); });
    } else if (subject == "heap") {
        Measure(size, false, [&] { return std::malloc(size); });
#ifdef HAS_BOOST
    } else if (subject == "boost") {
        boost::pool<> pool(size);
        Measure(size, false, [&] { return pool.malloc(); });
#endif
    } else if (subject == "pmr") {
        std::pmr::unsynchronized_pool_resource pool;
        Measure(size, false, [&] { return pool.allocate(size, 8); });
    } else {
        std::cerr << "Resident: unknown subject " << subject << std::endl;
        return 2;
    }
    return 0;
}
