// The steps of a block's life, watched: a release that the pool cannot take is refused, a header is
// compared with what the library left there before the pool goes by it, and what is found is told
// on standard error, a line each.
//
// Pools of several threads share the notes on the blocks, so that these are locked. A host's own
// code can run meanwhile, in the stream that a trace is written to, and may ask the pool.

#include <cstdio>
#include <cstdlib>
#include <map>
#include <mutex>
#include <string>
#include <utility>

#include "HostLayer/HostEnv.hpp"
#include "MemPool/Checked.hpp"
#include "diagnostics/checked/Blocks.hpp"
#include "diagnostics/checked/Checkers.hpp"
#include "diagnostics/checked/EndStatus.hpp"
#include "diagnostics/text/Text.hpp"
#include "diagnostics/text/Trace.hpp"

namespace OBR::MemPool::Checked {

namespace {

// What a used record's guard is here. The pool leaves that byte alone.
constexpr std::uint8_t usedGuard = 0xCC;

std::recursive_mutex mutex;
using Lock = std::lock_guard<std::recursive_mutex>;

// Never destroyed: a host may destroy a pool after the library's exit step.
Blocks& blocks = *new Blocks;

// Whether that step has told what lives.
bool hasToldAtExit = false;

void Tell(const BucketMgr& pool, const std::string& what) {
    const std::string line = "mempool: pool " + pool.name + ": " + what + "\n";
    std::fputs(line.c_str(), stderr);
    std::fflush(stderr);
    EndStatus::NoteFault();
}

// The names of the fields of a header that differ from what they must be, the first ones first.
std::string DamagedFields(const Block& block, const unsigned char* start) {
    static constexpr std::pair<std::size_t, const char*> bucketFields[] = {
        {0, "parent"}, {8, "next1"},    {16, "prev1"},    {24, "next2"},   {32, "prev2"},
        {40, "size"},  {42, "recSize"}, {44, "freeHead"}, {46, "numFree"}, {48, "link"},
        {50, "type"},  {51, "guard"},   {52, nullptr}};
    static constexpr std::pair<std::size_t, const char*> heapRecordFields[] = {
        {0, "next"},  {8, "prev"},   {16, "length"}, {20, "link"},
        {22, "type"}, {23, "guard"}, {24, nullptr}};
    std::string names;
    for (const auto* field = block.IsHeapRecord() ? heapRecordFields : bucketFields;
         field->second != nullptr; ++field) {
        const std::size_t length = (field + 1)->first - field->first;
        if (std::memcmp(start + field->first, &block.head[field->first], length) != 0) {
            names += std::string(names.empty() ? "" : ", ") + field->second;
        }
    }
    return names;
}

void TellDamage(const Block& block, const char* data, const unsigned char* start) {
    std::size_t last = block.layout->size;
    while (start[last - 1] == block.head[last - 1]) { --last; }
    const std::size_t distance = block.layout->size - (last - 1);
    const std::string record = PtrText(data - sizeof(RecHdr));
    const std::string place = block.IsHeapRecord()
                                  ? "heap record " + PtrText(start)
                                  : "bucket " + PtrText(start) + ", record " + record;
    Tell(*block.pool, place + ": the header is damaged up to " + std::to_string(distance) +
                          (distance == 1 ? " byte" : " bytes") + " ahead of the data (" +
                          DamagedFields(block, start) + ")");
    Checkers::TellStack();
    Checkers::TellHistory(data);
}

// Tells a damaged header, and mends it.
void Verify(const Block& block, const char* data) {
    char* const start = const_cast<char*>(data) - block.layout->size;
    Checkers::Unpoison(start, block.layout->size);
    if (std::memcmp(start, block.head.data(), block.layout->size) != 0) {
        TellDamage(block, data, reinterpret_cast<const unsigned char*>(start));
        std::memcpy(start, block.head.data(), block.layout->size);
    }
    Checkers::Poison(start, block.layout->size);
}

void VerifyNeighbour(const Block& block, std::size_t link) {
    const char* const data = block.Neighbour(link);
    if (const Block* const neighbour = blocks.Find(data)) { Verify(*neighbour, data); }
}

// Moves a block to the freed ones; its header is the heap's again.
void Release(const Block& block, const char* data) {
    Checkers::Unpoison(data - block.layout->size, block.layout->size);
    blocks.Release(data);
}

// visit(block, its data) for the living blocks of a pool. It may release the block.
template <typename Visit>
void ForEachBlock(const BucketMgr& pool, Visit visit) {
    const auto walk = [&](const void* first, const Layout& layout) {
        const char* data =
            first == nullptr ? nullptr : static_cast<const char*>(first) + layout.size;
        while (const Block* const block = blocks.Find(data)) {
            const char* const next = block->Neighbour(layout.next);
            visit(*block, data);
            data = next;
        }
    };
    walk(pool.extRecs, heapRecordLayout);
    for (std::uint32_t index = 0; index < pool.numGroups; ++index) {
        if (pool.groups[index] != nullptr) { walk(pool.groups[index]->head, bucketLayout); }
    }
}

// Tells what was never freed, and where the first of it was taken. A heap record of no bytes is the
// pool's own to release, and no fault of the host's.
void TellLiving(const BucketMgr& pool) {
    constexpr std::size_t maxHistories = 3;
    const char* histories[maxHistories] = {};
    std::size_t count = 0;
    std::size_t bytes = 0;
    ForEachBlock(pool, [&](const Block& block, const char* data) {
        if (block.IsHeapRecord() && block.size == 0) { return; }
        if (count < maxHistories) { histories[count] = data; }
        ++count;
        bytes += block.size;
    });
    if (count == 0) { return; }
    Tell(pool, std::to_string(count) + (count == 1 ? " block, " : " blocks, ") +
                   std::to_string(bytes) + " bytes never freed");
    for (const char* const data : histories) {
        if (data != nullptr) { Checkers::TellHistory(data); }
    }
}

// Tells why a release is refused. Returns false.
bool Refuse(const BucketMgr& pool, const void* data) {
    Trace::BlockFreed(&pool, data);
    const std::string address = PtrText(data);
    const char* const known = blocks.Around(data);
    if (const Block* const block = blocks.Find(data)) {
        Tell(pool, address + (block->pool != &pool ? " is a block of pool " + block->pool->name
                                                   : " has no bytes, and goes with Clear"));
    } else if (known == data) {
        Tell(pool, address + " is freed already");
    } else {
        Tell(pool, address + " is no block of a pool");
    }
    if (known != nullptr && known != data) {
        Tell(pool, address + " lies " + std::to_string(static_cast<const char*>(data) - known) +
                       " bytes into the block at " + PtrText(known));
    }
    Checkers::TellStack();
    if (known != nullptr) { Checkers::TellHistory(known); }

    const char* const aborts = Host_Env::GetEnv("MEMPOOL_ABORT");
    if (aborts != nullptr && std::string(aborts) == "1") { std::abort(); }
    return false;
}

}  // namespace

void* Taken(BucketMgr& pool, void* data, std::uint32_t size) {
    if (!pool.enabled) { return data; }
    try {
        const Lock lock(mutex);
        RecHdr* const hdr = RecHdr::Of(data);
        if (hdr->type == typeUsed) { hdr->guard = usedGuard; }
        const Block& block = blocks.Add(pool, static_cast<const char*>(data), size);
        Checkers::Poison(static_cast<const char*>(data) - block.layout->size, block.layout->size);
        VerifyNeighbour(block, block.layout->next);
    } catch (...) {
        pool.Free(data);
        throw;
    }
    return data;
}

bool MayAskAbout(const BucketMgr& pool, const void* data) {
    const Lock lock(mutex);
    const Block* const block = blocks.Find(data);
    if (block == nullptr || (block->pool != &pool && !block->IsHeapRecord())) { return false; }
    Verify(*block, static_cast<const char*>(data));
    return true;
}

bool MayRelease(BucketMgr& pool, void* data) {
    if (data == nullptr) { return false; }
    const Lock lock(mutex);
    const Block* const block = blocks.Find(data);
    if (!pool.enabled && block == nullptr) { return true; }
    if (block == nullptr || block->pool != &pool) { return Refuse(pool, data); }
    if (block->IsHeapRecord() && block->size == 0) { return Refuse(pool, data); }

    const char* const place = static_cast<const char*>(data);
    Verify(*block, place);
    VerifyNeighbour(*block, block->layout->next);
    VerifyNeighbour(*block, block->layout->prev);
    blocks.Unlink(*block);
    Release(*block, place);
    return true;
}

void BeforeClear(const BucketMgr& pool) {
    const Lock lock(mutex);
    ForEachBlock(pool, [](const Block& block, const char* data) { Verify(block, data); });
    ForEachBlock(pool, [](const Block& block, const char* data) { Release(block, data); });
}

void BeforeEnd(const BucketMgr& pool) {
    {
        const Lock lock(mutex);
        if (!hasToldAtExit) { TellLiving(pool); }
    }
    BeforeClear(pool);
}

void AtExit() {
    const Lock lock(mutex);
    std::map<std::string, const BucketMgr*> pools;
    for (const auto& [data, block] : blocks.Living()) { pools[block.pool->name] = block.pool; }
    for (const auto& [name, pool] : pools) { TellLiving(*pool); }
    hasToldAtExit = true;
}

}  // namespace OBR::MemPool::Checked
