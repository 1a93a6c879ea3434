// Stores the settings: through the exported accessors, and at the start-up from the environment.

#include "MemPool/Settings.hpp"

#include <cstdint>
#include <cstdlib>
#include <optional>

#include "HostLayer/HostEnv.hpp"
#include "diagnostics/text/Messages.hpp"

namespace OBR::MemPool {

// The accessors store what they are given.

unsigned int NUV_OBR_MEMPOOL_BUCKET_SIZE() {
    return Settings::pool.bucketSize;
}
void NUV_OBR_MEMPOOL_BUCKET_SIZE(unsigned int bytes) {
    Settings::pool.bucketSize = bytes;
}

unsigned int NUV_OBR_MEMPOOL_DATA_ALIGNMENT() {
    return Settings::pool.dataAlignment;
}
void NUV_OBR_MEMPOOL_DATA_ALIGNMENT(unsigned int bytes) {
    Settings::pool.dataAlignment = static_cast<std::uint16_t>(bytes);
}

bool NUV_OBR_MEMPOOL_KEEP_EMPTY_BUCKETS() {
    return Settings::pool.keepEmptyBuckets;
}
void NUV_OBR_MEMPOOL_KEEP_EMPTY_BUCKETS(bool keep) {
    Settings::pool.keepEmptyBuckets = keep;
}

unsigned int NUV_OBR_MEMPOOL_MAX_RECORD_SIZE() {
    return Settings::pool.maxRecordSize;
}
void NUV_OBR_MEMPOOL_MAX_RECORD_SIZE(unsigned int bytes) {
    Settings::pool.maxRecordSize = bytes;
}

unsigned int NUV_OBR_MEMPOOL_MIN_RECORD_SIZE() {
    return Settings::pool.minRecordSize;
}
void NUV_OBR_MEMPOOL_MIN_RECORD_SIZE(unsigned int bytes) {
    Settings::pool.minRecordSize = bytes;
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

// Kept for compatibility: programs that read reports know the library by this text.
const char* GetVersion() {
    return "$Id: MemPool,v 1.2.52.4 2009/08/10 21:28:15 qvw Exp $";
}

namespace {

// The number at the start of a variable's value, or 0 if there is none; nullopt if it is not set.
std::optional<std::int32_t> Number(const char* variable) {
    const char* const value = Host_Env::GetEnv(variable);
    if (value == nullptr) { return std::nullopt; }
    return std::atoi(value);
}

bool IsPositive(const char* variable) {
    return Number(variable).value_or(0) > 0;
}

// Reads the variables in this order, each with its own rule. A number out of bounds is silently
// ignored. The record sizes are compared as unsigned numbers: a negative one counts as large.
void ReadEnvironment() {
    using namespace SettingTable;
    PoolSettings& pool = Settings::pool;
    if (IsPositive("NUV_OBR_MEMPOOL_ON") || IsPositive("NUV_MEMPOOL_ON")) { Settings::off = false; }
    if (IsPositive("NUV_OBR_MEMPOOL_TRACE")) { Settings::trace = true; }
    if (const auto number = Number(bucketSize.variable); number >= 0) {
        pool.bucketSize = static_cast<std::uint32_t>(*number);
    }
    if (const auto number = Number(maxRecordSize.variable)) {
        const auto size = static_cast<std::uint32_t>(*number);
        if (size <= maxRecordSize.largest) { pool.maxRecordSize = size; }
    }
    if (const auto number = Number(minRecordSize.variable)) {
        const auto size = static_cast<std::uint32_t>(*number);
        if (size >= minRecordSize.smallest) { pool.minRecordSize = size; }
    }
    if (const auto number = Number(dataAlignment.variable)) {
        const auto size = static_cast<std::uint16_t>(*number);
        pool.dataAlignment = *number > 0 ? size : dataAlignment.smallest;
    }
    if (const auto number = Number(keepEmptyBuckets.variable)) {
        pool.keepEmptyBuckets = *number > 0;
    }
    if (Number("NUV_OBR_MEMPOOL_INFO") >= 0) { Messages::Banner(); }
}

}  // namespace

// Leaves the trace as it is: its variable can only turn it on.
EnvInit::EnvInit() {
    Settings::pool = PoolSettings();
    Settings::off = true;
    ReadEnvironment();
    if (!CanStartUp(Settings::pool)) {
        throw Messages::MinRecordNotBelowMax(Settings::pool.minRecordSize,
                                             Settings::pool.maxRecordSize);
    }
}

}  // namespace OBR::MemPool
