#include "replay/Mimalloc.hpp"

#include <dlfcn.h>

#include <stdexcept>

namespace Replay {

namespace {

// The beginning of mi_heap_area_t, as mimalloc.h declares it.
struct Area {
    void* blocks;
    std::size_t reserved;
    std::size_t committed;
};
using Visitor = bool(const void* heap, const Area* area, void* block, std::size_t size, void* sum);

template <typename Function>
Function* Find(const char* name) {
    static void* const library = dlopen("libmimalloc.so.2", RTLD_NOW | RTLD_LOCAL);
    void* const function = library == nullptr ? nullptr : dlsym(library, name);
    if (function == nullptr) { throw std::runtime_error("mimalloc is not installed"); }
    return reinterpret_cast<Function*>(function);
}

bool AddArea(const void* /*heap*/, const Area* area, void* /*block*/, std::size_t /*size*/,
             void* sum) {
    *static_cast<std::size_t*>(sum) += area->committed;
    return true;
}

}  // namespace

const Mimalloc& Mimalloc::Get() {
    static const Mimalloc functions = {Find<void*(std::size_t)>("mi_malloc"),
                                       Find<void(void*)>("mi_free")};
    return functions;
}

std::int64_t Mimalloc::BytesHeld() {
    std::size_t sum = 0;
    const void* const heap = Find<const void*()>("mi_heap_get_default")();
    Find<bool(const void*, bool, Visitor*, void*)>("mi_heap_visit_blocks")(heap, false, AddArea,
                                                                           &sum);
    return static_cast<std::int64_t>(sum);
}

}  // namespace Replay
