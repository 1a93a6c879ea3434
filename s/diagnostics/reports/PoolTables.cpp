// The three tables of a pool: its buckets and their fill, the free-bucket list of each group, and
// its heap records. An address is two characters wider than its column and moves the rest of its
// row to the right.

#include <iomanip>
#include <ostream>

#include "MemPool/BucketMgr.hpp"
#include "diagnostics/reports/Table.hpp"
#include "diagnostics/reports/Walks.hpp"
#include "diagnostics/text/Text.hpp"

namespace OBR::MemPool {

void BucketMgr::DbgBuckets(std::ostream& stream, std::uint32_t level) const {
    const std::string indent = Indent(level + 2);
    stream << std::endl;
    stream << Indent(level + 1) << "BUCKETS (" << GetNumBuckets() << ")" << std::endl;
    WriteTableHead(stream, indent,
                   {{"Id", 5},
                    {"Group", 5},
                    {"Used", 5},
                    {"Free", 5},
                    {"Total", 5},
                    {"% Used", 8},
                    {"Rec Size", 8},
                    {"Addr", 16}});

    std::uint32_t id = 0;
    ForEachGroup(*this, [&](std::uint32_t index, const Group& group) {
        ForEachBucket(group, [&](const Bucket& bucket) {
            const auto totalRecs = static_cast<std::uint32_t>(bucket.TotalRecs());
            const std::uint32_t used = totalRecs - bucket.numFree;
            const double percentage = totalRecs == 0 ? 0.0 : used * 100.0 / totalRecs;
            stream << indent;
            WriteId(stream, ++id, ' ');
            stream << std::setw(5) << index << " ";
            stream << std::setw(5) << used << " ";
            stream << std::setw(5) << bucket.numFree << " ";
            stream << std::setw(5) << totalRecs << " ";
            stream << std::fixed << std::setprecision(3) << std::setw(7) << percentage << "% ";
            stream << std::setw(8) << bucket.recSize << " ";
            stream << std::setw(16) << PtrText(&bucket) << " " << std::endl;
        });
    });
}

void BucketMgr::DbgFreeBuckets(std::ostream& stream, std::uint32_t level, std::uint32_t freeBucks,
                               std::uint32_t freeBucksM) const {
    const std::string indent = Indent(level + 2);
    stream << std::endl;
    stream << Indent(level + 1) << "FREE BUCKETS (" << freeBucks << "," << freeBucksM << ")"
           << std::endl;
    WriteTableHead(
        stream, indent,
        {{"Id", 5}, {"Group", 5}, {"Size", 5}, {"Count", 5}, {"Off", 5}, {"Buckets", 16}});

    std::uint32_t id = 0;
    ForEachGroup(*this, [&](std::uint32_t index, const Group& group) {
        if (group.freeBuckets == nullptr) { return; }
        std::uint32_t count = 0;
        for (const Bucket* bucket = group.freeBuckets; bucket != nullptr; bucket = bucket->next2) {
            ++count;
        }

        std::uint32_t position = 0;
        for (const Bucket* bucket = group.freeBuckets; bucket != nullptr; bucket = bucket->next2) {
            stream << indent;
            if (position == 0) {
                WriteId(stream, ++id, ' ');
                stream << std::setw(5) << index << " ";
                stream << std::setw(5) << bucket->DataSize() << " ";
                stream << std::setw(5) << count << " ";
            } else {
                for (int column = 0; column < 4; ++column) {
                    stream << std::setw(5) << " "
                           << " ";
                }
            }
            stream << std::setw(5) << position << " ";
            stream << std::setw(16) << PtrText(bucket) << std::endl;
            ++position;
        }
    });
    stream << std::endl;
}

void BucketMgr::DbgExtRecs(std::ostream& stream, std::uint32_t level) const {
    const std::string indent = Indent(level + 2);
    stream << std::endl;
    stream << Indent(level + 1) << "EXT RECS (" << numExtRecs << ")" << std::endl;
    WriteTableHead(
        stream, indent,
        {{"Id", 5}, {"Length", 7}, {"Data Ptr", 16}, {"Heap Ptr", 16}, {"Next", 16}, {"Prev", 16}});

    std::uint32_t id = 0;
    for (const ExtRec* extRec = extRecs; extRec != nullptr; extRec = extRec->next) {
        stream << indent;
        WriteId(stream, ++id, ' ');
        stream << std::setw(7) << extRec->length << " ";
        for (const void* address :
             {extRec->Data(), static_cast<const void*>(extRec),
              static_cast<const void*>(extRec->next), static_cast<const void*>(extRec->prev)}) {
            stream << std::setw(16) << PtrText(address) << " ";
        }
        stream << std::endl;
    }
    stream << std::endl;
}

}  // namespace OBR::MemPool
