// Every message of the library, a function each, in the order of their numbers. Those marked
// noreturn end the process through std::exit(1).

#ifndef OBR_DIAGNOSTICS_MESSAGES_HPP
#define OBR_DIAGNOSTICS_MESSAGES_HPP

#include <cstdint>
#include <string>

namespace OBR::MemPool {

namespace Messages {

[[noreturn]] void DuplicateName(const std::string& name);
[[noreturn]] void SizeAboveLimit(std::uint32_t size, std::uint32_t limit);
[[noreturn]] void MaxRecordAboveBucket(std::uint32_t maxRecordSize, std::uint32_t room,
                                       std::uint32_t bucketSize);
[[noreturn]] void MinRecordAboveMax(std::uint32_t minRecordSize, std::uint32_t maxRecordSize);
[[noreturn]] void InvalidFreeRecord(const char* kind);
[[noreturn]] void FreeListTooLong(std::uint32_t walked, std::uint32_t totalRecs);

// Warnings of the record tables.
void TooManyRows(std::uint32_t rows, std::uint32_t totalRecs);
void TooFewRows(std::uint32_t rows, std::uint32_t totalRecs);
void TooManyFreeRows(std::uint32_t rows, std::uint32_t totalRecs);

// Prints the present settings.
void Banner();

// Writes its line to standard error. Returns the same text, to be thrown; it lives as long as the
// library.
const char* MinRecordNotBelowMax(std::uint32_t minRecordSize, std::uint32_t maxRecordSize);

}  // namespace Messages

// Reports a broken assumption of the program and ends the process through std::exit(1). The library
// does not call it: kept for compatibility.
[[noreturn]] void MYASSERT(const char* text, const char* file, std::int32_t line);

}  // namespace OBR::MemPool

#endif
