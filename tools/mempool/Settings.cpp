// A table of the settings, and what is done with them.

#include "mempool/Settings.hpp"

#include <stdexcept>
#include <string>

#include <MemPool>

namespace Tool {

namespace {

struct Setting {
    const char* option;
    unsigned int Replay::PoolSettings::*place;
    int smallest;
    int largest;
    const char* help;
};
// The bounds are those of the environment. A larger bucket size would count as the largest here.
constexpr Setting table[] = {
    {"--bucket-size", &Replay::PoolSettings::bucketSize, 0, 65535, "Size of a bucket"},
    {"--max-record", &Replay::PoolSettings::maxRecordSize, 0, 32767,
     "Largest record, its overhead included"},
    {"--min-record", &Replay::PoolSettings::minRecordSize, 4, 65535,
     "Smallest record, its overhead included"},
    {"--alignment", &Replay::PoolSettings::dataAlignment, 1, 65535,
     "Data sizes are rounded up to a multiple of it"},
};

}  // namespace

void AddSettings(CLI::App& subcommand, Replay::PoolSettings& settings) {
    for (const Setting& row : table) {
        const std::string bounds =
            ", " + std::to_string(row.smallest) + " to " + std::to_string(row.largest);
        subcommand.add_option(row.option, settings.*row.place, row.help + bounds)
            ->check(CLI::Range(row.smallest, row.largest).description(""))
            ->type_name("BYTES");
    }
    subcommand.add_flag("--keep-empty", settings.keepEmptyBuckets,
                        "Keep buckets that become empty");
}

void ApplySettings(const Replay::PoolSettings& settings) {
    const std::string problem = settings.Problem();
    if (!problem.empty()) { throw std::runtime_error("these settings make no pool: " + problem); }
    settings.Apply();
    OBR::MemPool::NUV_OBR_MEMPOOL_ON(true);
    OBR::MemPool::NUV_OBR_MEMPOOL_TRACE(false);
}

}  // namespace Tool
