// A table of the settings.

#include "mempool/Settings.hpp"

#include <MemPool>

namespace Tool {

namespace {

struct Setting {
    const char* option;
    void (*store)(unsigned int);
    const char* help;
};
constexpr Setting settings[] = {
    {"--bucket-size", OBR::MemPool::NUV_OBR_MEMPOOL_BUCKET_SIZE, "Size of a bucket"},
    {"--max-record", OBR::MemPool::NUV_OBR_MEMPOOL_MAX_RECORD_SIZE,
     "Largest record, its overhead included"},
    {"--min-record", OBR::MemPool::NUV_OBR_MEMPOOL_MIN_RECORD_SIZE,
     "Smallest record, its overhead included"},
    {"--alignment", OBR::MemPool::NUV_OBR_MEMPOOL_DATA_ALIGNMENT,
     "Data sizes are rounded up to a multiple of it"},
};

}  // namespace

void AddSettings(CLI::App& subcommand) {
    for (const Setting& setting : settings) {
        subcommand.add_option_function<unsigned int>(setting.option, setting.store, setting.help)
            ->check(CLI::Range(1, 65535))
            ->type_name("BYTES");
    }
    subcommand.add_flag_callback(
        "--keep-empty", [] { OBR::MemPool::NUV_OBR_MEMPOOL_KEEP_EMPTY_BUCKETS(true); },
        "Keep buckets that become empty");
}

}  // namespace Tool
