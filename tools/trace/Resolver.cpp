// Which pools and blocks are alive, by address.

#include "trace/Resolver.hpp"

#include <algorithm>

#include "trace/TextWriter.hpp"

namespace Trace {

namespace {

constexpr std::uint64_t maxBlockSize = 0x3FFFFFFF;  // Of any pool.

}  // namespace

std::optional<Fault> Resolver::Resolve(const Event& event, Step& step) {
    step = {event.kind, 0, {}};
    if (event.kind == Kind::Malformed) { return Fault::Malformed; }
    if (event.kind == Kind::Info || event.kind == Kind::Time) { return std::nullopt; }
    if (event.kind == Kind::Created) { return Create(event.pool, step); }

    const auto found = livePools.find(event.pool);
    if (found == livePools.end()) { return Fault::UnknownPool; }
    LivePool& pool = found->second;
    step.pool = pool.index;
    switch (event.kind) {
        case Kind::Allocated:
            return Allocate(pool, event, step);
        case Kind::Freed:
            return Free(pool, event.block, step);
        case Kind::Cleared:
            DropAll(pool);
            break;
        case Kind::Destroyed:
            DropAll(pool);
            livePools.erase(found);
            break;
        case Kind::Named:
            pools[pool.index].name = event.text;
            break;
        case Kind::Created:
        case Kind::Info:
        case Kind::Time:
        case Kind::Malformed:
            break;  // Handled above.
    }
    return std::nullopt;
}

bool Resolver::EndPool() {
    if (livePools.empty()) { return false; }
    DropAll(livePools.begin()->second);
    livePools.erase(livePools.begin());
    return true;
}

std::optional<Fault> Resolver::Create(std::uint64_t address, Step& step) {
    step.pool = static_cast<std::uint32_t>(pools.size());
    if (!livePools.try_emplace(address, LivePool{step.pool, {}}).second) {
        return Fault::PoolTwice;
    }
    AppendAddress(pools.emplace_back().address, address);
    return std::nullopt;
}

std::optional<Fault> Resolver::Allocate(LivePool& pool, const Event& event, Step& step) {
    if (event.size > maxBlockSize) { return Fault::TooLarge; }
    const auto [place, isNew] = pool.blocks.try_emplace(event.block);
    if (!isNew) { return Fault::BlockTwice; }
    std::uint32_t index = 0;
    if (freeIndices.empty()) {
        index = numBlocks++;
    } else {
        index = freeIndices.back();
        freeIndices.pop_back();
    }
    step.block = place->second = {index, static_cast<std::uint32_t>(event.size)};
    return std::nullopt;
}

std::optional<Fault> Resolver::Free(LivePool& pool, std::uint64_t address, Step& step) {
    const auto place = pool.blocks.find(address);
    if (place == pool.blocks.end()) { return Fault::NotAllocated; }
    step.block = place->second;
    freeIndices.push_back(step.block.index);
    pool.blocks.erase(place);
    return std::nullopt;
}

void Resolver::DropAll(LivePool& pool) {
    dropped.clear();
    for (const auto& [address, block] : pool.blocks) { dropped.push_back(block); }
    std::sort(dropped.begin(), dropped.end(),
              [](const Block& a, const Block& b) { return a.index < b.index; });
    for (const Block& block : dropped) { freeIndices.push_back(block.index); }
    pool.blocks.clear();
}

}  // namespace Trace
