// The headers of a bucket that may be damaged. These functions read no byte beyond what the
// bucket's own header tells: a record's header that it does not hold, the guard aside, has an
// unknown type and no link.

#ifndef OBR_DIAGNOSTICS_RECORDHEADERS_HPP
#define OBR_DIAGNOSTICS_RECORDHEADERS_HPP

#include <cstddef>
#include <cstdint>

#include "MemPool/Bucket.hpp"

namespace OBR::MemPool {

inline bool HasHeaderAt(const Bucket& bucket, std::uint32_t offset) {
    return offset + offsetof(RecHdr, guard) <= bucket.size;
}

// A record is where the way from record to record comes by and finds a header, be it in a piece of
// a record at the end.
inline bool HasRecordAt(const Bucket& bucket, std::uint32_t offset) {
    return offset >= firstOffset && bucket.recSize != 0 &&
           (offset - firstOffset) % bucket.recSize == 0 && HasHeaderAt(bucket, offset);
}

inline std::uint8_t TypeAt(const Bucket& bucket, std::uint32_t offset) {
    return HasHeaderAt(bucket, offset) ? bucket.RecordAt(offset)->type : typeUnknown;
}

inline std::uint16_t LinkAt(const Bucket& bucket, std::uint32_t offset) {
    return HasHeaderAt(bucket, offset) ? bucket.RecordAt(offset)->Link() : std::uint16_t{0};
}

}  // namespace OBR::MemPool

#endif
