// Here alone stand the defaults of the settings, and for each environment variable the rule by
// which its value counts.

#include "MemPool/EnvInit.hpp"

#include <cstdint>
#include <cstdlib>
#include <optional>

#include "HostLayer/HostEnv.hpp"
#include "MemPool/Settings.hpp"
#include "diagnostics/text/Messages.hpp"

namespace OBR::MemPool {

namespace {

// The number that a variable starts with, 0 if with none; nothing if it is not set.
std::optional<std::int32_t> Number(const char* name) {
    const char* const value = Host_Env::GetEnv(name);
    if (value == nullptr) { return std::nullopt; }
    return std::atoi(value);
}

bool IsPositive(const char* name) {
    return Number(name).value_or(0) > 0;
}

void StoreDefaults() {
    Settings::bucketSize = 4010;
    Settings::dataAlignment = 4;
    Settings::maxRecordSize = 1000;
    Settings::minRecordSize = 8;
    Settings::keepEmptyBuckets = false;
    Settings::off = true;
}

// In this order. A value that its rule refuses is passed over without a word. The bounds of the two
// record sizes hold for the number taken as unsigned, as which a negative one is large.
void ReadEnvironment() {
    if (IsPositive("NUV_OBR_MEMPOOL_ON") || IsPositive("NUV_MEMPOOL_ON")) { Settings::off = false; }
    if (IsPositive("NUV_OBR_MEMPOOL_TRACE")) { Settings::trace = true; }
    if (const auto number = Number("NUV_OBR_MEMPOOL_BUCKET_SIZE"); number >= 0) {
        Settings::bucketSize = static_cast<std::uint32_t>(*number);
    }
    if (const auto number = Number("NUV_OBR_MEMPOOL_MAX_RECORD_SIZE")) {
        const auto size = static_cast<std::uint32_t>(*number);
        if (size <= Settings::largestMaxRecordSize) { Settings::maxRecordSize = size; }
    }
    if (const auto number = Number("NUV_OBR_MEMPOOL_MIN_RECORD_SIZE")) {
        const auto size = static_cast<std::uint32_t>(*number);
        if (size >= Settings::smallestMinRecordSize) { Settings::minRecordSize = size; }
    }
    if (const auto number = Number("NUV_OBR_MEMPOOL_DATA_ALIGNMENT")) {
        Settings::dataAlignment = static_cast<std::uint16_t>(*number > 0 ? *number : 1);
    }
    if (const auto number = Number("NUV_OBR_MEMPOOL_KEEP_EMPTY_BUCKETS")) {
        Settings::keepEmptyBuckets = *number > 0;
    }
    if (const auto number = Number("NUV_OBR_MEMPOOL_INFO"); number >= 0) { Messages::Banner(); }
}

}  // namespace

EnvInit::EnvInit() {
    StoreDefaults();
    ReadEnvironment();
    if (Settings::minRecordSize >= Settings::maxRecordSize) {
        throw Messages::MinRecordNotBelowMax(Settings::minRecordSize, Settings::maxRecordSize);
    }
}

}  // namespace OBR::MemPool
