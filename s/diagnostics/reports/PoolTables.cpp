// The four tables of a pool: a histogram of its blocks in use, its buckets and their fill, the
// free-bucket list of each group, and its heap records. An address is two characters wider than its
// column.

#include <algorithm>
#include <ostream>

#include "MemPool/BucketMgr.hpp"
#include "diagnostics/reports/Table.hpp"
#include "diagnostics/reports/Walks.hpp"
#include "diagnostics/text/Text.hpp"

namespace OBR::MemPool {

// The bars are scaled: the longest has 51 to 100 asterisks if it stands for 50 blocks or more.
void BucketMgr::DbgUsedData(std::ostream& stream, std::uint32_t level,
                            const SizeCounts& usedDataFreq) const {
    std::uint32_t largest = 0;
    for (const auto& entry : usedDataFreq) { largest = std::max(largest, entry.second); }
    const std::uint32_t scale = std::max(largest / 50, std::uint32_t{1});

    stream << std::endl;
    stream << Indent(level + 1) << "USED DATA FREQ DIST HISTOGRAM (" << usedDataFreq.size() << ")"
           << std::endl;
    constexpr Column columns[] = {{"Id", 5}, {"Size", 7}, {"Freq", 9}, {"Magnitude", 50}};
    const Table table(stream, level, columns, "");
    std::uint32_t id = 0;
    for (const auto& [size, frequency] : usedDataFreq) {
        table.WriteRow(++id, size, frequency, Bar{frequency / scale + 1});
    }
}

void BucketMgr::DbgBuckets(std::ostream& stream, std::uint32_t level) const {
    stream << std::endl;
    stream << Indent(level + 1) << "BUCKETS (" << GetNumBuckets() << ")" << std::endl;
    constexpr Column columns[] = {{"Id", 5},    {"Group", 5},  {"Used", 5},     {"Free", 5},
                                  {"Total", 5}, {"% Used", 8}, {"Rec Size", 8}, {"Addr", 16}};
    const Table table(stream, level + 2, columns);
    std::uint32_t id = 0;
    ForEachGroup(*this, [&](std::uint32_t index, const Group& group) {
        ForEachBucket(group, [&](const Bucket& bucket) {
            const auto totalRecs = static_cast<std::uint32_t>(bucket.TotalRecs());
            const std::uint32_t used = totalRecs - bucket.numFree;
            const Percentage percentage{totalRecs == 0 ? 0.0 : used * 100.0 / totalRecs};
            table.WriteRow(++id, index, used, bucket.numFree, totalRecs, percentage, bucket.recSize,
                           PtrText(&bucket));
        });
    });
}

// Only the row of a group's first bucket has the group's own values.
void BucketMgr::DbgFreeBuckets(std::ostream& stream, std::uint32_t level, std::uint32_t freeBucks,
                               std::uint32_t freeBucksM) const {
    stream << std::endl;
    stream << Indent(level + 1) << "FREE BUCKETS (" << freeBucks << "," << freeBucksM << ")"
           << std::endl;
    constexpr Column columns[] = {{"Id", 5},    {"Group", 5}, {"Size", 5},
                                  {"Count", 5}, {"Off", 5},   {"Buckets", 16}};
    const Table table(stream, level + 2, columns, "");
    std::uint32_t id = 0;
    ForEachGroup(*this, [&](std::uint32_t index, const Group& group) {
        std::uint32_t count = 0;
        for (const Bucket* bucket = group.freeBuckets; bucket != nullptr; bucket = bucket->next2) {
            ++count;
        }
        std::uint32_t position = 0;
        for (const Bucket* bucket = group.freeBuckets; bucket != nullptr; bucket = bucket->next2) {
            if (position == 0) {
                table.WriteRow(++id, index, bucket->DataSize(), count, position, PtrText(bucket));
            } else {
                table.WriteRow("", "", "", "", position, PtrText(bucket));
            }
            ++position;
        }
    });
    stream << std::endl;
}

void BucketMgr::DbgExtRecs(std::ostream& stream, std::uint32_t level) const {
    stream << std::endl;
    stream << Indent(level + 1) << "EXT RECS (" << numExtRecs << ")" << std::endl;
    constexpr Column columns[] = {{"Id", 5},        {"Length", 7}, {"Data Ptr", 16},
                                  {"Heap Ptr", 16}, {"Next", 16},  {"Prev", 16}};
    const Table table(stream, level + 2, columns);
    std::uint32_t id = 0;
    for (const ExtRec* extRec = extRecs; extRec != nullptr; extRec = extRec->next) {
        table.WriteRow(++id, extRec->length, PtrText(extRec->Data()), PtrText(extRec),
                       PtrText(extRec->next), PtrText(extRec->prev));
    }
    stream << std::endl;
}

}  // namespace OBR::MemPool
