// Runs an unchanged program on pools. `mempool try` uses it to compare pools with malloc:
//
//     LD_PRELOAD=.../libMallocOnPools.so NUV_OBR_MEMPOOL_BUCKET_SIZE=65450 perl ...
//
// It replaces the malloc family. Blocks up to the largest record come from one Heap, aligned to 16
// bytes as malloc promises. Larger ones come from the C library, which can grow them in place. The
// settings are those of the environment, with two exceptions: pools are on, unless
// NUV_OBR_MEMPOOL_ON disables them (then all blocks come from the C library), and there is no
// trace. MALLOC_ON_POOLS_REPORT=FILE appends the pool's report to FILE when a process exits.
//
// Threads: a heap has no lock, so calls take one here once the process has a second thread.
// Programs with threads work, but all of them share that lock.
//
// Whose block? A block of the C library has its size in the 8 bytes before it, so that the 4 bytes
// directly before it are 0 below 4 GB, and never look like what a Heap writes there. A Heap thus
// refuses such a block after one look, even if it was allocated before this library was ready, in
// another thread, or by the C library itself.

#include <MemPoolHeap>

#include <dlfcn.h>
#include <pthread.h>
#include <sys/mman.h>
#include <sys/single_threaded.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <exception>
#include <fstream>
#include <iostream>
#include <mutex>
#include <new>

#include "replay/Layer.hpp"

// The C library's own functions, by names that no library replaces.
// NOLINTBEGIN(bugprone-reserved-identifier)
extern "C" {
void* __libc_malloc(std::size_t size);
void* __libc_calloc(std::size_t count, std::size_t size);
void* __libc_realloc(void* block, std::size_t size);
void* __libc_memalign(std::size_t alignment, std::size_t size);
void __libc_free(void* block);

// Where this library begins and where its code ends.
extern char __ehdr_start __attribute__((visibility("hidden")));
extern char etext __attribute__((visibility("hidden")));
}
// NOLINTEND(bugprone-reserved-identifier)

namespace {

using OBR::MemPool::Heap;

using Replay::alignmentOfMalloc;

Heap* heap = nullptr;  // Lives from the start-up to the end of the process, after all exit steps.

// Blocks of fewer bytes than this come from the heap. 0 while the heap must not be used: before the
// start-up, while it prints its report, and while its exception is thrown to the caller.
std::atomic<std::size_t> limit{0};
std::size_t usualLimit = 0;  // What it is otherwise.

std::recursive_mutex mutex;  // A report, and an exception, give blocks back on their way.

// Does it while no other thread is in the heap.
template <typename Action>
auto Alone(const Action& action) {
    if (__libc_single_threaded != 0) { return action(); }
    const std::lock_guard<std::recursive_mutex> lock(mutex);
    return action();
}

void* Fail(int error) {
    errno = error;
    return nullptr;
}

// A block of the heap; null, with the reason in errno, if there is no memory.
void* Take(std::size_t size, std::size_t alignment) {
    return Alone([&]() -> void* {
        try {
            return heap->Allocate(size, alignment);
        } catch (const std::bad_alloc&) {
            limit = usualLimit;
            return Fail(ENOMEM);
        }
    });
}

// 0 for what is no block of the heap.
std::size_t Usable(void* block) {
    return heap == nullptr ? 0 : Alone([&] { return heap->UsableSize(block); });
}

void* Aligned(std::size_t alignment, std::size_t size) {
    alignment = std::max(alignment, alignmentOfMalloc);
    if (alignment <= 4096 && size + alignment - alignmentOfMalloc < limit) {
        return Take(size, alignment);
    }
    return __libc_memalign(alignment, size);
}

bool IsPowerOfTwo(std::size_t number) {
    return number != 0 && (number & (number - 1)) == 0;
}

using UsableSizeOfLibrary = std::size_t (*)(void*);
UsableSizeOfLibrary usableSizeOfLibrary = nullptr;

void FindUsableSize() {
    usableSizeOfLibrary =
        reinterpret_cast<UsableSizeOfLibrary>(dlsym(RTLD_NEXT, "malloc_usable_size"));
}

// Forgets which pages of this library are in use, as the start-up of the C++ library uses most of
// them and nothing else does. Those that are used again come back.
void DropPages() {
    char* const end = &etext - reinterpret_cast<std::uintptr_t>(&etext) % 4096;
    madvise(&__ehdr_start, static_cast<std::size_t>(end - &__ehdr_start), MADV_DONTNEED);
}

// After the start-up of the library, which reads the environment.
__attribute__((constructor)) void StartUp() {
    using namespace OBR::MemPool;  // NOLINT(google-build-using-namespace)
    FindUsableSize();
    DropPages();
    if (std::getenv("NUV_OBR_MEMPOOL_ON") != nullptr && !NUV_OBR_MEMPOOL_ON()) { return; }
    NUV_OBR_MEMPOOL_TRACE(false);  // Writing a line may allocate, which would be traced again.
    try {
        heap = new Heap("malloc", Replay::HeapSettingsOf(OBR::MemPool::PoolSettings::OfProcess()));
    } catch (const std::exception& error) {
        std::fprintf(stderr, "MallocOnPools: %s\n", error.what());
        std::_Exit(1);
    }
    // The thread that forks holds the lock, so that the child's heap is consistent. The child gets
    // a new lock, since its thread is not the one that holds the old one.
    pthread_atfork([] { mutex.lock(); }, [] { mutex.unlock(); },
                   [] { ::new (&mutex) std::recursive_mutex; });

    usualLimit = Replay::MallocLimit(NUV_OBR_MEMPOOL_MAX_RECORD_SIZE());
    limit = usualLimit;
}

__attribute__((destructor)) void Report() {
    const char* const name = std::getenv("MALLOC_ON_POOLS_REPORT");
    if (name == nullptr || heap == nullptr) { return; }
    const std::lock_guard<std::recursive_mutex> lock(mutex);
    limit = 0;
    std::ofstream file(name, std::ios::app);
    std::streambuf* const output = std::cout.rdbuf(file.rdbuf());
    heap->Report();
    std::cout.rdbuf(output);
    if (!file.flush()) { std::fprintf(stderr, "MallocOnPools: cannot write %s\n", name); }
    limit = usualLimit;
}

}  // namespace

// The pool's own memory comes from the C library. Only this library uses these operators: those of
// the program call the malloc below. Throwing calls malloc for the exception's memory.
void* operator new(std::size_t size) {
    void* const block = __libc_malloc(size);
    if (block == nullptr) {
        limit = 0;
        throw std::bad_alloc();
    }
    return block;
}
void operator delete(void* block) noexcept {
    __libc_free(block);
}
void operator delete(void* block, std::size_t) noexcept {
    __libc_free(block);
}

extern "C" {

void* malloc(std::size_t size) noexcept {
    return size < limit.load(std::memory_order_relaxed) ? Take(size, alignmentOfMalloc)
                                                        : __libc_malloc(size);
}

void free(void* block) noexcept {
    const bool isOfHeap = heap != nullptr && Alone([block] { return heap->Free(block); });
    if (!isOfHeap) { __libc_free(block); }
}

void* calloc(std::size_t count, std::size_t size) noexcept {
    std::size_t bytes = 0;
    if (__builtin_mul_overflow(count, size, &bytes)) { return Fail(ENOMEM); }
    if (bytes >= limit.load(std::memory_order_relaxed)) { return __libc_calloc(count, size); }
    void* const block = Take(bytes, alignmentOfMalloc);
    return block == nullptr ? nullptr : std::memset(block, 0, bytes);
}

// A block that shrinks stays in its place, unless less than half of it would be used.
void* realloc(void* block, std::size_t size) noexcept {
    if (block == nullptr) { return malloc(size); }
    const std::size_t usable = Usable(block);
    if (usable == 0) { return __libc_realloc(block, size); }
    if (size == 0) {
        free(block);
        return nullptr;
    }
    if (size <= usable && size >= usable / 2) { return block; }
    void* const moved = malloc(size);
    if (moved == nullptr) { return size <= usable ? block : nullptr; }
    std::memcpy(moved, block, std::min(size, usable));
    free(block);
    return moved;
}

void* reallocarray(void* block, std::size_t count, std::size_t size) noexcept {
    std::size_t bytes = 0;
    if (__builtin_mul_overflow(count, size, &bytes)) { return Fail(ENOMEM); }
    return realloc(block, bytes);
}

int posix_memalign(void** block, std::size_t alignment, std::size_t size) noexcept {
    if (!IsPowerOfTwo(alignment) || alignment % sizeof(void*) != 0) { return EINVAL; }
    const int error = errno;
    void* const aligned = Aligned(alignment, size);
    errno = error;
    if (aligned == nullptr) { return ENOMEM; }
    *block = aligned;
    return 0;
}

void* memalign(std::size_t alignment, std::size_t size) noexcept {
    return IsPowerOfTwo(alignment) ? Aligned(alignment, size) : __libc_memalign(alignment, size);
}

void* aligned_alloc(std::size_t alignment, std::size_t size) noexcept {
    return IsPowerOfTwo(alignment) ? Aligned(alignment, size) : Fail(EINVAL);
}

// valloc and pvalloc stay those of the C library. The heap refuses their blocks like all of its.

std::size_t malloc_usable_size(void* block) noexcept {
    if (block == nullptr) { return 0; }
    const std::size_t usable = Usable(block);
    if (usable != 0) { return usable; }
    if (usableSizeOfLibrary == nullptr) { FindUsableSize(); }
    return usableSizeOfLibrary(block);
}

}  // extern "C"
