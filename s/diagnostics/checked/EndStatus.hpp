// The status that the process ends with. Where the environment's MEMPOOL_CHECK_STATUS is a number
// from 1 to 255, a process that the library has told a fault of ends with it in place of 0, so that
// a script or a CI job sees the fault. It is `mempool check` that sets the variable.

#ifndef OBR_DIAGNOSTICS_ENDSTATUS_HPP
#define OBR_DIAGNOSTICS_ENDSTATUS_HPP

namespace OBR::MemPool::EndStatus {

// A fault was told. A child that the process forks, before or after, is not meant.
void NoteFault();

}  // namespace OBR::MemPool::EndStatus

#endif
