// The two sides of a replay: PoolSide carries the steps of a recording out through one Mgr a traced
// pool, HeapSide through operator new[] and delete[]. What a side still holds, its destructor gives
// back. `untimed` is time that no step is charged with, in nanoseconds.

#ifndef OBR_TOOLS_REPLAY_SIDES_HPP
#define OBR_TOOLS_REPLAY_SIDES_HPP

#include <cstddef>
#include <cstdint>
#include <optional>
#include <utility>
#include <vector>

#include <MemPool>

#include "replay/Clock.hpp"
#include "replay/Recording.hpp"

namespace Replay {

class PoolSide {
public:
    explicit PoolSide(const Recording& recording)
        : pools(recording.pools), mgrs(recording.pools.size()), blocks(recording.numBlocks) {}

    void Create(const Trace::Step& step) {
        mgrs[step.pool].emplace(pools[step.pool].address.c_str());
    }
    void Allocate(const Trace::Step& step) {
        blocks[step.block.index] = mgrs[step.pool]->Alloc(step.block.size);
    }
    void Free(const Trace::Step& step) { mgrs[step.pool]->Free(blocks[step.block.index]); }
    void Clear(const Trace::Step& step) { mgrs[step.pool]->Clear(); }
    void Destroy(const Trace::Step& step) { mgrs[step.pool].reset(); }

    static constexpr double untimed = 0;

private:
    const std::vector<Trace::Pool>& pools;
    std::vector<std::optional<OBR::MemPool::Mgr>> mgrs;
    std::vector<void*> blocks;
};

// Where a pool drops its blocks at once, the heap frees them one by one, so that it holds no more
// than the pool does. What a program clears it would have to free otherwise: that is charged. What
// it leaves to the end of a pool it never asks for: that is not.
class HeapSide {
public:
    explicit HeapSide(const Recording& recording)
        : dropped(recording.dropped), blocks(recording.numBlocks) {}
    HeapSide(const HeapSide&) = delete;
    HeapSide& operator=(const HeapSide&) = delete;
    ~HeapSide() {
        for (void* block : blocks) { ::operator delete[](block); }
    }

    void Create(const Trace::Step&) {}
    void Allocate(const Trace::Step& step) {
        blocks[step.block.index] = ::operator new[](step.block.size);
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
    void FreeAt(std::uint32_t index) { ::operator delete[](std::exchange(blocks[index], nullptr)); }

    const std::vector<std::uint32_t>& dropped;
    std::vector<void*> blocks;
};

// Carries the first `numSteps` steps out.
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
                break;  // In no recording.
        }
    }
}

}  // namespace Replay

#endif
