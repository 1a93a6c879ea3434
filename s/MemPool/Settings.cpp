// The exported accessors of the settings, which store what they are given.

#include "MemPool/Settings.hpp"

#include <MemPool>

namespace OBR::MemPool {

unsigned int NUV_OBR_MEMPOOL_BUCKET_SIZE() {
    return Settings::bucketSize;
}
void NUV_OBR_MEMPOOL_BUCKET_SIZE(unsigned int bytes) {
    Settings::bucketSize = bytes;
}

unsigned int NUV_OBR_MEMPOOL_DATA_ALIGNMENT() {
    return Settings::dataAlignment;
}
void NUV_OBR_MEMPOOL_DATA_ALIGNMENT(unsigned int bytes) {
    Settings::dataAlignment = static_cast<std::uint16_t>(bytes);
}

bool NUV_OBR_MEMPOOL_KEEP_EMPTY_BUCKETS() {
    return Settings::keepEmptyBuckets;
}
void NUV_OBR_MEMPOOL_KEEP_EMPTY_BUCKETS(bool keep) {
    Settings::keepEmptyBuckets = keep;
}

unsigned int NUV_OBR_MEMPOOL_MAX_RECORD_SIZE() {
    return Settings::maxRecordSize;
}
void NUV_OBR_MEMPOOL_MAX_RECORD_SIZE(unsigned int bytes) {
    Settings::maxRecordSize = bytes;
}

unsigned int NUV_OBR_MEMPOOL_MIN_RECORD_SIZE() {
    return Settings::minRecordSize;
}
void NUV_OBR_MEMPOOL_MIN_RECORD_SIZE(unsigned int bytes) {
    Settings::minRecordSize = bytes;
}

bool NUV_OBR_MEMPOOL_OFF() {
    return Settings::off;
}
void NUV_OBR_MEMPOOL_OFF(bool off) {
    Settings::off = off;
}
bool NUV_OBR_MEMPOOL_ON() {
    return !Settings::off;
}
void NUV_OBR_MEMPOOL_ON(bool on) {
    Settings::off = !on;
}

bool NUV_OBR_MEMPOOL_TRACE() {
    return Settings::trace;
}
void NUV_OBR_MEMPOOL_TRACE(bool trace) {
    Settings::trace = trace;
}

// The text of another time. It stays what it is for those who know reports by it.
const char* GetVersion() {
    return "$Id: MemPool,v 1.2.52.4 2009/08/10 21:28:15 qvw Exp $";
}

}  // namespace OBR::MemPool
