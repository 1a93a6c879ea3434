// The operators new and delete of this program.

#include "replay/HeapCount.hpp"

#include <malloc.h>

#include <algorithm>
#include <cstddef>
#include <cstdlib>
#include <new>

namespace {

bool counting = false;
std::int64_t heldBytes = 0;

// The bytes of the heap for a block in addition to its usable bytes.
#ifdef __GLIBC__
constexpr std::size_t headerSize = sizeof(std::size_t);
#else
constexpr std::size_t headerSize = 0;
#endif

std::int64_t Taken(void* block) {
    return static_cast<std::int64_t>(malloc_usable_size(block) + headerSize);
}

void* Lend(std::size_t size) {
    void* const block = std::malloc(std::max(size, std::size_t{1}));
    if (block == nullptr) { throw std::bad_alloc(); }
    if (counting) { heldBytes += Taken(block); }
    return block;
}

void* LendOrNull(std::size_t size) noexcept {
    try {
        return Lend(size);
    } catch (const std::bad_alloc&) { return nullptr; }
}

void TakeBack(void* block) noexcept {
    if (counting && block != nullptr) { heldBytes -= Taken(block); }
    std::free(block);
}

}  // namespace

void* operator new(std::size_t size) {
    return Lend(size);
}
void* operator new[](std::size_t size) {
    return Lend(size);
}
// Those of the C++ library may call another malloc, and those of a sanitizer do.
void* operator new(std::size_t size, const std::nothrow_t&) noexcept {
    return LendOrNull(size);
}
void* operator new[](std::size_t size, const std::nothrow_t&) noexcept {
    return LendOrNull(size);
}
void operator delete(void* block) noexcept {
    TakeBack(block);
}
void operator delete[](void* block) noexcept {
    TakeBack(block);
}
void operator delete(void* block, std::size_t) noexcept {
    TakeBack(block);
}
void operator delete[](void* block, std::size_t) noexcept {
    TakeBack(block);
}

namespace HeapCount {

void Start() {
    heldBytes = 0;
    counting = true;
}

std::int64_t Stop() {
    counting = false;
    return heldBytes;
}

}  // namespace HeapCount
