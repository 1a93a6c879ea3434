// Follows the events of a trace and finds the pool and the block of each. A *step* is an event that
// has them as indices, since other pools and blocks may reuse an address. An event that makes no
// sense after the earlier ones is a *fault*, and changes nothing.

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
    std::uint32_t index;  // Below NumBlocks; reused after the block is freed.
    std::uint32_t size;   // Requested bytes.
};

struct Step {
    Kind kind;
    std::uint32_t pool;  // Index into Pools.
    Block block;
};

struct Pool {
    std::string address;  // As in the trace.
    std::string name;     // Empty if the trace has none.
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
    // Sets `step`, or returns why there is none. Only the kind of an Info or a Time is set.
    std::optional<Fault> Resolve(const Event& event, Step& step);

    // The blocks that the last step, a Cleared or a Destroyed, has dropped, sorted by index, which
    // is roughly the order of their allocation.
    const std::vector<Block>& Dropped() const { return dropped; }

    // Ends one of the live pools as if the trace destroyed it; Dropped has its blocks. False if
    // none is left.
    bool EndPool();

    const std::vector<Pool>& Pools() const { return pools; }  // All ever created.
    std::uint32_t NumBlocks() const { return numBlocks; }     // The most alive at any time.

private:
    struct LivePool {
        std::uint32_t index;
        std::unordered_map<std::uint64_t, Block> blocks;  // By address.
    };

    std::optional<Fault> Create(std::uint64_t address, Step& step);
    std::optional<Fault> Allocate(LivePool& pool, const Event& event, Step& step);
    std::optional<Fault> Free(LivePool& pool, std::uint64_t address, Step& step);
    void DropAll(LivePool& pool);

    std::vector<Pool> pools;
    std::unordered_map<std::uint64_t, LivePool> livePools;  // By address.
    std::vector<std::uint32_t> freeIndices;
    std::vector<Block> dropped;
    std::uint32_t numBlocks = 0;
};

}  // namespace Trace

#endif
