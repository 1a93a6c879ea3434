// Advice as JSON, for the subcommands that give it.

#ifndef OBR_TOOLS_MEMPOOL_ADVISE_HPP
#define OBR_TOOLS_MEMPOOL_ADVISE_HPP

#include <string>

#include "advise/Advice.hpp"

namespace Tool {

// The output of `mempool advise --json`.
std::string AdviceAsJson(const Advise::Advice& advice);

}  // namespace Tool

#endif
