#include "mempool/Settings.hpp"

#include <stdexcept>
#include <string>

#include <MemPoolSettings>

namespace Tool {

void AddSettings(CLI::App& subcommand, OBR::MemPool::PoolSettings& settings) {
    for (const OBR::MemPool::Setting& row : OBR::MemPool::SettingTable::all) {
        if (row.IsFlag()) {
            subcommand.add_flag(row.option, settings.*row.flag, row.help);
            continue;
        }
        const std::string bounds =
            ", " + std::to_string(row.smallest) + " to " + std::to_string(row.largest);
        subcommand.add_option(row.option, settings.*row.size, row.help + bounds)
            ->check(CLI::Range(row.smallest, row.largest).description(""))
            ->type_name("BYTES");
    }
}

void AddSeconds(CLI::App& subcommand, unsigned int& seconds) {
    subcommand.add_option("--seconds", seconds, "How long to search, about")
        ->type_name("N")
        ->check(CLI::Range(1, 100000))
        ->capture_default_str();
}

void CheckSettings(const OBR::MemPool::PoolSettings& settings) {
    const std::string problem = OBR::MemPool::PoolSizes(settings).Problem();
    if (!problem.empty()) { throw std::runtime_error("these settings make no pool: " + problem); }
}

}  // namespace Tool
