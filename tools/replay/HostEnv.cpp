// The settings in the environment are for the programs that the tools run, not for the tools.

#include <HostLayer/HostEnv.hpp>

const char* Host_Env::GetEnv(const char* /*name*/) {
    return nullptr;
}
