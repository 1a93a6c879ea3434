// The settings of a pool as one value: told apart, tried one after the other, and checked before a
// pool is built with them, which would stop the process.

#ifndef OBR_TOOLS_REPLAY_POOLSETTINGS_HPP
#define OBR_TOOLS_REPLAY_POOLSETTINGS_HPP

#include <string>

namespace Replay {

// All sizes are bytes, those of records with their overhead of 4.
struct PoolSettings {
    unsigned int bucketSize = 0;
    unsigned int maxRecordSize = 0;
    unsigned int minRecordSize = 0;
    unsigned int dataAlignment = 0;
    bool keepEmptyBuckets = false;

    // Those of this process, which the environment has set or nobody yet.
    static PoolSettings OfProcess();

    // Makes them those of the process: of all pools that are built from now on.
    void Apply() const;

    // Why no pool can be built with them, or empty if one can.
    std::string Problem() const;
};

}  // namespace Replay

#endif
