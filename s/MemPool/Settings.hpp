// The settings of the process: plain values that every layer may read. Settings.cpp stores them.

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

// The constructor is the start-up: it stores the defaults, reads the environment and prints the
// banner if asked to. If the minimum record size is then not below the maximum, it throws a const
// char*, whose text lives as long as the library.
class EnvInit {
public:
    EnvInit();
};

}  // namespace OBR::MemPool

#endif
