// The calls of OBR::MemPool::Mgr of a program that uses the shared library. Each is passed on to
// the library and recorded. The functions have the names of the library's exports.
//
// Only one thread at a time uses a pool, so a call is recorded after it is done. Only the end of a
// pool is recorded before, since another pool may then be built at its address.

#include <dlfcn.h>

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <cstring>

#include "record/Recorder.hpp"

#define MGR(name) asm("_ZN3OBR7MemPool3Mgr" name)
#define MGR_CONST(name) "_ZNK3OBR7MemPool3Mgr" name

namespace Recorder {

namespace {

constexpr const char* library = POOLS_LIBRARY;

// An export of the library. If it is not the next symbol, a plugin that was loaded with RTLD_LOCAL
// has loaded the library.
template <typename Function>
Function* LookUp(const char* name) {
    void* address = dlsym(RTLD_NEXT, name);
    if (address == nullptr) {
        void* const handle = dlopen(library, RTLD_LAZY | RTLD_NOLOAD);
        if (handle != nullptr) { address = dlsym(handle, name); }
    }
    Function* function = nullptr;
    std::memcpy(&function, &address, sizeof(function));
    return function;
}

const void* PoolOf(const void* mgr) {
    static auto* const next = LookUp<const void*(const void*)>(MGR_CONST("12GetBucketMgrEv"));
    return next(mgr);
}
const char* NameOf(const void* mgr) {
    static auto* const next = LookUp<const char*(const void*)>(MGR_CONST("7GetNameEv"));
    return next(mgr);
}
bool IsEnabled(const void* mgr) {
    static auto* const next = LookUp<bool(const void*)>(MGR_CONST("9IsEnabledEv"));
    return next(mgr);
}

// Puts an event with a block. The second slot is filled first.
void PutBlock(Channel& channel, Op op, const void* mgr, const void* block, std::uint64_t size) {
    std::uint64_t index = 0;
    if (!Take(channel, 2, index)) { return; }
    Fill(channel, index + 1, Where(channel, block), What(Op::Data, size, 0));
    Fill(channel, index, Where(channel, PoolOf(mgr)), What(op, 0, 0));
}

void PutName(Channel& channel, const void* mgr) {
    constexpr std::size_t longest = 4096;
    const char* const name = NameOf(mgr);
    const std::size_t size = strnlen(name, longest);
    std::uint64_t part = 0;
    std::uint64_t index = 0;
    const std::size_t numParts = (size + sizeof(part) - 1) / sizeof(part);
    if (!Take(channel, 1 + numParts, index)) { return; }
    for (std::size_t number = 0; number != numParts; ++number) {
        const std::size_t offset = number * sizeof(part);
        const std::size_t rest = size - offset;
        std::memcpy(&part, name + offset, rest < sizeof(part) ? rest : sizeof(part));
        Fill(channel, index + 1 + number, part, What(Op::Data, 0, 0));
    }
    Fill(channel, index, Where(channel, PoolOf(mgr)), What(Op::PoolNamed, size, 0));
}

// A function of the library, looked up at the first call.
template <typename Function>
class Next {
public:
    explicit constexpr Next(const char* exportName) : name(exportName) {}
    Function* operator*() {
        Function* found = function.load(std::memory_order_relaxed);
        if (__builtin_expect(found == nullptr, 0)) {
            found = LookUp<Function>(name);
            function.store(found, std::memory_order_relaxed);
        }
        return found;
    }

private:
    const char* const name;
    std::atomic<Function*> function = nullptr;
};

Next<void(void*, const char*)> nextConstruct("_ZN3OBR7MemPool3MgrC1EPKc");
Next<void(void*)> nextDestroy("_ZN3OBR7MemPool3MgrD1Ev");
Next<void*(void*, unsigned int)> nextAlloc("_ZN3OBR7MemPool3Mgr5AllocEj");
Next<bool(void*, void*)> nextFree("_ZN3OBR7MemPool3Mgr4FreeEPv");
Next<void(void*)> nextClear("_ZN3OBR7MemPool3Mgr5ClearEv");

// Makes the call, and times it if it is sampled.
template <typename Call>
inline __attribute__((always_inline)) auto Timed(Channel& channel, Call call) {
    if (!IsSampled()) { return call(); }
    Sample sample(channel, false);
    sample.EnterAllocator();
    const auto result = call();
    sample.LeaveAllocator();
    return result;
}

}  // namespace

RECORDER_API void Construct(void* mgr, const char* name) MGR("C1EPKc");
RECORDER_API void ConstructBase(void* mgr, const char* name) MGR("C2EPKc");
RECORDER_API void Destroy(void* mgr) MGR("D1Ev");
RECORDER_API void DestroyBase(void* mgr) MGR("D2Ev");
RECORDER_API void* Alloc(void* mgr, unsigned int size) MGR("5AllocEj");
RECORDER_API bool Free(void* mgr, void* block) MGR("4FreeEPv");
RECORDER_API void Clear(void* mgr) MGR("5ClearEv");

void Construct(void* mgr, const char* name) {
    (*nextConstruct)(mgr, name);
    if (Channel* const channel = OpenChannel()) {
        Put(*channel, Op::PoolCreated, PoolOf(mgr), 0, 0);
        PutName(*channel, mgr);
    }
}
void ConstructBase(void* mgr, const char* name) {
    Construct(mgr, name);
}

void Destroy(void* mgr) {
    Channel* const channel = OpenChannel();
    const void* const pool = PoolOf(mgr);
    if (channel != nullptr && pool != nullptr) { Put(*channel, Op::PoolDestroyed, pool, 0, 0); }
    (*nextDestroy)(mgr);
}
void DestroyBase(void* mgr) {
    Destroy(mgr);
}

void* Alloc(void* mgr, unsigned int size) {
    Channel* const channel = OpenChannel();
    if (channel == nullptr) { return (*nextAlloc)(mgr, size); }
    void* const block = Timed(*channel, [=] { return (*nextAlloc)(mgr, size); });
    PutBlock(*channel, Op::PoolAllocated, mgr, block, size);
    return block;
}

bool Free(void* mgr, void* block) {
    Channel* const channel = OpenChannel();
    if (channel == nullptr) { return (*nextFree)(mgr, block); }
    const bool isFreed = Timed(*channel, [=] { return (*nextFree)(mgr, block); });
    if (isFreed) { PutBlock(*channel, Op::PoolFreed, mgr, block, 0); }
    return isFreed;
}

void Clear(void* mgr) {
    (*nextClear)(mgr);
    Channel* const channel = OpenChannel();
    if (channel == nullptr || !IsEnabled(mgr)) { return; }
    Put(*channel, Op::PoolCleared, PoolOf(mgr), 0, 0);
}

}  // namespace Recorder
