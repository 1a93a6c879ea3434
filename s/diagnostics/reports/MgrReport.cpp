// The report of a pool, and the exported operations that print it for one pool or for all. A pool
// keeps no statistics: the figures are gathered from its buckets first, then printed.

#include <algorithm>
#include <iomanip>
#include <iostream>
#include <new>

#include <MemPool>

#include "MemPool/BucketMgr.hpp"
#include "MemPool/MgrRegistry.hpp"
#include "diagnostics/reports/Table.hpp"
#include "diagnostics/reports/Walks.hpp"
#include "diagnostics/text/Text.hpp"

namespace OBR::MemPool {

namespace {

// The least bucket size that the report advises. Nothing enforces it.
constexpr std::uint32_t minBucketSize = 128;

struct Figures {
    std::uint32_t emptyBuckets = 0;  // No record in use.
    std::uint32_t fullBuckets = 0;   // No record free.
    std::uint32_t usedRecs = 0;
    std::uint32_t freeRecs = 0;
    std::uint32_t freeBucks = 0;   // Buckets on free-bucket lists.
    std::uint32_t freeBucksM = 0;  // Data size of the last group: bytes, and no count.
    SizeCounts usedDataFreq;       // Of records and heap records in use.
};

Figures Gather(const BucketMgr& pool) {
    Figures figures;
    ForEachGroup(pool, [&](std::uint32_t, const Group& group) {
        ForEachBucket(group, [&](const Bucket& bucket) {
            const auto totalRecs = static_cast<std::uint32_t>(bucket.TotalRecs());
            figures.freeRecs += bucket.numFree;
            figures.usedRecs += totalRecs - bucket.numFree;
            bucket.AddUsedRecords(figures.usedDataFreq);
            if (bucket.numFree == totalRecs) { ++figures.emptyBuckets; }
            if (bucket.numFree == 0) { ++figures.fullBuckets; }
        });
        figures.freeBucks += group.numFreeBuckets;
        figures.freeBucksM = group.recDataSize;
    });
    for (const ExtRec* extRec = pool.extRecs; extRec != nullptr; extRec = extRec->next) {
        ++figures.usedDataFreq[extRec->length];
    }
    return figures;
}

}  // namespace

void BucketMgr::DbgReport(std::ostream& stream, std::uint32_t level, bool showBuckets,
                          bool showRecords, bool showFreeList) const {
    const Figures figures = Gather(*this);

    const auto textLine = [&](const char* label, const std::string& text) {
        stream << Indent(level + 1) << label << text << std::endl;
    };
    const auto numberLine = [&](const char* label, std::uint32_t value) {
        stream << Indent(level + 1) << label << std::setw(16) << value << std::endl;
    };

    stream << Indent(level) << "MemPool::Mgr " << name << std::endl;
    textLine("Version     : ", GetVersion());
    textLine("Addr        : ", PtrText(this));
    numberLine("Sizeof      : ", sizeof(BucketMgr));
    numberLine("Bucket Size : ", bucketSize);
    numberLine("Num Groups  : ", numGroups);
    numberLine("Num Buckets : ", GetNumBuckets());
    numberLine("   Empty    : ", figures.emptyBuckets);
    numberLine("   Full     : ", figures.fullBuckets);
    numberLine("Used Recs   : ", figures.usedRecs);
    numberLine("Ext Recs    : ", numExtRecs);
    numberLine("Free Recs   : ", figures.freeRecs);
    numberLine("Free Bucks  : ", figures.freeBucks);
    numberLine("Free BucksM : ", figures.freeBucksM);
    numberLine("Enabled     : ", enabled);
    numberLine("Max Ext Sz  : ", maxAllocSize);
    numberLine("Min Buck Sz : ", minBucketSize);
    numberLine("Max Buck Sz : ", maxBucketSize);
    numberLine("Min Rec Sz  : ", minRecordSize);
    numberLine("Max Rec Sz  : ", maxRecordSize);
    numberLine("Data Align  : ", dataAlignment);
    numberLine("Sizeof Buck : ", sizeof(Bucket));
    numberLine("Sizeof Hdr  : ", sizeof(RecHdr));
    numberLine("Sizeof Free : ", sizeof(RecHdr));
    numberLine("Sizeof Used : ", sizeof(RecHdr));

    DbgUsedData(stream, level + 2, figures.usedDataFreq);
    DbgBuckets(stream, level);
    DbgFreeBuckets(stream, level, figures.freeBucks, figures.freeBucksM);
    DbgExtRecs(stream, level);

    if (showBuckets) {
        std::uint32_t number = 0;
        ForEachGroup(*this, [&](std::uint32_t, const Group& group) {
            ForEachBucket(group, [&](const Bucket& bucket) {
                bucket.DbgBucket(stream, ++number, level + 1, showRecords, showFreeList);
            });
        });
    }
}

// The bars are scaled so that the longest has 51 to 100 asterisks once it stands for 50 or more.
void BucketMgr::DbgUsedData(std::ostream& stream, std::uint32_t level,
                            const SizeCounts& usedDataFreq) const {
    const Histogram histogram{7, 9, ' '};
    const std::string indent = Indent(level);
    stream << std::endl;
    stream << Indent(level + 1) << "USED DATA FREQ DIST HISTOGRAM (" << usedDataFreq.size() << ")"
           << std::endl;
    histogram.WriteHead(stream, indent);

    std::uint32_t largest = 0;
    for (const auto& entry : usedDataFreq) { largest = std::max(largest, entry.second); }
    const std::uint32_t scale = std::max(largest / 50, std::uint32_t{1});

    std::uint32_t id = 0;
    for (const auto& [size, frequency] : usedDataFreq) {
        histogram.WriteRow(stream, indent, ++id, size, frequency, frequency / scale + 1);
        stream << std::endl;
    }
}

namespace {

// A failed write stays silent, unless the host has asked its stream to tell. But memory that is
// exhausted while the stream's buffer grows ends the report as it does elsewhere, by its exception:
// the stream would swallow it and leave half a number.
void Print(const BucketMgr& pool, bool detailed) {
    std::ostream& stream = std::cout;
    const std::ios::iostate told = stream.exceptions();
    if (!stream.bad()) { stream.exceptions(told | std::ios::badbit); }
    const auto restore = [&] {
        if ((told & std::ios::badbit) == 0) { stream.exceptions(told); }
    };
    try {
        pool.DbgReport(stream, 0, detailed, detailed, detailed);
    } catch (const std::bad_alloc&) {
        restore();
        throw;
    } catch (...) {
        if ((told & std::ios::badbit) != 0) { throw; }
    }
    restore();
}

void PrintAll(bool detailed) {
    for (const auto& entry : registry.All()) {
        if (const Mgr* const handle = MgrRegistry::HandleOf(entry.second)) {
            Print(*handle->GetBucketMgr(), detailed);
        }
    }
}

}  // namespace

void Mgr::Dbg() const {
    Print(*bucketMgr, false);
}
void Mgr::DbgDetailed() const {
    Print(*bucketMgr, true);
}

void Dbg() {
    PrintAll(false);
}
void DbgDetailed() {
    PrintAll(true);
}

}  // namespace OBR::MemPool
