// The three tables of a bucket: all its records, a histogram of the used ones, and its free list.

#include <algorithm>
#include <ostream>

#include "MemPool/Bucket.hpp"
#include "diagnostics/reports/RecordHeaders.hpp"
#include "diagnostics/reports/Table.hpp"
#include "diagnostics/reports/Walks.hpp"
#include "diagnostics/text/Messages.hpp"
#include "diagnostics/text/Text.hpp"

namespace OBR::MemPool {

void Bucket::DbgAllRecords(std::ostream& stream, std::uint32_t level) const {
    constexpr Column columns[] = {{"Id", 5, '0'}, {"Type", 4},  {"Offset", 6},  {"Size", 5},
                                  {"End", 5},     {"DSize", 5}, {"Address", 18}};
    const Table table(stream, level, columns);
    const auto totalRecs = static_cast<std::uint32_t>(TotalRecs());
    std::uint32_t rows = 0;
    ForEachRecord(*this, [&](std::uint32_t offset) {
        const std::uint8_t type = TypeAt(*this, offset);
        const std::uint32_t dataSize = type == typeUsed ? DataSize() : 0;
        table.WriteRow(++rows, RecKindName(type), offset, recSize, offset + recSize, dataSize,
                       PtrText(RecordAt(offset)));
        if (rows > totalRecs) { Messages::TooManyRows(rows, totalRecs); }
    });
    if (rows < totalRecs) { Messages::TooFewRows(rows, totalRecs); }
}

void Bucket::AddUsedRecords(SizeCounts& counts) const {
    ForEachRecord(*this, [&](std::uint32_t offset) {
        if (TypeAt(*this, offset) == typeUsed) { ++counts[DataSize()]; }
    });
}

// One asterisk per record, as many as the column holds.
void Bucket::DbgUsedHistogram(std::ostream& stream, std::uint32_t level) const {
    constexpr std::uint32_t maxBar = 50;
    SizeCounts counts;
    AddUsedRecords(counts);

    constexpr Column columns[] = {{"Id", 5, '0'}, {"Size", 5}, {"Freq", 5}, {"Magnitude", maxBar}};
    const Table table(stream, level, columns, "");
    std::uint32_t id = 0;
    for (const auto& [dataSize, frequency] : counts) {
        const Bar bar{std::min(frequency, maxBar), frequency > maxBar};
        table.WriteRow(++id, dataSize, frequency, bar);
    }
}

void Bucket::DbgFreeList(std::ostream& stream, std::uint32_t level) const {
    constexpr Column columns[] = {{"Id", 5, '0'}, {"Offset", 6},   {"Next", 5},
                                  {"Size", 5},    {"Address", 18}, {"Next Addr", 18}};
    const Table table(stream, level, columns);
    const auto totalRecs = static_cast<std::uint32_t>(TotalRecs());
    std::uint32_t rowsBefore = 0;
    for (FreeListWalk walk(*this); walk.IsOnRecord(); walk.Next()) {
        const std::uint16_t link = walk.Link();
        table.WriteRow(rowsBefore + 1, walk.Offset(), link, recSize,
                       PtrText(RecordAt(walk.Offset())),
                       PtrText(link != 0 ? RecordAt(link) : nullptr));
        if (rowsBefore > totalRecs) {
            Messages::TooManyFreeRows(rowsBefore, totalRecs);
            break;
        }
        ++rowsBefore;
    }
}

}  // namespace OBR::MemPool
