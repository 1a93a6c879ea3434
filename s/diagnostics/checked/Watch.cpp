// Watches the steps of a block's life. A release that the pool cannot carry out is refused. Before
// the pool relies on a header, the header is compared with what the library left there. Each fault
// is a line on standard error.
//
// The notes on the blocks are shared by the pools of all threads and therefore locked. The lock is
// recursive: a trace line can run code of the host's stream, which may use a pool.

#include <algorithm>
#include <cstdlib>
#include <map>
#include <mutex>
#include <string>
#include <vector>

#include "MemPool/Checked.hpp"
#include "diagnostics/checked/Blocks.hpp"
#include "diagnostics/checked/Checkers.hpp"
#include "diagnostics/checked/Fault.hpp"
#include "diagnostics/checked/Variables.hpp"
#include "diagnostics/text/Text.hpp"
#include "diagnostics/text/TraceLine.hpp"

namespace OBR::MemPool::Checked {

namespace {

// The guard of a used record. The pool itself does not use that byte.
constexpr std::uint8_t usedGuard = 0xCC;

std::recursive_mutex mutex;
using Lock = std::lock_guard<std::recursive_mutex>;

// Never destroyed: a host may destroy a pool after the library's exit step.
Blocks& blocks = *new Blocks;

bool hasReportedAtExit = false;  // The living blocks.

std::string Count(std::size_t count, const std::string& unit) {
    return std::to_string(count) + " " + unit + (count == 1 ? "" : "s");
}

// The names of the fields in a header that are not what they must be.
std::string DamagedFields(const Block& block, const unsigned char* start) {
    std::string names;
    for (const Layout::Field& field : block.layout->fields) {
        if (std::memcmp(start + field.offset, &block.header[field.offset], field.size) != 0) {
            names += std::string(names.empty() ? "" : ", ") + field.name;
        }
    }
    return names;
}

void ReportDamage(const Block& block, const char* data, const unsigned char* start) {
    std::size_t last = block.layout->size;
    while (start[last - 1] == block.header[last - 1]) { --last; }
    const std::string place = block.IsHeapRecord() ? "heap record " + PtrText(start)
                                                   : "bucket " + PtrText(start) + ", record " +
                                                         PtrText(data - sizeof(RecHdr));
    Report(*block.pool, place + ": the header is damaged up to " +
                            Count(block.layout->size - (last - 1), "byte") + " before the data (" +
                            DamagedFields(block, start) + ")");
    Checkers::PrintStack();
    Checkers::PrintHistory(data);
}

// Reports and repairs a damaged header.
void Verify(const Block& block, const char* data) {
    char* const start = const_cast<char*>(data) - block.layout->size;
    Checkers::Unpoison(start, block.layout->size);
    if (std::memcmp(start, block.header.data(), block.layout->size) != 0) {
        ReportDamage(block, data, reinterpret_cast<const unsigned char*>(start));
        std::memcpy(start, block.header.data(), block.layout->size);
    }
    Checkers::Poison(start, block.layout->size);
}

void VerifyNeighbour(const Block& block, std::size_t link) {
    const char* const data = block.Neighbour(link);
    if (const Block* const neighbour = blocks.Find(data)) { Verify(*neighbour, data); }
}

// Marks a block as freed. Its header belongs to the heap again.
void Release(Block& block, const char* data) {
    Checkers::Unpoison(data - block.layout->size, block.layout->size);
    Blocks::Release(block);
}

// Calls visit(block, its data) for the living blocks of a pool. It may release the block.
template <typename Visit>
void ForEachBlock(const BucketMgr& pool, Visit visit) {
    const auto walk = [&](const void* first, const Layout& layout) {
        const char* data =
            first == nullptr ? nullptr : static_cast<const char*>(first) + layout.size;
        while (Block* const block = blocks.Find(data)) {
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

// Only Clear releases a heap record of 0 bytes. That it still lives is not the host's fault.
bool HasNoBytes(const Block& block) {
    return block.IsHeapRecord() && block.size == 0;
}

// Reports the blocks that were never freed, and where the first of them were allocated.
void ReportLiving(const BucketMgr& pool) {
    constexpr std::size_t maxHistories = 3;
    std::vector<const char*> living;
    std::size_t bytes = 0;
    ForEachBlock(pool, [&](const Block& block, const char* data) {
        if (HasNoBytes(block)) { return; }
        living.push_back(data);
        bytes += block.size;
    });
    if (living.empty()) { return; }
    Report(pool, Count(living.size(), "block") + ", " + Count(bytes, "byte") + " never freed");
    living.resize(std::min(living.size(), maxHistories));
    for (const char* const data : living) { Checkers::PrintHistory(data); }
}

// Why a release is refused.
std::string Reason(const BucketMgr& pool, const void* data, const char* known) {
    if (const Block* const block = blocks.Find(data)) {
        return block->pool != &pool ? "is a block of pool " + block->pool->name
                                    : "is a heap record of 0 bytes, which only Clear releases";
    }
    if (known == nullptr) { return "is not a block of any pool"; }
    if (known == data) { return "is already freed"; }
    return "is not a block: it lies " +
           Count(static_cast<std::size_t>(static_cast<const char*>(data) - known), "byte") +
           " into the block at " + PtrText(known);
}

// Reports a refused release. Returns false.
bool Refuse(const BucketMgr& pool, const void* data) {
    TraceLine::BlockFreed(&pool, data);
    const char* const known = blocks.Around(data);
    Report(pool, PtrText(data) + " " + Reason(pool, data, known));
    Checkers::PrintStack();
    if (known != nullptr) { Checkers::PrintHistory(known); }
    if (NumberOf("MEMPOOL_ABORT", 0, 1, 0) == 1) { std::abort(); }
    return false;
}

}  // namespace

void KeepSizesExact(BucketMgr& pool) {
    pool.dataAlignment = static_cast<std::uint32_t>(NumberOf("MEMPOOL_CHECK_ALIGNMENT", 1, 64, 1));
    pool.minRecordSize = RoundUp(recordOverhead, pool.dataAlignment);
    pool.maxRecordSize -= pool.maxRecordSize % pool.dataAlignment;
    pool.maxRecordSize = std::max(pool.maxRecordSize, pool.minRecordSize);
}

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
    Block* const block = blocks.Find(data);
    if (!pool.enabled && block == nullptr) { return true; }
    if (block == nullptr || block->pool != &pool || HasNoBytes(*block)) {
        return Refuse(pool, data);
    }

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
    ForEachBlock(pool, [](Block& block, const char* data) { Release(block, data); });
}

void BeforeEnd(const BucketMgr& pool) {
    const Use use(pool);
    const Lock lock(mutex);
    if (!hasReportedAtExit) { ReportLiving(pool); }
    BeforeClear(pool);
    use.IsLast();
}

void AtExit() {
    const Lock lock(mutex);
    std::map<std::string, const BucketMgr*> pools;
    for (const auto& [data, block] : blocks.All()) {
        if (block.pool != nullptr) { pools[block.pool->name] = block.pool; }
    }
    for (const auto& [name, pool] : pools) { ReportLiving(*pool); }
    hasReportedAtExit = true;
}

}  // namespace OBR::MemPool::Checked
