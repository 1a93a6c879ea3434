// The settings of the process: plain values, which every layer may read. The start-up and the
// exported accessors store them.

#ifndef OBR_MEMPOOL_SETTINGS_HPP
#define OBR_MEMPOOL_SETTINGS_HPP

#include <MemPoolSettings>

// Hidden by name, so that reading a setting is one load even where it is only declared.
#define OBR_HIDDEN __attribute__((visibility("hidden")))

namespace OBR::MemPool {

namespace Settings {

OBR_HIDDEN extern PoolSettings pool;  // A new pool copies them. dataAlignment has 16 bits.
OBR_HIDDEN extern bool off;           // Whether new pools pass requests to the heap.
OBR_HIDDEN extern bool trace;         // Read at every event of every pool.

}  // namespace Settings

// Its construction is the start-up: the defaults, the environment, the banner if asked for. It
// throws a text, const char*, if the record sizes of the environment cannot work; the text outlives
// the unwinding.
class EnvInit {
public:
    EnvInit();
};

}  // namespace OBR::MemPool

#endif
