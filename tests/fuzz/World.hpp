// A process with pools as a fuzzed input drives it: each operation takes its choices from the
// input, does something to the library and compares the outcome with the accounts.

#ifndef OBR_TESTS_FUZZ_WORLD_HPP
#define OBR_TESTS_FUZZ_WORLD_HPP

#include <MemPoolHeap>

#include <array>
#include <cstddef>
#include <cstdint>
#include <memory>

#include "../HeapSpy.hpp"
#include "Accounts.hpp"
#include "Bytes.hpp"
#include "MemPoolC/Heap.hpp"

namespace Fuzz {

class World {
public:
    explicit World(Bytes& input);
    World(const World&) = delete;
    World& operator=(const World&) = delete;
    ~World();

    // One operation, and a check of what it touched.
    void Step();

private:
    struct Handle {
        std::unique_ptr<OBR::MemPool::Mgr> mgr;
        Account* account = nullptr;  // Null if it has no pool.
    };
    struct HeapPlace {
        std::unique_ptr<obr_heap, decltype(&obr_heap_delete)> owner{nullptr, obr_heap_delete};
        OBR::MemPool::Heap* heap = nullptr;  // The owner's. It takes the calls of C and of C++.
        Account* account = nullptr;
        std::size_t alignment = 8;  // Of blocks without a requested alignment.
        bool canFail = true;        // Large buckets can do without some of their requests.
    };

    // Settings, handles and names: WorldOps.cpp.
    void ChangeSetting();
    void Build(Handle& handle);
    void Destroy(Handle& handle);
    void Assign(Handle& handle, const Handle& other);
    void ReportOn(const OBR::MemPool::Mgr& mgr, const Account& account);
    void CheckRegistry() const;
    const char* Name();
    bool HasPool(const OBR::MemPool::Mgr* handle) const;

    // Blocks of a Mgr: MgrOps.cpp.
    void StepOf(Handle& handle);
    void Alloc(Handle& handle);
    void Free(Handle& handle);
    void AskAboutOthers(Handle& handle);

    // A Heap and its blocks: HeapOps.cpp.
    void Build(HeapPlace& place);
    void Destroy(HeapPlace& place);
    void StepOf(HeapPlace& place);
    void Take(HeapPlace& place);
    void Resize(HeapPlace& place);
    void GiveBack(HeapPlace& place);
    void RefuseForeign(HeapPlace& place);
    void CheckStats(const HeapPlace& place) const;

    // Runs `action`, whose request to the heap is refused if the input says so. False if it was.
    template <typename Action>
    bool Succeeds(Action action, bool canFail = true) {
        // Most inputs have no refusal in most places.
        const std::uint32_t choice = bytes.Byte();
        return !HeapSpy::FailsAt(choice < 224 || !canFail ? SIZE_MAX - 1 : choice % 3, action);
    }
    std::uint32_t Size(const Account& account);
    bool HasRoom() const { return accounts.NumBlocks() < 400; }
    Live::iterator OneBlock(Account& account);

    Bytes& bytes;
    Accounts accounts;
    std::array<Handle, 5> handles;
    std::array<HeapPlace, 2> heaps;
};

}  // namespace Fuzz

#endif
