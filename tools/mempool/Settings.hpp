// The settings of the pools, and of a search for them, as options of a subcommand.

#ifndef OBR_TOOLS_MEMPOOL_SETTINGS_HPP
#define OBR_TOOLS_MEMPOOL_SETTINGS_HPP

#include <MemPoolSettings>

#include "mempool/CommandLine.hpp"
#include "replay/Layer.hpp"

namespace Tool {

// Adds an option for each setting, which stores it in `settings`. Settings without an option on the
// command line keep their values.
void AddSettings(Subcommand& subcommand, OBR::MemPool::PoolSettings& settings);

// Takes the settings for which no option was given from the environment. For the callback of the
// subcommand. An invalid value is an error like an invalid option.
void TakeEnvironment(const Subcommand& subcommand, OBR::MemPool::PoolSettings& settings);

// Adds --layer, the layer that is compared with the heap.
void AddLayer(Subcommand& subcommand, Replay::Layer& layer);

// The name of a layer, as for --layer.
const char* NameOf(Replay::Layer layer);

// Adds --seconds, the length of a search.
void AddSeconds(Subcommand& subcommand, unsigned int& seconds);

// Throws std::runtime_error if no pool can be built with these settings.
void CheckSettings(const OBR::MemPool::PoolSettings& settings);

}  // namespace Tool

#endif
