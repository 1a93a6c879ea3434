// Runs an unchanged program on pools. `mempool try` uses it to compare pools with malloc:
//
//     LD_PRELOAD=.../libMallocOnPools.so NUV_OBR_MEMPOOL_BUCKET_SIZE=65450 perl ...
//
// It replaces the malloc family. Blocks up to the largest record come from one Heap, aligned to 16
// bytes as malloc promises: see Replay::MallocHeap. Larger ones come from the C library, which can
// grow them in place, and so do those that need more alignment. The settings are those of the
// environment, with two exceptions: pools are on, unless
// NUV_OBR_MEMPOOL_ON disables them (then all blocks come from the C library), and there is no
// trace. MALLOC_ON_POOLS_REPORT=FILE appends the pool's report to FILE when a process exits.
//
// Threads: a heap has no lock, so calls take one here once the process has a second thread.
// Programs with threads work, but all of them share that lock.
//
// Whose block? A block of the C library has its size in the 8 bytes before it, so that the 4 bytes
// directly before it are 0 below 4 GB, and never look like the header of a record. This holds even
// for a block that was allocated before this library was ready, in another thread, or by the C
// library itself.

#include <MemPoolSettings>

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

#include "replay/MallocHeap.hpp"

#define SLOW_PATH __attribute__((noinline))

// The C library's own functions, by names that no library replaces.
// NOLINTBEGIN(bugprone-reserved-identifier)
extern "C" {
void* __libc_malloc(std::size_t size) noexcept;
void* __libc_calloc(std::size_t count, std::size_t size) noexcept;
void* __libc_realloc(void* block, std::size_t size) noexcept;
void* __libc_memalign(std::size_t alignment, std::size_t size) noexcept;
void __libc_free(void* block) noexcept;

// Where this library begins and where its code ends.
extern char __ehdr_start __attribute__((visibility("hidden")));
extern char etext __attribute__((visibility("hidden")));
}
// NOLINTEND(bugprone-reserved-identifier)

namespace {

using OBR::MemPool::Bucket;
using Replay::MallocHeap;

// Lives from the start-up to the end of the process, after all exit steps.
MallocHeap* heap = nullptr;

// Blocks of fewer bytes than this come from the heap. 0 while the heap must not be used: before the
// start-up, while it prints its report, and while its exception is thrown to the caller.
std::atomic<std::size_t> limit{0};

std::recursive_mutex mutex;  // A report, and an exception, give blocks back on their way.

// Does it while no other thread is in the heap. Actions are passed by value, in registers.
template <typename Action>
SLOW_PATH auto WithLock(Action action) noexcept {
    const std::lock_guard<std::recursive_mutex> lock(mutex);
    return action();
}
template <typename Action>
auto Alone(Action action) noexcept {
    return __libc_single_threaded == 0 ? WithLock(action) : action();
}

bool IsBelowLimit(std::size_t size) {
    return size < limit.load(std::memory_order_relaxed);
}

// Null for a block of the C library.
Bucket* BucketOf(void* block) {
    return heap == nullptr || block == nullptr ? nullptr : MallocHeap::BucketOf(block);
}

SLOW_PATH void* Fail(int error) {
    errno = error;
    return nullptr;
}

// A block of the heap; null, with the reason in errno, if there is no memory. This and the next are
// not inline, so that malloc and free only decide and jump.
SLOW_PATH void* Take(std::size_t size) noexcept {
    return Alone([size]() -> void* {
        try {
            return heap->Allocate(size);
        } catch (const std::bad_alloc&) {
            limit = heap->Limit();
            return Fail(ENOMEM);
        }
    });
}

SLOW_PATH void GiveBack(void* block, Bucket* bucket) noexcept {
    Alone([block, bucket] { MallocHeap::Free(block, bucket); });
}

void* Aligned(std::size_t alignment, std::size_t size) {
    return alignment <= Replay::alignmentOfMalloc ? malloc(size) : __libc_memalign(alignment, size);
}

bool IsPowerOfTwo(std::size_t number) {
    return number != 0 && (number & (number - 1)) == 0;
}

// Forgets which pages of this library are in use, as the start-up of the C++ library uses most of
// them and nothing else does. Those that are used again come back.
void DropPages() {
    char* const end = &etext - reinterpret_cast<std::uintptr_t>(&etext) % 4096;
    madvise(&__ehdr_start, static_cast<std::size_t>(end - &__ehdr_start), MADV_DONTNEED);
}

void BuildHeap() {
    // Writing a line may allocate, which would be traced again.
    OBR::MemPool::NUV_OBR_MEMPOOL_TRACE(false);
    try {
        heap = new MallocHeap(OBR::MemPool::PoolSettings::OfProcess());
    } catch (const std::exception& error) {
        std::fprintf(stderr, "MallocOnPools: %s\n", error.what());
        std::_Exit(1);
    }
    // The thread that forks holds the lock, so that the child's heap is consistent. The child gets
    // a new lock, since its thread is not the one that holds the old one.
    pthread_atfork([] { mutex.lock(); }, [] { mutex.unlock(); },
                   [] { ::new (&mutex) std::recursive_mutex; });

    limit = heap->Limit();
}

// After the start-up of the library, which reads the environment.
__attribute__((constructor)) void StartUp() {
    const bool isOff =
        std::getenv("NUV_OBR_MEMPOOL_ON") != nullptr && !OBR::MemPool::NUV_OBR_MEMPOOL_ON();
    if (!isOff) { BuildHeap(); }
    DropPages();
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
    limit = heap->Limit();
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
    return IsBelowLimit(size) ? Take(size) : __libc_malloc(size);
}

void free(void* block) noexcept {
    Bucket* const bucket = BucketOf(block);
    return bucket == nullptr ? __libc_free(block) : GiveBack(block, bucket);
}

void* calloc(std::size_t count, std::size_t size) noexcept {
    std::size_t bytes = 0;
    if (__builtin_mul_overflow(count, size, &bytes)) { return Fail(ENOMEM); }
    if (!IsBelowLimit(bytes)) { return __libc_calloc(count, size); }
    void* const block = Take(bytes);
    return block == nullptr ? nullptr : std::memset(block, 0, bytes);
}

// A block that shrinks stays in its place, unless less than half of it would be used.
void* realloc(void* block, std::size_t size) noexcept {
    if (block == nullptr) { return malloc(size); }
    Bucket* const bucket = BucketOf(block);
    if (bucket == nullptr) { return __libc_realloc(block, size); }
    if (size == 0) {
        GiveBack(block, bucket);
        return nullptr;
    }
    const std::size_t usable = bucket->DataSize();
    if (size <= usable && size >= usable / 2) { return block; }
    void* const moved = malloc(size);
    if (moved == nullptr) { return size <= usable ? block : nullptr; }
    std::memcpy(moved, block, std::min(size, usable));
    GiveBack(block, bucket);
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
    if (const Bucket* const bucket = BucketOf(block)) { return bucket->DataSize(); }
    static const auto usableSizeOfLibrary =
        reinterpret_cast<std::size_t (*)(void*)>(dlsym(RTLD_NEXT, "malloc_usable_size"));
    return usableSizeOfLibrary(block);
}

}  // extern "C"
