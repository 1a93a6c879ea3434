// The replaced operators. Their own table of blocks lives on malloc and is never destroyed, since
// blocks are released until the very end of the program.

#include "HeapSpy.hpp"

#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <functional>
#include <unordered_map>
#include <utility>

namespace HeapSpy {

Block lastRequest = {};
Block lastRelease = {};
std::array<std::uint8_t, 48> releasedHead = {};
std::size_t numRequests = 0;
std::size_t numReleases = 0;
std::size_t numLive = 0;
std::size_t numMisfits = 0;
std::size_t refuseIn = 0;

namespace {

template <typename T>
struct MallocAllocator {
    using value_type = T;
    MallocAllocator() = default;
    template <typename Other>
    MallocAllocator(const MallocAllocator<Other>&) {}
    T* allocate(std::size_t n) { return static_cast<T*>(std::malloc(n * sizeof(T))); }
    void deallocate(T* block, std::size_t) { std::free(block); }
    bool operator==(const MallocAllocator&) const { return true; }
    bool operator!=(const MallocAllocator&) const { return false; }
};

using Table = std::unordered_map<const void*, Block, std::hash<const void*>, std::equal_to<>,
                                 MallocAllocator<std::pair<const void* const, Block>>>;

Table& Living() {
    static Table& table = *new (std::malloc(sizeof(Table))) Table;
    return table;
}

void* Request(std::size_t size, Form form) {
    ++numRequests;
    lastRequest = {nullptr, size, form};
    if (refuseIn != 0 && --refuseIn == 0) { throw std::bad_alloc(); }
    void* const start = std::malloc(size);
    if (start == nullptr) { throw std::bad_alloc(); }
    std::memset(start, freshByte, size);
    lastRequest.start = start;
    Living().emplace(start, lastRequest);
    ++numLive;
    return start;
}

void Release(void* start, Form form) {
    if (start == nullptr) { return; }
    const auto entry = Living().find(start);
    if (entry == Living().end()) {
        ++numMisfits;
        return;
    }
    ++numReleases;
    --numLive;
    lastRelease = entry->second;
    if (form != lastRelease.form) { ++numMisfits; }
    Living().erase(entry);
    std::memcpy(releasedHead.data(), start, std::min(releasedHead.size(), lastRelease.size));
    std::memset(start, releasedByte, lastRelease.size);
    std::free(start);
}

}  // namespace

const Block* Find(const void* start) {
    const auto entry = Living().find(start);
    return entry == Living().end() ? nullptr : &entry->second;
}

}  // namespace HeapSpy

void* operator new(std::size_t size) {
    return HeapSpy::Request(size, HeapSpy::Form::single);
}
void* operator new[](std::size_t size) {
    return HeapSpy::Request(size, HeapSpy::Form::array);
}
void operator delete(void* block) noexcept {
    HeapSpy::Release(block, HeapSpy::Form::single);
}
void operator delete(void* block, std::size_t) noexcept {
    HeapSpy::Release(block, HeapSpy::Form::single);
}
void operator delete[](void* block) noexcept {
    HeapSpy::Release(block, HeapSpy::Form::array);
}
void operator delete[](void* block, std::size_t) noexcept {
    HeapSpy::Release(block, HeapSpy::Form::array);
}
