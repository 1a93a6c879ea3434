// The settings of the pools as options of a subcommand.

#ifndef OBR_TOOLS_MEMPOOL_SETTINGS_HPP
#define OBR_TOOLS_MEMPOOL_SETTINGS_HPP

#include <CLI/CLI.hpp>

namespace Tool {

// Adds an option for each. What is not given comes from the environment, as in every host.
void AddSettings(CLI::App& subcommand);

}  // namespace Tool

#endif
