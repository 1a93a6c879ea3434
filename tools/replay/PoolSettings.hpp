// The settings with which pools replay a trace.

#ifndef OBR_TOOLS_REPLAY_POOLSETTINGS_HPP
#define OBR_TOOLS_REPLAY_POOLSETTINGS_HPP

#include <MemPoolSettings>

namespace Replay {

using OBR::MemPool::PoolSettings;

// All pools built from now on have these settings, are enabled and write no trace.
inline void UsePools(const PoolSettings& settings) {
    settings.Apply();
    OBR::MemPool::NUV_OBR_MEMPOOL_ON(true);
    OBR::MemPool::NUV_OBR_MEMPOOL_TRACE(false);
}

}  // namespace Replay

#endif
