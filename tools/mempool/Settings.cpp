#include "mempool/Settings.hpp"

#include <algorithm>
#include <cstdlib>
#include <map>
#include <stdexcept>
#include <string>

#include <MemPoolSettings>

namespace Tool {

namespace {

const std::map<std::string, Replay::Layer> layers = {
    {"heap", Replay::Layer::Heap}, {"malloc", Replay::Layer::Malloc}, {"mgr", Replay::Layer::Mgr}};

}  // namespace

void AddSettings(Subcommand& subcommand, OBR::MemPool::PoolSettings& settings) {
    for (const OBR::MemPool::Setting& row : OBR::MemPool::SettingTable::all) {
        if (row.IsFlag()) {
            subcommand.AddFlag(row.option, settings.*row.flag, row.help);
            continue;
        }
        const std::string bounds =
            ", " + std::to_string(row.smallest) + " to " + std::to_string(row.largest);
        subcommand.AddNumber(row.option, settings.*row.size, row.smallest, row.largest,
                             row.help + bounds, "BYTES");
    }
}

void TakeEnvironment(const Subcommand& subcommand, OBR::MemPool::PoolSettings& settings) {
    for (const OBR::MemPool::Setting& row : OBR::MemPool::SettingTable::all) {
        const char* const value = std::getenv(row.variable);
        if (value == nullptr || *value == '\0' || subcommand.IsGiven(row.option)) { continue; }
        const unsigned int number = ParseNumber(row.variable, value, row.smallest, row.largest);
        if (row.IsFlag()) {
            settings.*row.flag = number != 0;
        } else {
            settings.*row.size = number;
        }
    }
}

void AddLayer(Subcommand& subcommand, Replay::Layer& layer) {
    subcommand.AddChoice("--layer", layers, layer, "LAYER",
                         "What serves the blocks instead of malloc: heap, malloc or mgr");
}

const char* NameOf(Replay::Layer layer) {
    const auto isIt = [layer](const auto& each) { return each.second == layer; };
    return std::find_if(layers.begin(), layers.end(), isIt)->first.c_str();
}

void AddSeconds(Subcommand& subcommand, unsigned int& seconds) {
    subcommand.AddNumber("--seconds", seconds, 1, 100000, "Approximate time of the search");
}

void CheckSettings(const OBR::MemPool::PoolSettings& settings) {
    const std::string problem = OBR::MemPool::PoolSizes(settings).Problem();
    if (!problem.empty()) {
        throw std::runtime_error("no pool can have these settings: " + problem);
    }
}

}  // namespace Tool
