// The sides of a replay, which execute the steps of a recording: pools that drop their blocks at
// once, and pools whose blocks are freed one by one, such as the C library's heap. The destructor
// of a side frees what is left. `untimed` is the time, in nanoseconds, that does not count.

#ifndef OBR_TOOLS_REPLAY_SIDES_HPP
#define OBR_TOOLS_REPLAY_SIDES_HPP

#include <cstddef>
#include <cstdint>
#include <optional>
#include <utility>
#include <vector>

#include <MemPool>
#include <MemPoolHeap>

#include "replay/Clock.hpp"
#include "replay/Layer.hpp"
#include "replay/MallocHeap.hpp"
#include "replay/Mimalloc.hpp"
#include "replay/Recording.hpp"

namespace Replay {

// These pools have the settings of the process.

class HeapPool {
public:
    explicit HeapPool(const char* name)
        : heap(name, HeapSettingsOf(OBR::MemPool::PoolSettings::OfProcess())) {}

    void* Allocate(std::size_t size) { return heap.Allocate(size); }
    void Free(void* block) { heap.Free(block); }
    void Clear() { heap.FreeAll(); }

private:
    OBR::MemPool::Heap heap;
};

class MgrPool {
public:
    explicit MgrPool(const char* name) : mgr(name) {}

    void* Allocate(unsigned int size) { return mgr.Alloc(size); }
    void Free(void* block) { mgr.Free(block); }
    void Clear() { mgr.Clear(); }

private:
    OBR::MemPool::Mgr mgr;
};

class MallocPool {
public:
    void* Allocate(std::size_t size) {
        return size < heap.Limit() ? heap.Allocate(size) : ::operator new[](size);
    }
    void Free(void* block) {
        OBR::MemPool::Bucket* const bucket = MallocHeap::BucketOf(block);
        if (bucket == nullptr) {
            ::operator delete[](block);
        } else {
            MallocHeap::Free(block, bucket);
        }
    }

private:
    MallocHeap heap{OBR::MemPool::PoolSettings::OfProcess()};
};

class SystemHeap {
public:
    void* Allocate(std::size_t size) { return ::operator new[](size); }
    void Free(void* block) { ::operator delete[](block); }
};

class MimallocHeap {
public:
    void* Allocate(std::size_t size) { return mimalloc.allocate(size); }
    void Free(void* block) { mimalloc.free(block); }

private:
    const Mimalloc mimalloc = Mimalloc::Get();
};

// Has a pool for each one in the recording.
template <typename Pool>
class DroppingSide {
public:
    explicit DroppingSide(const Recording& recording)
        : names(recording.pools), pools(recording.pools.size()), blocks(recording.numBlocks) {}

    void Create(const Trace::Step& step) {
        pools[step.pool].emplace(names[step.pool].address.c_str());
    }
    void Allocate(const Trace::Step& step) {
        blocks[step.block.index] = pools[step.pool]->Allocate(step.block.size);
    }
    void Free(const Trace::Step& step) { pools[step.pool]->Free(blocks[step.block.index]); }
    void Clear(const Trace::Step& step) { pools[step.pool]->Clear(); }
    void Destroy(const Trace::Step& step) { pools[step.pool].reset(); }

    static constexpr double untimed = 0;

private:
    const std::vector<Trace::Pool>& names;
    std::vector<std::optional<Pool>> pools;
    std::vector<void*> blocks;
};

// Has one pool for all. Blocks that a pool of the recording drops at once are freed one by one
// here, so that both hold the same blocks. For a Clear that time counts, since without pools a
// program would have to free these blocks. At the end of a pool it does not: a program need not
// free them.
template <typename Pool>
class FreeingSide {
public:
    explicit FreeingSide(const Recording& recording)
        : dropped(recording.dropped), blocks(recording.numBlocks) {}
    FreeingSide(const FreeingSide&) = delete;
    FreeingSide& operator=(const FreeingSide&) = delete;
    ~FreeingSide() {
        for (void* block : blocks) {
            if (block != nullptr) { pool->Free(block); }
        }
    }

    void Create(const Trace::Step&) {
        if (!pool.has_value()) { pool.emplace(); }
    }
    void Allocate(const Trace::Step& step) {
        blocks[step.block.index] = pool->Allocate(step.block.size);
    }
    void Free(const Trace::Step& step) { FreeAt(step.block.index); }
    void Clear(const Trace::Step& step) {
        for (std::uint32_t i = 0; i < step.block.size; ++i) {
            FreeAt(dropped[step.block.index + i]);
        }
    }
    void Destroy(const Trace::Step& step) {
        const double start = ProcessorNanoseconds();
        Clear(step);
        untimed += ProcessorNanoseconds() - start;
    }

    double untimed = 0;

private:
    void FreeAt(std::uint32_t index) { pool->Free(std::exchange(blocks[index], nullptr)); }

    const std::vector<std::uint32_t>& dropped;
    std::optional<Pool> pool;
    std::vector<void*> blocks;
};

// Executes the first `numSteps` steps.
template <typename Side>
void Run(Side& side, const Recording& recording, std::size_t numSteps) {
    const Trace::Step* step = recording.steps.data();
    for (const Trace::Step* const end = step + numSteps; step != end; ++step) {
        switch (step->kind) {
            case Trace::Kind::Created:
                side.Create(*step);
                break;
            case Trace::Kind::Allocated:
                side.Allocate(*step);
                break;
            case Trace::Kind::Freed:
                side.Free(*step);
                break;
            case Trace::Kind::Cleared:
                side.Clear(*step);
                break;
            case Trace::Kind::Destroyed:
                side.Destroy(*step);
                break;
            case Trace::Kind::Named:
            case Trace::Kind::Info:
            case Trace::Kind::Time:
            case Trace::Kind::Malformed:
                break;  // Not in a recording.
        }
    }
}

}  // namespace Replay

#endif
