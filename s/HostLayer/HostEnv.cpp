// Stands in for the host's own layer, over the standard environment.

#include "HostLayer/HostEnv.hpp"

#include <cstdlib>

const char* Host_Env::GetEnv(const char* name) {
    return std::getenv(name);
}
