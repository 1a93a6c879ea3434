// The report of a pool, and the exported operations that print it for one pool or for all. A pool
// keeps no statistics: its figures are gathered from its buckets and then printed.

#include <iomanip>
#include <iostream>
#include <new>

#include <MemPool>

#include "MemPool/BucketMgr.hpp"
#include "MemPool/Checked.hpp"
#include "MemPool/MgrRegistry.hpp"
#include "diagnostics/reports/Walks.hpp"
#include "diagnostics/text/Text.hpp"

namespace OBR::MemPool {

namespace {

// The smallest bucket size according to the report; not enforced.
constexpr std::uint32_t minBucketSize = 128;

struct Figures {
    std::uint32_t emptyBuckets = 0;  // No record in use.
    std::uint32_t fullBuckets = 0;   // No record free.
    std::uint32_t usedRecs = 0;
    std::uint32_t freeRecs = 0;
    std::uint32_t freeBucks = 0;   // Buckets on free-bucket lists.
    std::uint32_t freeBucksM = 0;  // Data size of the last group, in bytes.
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

namespace {

// A failed write is silent unless the host has enabled the stream's exceptions. But std::bad_alloc
// while the stream's buffer grows is thrown on, as everywhere else: the stream would swallow it
// after half a number.
void Print(const BucketMgr& pool, bool detailed) {
    const Checked::Use use(pool);
    const std::ios::iostate enabled = std::cout.exceptions();
    const bool throwsAll = (enabled & std::ios::badbit) != 0;
    if (!std::cout.bad()) { std::cout.exceptions(enabled | std::ios::badbit); }
    const auto restore = [=] {
        if (!throwsAll) { std::cout.exceptions(enabled); }
    };
    try {
        pool.DbgReport(std::cout, 0, detailed, detailed, detailed);
    } catch (const std::bad_alloc&) {
        restore();
        throw;
    } catch (...) {
        if (throwsAll) { throw; }
    }
    restore();
}

void PrintAll(bool detailed) {
    registry.ForEachHandle([=](const Mgr* handle) { Print(*handle->GetBucketMgr(), detailed); });
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
