// What happens when the library is loaded and unloaded, in this order: the registry is constructed
// empty, its exit step stands ready, the settings start up (which may throw). On the way out the
// exit step releases the registry's own nodes and nothing else.

#include <iostream>  // Ahead of the objects below: its streams work while they are constructed.

#include "MemPool/EnvInit.hpp"
#include "MemPool/MgrRegistry.hpp"

namespace OBR::MemPool {

MgrRegistry registry;

namespace {

struct ExitStep {
    ~ExitStep() { registry.ReleaseNodes(); }
};
const ExitStep exitStep;

const EnvInit envInit;

}  // namespace

}  // namespace OBR::MemPool
