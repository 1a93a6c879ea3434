// The replaced operators, which keep a header of their own before each block.

#include "HeapSpy.hpp"

#include <algorithm>
#include <cstdlib>
#include <cstring>

namespace HeapSpy {

std::size_t lastRequest = 0;
const void* lastRelease = nullptr;
std::array<std::uint8_t, 48> releasedHead = {};
std::size_t numLive = 0;
std::size_t arrayBytes = 0;
std::size_t numMisfits = 0;
std::size_t refuseIn = 0;
bool refusesForGood = false;

namespace {

constexpr std::uint8_t releasedByte = 0xD7;

enum class Form : std::size_t { single = 0x51461E51461E51, array = 0xA88A1A88A1A8 };

struct alignas(std::max_align_t) Header {
    std::size_t size;
    Form form;
};

void* Request(std::size_t size, Form form) {
    lastRequest = size;
    if (refuseIn != 0 && --refuseIn == 0) {
        if (refusesForGood) { refuseIn = 1; }
        throw std::bad_alloc();
    }
    auto* const header = static_cast<Header*>(std::malloc(sizeof(Header) + size));
    if (header == nullptr) { throw std::bad_alloc(); }
    *header = {size, form};
    ++numLive;
    if (form == Form::array) { arrayBytes += size; }
    return std::memset(header + 1, freshByte, size);
}

void Release(void* start, Form form) {
    if (start == nullptr) { return; }
    Header* const header = static_cast<Header*>(start) - 1;
    if (header->form != form) {
        ++numMisfits;
        return;
    }
    --numLive;
    if (form == Form::array) { arrayBytes -= header->size; }
    lastRelease = start;
    std::memcpy(releasedHead.data(), start, std::min(releasedHead.size(), header->size));
    std::memset(header, releasedByte, sizeof(Header) + header->size);
    std::free(header);
}

}  // namespace

bool IsArray(const void* start, std::size_t size) {
    const Header* const header = static_cast<const Header*>(start) - 1;
    return header->form == Form::array && header->size == size;
}

}  // namespace HeapSpy

void* operator new(std::size_t size) {
    return HeapSpy::Request(size, HeapSpy::Form::single);
}
void* operator new[](std::size_t size) {
    return HeapSpy::Request(size, HeapSpy::Form::array);
}
// A sanitizer has one of its own, with blocks that are not ours. std::stable_sort calls it.
void* operator new(std::size_t size, const std::nothrow_t&) noexcept {
    try {
        return operator new(size);
    } catch (const std::bad_alloc&) { return nullptr; }
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
