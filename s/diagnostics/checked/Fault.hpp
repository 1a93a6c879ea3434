// A fault of the host's is a line on standard error, and shows in the exit status: if the
// environment's MEMPOOL_CHECK_STATUS is not 0, a process with a reported fault ends with that
// number in place of 0, so that a script or a CI job sees it. `mempool check` sets the variable.

#ifndef OBR_DIAGNOSTICS_FAULT_HPP
#define OBR_DIAGNOSTICS_FAULT_HPP

#include <string>

#include "MemPool/BucketMgr.hpp"

namespace OBR::MemPool::Checked {

// Reports a fault. It does not count for a child that the process forks, before or after.
void Report(const BucketMgr& pool, const std::string& what);

}  // namespace OBR::MemPool::Checked

#endif
