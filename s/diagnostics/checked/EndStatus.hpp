// The status that the process ends with. If the environment's MEMPOOL_CHECK_STATUS is not 0, a
// process in which the library has reported a fault ends with that number in place of 0, so that a
// script or a CI job sees the fault. `mempool check` sets the variable.

#ifndef OBR_DIAGNOSTICS_ENDSTATUS_HPP
#define OBR_DIAGNOSTICS_ENDSTATUS_HPP

namespace OBR::MemPool::EndStatus {

// A fault was reported. It does not count for a child that the process forks, before or after.
void NoteFault();

}  // namespace OBR::MemPool::EndStatus

#endif
