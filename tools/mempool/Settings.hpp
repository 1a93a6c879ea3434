// The settings of the pools as options of a subcommand.

#ifndef OBR_TOOLS_MEMPOOL_SETTINGS_HPP
#define OBR_TOOLS_MEMPOOL_SETTINGS_HPP

#include <CLI/CLI.hpp>

#include "replay/PoolSettings.hpp"

namespace Tool {

// Adds an option for each, which stores it in `settings`. What is not given stays as it is.
void AddSettings(CLI::App& subcommand, Replay::PoolSettings& settings);

// Switches pools on, the trace off, and makes the settings those of the process. Settings that make
// no pool are a std::runtime_error.
void ApplySettings(const Replay::PoolSettings& settings);

}  // namespace Tool

#endif
