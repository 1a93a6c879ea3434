// The malloc family that the program calls. Each call is passed on to the allocator that the
// program would have without the recorder, and recorded. Operator new and delete use these calls
// too.
//
// A block is recorded after it is allocated, and its release before it is freed, so that no other
// thread can record the same address in between.

#include <dlfcn.h>
#include <malloc.h>

#include <cerrno>
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <cstring>

#include "record/Callers.hpp"
#include "record/Recorder.hpp"

namespace Recorder {

namespace {

// The allocator's own calls.
struct Next {
    void* (*Malloc)(std::size_t);
    void* (*Calloc)(std::size_t, std::size_t);
    void* (*Realloc)(void*, std::size_t);
    void (*Free)(void*);
    void* (*Memalign)(std::size_t, std::size_t);
    void* (*AlignedAlloc)(std::size_t, std::size_t);
    int (*PosixMemalign)(void**, std::size_t, std::size_t);
    void* (*Valloc)(std::size_t);
    void* (*Pvalloc)(std::size_t);
    std::size_t (*UsableSize)(void*);
};
Next next = {};
std::atomic<bool> isReady = false;

// Looking up the allocator's functions may itself allocate. Blocks that are requested before they
// are known come from here. They are never reused and never recorded.
alignas(16) char earlyMemory[std::size_t{1} << 17];
std::atomic<std::size_t> earlyUsed = 0;

bool IsEarly(const void* block) {
    const auto offset =
        reinterpret_cast<std::uintptr_t>(block) - reinterpret_cast<std::uintptr_t>(earlyMemory);
    return __builtin_expect(offset < sizeof(earlyMemory), 0);
}

// The size is stored before the block.
std::size_t EarlySize(const void* block) {
    std::size_t size = 0;
    std::memcpy(&size, static_cast<const char*>(block) - sizeof(size), sizeof(size));
    return size;
}

void* EarlyAllocate(std::size_t size, std::size_t alignment = 16) {
    if (size > sizeof(earlyMemory) || alignment > 4096) {
        errno = ENOMEM;
        return nullptr;
    }
    const std::size_t taken = (size + alignment + 31) / 16 * 16;
    const std::size_t offset = earlyUsed.fetch_add(taken);
    if (offset + taken > sizeof(earlyMemory)) {
        errno = ENOMEM;
        return nullptr;
    }
    const auto start = reinterpret_cast<std::uintptr_t>(earlyMemory) + offset + 16;
    char* const block = earlyMemory + offset + 16 + (alignment - start % alignment) % alignment;
    std::memcpy(block - sizeof(size), &size, sizeof(size));
    return block;
}

template <typename Call>
void LookUp(Call& call, const char* name) {
    void* const address = dlsym(RTLD_NEXT, name);
    std::memcpy(&call, &address, sizeof(call));
}

void LookUpAll() {
    static std::atomic<bool> isBegun = false;
    if (isBegun.exchange(true)) { return; }
    LookUp(next.Malloc, "malloc");
    LookUp(next.Calloc, "calloc");
    LookUp(next.Realloc, "realloc");
    LookUp(next.Free, "free");
    LookUp(next.Memalign, "memalign");
    LookUp(next.AlignedAlloc, "aligned_alloc");
    LookUp(next.PosixMemalign, "posix_memalign");
    LookUp(next.Valloc, "valloc");
    LookUp(next.Pvalloc, "pvalloc");
    LookUp(next.UsableSize, "malloc_usable_size");
    isReady.store(true, std::memory_order_release);
}

// Whether the allocator can be called.
inline bool IsReady() {
    if (__builtin_expect(isReady.load(std::memory_order_acquire), 1)) { return true; }
    LookUpAll();
    return isReady.load(std::memory_order_acquire);
}

struct CallSite {
    const void* returnAddress;
    const void* frame;
};
#define CALL_SITE                                          \
    CallSite {                                             \
        __builtin_return_address(0), __builtin_dwarf_cfa() \
    }

inline void RecordAllocated(Channel& channel, const void* block, std::size_t size,
                            const CallSite& site) {
    if (block == nullptr) { return; }
    const std::uint64_t group =
        channel.by >= By::Caller ? FindGroup(channel, site.returnAddress, site.frame) : 0;
    Put(channel, Op::Allocated, block, size, group);
}

template <typename Call>
__attribute__((noinline)) void* AllocateTimed(Channel& channel, std::size_t size,
                                              const CallSite& site, Call call) {
    Sample sample(channel, size >= largeSize);
    sample.EnterAllocator();
    void* const block = call();
    sample.LeaveAllocator();
    RecordAllocated(channel, block, size, site);
    if (channel.by >= By::Caller) { sample.EndWalk(); }
    return block;
}

// Makes the call, which returns a block of `size` bytes or null, and records it.
template <typename Call>
inline __attribute__((always_inline)) void* Allocate(std::size_t size, const CallSite& site,
                                                     Call call) {
    Channel* const channel = OpenChannel();
    if (channel == nullptr) { return call(); }
    if (size >= largeSize || IsSampled()) { return AllocateTimed(*channel, size, site, call); }
    void* const block = call();
    RecordAllocated(*channel, block, size, site);
    return block;
}

__attribute__((noinline)) void FreeTimed(Channel& channel, void* block, bool isLarge) {
    Sample sample(channel, isLarge);
    Put(channel, Op::Released, block, 0, 0);
    sample.EnterAllocator();
    next.Free(block);
    sample.LeaveAllocator();
}

// Moves a block of the early memory to the heap.
void* MoveEarly(void* block, std::size_t size, const CallSite& site) {
    void* const moved = Allocate(size, site, [=] { return next.Malloc(size); });
    const std::size_t earlySize = EarlySize(block);
    if (moved != nullptr) { std::memcpy(moved, block, size < earlySize ? size : earlySize); }
    return moved;
}

void* Reallocate(void* block, std::size_t size, const CallSite& site) {
    if (!IsReady()) {
        void* const moved = EarlyAllocate(size);
        if (block == nullptr || moved == nullptr) { return moved; }
        const std::size_t oldSize = EarlySize(block);
        return std::memcpy(moved, block, size < oldSize ? size : oldSize);
    }
    if (block == nullptr) {
        return Allocate(size, site, [=] { return next.Realloc(nullptr, size); });
    }
    if (IsEarly(block)) { return MoveEarly(block, size, site); }
    Channel* const channel = OpenChannel();
    if (channel == nullptr) { return next.Realloc(block, size); }
    Put(*channel, Op::Released, block, 0, 0);
    void* const moved = Allocate(size, site, [=] { return next.Realloc(block, size); });
    // A failure leaves the block in its place. Its requested size is unknown.
    if (moved == nullptr && size != 0) {
        RecordAllocated(*channel, block, next.UsableSize(block), site);
    }
    return moved;
}

}  // namespace

// AddressSanitizer reads these default options. Without them it refuses to run after another
// preloaded library.
RECORDER_API const char* SanitizerOptions() asm("__asan_default_options");
const char* SanitizerOptions() {
    return "verify_asan_link_order=0";
}

RECORDER_API void* malloc(std::size_t size) noexcept {
    if (!IsReady()) { return EarlyAllocate(size); }
    return Allocate(size, CALL_SITE, [=] { return next.Malloc(size); });
}

RECORDER_API void* calloc(std::size_t number, std::size_t size) noexcept {
    std::size_t whole = 0;
    const bool isTooLarge = __builtin_mul_overflow(number, size, &whole);
    if (!IsReady()) { return EarlyAllocate(isTooLarge ? sizeof(earlyMemory) + 1 : whole); }
    return Allocate(whole, CALL_SITE, [=] { return next.Calloc(number, size); });
}

RECORDER_API void* realloc(void* block, std::size_t size) noexcept {
    return Reallocate(block, size, CALL_SITE);
}

RECORDER_API void* reallocarray(void* block, std::size_t number, std::size_t size) noexcept {
    std::size_t whole = 0;
    if (__builtin_mul_overflow(number, size, &whole)) {
        errno = ENOMEM;
        return nullptr;
    }
    return Reallocate(block, whole, CALL_SITE);
}

RECORDER_API void free(void* block) noexcept {
    if (block == nullptr || IsEarly(block) || !IsReady()) { return; }
    Channel* const channel = OpenChannel();
    if (channel == nullptr) { return next.Free(block); }
    const bool isLarge = next.UsableSize(block) >= largeSize;
    if (isLarge || IsSampled()) { return FreeTimed(*channel, block, isLarge); }
    Put(*channel, Op::Released, block, 0, 0);
    next.Free(block);
}

RECORDER_API void* memalign(std::size_t alignment, std::size_t size) noexcept {
    if (!IsReady()) { return EarlyAllocate(size, alignment); }
    return Allocate(size, CALL_SITE, [=] { return next.Memalign(alignment, size); });
}

RECORDER_API void* aligned_alloc(std::size_t alignment, std::size_t size) noexcept {
    if (!IsReady()) { return EarlyAllocate(size, alignment); }
    return Allocate(size, CALL_SITE, [=] { return next.AlignedAlloc(alignment, size); });
}

RECORDER_API int posix_memalign(void** place, std::size_t alignment, std::size_t size) noexcept {
    int error = 0;
    const auto call = [&]() -> void* {
        void* block = nullptr;
        error = next.PosixMemalign(&block, alignment, size);
        return error == 0 ? block : nullptr;
    };
    void* const block =
        IsReady() ? Allocate(size, CALL_SITE, call) : EarlyAllocate(size, alignment);
    if (block == nullptr && error == 0 && !IsReady()) { return ENOMEM; }
    if (error == 0) { *place = block; }
    return error;
}

RECORDER_API void* valloc(std::size_t size) noexcept {
    if (!IsReady()) { return EarlyAllocate(size, 4096); }
    return Allocate(size, CALL_SITE, [=] { return next.Valloc(size); });
}

RECORDER_API void* pvalloc(std::size_t size) noexcept {
    if (!IsReady()) { return EarlyAllocate(size, 4096); }
    return Allocate(size, CALL_SITE, [=] { return next.Pvalloc(size); });
}

RECORDER_API std::size_t malloc_usable_size(void* block) noexcept {
    if (block == nullptr || !IsReady()) { return 0; }
    return IsEarly(block) ? EarlySize(block) : next.UsableSize(block);
}

}  // namespace Recorder
