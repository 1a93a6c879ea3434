// The headers of records in a bucket that may be damaged. These functions read no byte beyond the
// size that the bucket's header states. A record's header that does not fit there (its guard need
// not) has an unknown type and no link.

#ifndef OBR_DIAGNOSTICS_RECORDHEADERS_HPP
#define OBR_DIAGNOSTICS_RECORDHEADERS_HPP

#include <cstddef>
#include <cstdint>

#include "MemPool/Bucket.hpp"

namespace OBR::MemPool {

inline bool HasHeaderAt(const Bucket& bucket, std::uint32_t offset) {
    return offset + offsetof(RecHdr, guard) <= bucket.size;
}

// Whether a record begins at the offset: at a multiple of the record size, with a whole header,
// even if the record itself is cut off by the bucket's end.
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
