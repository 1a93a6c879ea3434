// Reports a fault of the host as a line on standard error and in the exit status: if the variable
// MEMPOOL_CHECK_STATUS is set and not 0, a process with a reported fault that would exit with 0
// exits with that number, so that a script or a CI job sees it. `mempool check` sets the variable.

#ifndef OBR_DIAGNOSTICS_FAULT_HPP
#define OBR_DIAGNOSTICS_FAULT_HPP

#include <string>

#include "MemPool/BucketMgr.hpp"

namespace OBR::MemPool::Checked {

// Reports a fault. It does not change the exit status of a child that the process forks.
void Report(const BucketMgr& pool, const std::string& what);

}  // namespace OBR::MemPool::Checked

#endif
