// Follows the events of a trace and tells which pool and which block each is about: a *step*, with
// the pool and the block as indices in place of addresses, which come again for others. What makes
// no sense after the events before it is a *fault*, and changes nothing.

#ifndef OBR_TOOLS_TRACE_RESOLVER_HPP
#define OBR_TOOLS_TRACE_RESOLVER_HPP

#include <array>
#include <cstdint>
#include <optional>
#include <string>
#include <unordered_map>
#include <vector>

#include "trace/Event.hpp"

namespace Trace {

struct Block {
    std::uint32_t index;  // Below NumBlocks, given anew once the block is gone.
    std::uint32_t size;   // Bytes asked for.
};

struct Step {
    Kind kind;
    std::uint32_t pool;  // Index into Pools.
    Block block;
};

struct Pool {
    std::string address;  // As the trace shows it.
    std::string name;     // What the trace calls it, empty if it does not.
};

enum class Fault : std::uint8_t {
    Malformed,
    TooLarge,
    UnknownPool,
    PoolTwice,
    NotAllocated,
    BlockTwice
};
inline constexpr std::array faultNames = {
    "truncated or malformed", "size above 1073741823",          "unknown pool",
    "pool created twice",     "free of what was not allocated", "pointer allocated twice",
};

class Resolver {
public:
    // Fills `step`, or tells why there is none. That of an Info has a kind and nothing else.
    std::optional<Fault> Resolve(const Event& event, Step& step);

    // The blocks that went with the last step, a Cleared or a Destroyed, in the order of their
    // indices, which is about that of the allocations.
    const std::vector<Block>& Dropped() const { return dropped; }

    // Ends the pools that still live, one a call, as if the trace destroyed them: Dropped tells
    // their blocks. False once none is left.
    bool EndPool();

    const std::vector<Pool>& Pools() const { return pools; }  // Each one ever created.
    std::uint32_t NumBlocks() const { return numBlocks; }     // Most blocks alive at a time.

private:
    struct LivePool {
        std::uint32_t index;
        std::unordered_map<std::uint64_t, Block> blocks;  // By their addresses.
    };

    std::optional<Fault> Create(std::uint64_t address, Step& step);
    std::optional<Fault> Allocate(LivePool& pool, const Event& event, Step& step);
    std::optional<Fault> Free(LivePool& pool, std::uint64_t address, Step& step);
    void DropAll(LivePool& pool);

    std::vector<Pool> pools;
    std::unordered_map<std::uint64_t, LivePool> livePools;  // By their addresses.
    std::vector<std::uint32_t> freeIndices;
    std::vector<Block> dropped;
    std::uint32_t numBlocks = 0;
};

}  // namespace Trace

#endif
