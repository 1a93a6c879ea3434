// The exact texts. Each message has a fixed number, by which people search for it; the number is
// not a line of these files.

#include "diagnostics/text/Messages.hpp"

#include <cstdlib>
#include <iomanip>
#include <iostream>

#include <MemPool>

#include "MemPool/Settings.hpp"
#include "diagnostics/text/Text.hpp"

namespace OBR::MemPool {

namespace {

// Writes one line. The stream's own fill and justification apply to the number.
template <typename... Pieces>
void WriteLine(const char* severity, int number, const Pieces&... pieces) {
    std::cout << severity << ":../s/MemPool:" << std::setw(5) << number << ": ";
    (std::cout << ... << pieces) << std::endl;
}

template <typename... Pieces>
[[noreturn]] void Stop(int number, const Pieces&... pieces) {
    WriteLine("ERROR", number, pieces...);
    std::exit(1);
}

template <typename... Pieces>
void Warn(int number, const Pieces&... pieces) {
    WriteLine("WARNING", number, pieces...);
}

template <typename... Pieces>
void Inform(int number, const Pieces&... pieces) {
    WriteLine("INFO", number, pieces...);
}

}  // namespace

namespace Messages {

void DuplicateName(const std::string& name) {
    Stop(1645, "Duplicate Obr_MemPool::Mgr name encountered '", name, "'");
}

void SizeAboveLimit(std::uint32_t size, std::uint32_t limit) {
    Stop(1711, "Cannot allocate ", size, " bytes, the maximum is ", limit);
}

void MaxRecordAboveBucket(std::uint32_t maxRecordSize, std::uint32_t room,
                          std::uint32_t bucketSize) {
    Stop(1988, "Unexpected condition: the maximum record size is larger than the bucket size (",
         maxRecordSize, ">", room, ") [", bucketSize, "]");
}

void MinRecordAboveMax(std::uint32_t minRecordSize, std::uint32_t maxRecordSize) {
    Stop(1996, "Unexpected condition: the min rec size is larger than the max rec size (",
         minRecordSize, ">", maxRecordSize, ")");
}

void InvalidFreeRecord(const char* kind) {
    Stop(2640, "Invalid free record FREE != ", kind);
}

void FreeListTooLong(std::uint32_t walked, std::uint32_t totalRecs) {
    Stop(2648, "Exceeded the total number of recs ", walked, " > ", totalRecs);
}

void TooManyRows(std::uint32_t rows, std::uint32_t totalRecs) {
    Warn(2916, "Exceeded the total number of recs ", rows, " > ", totalRecs);
}

void TooFewRows(std::uint32_t rows, std::uint32_t totalRecs) {
    Warn(2922, "Did not reach the expected number of recs ", rows, " < ", totalRecs);
}

void TooManyFreeRows(std::uint32_t rows, std::uint32_t totalRecs) {
    Warn(2970, "Exceeded the number of total number of recs ", rows, " > ", totalRecs);
}

// Flags are printed as 1 and 0, whatever the stream makes of a bool.
void Banner() {
    Inform(3259, "# ================================================");
    Inform(3260, "# NUV_OBR_MEMPOOL_INFO");
    Inform(3261, "# ================================================");
    Inform(3262, "# Version            : ", GetVersion());
    Inform(3263, "# Bucket Size        : ", Settings::pool.bucketSize);
    Inform(3264, "# Data Alignment     : ", Settings::pool.dataAlignment);
    Inform(3265, "# Keep Empty Buckets : ", int{Settings::pool.keepEmptyBuckets});
    Inform(3266, "# Max Record Size    : ", Settings::pool.maxRecordSize);
    Inform(3267, "# Min Record Size    : ", Settings::pool.minRecordSize);
    Inform(3268, "# Trace              : ", int{Settings::trace});
    Inform(3269, "# Use Heap           : ", int{Settings::off});
}

// The text is made in place, so that neither a locale nor exhausted memory changes it.
const char* MinRecordNotBelowMax(std::uint32_t minRecordSize, std::uint32_t maxRecordSize) {
    static FixedText text;
    text = FixedText();
    text.Add("EXCEPTION:../s/MemPool:3337: MIN_RECORD_SIZE >= MAX_RECORD_SIZE (");
    text.AddNumber(minRecordSize).Add(">=").AddNumber(maxRecordSize).Add(")");
    std::cerr << text.CString() << std::endl;
    return text.CString();
}

}  // namespace Messages

void MYASSERT(const char* text, const char* file, std::int32_t line) {
    std::cout << "MYASSERT:" << file << ":" << std::setw(5) << line << ": " << text << std::endl;
    std::cout << "\tSet your debug breakpoint in ../s/MemPool at line 100." << std::endl;
    std::exit(1);
}

}  // namespace OBR::MemPool
