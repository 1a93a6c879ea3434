// Used if the host has no layer of its own: reads the standard environment.

#include "HostLayer/HostEnv.hpp"

#include <cstdlib>

const char* Host_Env::GetEnv(const char* name) {
    return std::getenv(name);
}
