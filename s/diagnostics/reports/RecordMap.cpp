// The records of one bucket drawn as a grid of boxes, eight to a row: which are used, where the
// free list begins ("+") and how it runs.
//
//               1         2         3
//          +---------+---------+---------+
//          | USED    | FREE +  | FREE    |     kinds
//          | o=2     | o=18    | o=34    |     offsets
//        0 | s=16    | s=16    | s=16    |     sizes, after the index of the row's first record
//          | d=12    | n=34    | n=0     |     values: data size, or offset of the next free record
//          +---------+---------+---------+

#include <algorithm>
#include <iomanip>
#include <ostream>
#include <string>

#include "MemPool/Bucket.hpp"
#include "diagnostics/reports/RecordHeaders.hpp"
#include "diagnostics/reports/Walks.hpp"

namespace OBR::MemPool {

namespace {

constexpr std::uint16_t boxesPerRow = 8;

void WriteMargin(std::ostream& stream) {
    stream << std::setw(5) << " ";
}

template <typename Text>
void WriteLeft(std::ostream& stream, int width, const Text& text) {
    stream << std::left << std::setw(width) << text << std::right << "| ";
}

// A line of boxes: writeBox(index) writes the box of each record.
template <typename WriteBox>
void WriteBoxes(std::ostream& stream, std::uint16_t n, std::uint16_t first, WriteBox writeBox) {
    WriteMargin(stream);
    stream << "| ";
    for (std::uint32_t index = first; index < std::uint32_t{first} + n; ++index) {
        writeBox(index);
    }
    stream << std::endl;
}

}  // namespace

void Bucket::DbgRecordMap(std::ostream& stream) const {
    const auto totalRecs = static_cast<std::uint32_t>(TotalRecs());
    Records records;
    records.reserve(totalRecs);
    std::uint16_t count = 0;
    ForEachRecord(*this, [&](std::uint32_t offset) {
        records.push_back(RecordAt(offset));
        ++count;
    });

    stream << std::setw(6) << " ";
    for (std::uint16_t number = 1; number <= std::min(count, boxesPerRow); ++number) {
        stream << "    " << number << "     ";
    }
    stream << std::endl;

    const auto writeRow = [&](std::uint16_t n, std::uint16_t first) {
        DbgMapKinds(stream, n, first, records);
        DbgMapOffsets(stream, n, first, records);
        DbgMapSizes(stream, n, first);
        DbgMapValues(stream, n, first, records);
    };
    const auto fullRows = static_cast<std::uint16_t>(totalRecs / boxesPerRow);
    const auto partial = static_cast<std::uint16_t>(totalRecs % boxesPerRow);
    for (std::uint16_t row = 0; row < fullRows; ++row) {
        DbgMapRule(stream, boxesPerRow);
        writeRow(boxesPerRow, static_cast<std::uint16_t>(row * boxesPerRow));
    }
    DbgMapRule(stream, std::min(count, boxesPerRow));
    if (partial != 0) {
        writeRow(partial, static_cast<std::uint16_t>(fullRows * boxesPerRow));
        DbgMapRule(stream, partial);
    }
}

void Bucket::DbgMapRule(std::ostream& stream, std::uint16_t n) const {
    WriteMargin(stream);
    stream << "+";
    for (std::uint16_t box = 0; box < n; ++box) { stream << "---------+"; }
    stream << std::endl;
}

void Bucket::DbgMapKinds(std::ostream& stream, std::uint16_t n, std::uint16_t first,
                         const Records& records) const {
    WriteBoxes(stream, n, first, [&](std::uint32_t index) {
        const std::uint16_t offset = OffsetOf(records[index]);
        std::string kind = RecKindName(TypeAt(*this, offset));
        if (offset == freeHead) { kind += " +"; }
        WriteLeft(stream, 8, kind);
    });
}

void Bucket::DbgMapOffsets(std::ostream& stream, std::uint16_t n, std::uint16_t first,
                           const Records& records) const {
    WriteBoxes(stream, n, first, [&](std::uint32_t index) {
        stream << "o=";
        WriteLeft(stream, 6, OffsetOf(records[index]));
    });
}

void Bucket::DbgMapSizes(std::ostream& stream, std::uint16_t n, std::uint16_t first) const {
    stream << std::setw(4) << first << " | ";
    for (std::uint16_t box = 0; box < n; ++box) {
        stream << "s=";
        WriteLeft(stream, 6, recSize);
    }
    stream << std::endl;
}

void Bucket::DbgMapValues(std::ostream& stream, std::uint16_t n, std::uint16_t first,
                          const Records& records) const {
    WriteBoxes(stream, n, first, [&](std::uint32_t index) {
        const std::uint16_t offset = OffsetOf(records[index]);
        switch (TypeAt(*this, offset)) {
            case typeFree:
                stream << "n=";
                WriteLeft(stream, 6, LinkAt(*this, offset));
                break;
            case typeUsed:
                stream << "d=";
                WriteLeft(stream, 6, DataSize());
                break;
            default:
                stream << "u=";
                WriteLeft(stream, 6, 0U);
                break;
        }
    });
}

}  // namespace OBR::MemPool
