// The report of one bucket: its header, the figures computed from it, and on request the sections
// about each of its records.

#include <iomanip>
#include <ostream>

#include "MemPool/Bucket.hpp"
#include "diagnostics/text/Text.hpp"

namespace OBR::MemPool {

void Bucket::DbgBucket(std::ostream& stream, std::uint32_t number, std::uint32_t level,
                       bool showRecords, bool showFreeList) const {
    const auto totalRecs = static_cast<std::uint32_t>(TotalRecs());
    const std::uint32_t used = totalRecs - numFree;

    const auto title = [&]() -> std::ostream& {
        return stream << Indent(level) << "MemPool::Bucket #" << std::setw(3) << std::setfill('0')
                      << number << std::setfill(' ');
    };
    const auto section = [&](const char* name, std::uint32_t count) {
        stream << std::endl;
        title() << " " << name << " (" << count << ")" << std::endl;
    };
    const auto pointerLine = [&](const char* label, const void* pointer) {
        stream << Indent(level + 1) << label << PtrText(pointer) << std::endl;
    };
    const auto numberLine = [&](const char* label, std::uint32_t value) {
        stream << Indent(level + 1) << label << std::setw(16) << value << std::endl;
    };

    stream << std::endl;
    title() << std::endl;
    pointerLine("Addr        : ", this);
    numberLine("Sizeof      : ", sizeof(Bucket));
    pointerLine("Parent      : ", parent);
    pointerLine("Next1       : ", next1);
    pointerLine("Prev1       : ", prev1);
    pointerLine("Next2       : ", next2);
    pointerLine("Prev2       : ", prev2);
    pointerLine("Recs Base   : ", RecsBase());
    pointerLine("Recs Beg    : ", RecordAt(firstOffset));
    pointerLine("Recs End    : ", RecsEnd());
    numberLine("Recs Size   : ", recSize);
    numberLine("Size        : ", size);
    numberLine("Total Recs  : ", totalRecs);
    numberLine("Used Recs   : ", used);
    numberLine("Used Bytes  : ", DataSize() * used);
    numberLine("Free Recs   : ", numFree);
    numberLine("Free Bytes  : ", DataSize() * numFree);
    numberLine("Free Head   : ", freeHead);
    numberLine("Hdr Offset  : ", sizeof(Bucket));

    if (showRecords) {
        section("ALL RECORDS", totalRecs);
        DbgAllRecords(stream, level + 1);
        section("USED DATA FREQ DIST HISTOGRAM", used);
        DbgUsedHistogram(stream, level + 1);
        section("ALL RECORDS MAP", totalRecs);
        DbgRecordMap(stream);
    }
    if (showFreeList) {
        section("FREE LIST", numFree);
        DbgFreeList(stream, level + 1);
    }
    stream << std::endl;
}

}  // namespace OBR::MemPool
