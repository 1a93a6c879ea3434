// The three tables that open up one bucket: all its records, a histogram of the used ones, and its
// free list from the head on.

#include <algorithm>
#include <iomanip>
#include <ostream>

#include "MemPool/Bucket.hpp"
#include "diagnostics/reports/RecordHeaders.hpp"
#include "diagnostics/reports/Table.hpp"
#include "diagnostics/reports/Walks.hpp"
#include "diagnostics/text/Messages.hpp"
#include "diagnostics/text/Text.hpp"

namespace OBR::MemPool {

void Bucket::DbgAllRecords(std::ostream& stream, std::uint32_t level) const {
    const std::string indent = Indent(level);
    WriteTableHead(stream, indent,
                   {{"Id", 5},
                    {"Type", 4},
                    {"Offset", 6},
                    {"Size", 5},
                    {"End", 5},
                    {"DSize", 5},
                    {"Address", 18}});

    const auto totalRecs = static_cast<std::uint32_t>(TotalRecs());
    std::uint32_t rows = 0;
    ForEachRecord(*this, [&](std::uint32_t offset) {
        const std::uint8_t type = TypeAt(*this, offset);
        stream << indent;
        WriteId(stream, ++rows, '0');
        stream << std::setw(4) << RecKindName(type) << " ";
        stream << std::setw(6) << offset << " ";
        stream << std::setw(5) << recSize << " ";
        stream << std::setw(5) << offset + recSize << " ";
        stream << std::setw(5) << (type == typeUsed ? DataSize() : 0) << " ";
        stream << std::setw(18) << PtrText(RecordAt(offset)) << " " << std::endl;
        if (rows > totalRecs) { Messages::TooManyRows(rows, totalRecs); }
    });
    if (rows < totalRecs) { Messages::TooFewRows(rows, totalRecs); }
}

void Bucket::AddUsedRecords(SizeCounts& counts) const {
    ForEachRecord(*this, [&](std::uint32_t offset) {
        if (TypeAt(*this, offset) == typeUsed) { ++counts[DataSize()]; }
    });
}

// One asterisk a record, and a "+" where there are more than the column holds.
void Bucket::DbgUsedHistogram(std::ostream& stream, std::uint32_t level) const {
    constexpr std::uint32_t maxBar = 50;
    const Histogram histogram{5, 5, '0'};
    const std::string indent = Indent(level);
    SizeCounts counts;
    AddUsedRecords(counts);

    histogram.WriteHead(stream, indent);
    std::uint32_t id = 0;
    for (const auto& [dataSize, frequency] : counts) {
        histogram.WriteRow(stream, indent, ++id, dataSize, frequency, std::min(frequency, maxBar));
        stream << (frequency > maxBar ? "+" : "") << std::endl;
    }
}

void Bucket::DbgFreeList(std::ostream& stream, std::uint32_t level) const {
    const std::string indent = Indent(level);
    WriteTableHead(
        stream, indent,
        {{"Id", 5}, {"Offset", 6}, {"Next", 5}, {"Size", 5}, {"Address", 18}, {"Next Addr", 18}});

    const auto totalRecs = static_cast<std::uint32_t>(TotalRecs());
    std::uint32_t rowsBefore = 0;
    for (FreeListWalk walk(*this); walk.IsOnRecord(); walk.Next()) {
        const std::uint16_t link = walk.Link();
        stream << indent;
        WriteId(stream, rowsBefore + 1, '0');
        stream << std::setw(6) << walk.Offset() << " ";
        stream << std::setw(5) << link << " ";
        stream << std::setw(5) << recSize << " ";
        stream << std::setw(18) << PtrText(RecordAt(walk.Offset())) << " ";
        stream << std::setw(18) << PtrText(link != 0 ? RecordAt(link) : nullptr) << " "
               << std::endl;
        if (rowsBefore > totalRecs) {
            Messages::TooManyFreeRows(rowsBefore, totalRecs);
            break;
        }
        ++rowsBefore;
    }
}

}  // namespace OBR::MemPool
