#include "mempool/Settings.hpp"

#include <algorithm>
#include <cstdlib>
#include <map>
#include <stdexcept>
#include <string>

#include <MemPoolSettings>

#include "mempool/CommandLine.hpp"

namespace Tool {

namespace {

const std::map<std::string, Replay::Layer> layers = {
    {"heap", Replay::Layer::Heap}, {"malloc", Replay::Layer::Malloc}, {"mgr", Replay::Layer::Mgr}};

}  // namespace

void AddSettings(CLI::App& subcommand, OBR::MemPool::PoolSettings& settings) {
    for (const OBR::MemPool::Setting& row : OBR::MemPool::SettingTable::all) {
        if (row.IsFlag()) {
            subcommand.add_flag(row.option, settings.*row.flag, row.help);
            continue;
        }
        const std::string bounds =
            ", " + std::to_string(row.smallest) + " to " + std::to_string(row.largest);
        AddNumber(subcommand, row.option, settings.*row.size, row.smallest, row.largest,
                  row.help + bounds)
            .type_name("BYTES");
    }
}

void TakeEnvironment(const CLI::App& subcommand, OBR::MemPool::PoolSettings& settings) {
    for (const OBR::MemPool::Setting& row : OBR::MemPool::SettingTable::all) {
        const char* const value = std::getenv(row.variable);
        if (value == nullptr || *value == '\0' || subcommand.count(row.option) != 0) { continue; }
        const unsigned int number = ParseNumber(row.variable, value, row.smallest, row.largest);
        if (row.IsFlag()) {
            settings.*row.flag = number != 0;
        } else {
            settings.*row.size = number;
        }
    }
}

void AddLayer(CLI::App& subcommand, Replay::Layer& layer) {
    subcommand
        .add_option("--layer", layer,
                    "What serves the blocks instead of malloc: heap, malloc or mgr")
        ->type_name("LAYER")
        ->transform(CLI::Transformer(layers))
        ->default_str(NameOf(layer));
}

const char* NameOf(Replay::Layer layer) {
    const auto isIt = [layer](const auto& each) { return each.second == layer; };
    return std::find_if(layers.begin(), layers.end(), isIt)->first.c_str();
}

void AddSeconds(CLI::App& subcommand, unsigned int& seconds) {
    AddNumber(subcommand, "--seconds", seconds, 1, 100000, "Approximate time of the search");
}

void CheckSettings(const OBR::MemPool::PoolSettings& settings) {
    const std::string problem = OBR::MemPool::PoolSizes(settings).Problem();
    if (!problem.empty()) {
        throw std::runtime_error("no pool can have these settings: " + problem);
    }
}

}  // namespace Tool
