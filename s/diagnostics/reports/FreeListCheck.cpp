// The check of one bucket's free list, which stops the process at the first fault and prints
// nothing for a sound list.

#include "MemPool/Bucket.hpp"
#include "diagnostics/reports/RecordHeaders.hpp"
#include "diagnostics/reports/Walks.hpp"
#include "diagnostics/text/Messages.hpp"

namespace OBR::MemPool {

void Bucket::CheckFreeList() const {
    const auto totalRecs = static_cast<std::uint32_t>(TotalRecs());
    std::uint32_t walked = 0;
    for (FreeListWalk walk(*this); !walk.IsAtEnd(); walk.Next()) {
        const std::uint8_t type = walk.IsOnRecord() ? TypeAt(*this, walk.Offset()) : typeUnknown;
        if (type != typeFree) { Messages::InvalidFreeRecord(RecKindName(type)); }
        if (walked >= totalRecs) { Messages::FreeListTooLong(walked + 1, totalRecs); }
        ++walked;
    }
}

}  // namespace OBR::MemPool
